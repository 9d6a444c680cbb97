// Wireless networks that the kernel joins by itself, for a card without a supplicant: open and WEP ones.
//
// No network is ever formed, and the regulatory domain is left alone.
#pragma once

#include <chrono>
#include <memory>
#include <optional>
#include <span>
#include <string>

#include "platform/apply/Plan.h"
#include "platform/apply/direct/WirelessCard.h"
#include "platform/apply/direct/WirelessJoin.h"
#include "platform/apply/direct/WirelessMessages.h"
#include "platform/base/Outcome.h"

namespace platform::apply {

// Nothing, and success, for what is no wireless card, and for one that is gone.
Outcome readWirelessState(const std::string& interface, std::optional<WirelessState>& state);

// Begins to join the network; null, and success, when it is no wireless card. The card leaves the network
// that it is on at once, unless it mayStay and has that name, and the object looks for the one named until it
// is heard, however often that takes; nobody looks any more when the object has ended. The link is to be up.
// Addresses and routes may stand before: changing between access points and ad-hoc cells takes the link down
// for a moment, and they are made again behind it.
Outcome joinByKernel(const std::string& interface, const WirelessSettings& settings, bool mayStay,
                     std::unique_ptr<WirelessJoin>& join);

// Leaves what the card is on, and makes it of the type that it was. `join` then is the way back onto the
// network that it was on, null when there was none or it is on it. One with a key is given up: only whoever
// had the key can join it again. Success without a change when it is no wireless card.
Outcome leaveByKernel(const std::string& interface, const std::optional<WirelessState>& before,
                      std::unique_ptr<WirelessJoin>& join);

// Of the entries of a scan the one to join: of that name, heard no longer ago than `age`, open without a key,
// WEP with one that fits; the strongest. Without one, the reason tells why; isHopeless when one of that name
// is there and only another key or a supplicant could help. The reason holds no key.
struct EntryChoice {
    std::optional<ScanEntry> entry;
    bool isHopeless = false;
    std::string reason;
};
[[nodiscard]] EntryChoice chooseEntry(std::span<const ScanEntry> entries, const std::string& network,
                                      const std::optional<std::string>& key, std::chrono::milliseconds age);

}  // namespace platform::apply
