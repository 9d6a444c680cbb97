#include "platform/apply/Apply.h"

#include <algorithm>
#include <chrono>
#include <memory>
#include <utility>

#include "platform/Log.h"
#include "platform/apply/Agents.h"
#include "platform/apply/Plan.h"
#include "platform/apply/Properties.h"
#include "platform/apply/Record.h"
#include "platform/apply/StateFile.h"

namespace platform::apply {
namespace {

// Longer than one run holds the lock: a slow activation of every interface, and the way back before it.
constexpr std::chrono::seconds lockBound{120};

// Keeps the first failure, and logs every one.
class Failures {
  public:
    bool note(const Outcome& outcome, const std::string& interface = {}) {
        if (!outcome.ok()) {
            logLine(LogLevel::error,
                    interface.empty() ? outcome.reason() : interface + ": " + outcome.reason());
            if (first_.ok()) {
                first_ = outcome;
            }
        }
        return outcome.ok();
    }
    [[nodiscard]] Outcome first() const { return first_; }

  private:
    Outcome first_;
};

values::Owned<CFDictionaryRef> asProperties(const InterfacePlan& plan, const Record& record) {
    return values::Owned<CFDictionaryRef>::adopt(copyPlanAsPropertyList(plan, record.salt));
}

bool isSo(const RecordEntry* entry, const InterfacePlan& plan, const Record& record) {
    return entry != nullptr && entry->completed && entry->plan &&
           CFEqual(entry->plan.get(), asProperties(plan, record).get()) != 0;
}

bool isSo(const Record& record, const Plan& plan) {
    return record.entries.size() == plan.size() &&
           std::all_of(plan.begin(), plan.end(), [&record](const InterfacePlan& interface) {
               return isSo(record.find(interface.name), interface, record);
           });
}

// One run under the lock.
class Run {
  public:
    Run(const Plan& plan, Record& record, Failures& failures)
        : plan_(plan), record_(record), failures_(failures) {}

    void make() {
        // An interface that was missing may have come since: it is looked at again.
        std::erase_if(record_.entries, [](const RecordEntry& entry) { return entry.isAbsent(); });
        std::shared_ptr<Agent> agent;
        const bool hasAgent = plan_.empty() || failures_.note(chooseAgent(agent));
        giveBack(agent.get());
        if (hasAgent && !plan_.empty() && capture(*agent)) {
            takeOver(*agent);
        }
    }

  private:
    [[nodiscard]] const InterfacePlan* wanted(const std::string& interface) const {
        const auto found = std::find_if(plan_.begin(), plan_.end(), [&interface](const InterfacePlan& plan) {
            return plan.name == interface;
        });
        return found == plan_.end() ? nullptr : &*found;
    }

    // What the plan does not name, and what another agent holds than the one that leads now.
    void giveBack(const Agent* leading) {
        std::vector<std::string> leaving;
        for (const RecordEntry& entry : record_.entries) {
            if (wanted(entry.captured.interface) == nullptr ||
                (leading != nullptr && entry.agent != leading->name())) {
                leaving.push_back(entry.captured.interface);
            }
        }
        for (const std::string& interface : leaving) {
            RecordEntry& entry = *record_.find(interface);
            // A run that ends in mid-way leaves an entry that no plan equals.
            entry.completed = false;
            std::shared_ptr<Agent> agent;
            if (failures_.note(agentNamed(entry.agent, agent), interface) &&
                failures_.note(agent->giveBack(entry.captured), interface)) {
                std::erase_if(record_.entries, [&interface](const RecordEntry& e) {
                    return e.captured.interface == interface;
                });
                failures_.note(writeRecord(record_));
            }
        }
    }

    // Puts on the disk how the interfaces are that are new to the record, and what all of them are to become.
    bool capture(Agent& agent) {
        std::vector<std::string> names;
        for (const InterfacePlan& plan : plan_) {
            if (record_.find(plan.name) == nullptr) {
                names.push_back(plan.name);
            }
        }
        std::vector<Captured> captured;
        if (!names.empty() && failures_.note(agent.capture(names, captured))) {
            for (Captured& one : captured) {
                record_.entries.push_back({std::string(agent.name()), std::move(one), {}, false});
            }
            for (const std::string& name : names) {
                noteMissing(name);
            }
        }
        for (const InterfacePlan& plan : plan_) {
            RecordEntry* const entry = record_.find(plan.name);
            if (entry != nullptr && entry->agent == agent.name() && !isSo(entry, plan, record_)) {
                entry->plan = asProperties(plan, record_);
                entry->completed = false;
            }
        }
        return failures_.note(writeRecord(record_));
    }

    void noteMissing(const std::string& name) {
        if (record_.find(name) != nullptr) {
            return;
        }
        const InterfacePlan& plan = *wanted(name);
        if (plan.active) {
            failures_.note({kSCStatusFailed, "there is no such interface"}, name);
            return;
        }
        record_.entries.push_back(
            {"", {name, DictionaryBuilder().take()}, asProperties(plan, record_), true});
    }

    void takeOver(Agent& agent) {
        bool changed = false;
        for (const InterfacePlan& plan : plan_) {
            RecordEntry* const entry = record_.find(plan.name);
            if (entry == nullptr || entry->completed || entry->agent != agent.name()) {
                continue;
            }
            if (failures_.note(agent.takeOver(plan, entry->captured), plan.name)) {
                entry->completed = true;
                changed = true;
            }
        }
        if (changed) {
            failures_.note(writeRecord(record_));
        }
    }

    const Plan& plan_;
    Record& record_;
    Failures& failures_;
};

}  // namespace

Outcome applyTree(CFDictionaryRef root) {
    Failures failures;
    Plan plan;
    failures.note(makePlan(root, plan));

    // Without the lock: the file is replaced as a whole, and a run that is under way has marked what it
    // changes.
    Record record;
    if (!failures.note(readRecord(record)) || isSo(record, plan)) {
        return failures.first();
    }
    StateLock lock;
    if (failures.note(makeRuntimeDirectory()) &&
        failures.note(lock.acquire(runtimePath("applied.lock"), lockBound)) &&
        failures.note(readRecord(record)) && !isSo(record, plan)) {
        Run(plan, record, failures).make();
    }
    return failures.first();
}

}  // namespace platform::apply
