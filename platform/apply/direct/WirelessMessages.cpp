#include "platform/apply/direct/WirelessMessages.h"

#include <linux/nl80211.h>

#include <algorithm>
#include <charconv>

namespace platform::apply {
namespace {

using netlink::Attributes;
using netlink::Bytes;
using netlink::ByteView;
using netlink::Message;

// IEEE 802.11: bits of the capability field, elements of a beacon, cipher suites.
constexpr std::uint16_t capabilityAdHoc = 0x0002;
constexpr std::uint16_t capabilityPrivacy = 0x0010;
constexpr std::byte elementName{0};
constexpr std::byte elementRSN{48};
constexpr std::byte elementVendor{221};
constexpr std::array<std::byte, 4> vendorWPA{std::byte{0x00}, std::byte{0x50}, std::byte{0xF2},
                                             std::byte{0x01}};
constexpr std::uint32_t cipherWEP40 = 0x000FAC01;
constexpr std::uint32_t cipherWEP104 = 0x000FAC05;
constexpr std::size_t shortWEPKey = 5;

// The key-management suites of an RSN or WPA element: version, group cipher, a list of pairwise ciphers, and
// the list that is wanted; each suite has four bytes, each list a little-endian count of two before it.
unsigned keyManagementIn(ByteView element) {
    constexpr std::size_t suite = 4;
    const auto countAt = [&element](std::size_t offset) {
        return offset + 2 > element.size() ? std::size_t{0}
                                           : std::to_integer<std::size_t>(element[offset]) +
                                                 (std::to_integer<std::size_t>(element[offset + 1]) << 8U);
    };
    const std::size_t pairwise = 2 + suite;
    const std::size_t wanted = pairwise + 2 + countAt(pairwise) * suite;
    unsigned kinds = 0;
    std::size_t offset = wanted + 2;
    for (std::size_t left = countAt(wanted); left > 0 && offset + suite <= element.size(); --left) {
        switch (std::to_integer<unsigned>(element[offset + 3])) {
            case 1:  // 802.1X
            case 5:  // the same with SHA-256
                kinds |= management8021X;
                break;
            case 2:  // PSK
            case 6:  // the same with SHA-256
                kinds |= managementPSK;
                break;
            case 8:  // SAE
                kinds |= managementSAE;
                break;
            default:
                break;
        }
        offset += suite;
    }
    return kinds;
}

// Elements: a byte of identity, a byte of length, and so many bytes.
void readElements(ByteView elements, ScanEntry& network) {
    while (elements.size() >= 2) {
        const auto size = std::to_integer<std::size_t>(elements[1]);
        if (size + 2 > elements.size()) {
            return;
        }
        ByteView content = elements.subspan(2, size);
        const bool isWPA = elements[0] == elementVendor && content.size() >= vendorWPA.size() &&
                           std::equal(vendorWPA.begin(), vendorWPA.end(), content.begin());
        if (elements[0] == elementName) {
            network.network.assign(reinterpret_cast<const char*>(content.data()), content.size());
        } else if (elements[0] == elementRSN || isWPA) {
            network.security = Security::wpa;
            network.keyManagement |= keyManagementIn(isWPA ? content.subspan(vendorWPA.size()) : content);
        }
        elements = elements.subspan(2 + size);
    }
}

Bytes keyBytes(const std::string& key) {
    Bytes bytes;
    if (!isInDigits(key)) {
        const auto view = std::as_bytes(std::span(key));
        return {view.begin(), view.end()};
    }
    for (std::size_t i = 0; i + 1 < key.size(); i += 2) {
        std::uint8_t byte = 0;
        std::from_chars(key.data() + i, key.data() + i + 2, byte, 16);
        bytes.push_back(std::byte{byte});
    }
    return bytes;
}

ByteView viewOf(const std::string& text) {
    return std::as_bytes(std::span(text));
}

}  // namespace

std::optional<ScanEntry> decodeScanEntry(const Message& message) {
    const auto entry = message.attributes<genlmsghdr>().find(NL80211_ATTR_BSS);
    if (!entry) {
        return std::nullopt;
    }
    const Attributes parts = entry->nested();
    const auto bssid = parts.find(NL80211_BSS_BSSID);
    ScanEntry network;
    if (!bssid || bssid->payload.size() != network.bssid.size()) {
        return std::nullopt;
    }
    std::copy(bssid->payload.begin(), bssid->payload.end(), network.bssid.begin());
    network.frequency = parts.u32(NL80211_BSS_FREQUENCY).value_or(0);
    network.signal = static_cast<int>(parts.u32(NL80211_BSS_SIGNAL_MBM).value_or(0));
    network.age = std::chrono::milliseconds(parts.u32(NL80211_BSS_SEEN_MS_AGO).value_or(0));
    constexpr std::uint32_t notJoined = NL80211_BSS_STATUS_AUTHENTICATED;
    network.isCurrent = parts.u32(NL80211_BSS_STATUS).value_or(notJoined) != notJoined;
    if (const auto capability = parts.find(NL80211_BSS_CAPABILITY)) {
        const unsigned bits = capability->as<std::uint16_t>().value_or(0);
        network.isAdHoc = (bits & capabilityAdHoc) != 0;
        network.security = (bits & capabilityPrivacy) != 0 ? Security::wep : Security::open;
    }
    if (const auto elements = parts.find(NL80211_BSS_INFORMATION_ELEMENTS)) {
        readElements(elements->payload, network);
    }
    // One that hides its name may send as many NULs in its place.
    if (network.network.find_first_not_of('\0') == std::string::npos) {
        network.network.clear();
    }
    return network;
}

std::optional<WirelessNotice> decodeNotice(const Message& message, int index) {
    const auto header = message.family<genlmsghdr>();
    const Attributes attributes = message.attributes<genlmsghdr>();
    if (!header || attributes.u32(NL80211_ATTR_IFINDEX) != static_cast<std::uint32_t>(index)) {
        return std::nullopt;
    }
    WirelessNotice notice;
    switch (header->cmd) {
        case NL80211_CMD_NEW_SCAN_RESULTS:
        case NL80211_CMD_SCAN_ABORTED:
            notice.isScanEnd = true;
            return notice;
        case NL80211_CMD_CONNECT: {
            const auto status = attributes.find(NL80211_ATTR_STATUS_CODE);
            notice.joinStatus = status && !attributes.find(NL80211_ATTR_TIMED_OUT)
                                    ? status->as<std::uint16_t>().value_or(WirelessNotice::noAnswer)
                                    : WirelessNotice::noAnswer;
            return notice;
        }
        default:
            return std::nullopt;
    }
}

Message makeRequest(const netlink::GenericFamily& family, int index, std::uint8_t command,
                    std::uint16_t flags) {
    Message message = family.request(command, flags);
    message.addValue(NL80211_ATTR_IFINDEX, index);
    return message;
}

Message makeJoinRequest(const netlink::GenericFamily& family, int index, const ScanEntry& network,
                        const std::optional<std::string>& key) {
    Message message =
        makeRequest(family, index, network.isAdHoc ? NL80211_CMD_JOIN_IBSS : NL80211_CMD_CONNECT);
    message.add(NL80211_ATTR_SSID, viewOf(network.network))
        .add(NL80211_ATTR_MAC, network.bssid)
        .addValue(NL80211_ATTR_WIPHY_FREQ, network.frequency);
    if (network.isAdHoc) {
        message.add(NL80211_ATTR_FREQ_FIXED, {});
    }
    if (key) {
        message.add(NL80211_ATTR_PRIVACY, {});
        // Without an authentication type the kernel tries the open one, then the one by shared key.
        message.addNested(NL80211_ATTR_KEYS, [&key](Message& keys) {
            keys.addNested(1, [&key](Message& parts) {
                const Bytes bytes = keyBytes(*key);
                parts.add(NL80211_KEY_DATA, bytes)
                    .addValue(NL80211_KEY_CIPHER, bytes.size() == shortWEPKey ? cipherWEP40 : cipherWEP104)
                    .addValue(NL80211_KEY_IDX, std::uint8_t{0})
                    .add(NL80211_KEY_DEFAULT, {});
            });
        });
    }
    return message;
}

}  // namespace platform::apply
