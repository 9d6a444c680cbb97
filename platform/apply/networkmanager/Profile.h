// The temporary profile for one interface: what NetworkManager is told to do, as a pure function of the plan
// and of what the card sees.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "platform/apply/Plan.h"
#include "platform/apply/WirelessChoice.h"
#include "platform/bus/Value.h"

namespace platform::apply {

using bus::ByteArray;
using bus::Dictionary;
using bus::Sections;
using bus::TextMap;
using bus::Texts;
using bus::Value;
using bus::valueOf;

// What was there before the profile, kept in the profile itself too: whoever finds the profile finds the way
// back.
struct ProfileSnapshot {
    std::string uuid;  // the UUID of the profile that was active; empty for none
    bool autoconnect = true;
    bool radio = true;
    bool operator==(const ProfileSnapshot&) const = default;
};

// The wireless link of a profile.
struct WirelessLink {
    // How the plan's network is joined; nothing keeps the link of `current`.
    std::optional<JoinChoice> choice;
    // The sections about the wireless link of the profile that the card is on, with their secrets; empty when
    // it is on none.
    Sections current;
};

// The same for the same interface, always.
[[nodiscard]] std::string profileUUID(const std::string& interface);
// Decides what is ours: a name or an UUID can be anybody's.
[[nodiscard]] bool isOurs(const Sections& profile);
// What one of our profiles keeps of the time before.
[[nodiscard]] ProfileSnapshot snapshotIn(const Sections& profile);
// The sections about the wireless link, without what the daemon only remembers.
[[nodiscard]] Sections wirelessSections(const Sections& profile);
// The bytes of the network's name in a profile; empty when it has none.
[[nodiscard]] std::string networkOf(const Sections& profile);

// The profile for an active interface; link is null for a wired card.
[[nodiscard]] Sections makeProfile(const InterfacePlan& plan, const WirelessLink* link,
                                   const ProfileSnapshot& before);

}  // namespace platform::apply
