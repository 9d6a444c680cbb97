// The wireless supplicant of an interface: networks are joined and left through it.
//
// What this system adds carries its own tag and is found by it, whatever its number; what others configured
// is never changed, only switched on again after the way back, because joining one network switches the
// others off.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/apply/Plan.h"
#include "platform/apply/direct/WirelessJoin.h"
#include "platform/base/Outcome.h"

namespace platform::apply {

// The networks that a supplicant knew and would join by itself, by their numbers.
struct KnownNetworks {
    std::vector<int> all;
    std::vector<int> enabled;
    bool isOnOne = false;

    template <class Self, class Fields>
    static void listFields(Self& self, Fields& fields) {
        fields("All", self.all);
        fields("Enabled", self.enabled);
        fields("IsOnOne", self.isOnOne);
    }
};

// Nothing, and success, when no supplicant runs for the interface.
Outcome readKnownNetworks(const std::string& interface, std::optional<KnownNetworks>& networks);

// Begins to join the network; null, and success, when no supplicant runs for the interface. The card may stay
// where it is when it is on a network that was joined before with the same settings. The card leaves every
// other network at once, and the supplicant goes on looking for this one by its name, whatever becomes of the
// object.
Outcome joinBySupplicant(const std::string& interface, const WirelessSettings& settings, bool mayStay,
                         std::unique_ptr<WirelessJoin>& join);

// Removes what was added, and switches on again what was on before. When somebody has chosen another network
// since, it only removes. Success when there is no supplicant, or nothing of ours. `join` then is the way
// back onto a network, null when the card was on none.
Outcome leaveBySupplicant(const std::string& interface, const std::optional<KnownNetworks>& before,
                          std::unique_ptr<WirelessJoin>& join);

}  // namespace platform::apply
