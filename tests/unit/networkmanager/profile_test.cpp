// The profiles, as pure functions. With the socket of a bus in LA_NETWORKMANAGER_BUS the real NetworkManager
// judges each of them.
#include <arpa/inet.h>
#include <gtest/gtest.h>

#include <cstdlib>
#include <limits>

#include "platform/apply/networkmanager/Daemon.h"
#include "platform/base/Host.h"

namespace platform::apply {
namespace {

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
    plan.method = IPv4Method::dhcp;
    plan.wireless = WirelessSettings{true, std::move(network), std::move(key)};
    return plan;
}

Sections made(const InterfacePlan& plan, const WirelessLink* link = nullptr,
              const ProfileSnapshot& before = {}) {
    Sections profile = makeProfile(plan, link, before);
    if (const char* const socket = std::getenv("LA_NETWORKMANAGER_BUS"); socket != nullptr) {
        Host host;
        host.systemBusSocket = socket;
        const HostOverride override(host);
        Daemon daemon;
        std::string path;
        EXPECT_EQ("", daemon.connect().reason());
        EXPECT_EQ("", daemon.addProfile(profile, Adding::heldBack, {}, path).reason());
        EXPECT_EQ("", daemon.deleteProfile(path).reason());
    }
    return profile;
}

TEST(Profile, HoldsTheAddresses) {
    InterfacePlan plan = wired();
    EXPECT_EQ(made(plan)["ipv4"]["method"], Value{std::string("disabled")});
    plan.method = IPv4Method::manual;
    EXPECT_EQ(made(plan)["ipv4"]["method"], Value{std::string("disabled")});

    plan.addresses = {{address("192.0.0.199"), 24}, {address("10.0.0.1"), 32}};
    plan.router = address("192.0.0.192");
    plan.nameServers = {address("192.0.0.1"), address("192.0.0.2")};
    plan.searchDomains = {"example.com", "example.org"};
    plan.rank = 3;
    Dictionary expected{
        {"method", {std::string("manual")}},
        {"may-fail", {false}},
        {"route-metric", {std::int64_t{4}}},
        {"address-data",
         {std::vector<Dictionary>{{{"address", {std::string("192.0.0.199")}}, {"prefix", {24U}}},
                                  {{"address", {std::string("10.0.0.1")}}, {"prefix", {32U}}}}}},
        {"gateway", {std::string("192.0.0.192")}},
        {"dns", {std::vector{address("192.0.0.1"), address("192.0.0.2")}}},
        {"dns-search", {Texts{"example.com", "example.org"}}}};
    EXPECT_EQ(made(plan)["ipv4"], expected);

    plan.method = IPv4Method::dhcp;
    plan.dhcpClientID = "mac";  // a word of NetworkManager's, but free text here
    expected.erase("address-data");
    expected.erase("gateway");
    expected["method"] = {std::string("auto")};
    expected["dhcp-client-id"] = {std::string("00:6d:61:63")};
    expected["dhcp-timeout"] = {std::numeric_limits<std::int32_t>::max()};
    expected["ignore-auto-dns"] = {true};
    EXPECT_EQ(made(plan)["ipv4"], expected);
}

TEST(Profile, IsFoundAgain) {
    EXPECT_NE(profileUUID("eth0"), profileUUID("eth1"));
    for (const ProfileSnapshot& before :
         {ProfileSnapshot{"11111111-2222-4333-8444-555555555555", false, true},
          ProfileSnapshot{"", true, false}}) {
        Sections profile = made(wired(), nullptr, before);
        EXPECT_TRUE(isOurs(profile));
        EXPECT_EQ(snapshotIn(profile), before);
        EXPECT_EQ(profile["connection"]["uuid"], Value{profileUUID("eth0")});
        EXPECT_EQ(profile["connection"]["autoconnect-priority"], Value{999});
        profile.erase("user");
        EXPECT_FALSE(isOurs(profile));
    }
}

// The choice and the profile that it makes: mode, key management, and whether it is asked for by its name.
TEST(Profile, JoinsByTheKeyAndByWhatIsOnTheAir) {
    const HeardNetwork open{false, Security::open, 50};
    const HeardNetwork wep{false, Security::wep, 90};
    const HeardNetwork wpa{false, Security::wpa, 50};
    const HeardNetwork sae{false, Security::sae, 50};
    const HeardNetwork cell{true, Security::open, 90, 2462};
    const HeardNetwork oldCell{true, Security::open, 90, 2462, "", oldestCell + std::chrono::seconds(1)};
    const std::string wpaPoint = "infrastructure wpa-psk";
    const std::string wepPoint = "infrastructure none";
    const struct {
        const char* what;
        std::vector<HeardNetwork> heard;
        std::optional<std::string> key;
        std::string made;  // empty: nothing is joined
    } rows[] = {
        {"open", {open}, {}, "infrastructure"},
        {"the strongest counts", {open, cell}, {}, "adhoc"},
        {"a cell of long ago is not formed anew", {oldCell}, {}, "infrastructure hidden"},
        {"WEP, 5 characters", {wep}, "abcde", wepPoint},
        {"WEP, 13 characters", {wep}, "abcdefghijklm", wepPoint},
        {"WEP, 10 digits", {wep}, "0123456789", wepPoint},
        {"WEP, 26 digits", {wep}, "0123456789abcdefABCDEF0123", wepPoint},
        {"WEP, 10 characters that are no digits", {wep}, "canary-xyz", ""},
        {"WEP, 5 bytes that are no characters", {wep}, "caf\xc3\xa9", ""},
        {"WEP without a key", {wep}, {}, ""},
        {"WPA, 8 characters", {wpa}, "abcdefgh", wpaPoint},
        {"WPA, 63 characters", {wpa}, std::string(63, 'k'), wpaPoint},
        {"WPA, 64 digits", {wpa}, std::string(64, 'a'), wpaPoint},
        {"WPA, a key that looks like WEP's", {wpa}, "0123456789", wpaPoint},
        {"WPA, 7 characters", {wpa}, "canary7", ""},
        {"WPA, 64 characters", {wpa}, std::string(64, 'k'), ""},
        {"WPA3", {sae}, canary, "infrastructure sae"},
        {"a cell with WPA", {{true, Security::wpa}}, canary, "adhoc wpa-psk rsn"},
        {"a name and a password for each user", {{false, Security::enterprise}}, canary, ""},
        {"the key is not given up for an open network of the name", {open}, canary, wpaPoint + " hidden"},
        {"nor for the stronger WEP network", {wep, wpa}, "abcdefghijklm", wpaPoint},
        {"nothing on the air", {}, {}, "infrastructure hidden"},
        {"nothing on the air, a key of WEP's form alone", {}, "abcde", wepPoint + " hidden"},
        {"nothing on the air, a key of both forms", {}, "abcdefghijklm", wpaPoint + " hidden"},
        {"nothing on the air, a key of no form", {}, "canary7", ""},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.what);
        const JoinDecision decision = chooseNetwork(row.heard, row.key);
        EXPECT_TRUE(!row.key || decision.reason.find(*row.key) == std::string::npos);
        ASSERT_EQ(decision.choice.has_value(), !row.made.empty()) << decision.reason;
        if (!decision.choice) {
            EXPECT_NE(decision.reason, "");
            continue;
        }
        const WirelessLink link{decision.choice, {}};
        const InterfacePlan plan = wireless("printer \xf0\x9f\x96\xa8", row.key);
        Sections profile = made(plan, &link);
        EXPECT_EQ(networkOf(profile), *plan.wireless->network);
        Dictionary& security = profile["802-11-wireless-security"];
        std::string text = valueOf<std::string>(profile["802-11-wireless"], "mode").value_or("");
        text += security.empty() ? "" : " " + valueOf<std::string>(security, "key-mgmt").value_or("");
        text +=
            security.contains("proto") ? " " + valueOf<Texts>(security, "proto").value_or(Texts{"?"})[0] : "";
        text += profile["802-11-wireless"].contains("hidden") ? " hidden" : "";
        EXPECT_EQ(text, row.made);
        EXPECT_EQ(row.key.value_or(""),
                  valueOf<std::string>(security, "psk")
                      .value_or(valueOf<std::string>(security, "wep-key0").value_or("")));
    }
}

