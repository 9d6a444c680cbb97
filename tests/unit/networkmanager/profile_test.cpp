#include <arpa/inet.h>
#include <gtest/gtest.h>

#include "platform/apply/networkmanager/Profile.h"
#include "tests/unit/networkmanager/Verify.h"

namespace platform::apply {
namespace {

using testing_support::verifyProfile;

const std::string canary = "canary-e7c1";

IPv4Address address(const char* text) {
    IPv4Address result = 0;
    EXPECT_EQ(::inet_pton(AF_INET, text, &result), 1);
    return result;
}

InterfacePlan wired() {
    InterfacePlan plan;
    plan.name = "eth0";
    plan.active = true;
    return plan;
}

InterfacePlan wireless(std::optional<std::string> network, std::optional<std::string> key) {
    InterfacePlan plan = wired();
    plan.name = "wlan0";
    plan.method = IPv4Method::dhcp;
    plan.wireless = WirelessSettings{true, std::move(network), std::move(key)};
    return plan;
}

template <class T>
std::optional<T> in(const Sections& profile, const char* section, const char* key) {
    const auto found = profile.find(section);
    return found == profile.end() ? std::nullopt : valueOf<T>(found->second, key);
}

Sections made(const InterfacePlan& plan, const WirelessFacts* facts = nullptr, const ProfileNote& note = {}) {
    Sections profile;
    const Outcome outcome = makeProfile(plan, facts, note, profile);
    EXPECT_TRUE(outcome.ok()) << outcome.reason();
    EXPECT_EQ(verifyProfile(profile), "");
    return profile;
}

TEST(Profile, addresses) {
    InterfacePlan plan = wired();
    EXPECT_EQ(in<std::string>(made(plan), "ipv4", "method"), "disabled");
    plan.method = IPv4Method::manual;
    EXPECT_EQ(in<std::string>(made(plan), "ipv4", "method"), "disabled");

    plan.addresses = {{address("192.0.0.199"), 24}, {address("10.0.0.1"), 32}};
    EXPECT_EQ(in<std::string>(made(plan), "ipv4", "gateway"), std::nullopt);
    plan.router = address("192.0.0.192");
    plan.nameServers = {address("192.0.0.1"), address("192.0.0.2")};
    plan.searchDomains = {"example.com", "example.org"};
    plan.rank = 3;
    Sections profile = made(plan);
    EXPECT_EQ(profile["ipv4"],
              (Dictionary{{"method", {std::string("manual")}},
                          {"may-fail", {false}},
                          {"route-metric", {std::int64_t{4}}},
                          {"address-data",
                           {std::vector<Dictionary>{
                               {{"address", {std::string("192.0.0.199")}}, {"prefix", {std::uint32_t{24}}}},
                               {{"address", {std::string("10.0.0.1")}}, {"prefix", {std::uint32_t{32}}}}}}},
                          {"gateway", {std::string("192.0.0.192")}},
                          {"dns", {std::vector<std::uint32_t>{address("192.0.0.1"), address("192.0.0.2")}}},
                          {"dns-search", {Texts{"example.com", "example.org"}}}}));
    EXPECT_EQ(in<std::string>(profile, "ipv6", "method"), "disabled");

    plan.method = IPv4Method::dhcp;
    plan.dhcpClientID = "mac";  // a word of NetworkManager's, but free text here
    profile = made(plan);
    EXPECT_EQ(in<std::string>(profile, "ipv4", "dhcp-client-id"), "00:6d:61:63");
    EXPECT_EQ(in<std::int32_t>(profile, "ipv4", "dhcp-timeout"), 20);
    EXPECT_EQ(in<bool>(profile, "ipv4", "ignore-auto-dns"), true);
    EXPECT_EQ(in<bool>(profile, "ipv4", "may-fail"), false);
    EXPECT_EQ(in<std::string>(profile, "ipv4", "gateway"), std::nullopt);
}

TEST(Profile, isFoundAgain) {
    EXPECT_EQ(profileUUID("eth0"), profileUUID("eth0"));
    EXPECT_NE(profileUUID("eth0"), profileUUID("eth1"));
    const ProfileNote notes[] = {{"11111111-2222-4333-8444-555555555555", false, true}, {"", true, false}};
    for (const ProfileNote& note : notes) {
        Sections profile = made(wired(), nullptr, note);
        EXPECT_TRUE(isOurs(profile));
        EXPECT_EQ(noteOf(profile), note);
        EXPECT_EQ(in<std::string>(profile, "connection", "uuid"), profileUUID("eth0"));
        EXPECT_EQ(in<std::int32_t>(profile, "connection", "autoconnect-priority"), 999);
        profile.erase("user");
        EXPECT_FALSE(isOurs(profile));
    }
}

TEST(Profile, wirelessSecurity) {
    constexpr AccessPoint open{false, false, false, false, 50};
    constexpr AccessPoint wep{false, true, false, false, 50};
    constexpr AccessPoint wpa{false, true, true, true, 50};
    constexpr AccessPoint enterprise{false, true, true, false, 50};
    constexpr AccessPoint cell{true, false, false, false, 90};
    constexpr AccessPoint wpaCell{true, true, true, true, 90};
    const std::string none;
    const struct {
        const char* what;
        std::vector<AccessPoint> seen;
        bool canAdHoc;
        std::optional<std::string> key;
        const char* mode;      // null: refused
        const char* security;  // key-mgmt; null for none
    } rows[] = {
        {"open", {open}, true, {}, "infrastructure", nullptr},
        {"open, with a key that nobody asks for", {open}, true, canary, "infrastructure", nullptr},
        {"an open cell", {cell}, false, {}, "adhoc", nullptr},
        {"the strongest counts", {open, cell}, false, {}, "adhoc", nullptr},
        {"WEP, 5 characters", {wep}, false, "abcde", "infrastructure", "none"},
        {"WEP, 13 characters", {wep}, false, "abcdefghijklm", "infrastructure", "none"},
        {"WEP, 10 digits", {wep}, false, "0123456789", "infrastructure", "none"},
        {"WEP, 26 digits", {wep}, false, "0123456789abcdefABCDEF0123", "infrastructure", "none"},
        {"WEP, 10 characters that are no digits", {wep}, false, "canary-xyz", nullptr, nullptr},
        {"WEP, 11 characters", {wep}, false, canary, nullptr, nullptr},
        {"WEP, 5 bytes that are no characters", {wep}, false, "caf\xc3\xa9", nullptr, nullptr},
        {"WEP without a key", {wep}, false, {}, nullptr, nullptr},
        {"WPA, 8 characters", {wpa}, false, "abcdefgh", "infrastructure", "wpa-psk"},
        {"WPA, 63 characters", {wpa}, false, std::string(63, 'k'), "infrastructure", "wpa-psk"},
        {"WPA, 64 digits", {wpa}, false, std::string(64, 'a'), "infrastructure", "wpa-psk"},
        {"WPA, a key that looks like WEP's", {wpa}, false, "0123456789", "infrastructure", "wpa-psk"},
        {"WPA, 7 characters", {wpa}, false, "canary7", nullptr, nullptr},
        {"WPA, 64 characters", {wpa}, false, std::string(64, 'k'), nullptr, nullptr},
        {"WPA without a key", {wpa}, false, {}, nullptr, nullptr},
        {"a cell with WPA", {wpaCell}, true, canary, "adhoc", "wpa-psk"},
        {"a name and a password for each user", {enterprise}, false, canary, nullptr, nullptr},
        {"unseen, the card can be a cell", {}, true, {}, "adhoc", nullptr},
        {"unseen, the card cannot", {}, false, {}, "infrastructure", nullptr},
        {"unseen, WEP by its form", {}, false, "0123456789", "infrastructure", "none"},
        {"unseen, WPA by its form", {}, false, canary, "infrastructure", "wpa-psk"},
        {"unseen, a key of no form", {}, false, "canary7", nullptr, nullptr},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.what);
        const WirelessFacts facts{row.canAdHoc, row.seen, {}};
        Sections profile;
        const InterfacePlan plan = wireless("printer \xf0\x9f\x96\xa8", row.key);
        const Outcome outcome = makeProfile(plan, &facts, {}, profile);
        EXPECT_EQ(outcome.ok(), row.mode != nullptr) << outcome.reason();
        if (row.mode == nullptr || !outcome.ok()) {
            EXPECT_EQ(outcome.status(), kSCStatusFailed);
            EXPECT_TRUE(!row.key || outcome.reason().find(*row.key) == std::string::npos);
            continue;
        }
        EXPECT_EQ(verifyProfile(profile), "");
        EXPECT_EQ(networkOf(profile), *plan.wireless->network);
        EXPECT_EQ(in<std::string>(profile, "802-11-wireless", "mode"), row.mode);
        EXPECT_EQ(in<std::string>(profile, "802-11-wireless-security", "key-mgmt").value_or(""),
                  row.security == nullptr ? "" : row.security);
        const bool hidden = in<bool>(profile, "802-11-wireless", "hidden").value_or(false);
        EXPECT_EQ(hidden, row.seen.empty() && !row.canAdHoc);
    }
}

TEST(Profile, networkNames) {
    for (const std::string& name : {std::string("x"), std::string(32, 'x'), std::string("a\"b<&>'"),
                                    std::string("\x01\x02"), std::string("\xf0\x9f\x96\xa8")}) {
        const WirelessFacts facts;
        EXPECT_EQ(networkOf(made(wireless(name, {}), &facts)), name);
    }
}

TEST(Profile, keepsTheNetworkOfTheCard) {
    const Sections home = {
        {"802-11-wireless",
         {{"ssid", {Bytes{'h', 'o', 'm', 'e'}}},
          {"hidden", {true}},
          {"seen-bssids", {Texts{"00:11:22:33:44:55"}}}}},
        {"802-11-wireless-security",
         {{"key-mgmt", {std::string("wpa-psk")}}, {"psk", {canary}}, {"psk-flags", {std::uint32_t{1}}}}},
        {"connection", {{"id", {std::string("Home")}}}},
        {"ipv4", {{"method", {std::string("auto")}}}},
    };
    WirelessFacts facts;
    facts.current = wirelessSections(home);
    InterfacePlan plan = wireless({}, {});
    plan.method = IPv4Method::manual;
    plan.addresses = {{address("192.0.0.199"), 24}};
    for (const char* named : {"", "home"}) {
        if (*named != '\0') {
            plan.wireless->network = named;
        }
        const Sections profile = made(plan, &facts);
        EXPECT_EQ(networkOf(profile), "home");
        EXPECT_EQ(in<std::string>(profile, "802-11-wireless-security", "psk"), canary);
        EXPECT_EQ(in<std::uint32_t>(profile, "802-11-wireless-security", "psk-flags"), std::nullopt);
        EXPECT_EQ(in<bool>(profile, "802-11-wireless", "hidden"), true);
        EXPECT_EQ(in<Texts>(profile, "802-11-wireless", "seen-bssids"), std::nullopt);
        EXPECT_EQ(in<std::string>(profile, "connection", "id"), "location-assistant wlan0");
        EXPECT_EQ(in<std::string>(profile, "ipv4", "method"), "manual");
    }
    plan.wireless->network = "home";
    plan.wireless->key = "another key";
    EXPECT_EQ(in<std::string>(made(plan, &facts), "802-11-wireless-security", "psk"), "another key");

    facts.current.clear();
    Sections profile;
    EXPECT_EQ(makeProfile(wireless({}, {}), &facts, {}, profile).status(), kSCStatusFailed);
}

}  // namespace
}  // namespace platform::apply
