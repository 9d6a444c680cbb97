#include "platform/apply/Apply.h"

#include <algorithm>
#include <memory>
#include <utility>

#include "platform/apply/Agents.h"
#include "platform/apply/Plan.h"
#include "platform/apply/Properties.h"
#include "platform/apply/Record.h"
#include "platform/apply/StateFile.h"
#include "platform/base/FileLock.h"
#include "platform/base/Log.h"
#include "platform/values/Fields.h"

namespace platform::apply {
namespace {

// Longer than one apply holds the lock.
constexpr std::chrono::seconds lockBound{60};
constexpr std::chrono::seconds goingBound{20};
constexpr std::chrono::seconds returningBound{15};
// What an earlier run left half-way is set going again; whoever comes to do something else does not wait long
// for it.
constexpr std::chrono::seconds finishingBound{3};
// With agents at work side by side each gets its turn this often.
constexpr std::chrono::milliseconds slice{50};
// How often one process tries to finish the same unfinished plan: each try may take a deadline's time.
constexpr int mostRetries = 1;

void logFor(LogLevel level, const std::string& interface, const std::string& reason) {
    logLine(level, interface.empty() ? reason : interface + ": " + reason);
}

// The tasks of each agent, in order.
class Crew {
  public:
    void add(const std::shared_ptr<Agent>& agent, Task task) {
        auto group =
            std::ranges::find(groups_, agent->name(), [](const Group& g) { return g.agent->name(); });
        if (group == groups_.end()) {
            group = groups_.insert(group, {agent, {}});
        }
        group->tasks.push_back(std::move(task));
    }
    void run(Clock::time_point deadline) {
        for (Group& group : groups_) {
            group.agent->start(group.tasks, deadline);
        }
        const bool isAlone = groups_.size() == 1;
        for (bool waiting = true; waiting;) {
            waiting = false;
            for (Group& group : groups_) {
                const bool settled = group.agent->settle(isAlone ? deadline : Clock::now() + slice);
                waiting = waiting || !settled;
            }
        }
    }
    template <class Each>
    void forEach(const Each& each) const {
        for (const Group& group : groups_) {
            std::ranges::for_each(group.tasks, each);
        }
    }

  private:
    struct Group {
        std::shared_ptr<Agent> agent;
        std::vector<Task> tasks;
    };
    std::vector<Group> groups_;
};

// Whether this process may try once more to make this location so.
bool mayRetry(const std::optional<std::string>& location) {
    static std::optional<std::string> tried;
    static int tries = 0;
    if (tried != location) {
        tried = location;
        tries = 0;
    }
    return tries++ < mostRetries;
}

bool isActivation(CFDictionaryRef root, CFDictionaryRef replaced, const Plan& plan) {
    if (replaced == nullptr) {
        return false;
    }
    std::vector<Trouble> ignored;
    return CFEqual(replaced, root) != 0 ||
           textIn(replaced, CFSTR("CurrentSet")) != textIn(root, CFSTR("CurrentSet")) ||
           makePlan(replaced, ignored) != plan;
}

class Run {
  public:
    Run(CFDictionaryRef root, CFDictionaryRef replaced)
        : location_(textIn(root, CFSTR("CurrentSet"))),
          plan_(makePlan(root, troubles_)),
          activates_(isActivation(root, replaced, plan_)) {}

    Outcome make() {
        for (const Trouble& trouble : troubles_) {
            if (activates_) {
                logFor(LogLevel::warning, trouble.interface, trouble.reason);
            }
        }
        // Without the lock: the file is replaced as a whole, and a run that is under way has marked what it
        // changes.
        FileDescriptor lock;
        if (note(readRecord(record_)) && isAnythingToDo() && note(makeRuntimeDirectory()) &&
            note(takeFileLock(runtimePath("applied.lock"), lockBound, lock)) && note(readRecord(record_)) &&
            (activates_ || !record_.isOf(plan_))) {
            makeUnderLock();
        }
        return activates_ ? first_ : Outcome();
    }

  private:
    [[nodiscard]] bool isAnythingToDo() const {
        return activates_ ? !record_.entries.empty() || !plan_.empty()
                          : !record_.entries.empty() && !record_.isOf(plan_) && mayRetry(location_);
    }

    void makeUnderLock() {
        const Clock::time_point begin = Clock::now();
        // What was missing may have come since: it is looked at again.
        const bool isShorter =
            std::erase_if(record_.entries, [](const RecordEntry& entry) { return entry.isLeftAlone(); }) != 0;
        const bool hasAgents = plan_.empty() || note(findAgents(agents_));
        known_ = agents_;
        giveBack(begin + returningBound, isShorter);
        if (hasAgents && !plan_.empty() && takeSnapshots()) {
            takeOver(begin + (activates_ ? goingBound : finishingBound));
        }
    }

    // Keeps the first failure, and logs every one.
    bool note(const Outcome& outcome, const std::string& interface = {}) {
        if (!outcome.ok()) {
            logFor(LogLevel::error, interface, outcome.reason());
            if (first_.ok()) {
                first_ = outcome;
            }
        }
        return outcome.ok();
    }
    bool note(const Task& task) {
        const std::string& interface = task.before->interface;
        if (task.refusal.ok() && !task.trouble.empty()) {
            logFor(LogLevel::warning, interface, task.trouble);
        }
        return note(task.refusal, interface);
    }

