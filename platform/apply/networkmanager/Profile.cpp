#include "platform/apply/networkmanager/Profile.h"

#include <arpa/inet.h>

#include <algorithm>
#include <array>
#include <cstdio>
#include <limits>

#include "platform/apply/Digest.h"

namespace platform::apply {
namespace {

constexpr const char* tagKey = "location-assistant.interface";
constexpr const char* earlierKey = "location-assistant.earlier";
constexpr const char* autoconnectKey = "location-assistant.autoconnect";
constexpr const char* radioKey = "location-assistant.radio";
constexpr const char* none = "none";

// Without an end: whoever waits has a bound of its own, and the server may come later.
constexpr std::int32_t dhcpSeconds = std::numeric_limits<std::int32_t>::max();
// Higher than a person's: the largest there is.
constexpr std::int32_t highestPriority = 999;

constexpr std::array<const char*, 3> wirelessSectionNames = {"802-11-wireless", "802-11-wireless-security",
                                                             "802-1x"};

std::string dotted(IPv4Address address) {
    std::array<char, INET_ADDRSTRLEN> text{};
    ::inet_ntop(AF_INET, &address, text.data(), text.size());
    return text.data();
}

// As the octets of type 0, which stands for free text: the plain form has words with a meaning of their own.
std::string clientIDOctets(const std::string& clientID) {
    std::string octets = "00";
    for (const char c : clientID) {
        std::array<char, 4> octet{};
        std::snprintf(octet.data(), octet.size(), ":%02x",
                      static_cast<unsigned>(static_cast<unsigned char>(c)));
        octets += octet.data();
    }
    return octets;
}

// Below every metric that the daemon gives by itself.
std::int64_t metricOf(const InterfacePlan& plan) {
    return std::int64_t{plan.rank} + 1;
}

Dictionary makeIPv4(const InterfacePlan& plan) {
    const bool manual = plan.method == IPv4Method::manual && !plan.addresses.empty();
    if (!manual && plan.method != IPv4Method::dhcp) {
        return {{"method", {std::string("disabled")}}, {"route-metric", {metricOf(plan)}}};
    }
    Dictionary ipv4 = {{"method", {std::string(manual ? "manual" : "auto")}},
                       {"may-fail", {false}},
                       {"route-metric", {metricOf(plan)}}};
    if (manual) {
        std::vector<Dictionary> addresses;
        for (const ManualAddress& address : plan.addresses) {
            addresses.push_back(
                {{"address", {dotted(address.address)}}, {"prefix", {std::uint32_t{address.prefixLength}}}});
        }
        ipv4["address-data"] = {std::move(addresses)};
        if (plan.router != 0) {
            ipv4["gateway"] = {dotted(plan.router)};
        }
    } else {
        ipv4["dhcp-timeout"] = {dhcpSeconds};
        if (!plan.dhcpClientID.empty()) {
            ipv4["dhcp-client-id"] = {clientIDOctets(plan.dhcpClientID)};
        }
    }
    if (!plan.nameServers.empty()) {
        ipv4["dns"] = {std::vector<std::uint32_t>(plan.nameServers.begin(), plan.nameServers.end())};
        if (!manual) {
            ipv4["ignore-auto-dns"] = {true};
        }
    }
    if (!plan.searchDomains.empty()) {
        ipv4["dns-search"] = {plan.searchDomains};
    }
    return ipv4;
}

// A secret from the desktop's key ring is looked for there again under the new profile, which it does not
// know, unless the profile is said to hold it.
void keepSecretsInside(Dictionary& section) {
    static constexpr std::string_view flags = "-flags";
    std::erase_if(section, [&section](const auto& entry) {
        const std::string_view key = entry.first;
        if (!key.ends_with(flags)) {
            return false;
        }
        const std::string_view secret = key.substr(0, key.size() - flags.size());
        return std::any_of(section.begin(), section.end(), [secret](const auto& other) {
            return other.first.starts_with(secret) && !std::string_view(other.first).ends_with(flags);
        });
    });
}

void setWireless(const WirelessSettings& settings, const WirelessLink& link, Sections& profile) {
    if (!link.choice) {
        for (const auto& [name, section] : link.current) {
            keepSecretsInside(profile[name] = section);
        }
        return;
    }
    const JoinChoice& choice = *link.choice;
    const std::string network = settings.network.value_or("");
    Dictionary wireless = {{"ssid", {ByteArray(network.begin(), network.end())}},
                           {"mode", {std::string(choice.isAdHoc ? "adhoc" : "infrastructure")}}};
    if (!choice.isHeard) {
        // It may be one that does not announce its name and has to be asked for.
        wireless["hidden"] = {true};
    }
    profile["802-11-wireless"] = std::move(wireless);
    const std::string key = settings.key.value_or("");
    switch (choice.security) {
        case Security::wep:
            profile["802-11-wireless-security"] = {{"key-mgmt", {std::string("none")}},
                                                   {"wep-key-type", {std::uint32_t{1}}},
                                                   {"wep-key0", {key}}};
            break;
        case Security::wpa:
            profile["802-11-wireless-security"] = {{"key-mgmt", {std::string("wpa-psk")}}, {"psk", {key}}};
            if (choice.isAdHoc) {
                // All that a network without an access point can agree on.
                profile["802-11-wireless-security"].insert(
                    {{"proto", {Texts{"rsn"}}}, {"pairwise", {Texts{"ccmp"}}}, {"group", {Texts{"ccmp"}}}});
            }
            break;
        case Security::sae:
            profile["802-11-wireless-security"] = {{"key-mgmt", {std::string("sae")}}, {"psk", {key}}};
            break;
        case Security::open:
        case Security::enterprise:
            break;
    }
}

Dictionary sectionIn(const Sections& profile, const char* name) {
    const auto found = profile.find(name);
    return found == profile.end() ? Dictionary() : found->second;
}

TextMap userData(const Sections& profile) {
    return valueOf<TextMap>(sectionIn(profile, "user"), "data").value_or(TextMap());
}

}  // namespace

std::string profileUUID(const std::string& interface) {
    // Two fixed keys, drawn once, are the name space.
    static constexpr std::array<std::uint8_t, 16> high = {0x8e, 0x1f, 0x5c, 0x73, 0x0a, 0xd2, 0x44, 0x9b,
                                                          0xb6, 0x31, 0xe7, 0x90, 0x2d, 0x6f, 0x58, 0xc4};
    static constexpr std::array<std::uint8_t, 16> low = {0x35, 0xa9, 0x0e, 0x62, 0xf1, 0x87, 0x4d, 0xcb,
                                                         0x13, 0x7c, 0xd8, 0x56, 0x9f, 0x20, 0xe4, 0xbd};
    const std::uint64_t first = sipHash(high, interface);
    const std::uint64_t second = sipHash(low, interface);
    std::array<char, 37> text{};
    // Version 8, made in a way of its own, and the usual variant.
    std::snprintf(text.data(), text.size(), "%08x-%04x-8%03x-%04x-%012llx",
                  static_cast<unsigned>(first >> 32U), static_cast<unsigned>((first >> 16U) & 0xFFFFU),
                  static_cast<unsigned>(first & 0xFFFU),
                  static_cast<unsigned>(0x8000U | ((second >> 48U) & 0x3FFFU)),
                  static_cast<unsigned long long>(second & 0xFFFFFFFFFFFFU));
    return text.data();
}

bool isOurs(const Sections& profile) {
    return userData(profile).contains(tagKey);
}

ProfileSnapshot snapshotIn(const Sections& profile) {
    TextMap data = userData(profile);
    const std::string earlier = data[earlierKey];
    return {earlier == none ? "" : earlier, data[autoconnectKey] != "no", data[radioKey] != "no"};
}

Sections wirelessSections(const Sections& profile) {
    Sections wireless;
    for (const char* const name : wirelessSectionNames) {
        if (const auto found = profile.find(name); found != profile.end()) {
            wireless.insert(*found);
        }
    }
    if (const auto found = wireless.find("802-11-wireless"); found != wireless.end()) {
        found->second.erase("seen-bssids");
    }
    return wireless;
}

std::string networkOf(const Sections& profile) {
    const auto ssid = valueOf<ByteArray>(sectionIn(profile, "802-11-wireless"), "ssid").value_or(ByteArray());
    return {ssid.begin(), ssid.end()};
}

Sections makeProfile(const InterfacePlan& plan, const WirelessLink* link, const ProfileSnapshot& before) {
    Sections profile;
    if (link != nullptr) {
        setWireless(plan.wireless.value_or(WirelessSettings()), *link, profile);
    } else {
        profile["802-3-ethernet"] = {};
    }
    profile["connection"] = {{"id", {"location-assistant " + plan.name}},
                             {"uuid", {profileUUID(plan.name)}},
                             {"type", {std::string(link != nullptr ? "802-11-wireless" : "802-3-ethernet")}},
                             {"interface-name", {plan.name}},
                             {"autoconnect", {true}},
                             {"autoconnect-priority", {highestPriority}},
                             // For ever: after a few failures the daemon would turn to another profile.
                             {"autoconnect-retries", {std::int32_t{0}}}};
    profile["ipv4"] = makeIPv4(plan);
    // A metric for what is off: without one the daemon keeps a number of its own for the card, and the
    // profiles before would come back with other numbers than they had.
    profile["ipv6"] = {{"method", {std::string("disabled")}}, {"route-metric", {metricOf(plan)}}};
    profile["user"] = {{"data",
                        {TextMap{{tagKey, plan.name},
                                 {earlierKey, before.uuid.empty() ? none : before.uuid},
                                 {autoconnectKey, before.autoconnect ? "yes" : "no"},
                                 {radioKey, before.radio ? "yes" : "no"}}}}};
    return profile;
}

}  // namespace platform::apply
