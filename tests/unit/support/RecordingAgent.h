// An agent that works on a made-up machine: a table of interfaces, each with one line that tells how it is.
// It records what it is asked for, and can fail at any of it.
#pragma once

#include <chrono>
#include <functional>
#include <map>
#include <set>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/apply/Agent.h"
#include "platform/apply/Properties.h"
#include "platform/values/Fields.h"

namespace testing_support {

class RecordingAgent : public platform::apply::Agent {
  public:
    explicit RecordingAgent(std::string name = "recording") : name_(std::move(name)) {}

    std::map<std::string, std::string> machine;  // interface -> how it is
    std::vector<std::string> calls;              // "capture a b", "takeOver a", "giveBack a", "settle"
    std::vector<std::string> changes;            // "a: before -> after"
    std::set<std::string> failing;               // entries of `calls` that fail, without a change
    std::set<std::string> troubled;              // and that end in trouble, behind the change
    std::set<std::string> foreign;               // interfaces that are left alone
    int slow = 0;                                // how often settle has to be asked once more
    double seconds = 0;                          // that the last start was given
    std::function<void()> interruption;          // what happens once while it is waited for

    [[nodiscard]] std::string_view name() const noexcept override { return name_; }

    platform::Outcome takeSnapshots(std::span<const std::string> interfaces,
                                    std::vector<platform::apply::Snapshot>& snapshots,
                                    std::vector<platform::apply::Trouble>& leftAlone) override {
        std::string call = "capture";
        for (const std::string& interface : interfaces) {
            call += " " + interface;
            if (foreign.contains(interface)) {
                leftAlone.push_back({interface, "it is somebody else's"});
            } else if (machine.contains(interface)) {
                platform::values::FieldWriter state;
                state("State", machine[interface]);
                snapshots.push_back({interface, state.take()});
            }
        }
        return begin(call);
    }

    void start(std::span<platform::apply::Task> tasks, platform::apply::Clock::time_point deadline) override {
        seconds = std::chrono::duration<double>(deadline - platform::apply::Clock::now()).count();
        for (platform::apply::Task& task : tasks) {
            const std::string& interface = task.before->interface;
            const std::string call = (task.plan != nullptr ? "takeOver " : "giveBack ") + interface;
            task.refusal = begin(call);
            task.trouble = troubled.contains(call) ? call + " met trouble" : "";
            if (task.refusal.ok() && machine.contains(interface)) {
                const auto before = platform::apply::textIn(task.before->state.get(), CFSTR("State"));
                const std::string wanted = task.plan != nullptr ? describe(*task.plan) : before.value_or("?");
                const std::string now = std::exchange(machine[interface], wanted);
                if (now != wanted) {
                    changes.push_back(interface + ": " + now + " -> " + wanted);
                }
            }
        }
        unsettled_ = slow;
    }

    bool settle(platform::apply::Clock::time_point /*until*/) override {
        calls.emplace_back("settle");
        if (const std::function<void()> once = std::exchange(interruption, nullptr)) {
            once();
        }
        return unsettled_-- <= 0;
    }

  private:
    static std::string describe(const platform::apply::InterfacePlan& plan) {
        static constexpr const char* methods[] = {"none ", "manual ", "dhcp "};
        return plan.active ? std::string("ours: ") + methods[static_cast<int>(plan.method)] +
                                 std::to_string(plan.rank)
                           : "ours: off";
    }
    platform::Outcome begin(const std::string& call) {
        calls.push_back(call);
        return failing.contains(call) ? platform::Outcome(kSCStatusFailed, call + " was told to fail")
                                      : platform::Outcome();
    }

    std::string name_;
    int unsettled_ = 0;
};

}  // namespace testing_support
