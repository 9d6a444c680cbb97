// The kernel's messages about wireless cards (nl80211), apart from the socket.
#pragma once

#include <array>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>

#include "platform/apply/WirelessChoice.h"
#include "platform/netlink/Generic.h"
#include "platform/netlink/Message.h"

namespace platform::apply {

// What a protected network lets a station prove itself by, as a set of bits.
enum KeyManagement : unsigned { managementPSK = 1, managementSAE = 2, management8021X = 4 };

// An access point or an ad-hoc cell, as a scan found it.
struct ScanEntry {
    std::string network;  // the bytes of its SSID; empty for one that hides it
    std::array<std::byte, 6> bssid{};
    std::uint32_t frequency = 0;      // MHz
    int signal = 0;                   // hundredths of a dBm
    std::chrono::milliseconds age{};  // since it was last heard
    bool isAdHoc = false;
    bool isCurrent = false;  // the card is on it
    Security security = Security::open;
    unsigned keyManagement = 0;  // of Security::wpa; 0 when it offers nothing that is known here
};
// Nothing when the message describes none.
[[nodiscard]] std::optional<ScanEntry> decodeScanEntry(const netlink::Message& message);

// What a notice means for the interface of that index; nothing for another one, or another notice.
struct WirelessNotice {
    bool isScanEnd = false;
    // What the access point answered to a request to join (IEEE 802.11's status codes), 0 for yes; nothing in
    // a notice of another kind. noAnswer when there was none.
    std::optional<std::uint16_t> joinStatus;
    static constexpr std::uint16_t noAnswer = 0xFFFF;
};
[[nodiscard]] std::optional<WirelessNotice> decodeNotice(const netlink::Message& message, int index);

// A request about the interface of that index. The kernel acknowledges it; what follows from it comes by
// notice.
[[nodiscard]] netlink::Message makeRequest(const netlink::GenericFamily& family, int index,
                                           std::uint8_t command, std::uint16_t flags = NLM_F_ACK);
// To join the network. The key is one that fits WEP; none joins an open network.
[[nodiscard]] netlink::Message makeJoinRequest(const netlink::GenericFamily& family, int index,
                                               const ScanEntry& network,
                                               const std::optional<std::string>& key);

}  // namespace platform::apply
