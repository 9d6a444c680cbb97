// An agent that works on a made-up machine: a table of interfaces, each with one line that tells how it is.
// It records what it is asked for, and can fail or "crash" (throw) at any of its steps.
#pragma once

#include <chrono>
#include <map>
#include <set>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/apply/Agent.h"
#include "platform/apply/Properties.h"

namespace testing_support {

struct Crash {};

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
    int crashAt = -1;  // throws at that step: each change has one before and one behind it

    [[nodiscard]] std::string_view name() const noexcept override { return name_; }

    platform::Outcome capture(std::span<const std::string> interfaces,
                              std::vector<platform::apply::Captured>& captured,
                              std::vector<platform::apply::Trouble>& leftAlone) override {
        std::string call = "capture";
        for (const std::string& interface : interfaces) {
            call += " " + interface;
        }
        platform::Outcome done = begin(call);
        for (const std::string& interface : interfaces) {
            if (!done.ok() || machine.count(interface) == 0) {
                continue;
            }
            if (foreign.count(interface) != 0) {
                leftAlone.push_back({interface, "it is somebody else's"});
                continue;
            }
            platform::apply::DictionaryBuilder state;
            state.setText(CFSTR("State"), machine[interface]);
            captured.push_back({interface, state.take()});
        }
        return done;
    }

    void start(std::span<platform::apply::Task> tasks, platform::apply::Clock::time_point deadline) override {
        const auto left = deadline - platform::apply::Clock::now();
        seconds = std::chrono::duration_cast<std::chrono::duration<double>>(left).count();
        for (platform::apply::Task& task : tasks) {
            const std::string& interface = task.before->interface;
            const std::string call = (task.plan != nullptr ? "takeOver " : "giveBack ") + interface;
            task.refusal = begin(call);
            task.trouble = troubled.count(call) != 0 ? call + " met trouble" : "";
            if (task.refusal.ok() && machine.count(interface) != 0) {
                change(interface,
                       task.plan != nullptr
                           ? "ours: " + describe(*task.plan)
                           : platform::apply::textIn(task.before->state.get(), CFSTR("State")).value_or("?"));
            }
        }
        unsettled_ = slow;
    }

    bool settle(platform::apply::Clock::time_point /*until*/) override {
        calls.emplace_back("settle");
        return unsettled_-- <= 0;
    }

    static std::string describe(const platform::apply::InterfacePlan& plan) {
        if (!plan.active) {
            return "off";
        }
        static constexpr const char* methods[] = {"none", "manual", "dhcp"};
        return std::string(methods[static_cast<int>(plan.method)]) + " " + std::to_string(plan.rank);
    }

  private:
    platform::Outcome begin(const std::string& call) {
        step();
        calls.push_back(call);
        if (failing.count(call) != 0) {
            return {kSCStatusFailed, call + " was told to fail"};
        }
        return {};
    }
    void change(const std::string& interface, const std::string& state) {
        std::string& now = machine[interface];
        if (now != state) {
            changes.push_back(interface + ": " + now + " -> " + state);
            now = state;
        }
        step();
    }
    void step() {
        if (crashAt >= 0 && crashAt-- == 0) {
            throw Crash();
        }
    }

    std::string name_;
    int unsettled_ = 0;
};

}  // namespace testing_support