TEST(Profile, KeepsTheNetworkOfTheCard) {
    const Sections home = {
        {"802-11-wireless",
         {{"ssid", {Bytes{'h', 'o', 'm', 'e'}}},
          {"hidden", {true}},
          {"seen-bssids", {Texts{"00:11:22:33:44:55"}}}}},
        {"802-11-wireless-security",
         {{"key-mgmt", {std::string("wpa-psk")}}, {"psk", {canary}}, {"psk-flags", {1U}}}},
        {"connection", {{"id", {std::string("Home")}}}},
        {"ipv4", {{"method", {std::string("disabled")}}}},
    };
    const WirelessLink link{{}, wirelessSections(home)};
    Sections profile = made(wireless({}, {}), &link);
    EXPECT_EQ(profile["802-11-wireless"],
              (Dictionary{{"ssid", {Bytes{'h', 'o', 'm', 'e'}}}, {"hidden", {true}}}));
    EXPECT_EQ(profile["802-11-wireless-security"],
              (Dictionary{{"key-mgmt", {std::string("wpa-psk")}}, {"psk", {canary}}}));
    EXPECT_EQ(profile["connection"]["id"], Value{std::string("location-assistant eth0")});
    EXPECT_EQ(profile["ipv4"]["method"], Value{std::string("auto")});
}

}  // namespace
}  // namespace platform::apply