    // One agent of a name for the whole run.
    Outcome agentOf(const std::string& name, std::shared_ptr<Agent>& agent) {
        const auto known = std::ranges::find(known_, name, [](const auto& one) { return one->name(); });
        if (known != known_.end()) {
            agent = *known;
            return {};
        }
        RETURN_IF_FAILED(findAgent(name, agent));
        known_.push_back(agent);
        return {};
    }

    [[nodiscard]] const InterfacePlan* wanted(const std::string& interface) const {
        const auto found = std::ranges::find(plan_, interface, &InterfacePlan::name);
        return found == plan_.end() ? nullptr : &*found;
    }

    // An interface that the direct agent holds and that NetworkManager leads by now changes hands.
    [[nodiscard]] std::vector<std::string> changingHands() {
        std::vector<std::string> names;
        for (const RecordEntry& entry : record_.entries) {
            if (agents_.size() > 1 && entry.agent == agents_.back()->name()) {
                names.push_back(entry.snapshot.interface);
            }
        }
        std::vector<Snapshot> snapshots;
        std::vector<Trouble> leftAlone;
        if (names.empty() || !agents_.front()->takeSnapshots(names, snapshots, leftAlone).ok()) {
            return {};
        }
        names.clear();
        for (const Snapshot& one : snapshots) {
            names.push_back(one.interface);
        }
        return names;
    }

    void giveBack(Clock::time_point deadline, bool isChanged) {
        const std::vector<std::string> changing = changingHands();
        Crew crew;
        for (RecordEntry& entry : record_.entries) {
            const std::string& interface = entry.snapshot.interface;
            if (wanted(interface) != nullptr && std::ranges::count(changing, interface) == 0) {
                continue;
            }
            isChanged = true;
            entry.completed = false;
            std::shared_ptr<Agent> agent;
            if (note(agentOf(entry.agent, agent), interface)) {
                crew.add(agent, {&entry.snapshot, nullptr, {}, {}});
            }
        }
        if (!isChanged) {
            return;
        }
        if (!changing.empty()) {
            note(writeRecord(record_));
        }
        crew.run(deadline);
        std::vector<std::string> given;
        crew.forEach([this, &given](const Task& task) {
            if (note(task) && !task.isUnfinished) {
                given.push_back(task.before->interface);
            }
        });
        std::erase_if(record_.entries, [&given](const RecordEntry& entry) {
            return std::ranges::count(given, entry.snapshot.interface) != 0;
        });
        note(writeRecord(record_));
    }

    // Puts on the disk how the interfaces are that are new to the record, and what all of them are to become.
    bool takeSnapshots() {
        std::vector<std::string> names;
        for (const InterfacePlan& plan : plan_) {
            if (record_.find(plan.name) == nullptr) {
                names.push_back(plan.name);
            }
        }
        bool isWhole = true;
        for (const std::shared_ptr<Agent>& agent : agents_) {
            std::vector<Snapshot> snapshots;
            std::vector<Trouble> leftAlone;
            if (names.empty() || !isWhole) {
                break;
            }
            isWhole = note(agent->takeSnapshots(names, snapshots, leftAlone));
            for (Snapshot& one : snapshots) {
                std::erase(names, one.interface);
                record_.entries.push_back({std::string(agent->name()), std::move(one), {}, false});
            }
            for (const Trouble& trouble : leftAlone) {
                std::erase(names, trouble.interface);
                leaveAlone(trouble.interface, trouble.reason);
            }
        }
        for (const std::string& name : names) {
            // One that is wanted off and is not there is off.
            if (isWhole) {
                leaveAlone(name, wanted(name)->active ? "there is no such interface" : "");
            }
        }
        for (const InterfacePlan& plan : plan_) {
            RecordEntry* const entry = record_.find(plan.name);
            std::optional<InterfacePlan> recorded = withoutKey(plan, record_.salt);
            if (entry != nullptr) {
                // All of them are looked at now: a run that is ended before the end of it leaves them marked.
                entry->plan = std::move(recorded);
                entry->completed = entry->isLeftAlone();
            }
        }
        return note(writeRecord(record_));
    }

    void leaveAlone(const std::string& interface, const std::string& reason) {
        if (!reason.empty()) {
            logFor(LogLevel::warning, interface, reason);
        }
        record_.entries.push_back({"",
                                   {interface, values::FieldWriter().take()},
                                   withoutKey(*wanted(interface), record_.salt),
                                   true});
    }

    void takeOver(Clock::time_point deadline) {
        Crew crew;
        for (const InterfacePlan& plan : plan_) {
            const RecordEntry* const entry = record_.find(plan.name);
            std::shared_ptr<Agent> agent;
            if (entry != nullptr && !entry->isLeftAlone() && note(agentOf(entry->agent, agent), plan.name)) {
                crew.add(agent, {&entry->snapshot, &plan, {}, {}});
            }
        }
        crew.run(deadline);
        bool isChanged = false;
        crew.forEach([this, &isChanged](const Task& task) {
            RecordEntry& entry = *record_.find(task.before->interface);
            isChanged = entry.completed != note(task) || isChanged;
            entry.completed = task.refusal.ok();
        });
        if (isChanged) {
            note(writeRecord(record_));
        }
    }

    const std::optional<std::string> location_;
    std::vector<Trouble> troubles_;
    const Plan plan_;
    const bool activates_;  // false: it finishes what was activated before
    Record record_;
    Outcome first_;
    Agents agents_;  // that may lead interfaces now
    Agents known_;   // and those of the record
};

}  // namespace

Outcome applyTree(CFDictionaryRef root, CFDictionaryRef replaced) {
    return Run(root, replaced).make();
}

}  // namespace platform::apply
