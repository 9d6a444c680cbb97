#include "platform/apply/direct/Supplicant.h"

#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <vector>

#include "platform/Host.h"
#include "tests/unit/apply/StandInSupplicant.h"
#include "tests/unit/support/TemporaryDirectory.h"

namespace platform::apply {
namespace {

using Lines = std::vector<std::string>;
using std::chrono::steady_clock;

class SupplicantTest : public testing::Test {
  protected:
    SupplicantTest() {
        Host host;
        host.supplicantDirectory = folder_.path();
        override_ = std::make_unique<HostOverride>(host);
    }
    // An earlier network that is on and one that is off, as a user has them.
    std::unique_ptr<StandInSupplicant> start() {
        auto supplicant = std::make_unique<StandInSupplicant>(folder_.at("wlan0"));
        supplicant->networks[0] = {{{"ssid", "\"home\""}}, false};
        supplicant->networks[1] = {{{"ssid", "\"work\""}}, true};
        return supplicant;
    }
    static std::string join(const WirelessSettings& settings) {
        return joinNetwork("wlan0", settings, false, steady_clock::now() + std::chrono::milliseconds(700))
            .reason();
    }

    const testing_support::TemporaryDirectory folder_;
    std::unique_ptr<HostOverride> override_;
};

TEST_F(SupplicantTest, JoinsByWhatTheNetworkAnnounces) {
    const std::string digits64(64, 'a');
    const struct {
        const char* air;
        WirelessSettings settings;
        Lines set;  // beside the tag and the name, or the failure
    } rows[] = {
        {"x\t2412\t-50\t[WPA2-PSK-CCMP][ESS]\tprinter\n",
         {{}, "printer", "p\"ss wörd"},
         {"key_mgmt WPA-PSK", "psk \"p\"ss wörd\""}},
        {"x\t2412\t-50\t[WPA-PSK-TKIP][ESS]\tprinter\n",
         {{}, "printer", digits64},
         {"key_mgmt WPA-PSK", "psk " + digits64}},
        {"x\t2462\t-50\t[WEP][IBSS]\tprinter\n",
         {{}, "printer", "abcde"},
         {"mode 1", "frequency 2462", "key_mgmt NONE", "wep_key0 \"abcde\"", "wep_tx_keyidx 0"}},
        {"x\t2412\t-50\t[WEP][ESS]\tprinter\n",
         {{}, "printer", "0123456789"},
         {"key_mgmt NONE", "wep_key0 0123456789", "wep_tx_keyidx 0"}},
        {"x\t2412\t-50\t[ESS]\tn\\xc3\\xa4h\\\\\n", {{}, "näh\\", {}}, {"key_mgmt NONE"}},
        {"", {{}, "printer", {}}, {"mode 1", "frequency 2412", "key_mgmt NONE"}},
        {"", {{}, "printer", "four"}, {"the network's key has no form that a key can have"}},
        {"x\t2412\t-50\t[WPA2-PSK-CCMP][ESS]\tprinter\n",
         {{}, "printer", {}},
         {"the network asks for a key and the location holds none"}},
    };
    for (const auto& row : rows) {
        const auto supplicant = start();
        supplicant->seenAfterScan = row.air;
        const std::string reason = join(row.settings);
        Lines set = supplicant->changes();
        SCOPED_TRACE(std::string(row.air) + reason);
        if (set.empty()) {
            EXPECT_EQ(row.set, Lines{reason});
            continue;
        }
        EXPECT_EQ("", reason);
        std::string hex;
        for (const char c : *row.settings.network) {
            char two[3];
            snprintf(two, sizeof two, "%02x", static_cast<unsigned>(static_cast<unsigned char>(c)));
            hex += two;
        }
        Lines expected{"ADD_NETWORK", "SET_NETWORK 2 id_str \"location-assistant\"",
                       "SET_NETWORK 2 ssid " + hex, "SET_NETWORK 2 scan_ssid 1"};
        for (const std::string& line : row.set) {
            expected.push_back("SET_NETWORK 2 " + line);
        }
        expected.emplace_back("SELECT_NETWORK 2");
        EXPECT_EQ(expected, set);
        EXPECT_EQ(2, supplicant->current());
    }
}

TEST_F(SupplicantTest, ComesBackToWhatItFound) {
    const auto supplicant = start();
    std::optional<KnownNetworks> before;
    ASSERT_TRUE(readKnownNetworks("wlan0", before).ok());
    ASSERT_TRUE(before);
    const WirelessSettings settings{{}, "printer", "12345678"};
    EXPECT_EQ("", join(settings));
    supplicant->changes();
    // Another key: a new network in place of the earlier one.
    EXPECT_EQ("", join({{}, "printer", "87654321"}));
    EXPECT_EQ("REMOVE_NETWORK 2", supplicant->changes().back());
    EXPECT_TRUE(leaveNetwork("wlan0", before).ok());
    EXPECT_EQ((Lines{"ENABLE_NETWORK 0", "REMOVE_NETWORK 3"}), supplicant->changes());

    // Somebody chose another network: only what is ours goes.
    EXPECT_EQ("", join(settings));
    supplicant->networks[0].isDisabled = true;
    supplicant->networks[1].isDisabled = false;
    supplicant->networks[2].isDisabled = true;
    supplicant->changes();
    EXPECT_TRUE(leaveNetwork("wlan0", before).ok());
    EXPECT_EQ(Lines{"REMOVE_NETWORK 2"}, supplicant->changes());
    EXPECT_FALSE(supplicant->networks[1].isDisabled);

    // A run that ended right after adding one left it without a name or a mark.
    supplicant->networks[7];
    EXPECT_TRUE(leaveNetwork("wlan0", before).ok());
    EXPECT_EQ(Lines{"REMOVE_NETWORK 7"}, supplicant->changes());
}

TEST_F(SupplicantTest, TellsWhyItFailed) {
    const WirelessSettings settings{{}, "printer", "12345678"};
    EXPECT_EQ("joining a wireless network needs NetworkManager or a wireless supplicant", join(settings));
    EXPECT_TRUE(leaveNetwork("wlan0", {}).ok());
    const struct {
        const char* notice;
        const char* reason;
    } rows[] = {
        {"<3>CTRL-EVENT-SSID-TEMP-DISABLED id=2 ssid=\"printer\" auth_failures=1 duration=10 "
         "reason=WRONG_KEY",
         "the network refused the key"},
        {"<3>CTRL-EVENT-NETWORK-NOT-FOUND ", "the network was not found"},
    };
    for (const auto& row : rows) {
        const auto supplicant = start();
        supplicant->joins = false;
        supplicant->notice = row.notice;
        EXPECT_EQ(row.reason, join(settings));
    }
}

}  // namespace
}  // namespace platform::apply
