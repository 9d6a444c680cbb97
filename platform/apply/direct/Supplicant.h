// The wireless supplicant of an interface, over its control socket: networks are joined and left through it.
//
// What this system adds carries its own tag and is found by it, whatever its number; what others configured
// is never changed, only switched on again after the way back, because joining one network switches the
// others off.
#pragma once

#include <chrono>
#include <optional>
#include <string>
#include <vector>

#include "platform/Outcome.h"
#include "platform/apply/Plan.h"

namespace platform::apply {

// The networks that a supplicant knew and would join by itself, by their numbers.
struct KnownNetworks {
    std::vector<int> all;
    std::vector<int> enabled;
};

// Nothing, and success, when no supplicant runs for the interface.
Outcome readKnownNetworks(const std::string& interface, std::optional<KnownNetworks>& networks);

// Joins the network (as the card sees it: protection, and with or without an access point; one that it does
// not see is taken for one without, when the card can do that and the key is none of WPA's) and returns when
// the card is on it. It may stay there when it is on one that was joined before with the same settings. Fails
// when there is no supplicant, when the key fits nothing or is refused, and at the deadline; the supplicant
// then goes on trying.
Outcome joinNetwork(const std::string& interface, const WirelessSettings& settings, bool mayStay,
                    std::chrono::steady_clock::time_point deadline);

// Removes what was added, and switches on again what was on before. When somebody has chosen another network
// since, it only removes. Success when there is no supplicant, or nothing of ours.
Outcome leaveNetwork(const std::string& interface, const std::optional<KnownNetworks>& before);

}  // namespace platform::apply
