// How an interface was before the direct agent first changed it, as the record keeps it, and the notes that
// the agent keeps about what it made.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "platform/CoreFoundation.h"
#include "platform/Outcome.h"
#include "platform/apply/Plan.h"
#include "platform/apply/direct/Kernel.h"
#include "platform/apply/direct/Supplicant.h"
#include "platform/values/Object.h"

namespace platform::apply {

struct Snapshot {
    bool up = false;
    std::optional<bool> ipv6Disabled;  // nothing when the kernel has no IPv6
    InterfaceState state;
    std::optional<KnownNetworks> networks;  // nothing when no wireless supplicant ran
    std::int64_t takenAt = 0;               // seconds since the machine's start, sleep included
};

[[nodiscard]] values::Owned<CFDictionaryRef> encodeSnapshot(const Snapshot& snapshot);
[[nodiscard]] std::optional<Snapshot> decodeSnapshot(CFDictionaryRef dictionary);

// The IPv6 switch of an interface.
[[nodiscard]] std::optional<bool> isIPv6Disabled(const std::string& interface);
Outcome disableIPv6(const std::string& interface, bool disabled);

// A network that was joined, told from another, or from the same with another key, without keeping the key.
struct JoinedNetwork {
    Salt salt{};
    std::uint32_t check = 0;
};
[[nodiscard]] JoinedNetwork makeJoinedNetwork(const WirelessSettings& settings);
[[nodiscard]] bool isSameNetwork(const JoinedNetwork& joined, const WirelessSettings& settings);

// What the direct agent has done with an interface; no notes means nothing that would have to be undone. They
// are on disk before the first change and are removed behind the last one of the way back.
struct Notes {
    enum class Phase { going, made, returning };
    Phase phase = Phase::going;
    bool off = false;                // the interface was switched off
    std::vector<Address> addresses;  // what it was given, other than by a lease
    std::optional<JoinedNetwork> joined;
};

Outcome readNotes(const std::string& interface, std::optional<Notes>& notes);
Outcome writeNotes(const std::string& interface, const Notes& notes);
Outcome removeNotes(const std::string& interface);

}  // namespace platform::apply
