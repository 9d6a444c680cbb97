#include "platform/apply/direct/Supplicant.h"

#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "platform/base/Host.h"
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
    // Why the network was not joined; empty when it was.
    static std::string join(const WirelessSettings& settings) {
        std::unique_ptr<WirelessJoin> join;
        EXPECT_TRUE(joinBySupplicant("wlan0", settings, false, join).ok());
        WirelessJoin::State state = WirelessJoin::State::waiting;
        std::string reason = "there is no supplicant";
        const auto deadline = steady_clock::now() + std::chrono::milliseconds(700);
        while (join && state == WirelessJoin::State::waiting && steady_clock::now() < deadline) {
            const Outcome polled = join->poll(state, reason);
            EXPECT_TRUE(polled.ok()) << polled.reason();
            std::this_thread::sleep_for(std::chrono::milliseconds(10));
        }
        return state == WirelessJoin::State::joined ? "" : reason;
    }
    static bool isAdHoc(const StandInSupplicant::Network& network) {
        return network.values.count("mode") != 0;
    }

    const testing_support::TemporaryDirectory folder_;
    std::unique_ptr<HostOverride> override_;
};

const std::string cell = "02:00:00:00:00:01\t2462\t-50\t";  // the one that the stand-in can be on

TEST_F(SupplicantTest, JoinsByWhatIsOnTheAir) {
    const std::string digits64(64, 'a');
    const WirelessSettings open{{}, "printer", {}};
    const struct {
        std::string air;
        WirelessSettings settings;
        Lines set;  // beside the tag and the name, or why nothing is joined
        int age = 0;
    } rows[] = {
        {"x\t2412\t-50\t[WPA2-PSK-CCMP][ESS]\tprinter\n",
         {{}, "printer", "p\"ss wörd"},
         {"key_mgmt WPA-PSK", "psk \"p\"ss wörd\""}},
        {"x\t2412\t-50\t[WPA-PSK-TKIP][ESS]\tprinter\n",
         {{}, "printer", digits64},
         {"key_mgmt WPA-PSK", "psk " + digits64}},
        {"x\t2412\t-50\t[WPA2-SAE-CCMP][ESS]\tprinter\n",
         {{}, "printer", "12345678"},
         {"key_mgmt SAE", "ieee80211w 2", "sae_password \"12345678\""}},
        {cell + "[WEP][IBSS]\tprinter\n",
         {{}, "printer", "abcde"},
         {"mode 1", "frequency 2462", "key_mgmt NONE", "wep_key0 \"abcde\"", "wep_tx_keyidx 0"}},
        {"x\t2412\t-50\t[WEP][ESS]\tprinter\n",
         {{}, "printer", "0123456789"},
         {"key_mgmt NONE", "wep_key0 0123456789", "wep_tx_keyidx 0"}},
        {"x\t2412\t-50\t[ESS]\tn\\xc3\\xa4h\\\\\n", {{}, "näh\\", {}}, {"key_mgmt NONE"}},
        {cell + "[IBSS]\tprinter\n", open, {"mode 1", "frequency 2462", "key_mgmt NONE"}},
        // Nothing of that name, or only what may be gone: an access point is looked for.
        {"", open, {"key_mgmt NONE"}},
        {cell + "[IBSS]\tprinter\n", open, {"key_mgmt NONE"}, 16},
        {"", {{}, "printer", "abcdefghijklm"}, {"key_mgmt WPA-PSK", "psk \"abcdefghijklm\""}},
        {"x\t2412\t-50\t[ESS]\tprinter\n",
         {{}, "printer", "12345678"},
         {"key_mgmt WPA-PSK", "psk \"12345678\""}},
        {"x\t2412\t-20\t[WEP][ESS]\tprinter\ny\t2412\t-80\t[WPA2-PSK-CCMP][ESS]\tprinter\n",
         {{}, "printer", "abcdefghijklm"},
         {"key_mgmt WPA-PSK", "psk \"abcdefghijklm\""}},
        {"", {{}, "printer", "four"}, {"the network's key has no form that a key can have"}},
        {"", {{}, "printer", std::string(64, 'x')}, {"the network's key has no form that a key can have"}},
        {"x\t2412\t-50\t[WPA2-PSK-CCMP][ESS]\tprinter\n",
         open,
         {"the network asks for a key and the location holds none"}},
        {"x\t2412\t-50\t[WPA2-EAP-CCMP][ESS]\tprinter\n",
         {{}, "printer", "12345678"},
         {"the network asks each user for a name and a password, which a location does not hold"}},
    };
    for (const auto& row : rows) {
        const auto supplicant = start();
        supplicant->scanResults += row.air;
        supplicant->age = row.age;
        const std::string reason = join(row.settings);
        Lines set = supplicant->changes();
        SCOPED_TRACE(row.air + reason);
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

TEST_F(SupplicantTest, FormsNoNetwork) {
    const WirelessSettings settings{{}, "printer", {}};
    auto supplicant = start();
    supplicant->joins = isAdHoc;
    supplicant->heardLater = cell + "[IBSS]\tprinter\n";
    EXPECT_EQ("", join(settings)) << "a cell is joined as soon as it is heard";
    EXPECT_EQ(3, supplicant->current());
    EXPECT_EQ("REMOVE_NETWORK 2", supplicant->changes().back());

    supplicant.reset();
    supplicant = start();
    supplicant->joins = isAdHoc;
    supplicant->scanResults += "02:00:00:00:00:02\t2462\t-50\t[IBSS]\tprinter\n";
    EXPECT_NE("", join(settings));
    EXPECT_EQ(-1, supplicant->current()) << "one that came up under another address was formed, and is left";
}

TEST_F(SupplicantTest, ComesBackToWhatItFound) {
    const auto supplicant = start();
    std::optional<KnownNetworks> before;
    ASSERT_TRUE(readKnownNetworks("wlan0", before).ok());
    ASSERT_TRUE(before);
    EXPECT_FALSE(before->isOnOne);
    const WirelessSettings settings{{}, "printer", "12345678"};
    EXPECT_EQ("", join(settings));
    supplicant->changes();
    // Another key: a new network in place of the earlier one.
    EXPECT_EQ("", join({{}, "printer", "87654321"}));
    EXPECT_EQ("REMOVE_NETWORK 2", supplicant->changes().back());
    std::unique_ptr<WirelessJoin> back;
    EXPECT_TRUE(leaveBySupplicant("wlan0", before, back).ok());
    EXPECT_FALSE(back);
    EXPECT_EQ((Lines{"ENABLE_NETWORK 0", "REMOVE_NETWORK 3"}), supplicant->changes());

    // Somebody chose another network: only what is ours goes. It was on a network: that is waited for.
    before->isOnOne = true;
    EXPECT_EQ("", join(settings));
    supplicant->networks[0].isDisabled = true;
    supplicant->networks[1].isDisabled = false;
    supplicant->networks[2].isDisabled = true;
    supplicant->changes();
    EXPECT_TRUE(leaveBySupplicant("wlan0", before, back).ok());
    EXPECT_TRUE(back);
    EXPECT_EQ(Lines{"REMOVE_NETWORK 2"}, supplicant->changes());
    EXPECT_FALSE(supplicant->networks[1].isDisabled);

    // A key that fits nothing ends the looking; what was on before is switched on all the same.
    supplicant->networks[0].isDisabled = false;
    supplicant->networks[1].isDisabled = true;
    EXPECT_EQ("", join(settings));
    EXPECT_NE("", join({{}, "printer", "four"}));
    EXPECT_TRUE(supplicant->networks[0].isDisabled);
    EXPECT_TRUE(leaveBySupplicant("wlan0", before, back).ok());
    EXPECT_FALSE(supplicant->networks[0].isDisabled);
    supplicant->changes();

    // A run that ended right after adding one left it without a name or a mark.
    supplicant->networks[7];
    EXPECT_TRUE(leaveBySupplicant("wlan0", before, back).ok());
    EXPECT_EQ(Lines{"REMOVE_NETWORK 7"}, supplicant->changes());
}

TEST_F(SupplicantTest, TellsWhyItFailed) {
    const WirelessSettings settings{{}, "printer", "12345678"};
    EXPECT_EQ("there is no supplicant", join(settings));
    std::unique_ptr<WirelessJoin> back;
    EXPECT_TRUE(leaveBySupplicant("wlan0", {}, back).ok());
    const struct {
        const char* notice;
        const char* reason;
    } rows[] = {
        {"<3>CTRL-EVENT-SSID-TEMP-DISABLED id=2 ssid=\"printer\" auth_failures=1 duration=10 "
         "reason=WRONG_KEY",
         "the network refused the key"},
        {"<3>CTRL-EVENT-ASSOC-REJECT status_code=1", "the network refused the card"},
        {"<3>CTRL-EVENT-NETWORK-NOT-FOUND ", "the network was not found"},
    };
    for (const auto& row : rows) {
        const auto supplicant = start();
        supplicant->joins = [](const auto&) { return false; };
        supplicant->notice = row.notice;
        EXPECT_EQ(row.reason, join(settings));
    }
}

}  // namespace
}  // namespace platform::apply
