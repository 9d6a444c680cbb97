// Who makes a plan so on this machine: NetworkManager, or the platform itself through the kernel.
#pragma once

#include <chrono>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/CoreFoundation.h"
#include "platform/apply/Plan.h"
#include "platform/base/Outcome.h"
#include "platform/values/Object.h"

namespace platform::apply {

using Clock = std::chrono::steady_clock;

// How an interface was before this system first changed it, in a form that only its agent reads: a property
// list, since it outlives the process. It is on disk before the first change and is dropped after the way
// back.
struct Snapshot {
    std::string interface;
    values::Owned<CFDictionaryRef> state;
};

// An interface that is to become what a plan says, or to be given back, and what came of it.
struct Task {
    const Snapshot* before = nullptr;
    const InterfacePlan* plan = nullptr;  // null: it is given back

    // Filled in by the agent. The machine (the kernel, a daemon, the disk) did not take the settings.
    Outcome refusal;
    // What a network, a cable, a key, a switch or a card that is away did; empty for nothing. The settings
    // stand all the same, and whoever leads the interface goes on by itself where it can.
    std::string trouble;
    // Of an interface that is given back: the trouble keeps it from being so, and the next run goes on.
    bool isUnfinished = false;
};

// Every interface is started before any is waited for: start() gives each its settings and asks for what
// takes time, settle() waits for all of them at once.
class Agent {
  public:
    virtual ~Agent() = default;

    // Kept in the record with each interface, so that the way back is led by the agent that led the way out.
    [[nodiscard]] virtual std::string_view name() const noexcept = 0;

    // How those of these interfaces are now that this agent leads, in the order in which they have to be
    // given back. One that it leads and may not touch, since it is somebody else's work, stands in leftAlone
    // instead. Changes nothing.
    virtual Outcome takeSnapshots(std::span<const std::string> interfaces, std::vector<Snapshot>& snapshots,
                                  std::vector<Trouble>& leftAlone) = 0;

    // Begins. An interface that already is what its plan says is not changed. Giving back restores what was
    // captured and compares; nothing is changed when the interface is gone or nothing is left to undo, and
    // only what is this system's own is removed when somebody else has taken the interface over since. The
    // tasks stay where they are until the end of settle.
    virtual void start(std::span<Task> tasks, Clock::time_point deadline) = 0;

    // Waits until nothing more can be expected of any task, at most until the given time or the deadline.
    // True when all are settled: each is what it was to become, or its refusal or trouble tells why not.
    // Only what was up before is waited for on the way back.
    virtual bool settle(Clock::time_point until) = 0;
};

}  // namespace platform::apply
