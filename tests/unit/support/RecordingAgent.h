// An agent that works on a made-up machine: a table of interfaces, each with one line that tells how it is.
// It records what it is asked for, and can fail or "crash" (throw) at any of its steps.
#pragma once

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
    std::vector<std::string> calls;              // "capture a b", "takeOver a", "giveBack a"
    std::vector<std::string> changes;            // "a: before -> after"
    std::set<std::string> failing;               // entries of `calls` that fail, without a change
    int crashAt = -1;  // throws at that step: each change has one before and one behind it

    [[nodiscard]] std::string_view name() const noexcept override { return name_; }

    platform::Outcome capture(std::span<const std::string> interfaces,
                              std::vector<platform::apply::Captured>& captured) override {
        std::string call = "capture";
        for (const std::string& interface : interfaces) {
            call += " " + interface;
        }
        platform::Outcome done = begin(call);
        for (const std::string& interface : interfaces) {
            if (done.ok() && machine.count(interface) != 0) {
                platform::apply::DictionaryBuilder state;
                state.setText(CFSTR("State"), machine[interface]);
                captured.push_back({interface, state.take()});
            }
        }
        return done;
    }

    platform::Outcome takeOver(const platform::apply::InterfacePlan& plan,
                               const platform::apply::Captured& /*before*/) override {
        platform::Outcome done = begin("takeOver " + plan.name);
        if (done.ok()) {
            change(plan.name, "ours: " + describe(plan));
        }
        return done;
    }

    platform::Outcome giveBack(const platform::apply::Captured& before) override {
        platform::Outcome done = begin("giveBack " + before.interface);
        if (done.ok() && machine.count(before.interface) != 0) {
            change(before.interface,
                   platform::apply::textIn(before.state.get(), CFSTR("State")).value_or("?"));
        }
        return done;
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
};

}  // namespace testing_support
