// Who makes a plan so on this machine: NetworkManager, or the platform itself through rtnetlink.
#pragma once

#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/CoreFoundation.h"
#include "platform/Outcome.h"
#include "platform/apply/Plan.h"
#include "platform/values/Object.h"

namespace platform::apply {

// How an interface was before this system first changed it, in a form that only its agent reads: a property
// list, since it outlives the process. It is on disk before the first change and is dropped after the way
// back.
struct Captured {
    std::string interface;
    values::Owned<CFDictionaryRef> state;
};

class Agent {
  public:
    virtual ~Agent() = default;

    // Kept in the record with each interface, so that the way back is led by the agent that led the way out.
    [[nodiscard]] virtual std::string_view name() const noexcept = 0;

    // How these interfaces are now, in the order in which they have to be given back. An interface that does
    // not exist is left out. Changes nothing.
    virtual Outcome capture(std::span<const std::string> interfaces, std::vector<Captured>& captured) = 0;

    // Makes the interface what the plan says, whatever it is now, and returns when it is so, has failed, or
    // the agent's bound on waiting is over. Called again with the same plan it changes nothing. An interface
    // that the plan wants off and that does not exist is off.
    virtual Outcome takeOver(const InterfacePlan& plan, const Captured& before) = 0;

    // Makes the interface as it was captured, compares, and fails when it is not so. Succeeds without a
    // change when the interface is gone, when there is nothing left to undo, or when somebody else has taken
    // it over since (it then removes only what is its own).
    virtual Outcome giveBack(const Captured& before) = 0;
};

}  // namespace platform::apply
