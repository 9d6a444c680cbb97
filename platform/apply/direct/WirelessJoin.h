// A wireless network on its way to being joined.
#pragma once

#include <string>

#include "platform/base/Outcome.h"

namespace platform::apply {

class WirelessJoin {
  public:
    WirelessJoin() = default;
    WirelessJoin(const WirelessJoin&) = delete;
    WirelessJoin& operator=(const WirelessJoin&) = delete;
    virtual ~WirelessJoin() = default;

    enum class State {
        waiting,  // reason: what stands against it so far; empty when nothing does
        joined,
        givenUp,  // nothing more can be expected; reason: why
    };
    // Looks how far it is, and takes the next step when one is due. Does not wait. A failure is the machine's
    // own: a supplicant that refuses or does not answer, a kernel that refuses.
    virtual Outcome poll(State& state, std::string& reason) = 0;
};

}  // namespace platform::apply
