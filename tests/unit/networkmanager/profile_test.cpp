#include <arpa/inet.h>
#include <gtest/gtest.h>

#include <limits>

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

Sections made(const InterfacePlan& plan, const WirelessLink* link = nullptr, const ProfileNote& note = {}) {
    Sections profile = makeProfile(plan, link, note);
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
    EXPECT_EQ(in<std::int32_t>(profile, "ipv4", "dhcp-timeout"), std::numeric_limits<std::int32_t>::max());
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

// What is joined of what is on the air, and as what the daemon is told to join it.
TEST(Profile, joinsByTheKeyAndByWhatIsOnTheAir) {
    const HeardNetwork open{false, Security::open, 50};
    const HeardNetwork wep{false, Security::wep, 90};
    const HeardNetwork wpa{false, Security::wpa, 50};
    const HeardNetwork sae{false, Security::sae, 50};
    const HeardNetwork enterprise{false, Security::enterprise, 50};
    const HeardNetwork cell{true, Security::open, 90, 2462};
    const HeardNetwork oldCell{true, Security::open, 90, 2462, "", oldestCell + std::chrono::seconds(1)};
    const HeardNetwork wpaCell{true, Security::wpa, 90, 2462};
    const char* const adHoc = "adhoc";
    const char* const point = "infrastructure";
    const struct {
        const char* what;
        std::vector<HeardNetwork> heard;
        std::optional<std::string> key;
        const char* mode;      // null: nothing is joined
        const char* security;  // key-mgmt; null for none
        bool hidden = false;
    } rows[] = {
        {"open", {open}, {}, point, nullptr},
        {"an open cell", {cell}, {}, adHoc, nullptr},
        {"the strongest counts", {open, cell}, {}, adHoc, nullptr},
        {"a cell of long ago is not formed anew", {oldCell}, {}, point, nullptr, true},
        {"WEP, 5 characters", {wep}, "abcde", point, "none"},
        {"WEP, 13 characters", {wep}, "abcdefghijklm", point, "none"},
        {"WEP, 10 digits", {wep}, "0123456789", point, "none"},
        {"WEP, 26 digits", {wep}, "0123456789abcdefABCDEF0123", point, "none"},
        {"WEP, 10 characters that are no digits", {wep}, "canary-xyz", nullptr, nullptr},
        {"WEP, 5 bytes that are no characters", {wep}, "caf\xc3\xa9", nullptr, nullptr},
        {"WEP without a key", {wep}, {}, nullptr, nullptr},
        {"WPA, 8 characters", {wpa}, "abcdefgh", point, "wpa-psk"},
        {"WPA, 63 characters", {wpa}, std::string(63, 'k'), point, "wpa-psk"},
        {"WPA, 64 digits", {wpa}, std::string(64, 'a'), point, "wpa-psk"},
        {"WPA, a key that looks like WEP's", {wpa}, "0123456789", point, "wpa-psk"},
        {"WPA, 7 characters", {wpa}, "canary7", nullptr, nullptr},
        {"WPA, 64 characters", {wpa}, std::string(64, 'k'), nullptr, nullptr},
        {"WPA3", {sae}, canary, point, "sae"},
        {"a cell with WPA", {wpaCell}, canary, adHoc, "wpa-psk"},
        {"a name and a password for each user", {enterprise}, canary, nullptr, nullptr},
        {"the key is not given up for an open network of the name", {open}, canary, point, "wpa-psk", true},
        {"nor for the stronger WEP network", {wep, wpa}, "abcdefghijklm", point, "wpa-psk"},
        {"nothing on the air", {}, {}, point, nullptr, true},
        {"nothing on the air, a key of WEP's form alone", {}, "abcde", point, "none", true},
        {"nothing on the air, a key of both forms", {}, "abcdefghijklm", point, "wpa-psk", true},
        {"nothing on the air, a key of no form", {}, "canary7", nullptr, nullptr},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.what);
        const JoinDecision decision = chooseNetwork(row.heard, row.key);
        EXPECT_TRUE(!row.key || decision.reason.find(*row.key) == std::string::npos);
        ASSERT_EQ(decision.choice.has_value(), row.mode != nullptr) << decision.reason;
        if (row.mode == nullptr) {
            EXPECT_NE(decision.reason, "");
            continue;
        }
        const WirelessLink link{decision.choice, {}};
        const InterfacePlan plan = wireless("printer \xf0\x9f\x96\xa8", row.key);
        const Sections profile = made(plan, &link);
        EXPECT_EQ(networkOf(profile), *plan.wireless->network);
        EXPECT_EQ(in<std::string>(profile, "802-11-wireless", "mode"), row.mode);
        EXPECT_EQ(in<std::string>(profile, "802-11-wireless-security", "key-mgmt").value_or(""),
                  row.security == nullptr ? "" : row.security);
        EXPECT_EQ(in<bool>(profile, "802-11-wireless", "hidden").value_or(false), row.hidden);
    }
}

TEST(Profile, networkNames) {
    for (const std::string& name : {std::string("x"), std::string(32, 'x'), std::string("a\"b<&>'"),
                                    std::string("\x01\x02"), std::string("\xf0\x9f\x96\xa8")}) {
        const WirelessLink link{JoinChoice(), {}};
        EXPECT_EQ(networkOf(made(wireless(name, {}), &link)), name);
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
    WirelessLink link{{}, wirelessSections(home)};
    InterfacePlan plan = wireless({}, {});
    plan.method = IPv4Method::manual;
    plan.addresses = {{address("192.0.0.199"), 24}};
    for (const char* named : {"", "home"}) {
        if (*named != '\0') {
            plan.wireless->network = named;
        }
        const Sections profile = made(plan, &link);
        EXPECT_EQ(networkOf(profile), "home");
        EXPECT_EQ(in<std::string>(profile, "802-11-wireless-security", "psk"), canary);
        EXPECT_EQ(in<std::uint32_t>(profile, "802-11-wireless-security", "psk-flags"), std::nullopt);
        EXPECT_EQ(in<bool>(profile, "802-11-wireless", "hidden"), true);
        EXPECT_EQ(in<Texts>(profile, "802-11-wireless", "seen-bssids"), std::nullopt);
        EXPECT_EQ(in<std::string>(profile, "connection", "id"), "location-assistant wlan0");
        EXPECT_EQ(in<std::string>(profile, "ipv4", "method"), "manual");
    }
}

}  // namespace
}  // namespace platform::apply
