// The switch of a wireless card's radio (rfkill).
#pragma once

#include <optional>
#include <string>

#include "platform/base/Outcome.h"

namespace platform::apply {

struct Radio {
    bool isOff = false;      // switched off by a program, as flight mode does
    bool isBlocked = false;  // by a switch on the computer, which no program can change
};

// Nothing for a card without such a switch.
[[nodiscard]] std::optional<Radio> readRadio(const std::string& interface);
// Success for a card without one.
Outcome switchRadio(const std::string& interface, bool on);

}  // namespace platform::apply
