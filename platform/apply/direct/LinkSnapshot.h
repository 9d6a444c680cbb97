// How an interface was before the direct agent first changed it, as the record keeps it, and the notes that
// the agent keeps about what it made.
#pragma once

#include <cstdint>
#include <optional>
#include <vector>

#include "platform/apply/Plan.h"
#include "platform/apply/direct/Addressing.h"
#include "platform/apply/direct/OtherDaemons.h"
#include "platform/apply/direct/Supplicant.h"
#include "platform/apply/direct/WirelessCard.h"
#include "platform/values/Fields.h"

namespace platform::apply {

struct LinkSnapshot {
    bool up = false;
    std::optional<bool> ipv6Disabled;  // nothing when the kernel has no IPv6
    InterfaceState state;
    std::optional<KnownNetworks> networks;  // nothing when no wireless supplicant ran
    std::optional<WirelessState> wireless;  // of a wireless card without one
    std::optional<bool> radioOff;           // nothing when it has no radio that can be switched
    OtherDaemons others;
    std::int64_t takenAt = 0;  // seconds since the machine's start, sleep included

    // Whether it had an IPv4 address that somebody else led, and whether its lease has ended since.
    [[nodiscard]] bool hasLedAddress() const;
    [[nodiscard]] bool hasLeaseEnded() const;

    template <class Self, class Fields>
    static void listFields(Self& self, Fields& fields) {
        fields("Up", self.up);
        fields("IPv6Disabled", self.ipv6Disabled);
        fields("Addresses", self.state.addresses);
        fields("Routes", self.state.routes);
        fields("Networks", self.networks);
        fields("Wireless", self.wireless);
        fields("RadioOff", self.radioOff);
        fields("Others", self.others);
        fields("TakenAt", self.takenAt);
    }
};

// A network that was joined, told from another, or from the same with another key, without keeping the key.
struct JoinedNetwork {
    Salt salt{};
    std::uint32_t check = 0;

    template <class Self, class Fields>
    static void listFields(Self& self, Fields& fields) {
        fields("Salt", self.salt);
        fields("Check", self.check);
    }
};
[[nodiscard]] JoinedNetwork makeJoinedNetwork(const WirelessSettings& settings);
[[nodiscard]] bool isSameNetwork(const JoinedNetwork& joined, const WirelessSettings& settings);

// What the direct agent has done with an interface; no notes means nothing that would have to be undone. They
// are on disk before the first change and are removed behind the last one of the way back.
struct AppliedLink {
    enum class Phase { applying, applied, restoring, last = restoring };
    Phase phase = Phase::applying;
    bool off = false;                // the interface was switched off
    std::vector<Address> addresses;  // what it was given, other than by a lease
    std::optional<JoinedNetwork> joined;

    template <class Self, class Fields>
    static void listFields(Self& self, Fields& fields) {
        fields("Phase", self.phase);
        fields("Off", self.off);
        fields("Addresses", self.addresses);
        fields("Joined", self.joined);
    }
};

}  // namespace platform::apply
