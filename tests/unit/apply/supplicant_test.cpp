// What only a supplicant that is made to can show; the rows over the air show the rest with the real one.
#include "platform/apply/direct/Supplicant.h"

#include <gtest/gtest.h>

#include <memory>

#include "platform/base/Hexadecimal.h"
#include "platform/base/Host.h"
#include "tests/unit/apply/StandInSupplicant.h"
#include "tests/unit/support/TemporaryDirectory.h"

namespace platform::apply {
namespace {

class SupplicantTest : public testing::Test {
  protected:
    static Host host(const std::string& directory) {
        Host host;
        host.supplicantDirectory = directory;
        return host;
    }
    static std::string wait(WirelessJoin& join) {
        WirelessJoin::State state = WirelessJoin::State::waiting;
        std::string reason;
        const auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(400);
        while (state == WirelessJoin::State::waiting && std::chrono::steady_clock::now() < deadline) {
            EXPECT_EQ("", join.poll(state, reason).reason());
            std::this_thread::sleep_for(std::chrono::milliseconds(5));
        }
        return state == WirelessJoin::State::joined ? "joined" : reason;
    }
    // What is changed, and what comes of it.
    Lines join(const WirelessSettings& settings) {
        std::unique_ptr<WirelessJoin> join;
        EXPECT_EQ("", joinBySupplicant("wlan0", settings, false, join).reason());
        const std::string end = join ? wait(*join) : "there is no supplicant";
        Lines changes = supplicant_->changes();
        changes.push_back(end);
        return changes;
    }

    const testing_support::TemporaryDirectory folder_;
    const HostOverride override_{host(folder_.path())};
    std::unique_ptr<StandInSupplicant> supplicant_ = std::make_unique<StandInSupplicant>(folder_.at("wlan0"));
};

// Forms of keys and networks that none of those rows has.
TEST_F(SupplicantTest, JoinsByWhatIsOnTheAir) {
    const std::string digits64(64, 'a');
    const struct {
        std::string air;
        WirelessSettings settings;
        Lines set;  // beside the mark and the name
        int age = 0;
    } rows[] = {
        {"[WPA2-PSK-CCMP][ESS] printer",
         {{}, "printer", "p\"ss wörd"},
         {"key_mgmt WPA-PSK", "psk \"p\"ss wörd\""}},
        {"[WPA2-PSK-CCMP][IBSS] printer",
         {{}, "printer", digits64},
         {"mode 1", "frequency 2462", "key_mgmt WPA-PSK", "psk " + digits64, "proto RSN", "pairwise CCMP",
          "group CCMP"}},
        {"[WPA2-SAE-CCMP][ESS] printer",
         {{}, "printer", "0123456789"},
         {"key_mgmt SAE", "ieee80211w 2", "sae_password \"0123456789\""}},
        {"[WEP][IBSS] n\\xc3\\xa4h\\t\\\\",
         {{}, "näh\t\\", "0123456789"},
         {"mode 1", "frequency 2462", "key_mgmt NONE", "wep_key0 0123456789", "wep_tx_keyidx 0"}},
        {"[IBSS] printer", {{}, "printer", {}}, {"key_mgmt NONE"}, 16},  // what may be gone is not formed
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.air);
        supplicant_->next = 2;
        supplicant_->hear(row.air, row.age);
        supplicant_->join(2);
        const std::string name = hexOf(*row.settings.network);
        Lines expected{"ADD_NETWORK", "SET_NETWORK 2 id_str \"location-assistant\"",
                       "SET_NETWORK 2 ssid " + name, "SET_NETWORK 2 scan_ssid 1"};
        std::ranges::transform(row.set, std::back_inserter(expected),
                               [](const std::string& line) { return "SET_NETWORK 2 " + line; });
        expected.insert(expected.end(), {"SELECT_NETWORK 2", "joined"});
        EXPECT_EQ(expected, join(row.settings));
    }
    supplicant_->hear("[WPA2-EAP-CCMP][ESS] printer");
    EXPECT_EQ(Lines{"the network asks each user for a name and a password, which a location does not hold"},
              join({{}, "printer", "12345678"}));
}

TEST_F(SupplicantTest, FormsNoNetwork) {
    const auto selections = [this] {
        Lines lines = join({{}, "printer", {}});
        std::erase_if(lines, [](const std::string& line) {
            return line.starts_with("SET") || line.starts_with("ADD");
        });
        return lines;
    };
    supplicant_->heardLater = "[IBSS] printer";
    supplicant_->join(1);
    EXPECT_EQ((Lines{"SELECT_NETWORK 0", "SELECT_NETWORK 1", "REMOVE_NETWORK 0", "joined"}), selections())
        << "a cell is joined as soon as it is heard";
    supplicant_->next = 0;
    supplicant_->hear("[IBSS] printer");
    supplicant_->join(0, "02:00:00:00:00:99");
    EXPECT_EQ(
        (Lines{"SELECT_NETWORK 0", "SELECT_NETWORK 1", "REMOVE_NETWORK 0", "the network was not found"}),
        selections())
        << "one under another address was formed, and is left";
}

TEST_F(SupplicantTest, ComesBackToWhatItFound) {
    const std::string head = "network id / ssid / bssid / flags\n";
    const std::string off = "\tany\t[DISABLED]\n";
    supplicant_->answers["LIST_NETWORKS"] = head + "0\thome\tany\t\n1\twork" + off;
    supplicant_->answers["STATUS"] = "wpa_state=SCANNING\n";
    supplicant_->answers["GET_NETWORK 2"] = "\"location-assistant\"";
    std::optional<KnownNetworks> before;
    ASSERT_TRUE(readKnownNetworks("wlan0", before).ok());
    const struct {
        std::string networks;
        bool wasOnOne;
        Lines changes;
    } rows[] = {
        {"0\thome" + off + "1\twork" + off + "2\tprinter\tany\t[CURRENT]\n",
         false,
         {"ENABLE_NETWORK 0", "REMOVE_NETWORK 2"}},
        {"0\thome" + off + "2\tprinter\tany\t\n", true, {"ENABLE_NETWORK 0", "REMOVE_NETWORK 2", "joined"}},
        // Somebody chose another network: only what is ours goes.
        {"0\thome" + off + "1\twork\tany\t\n2\tprinter" + off, false, {"REMOVE_NETWORK 2"}},
        // A run that ended right after adding one left it without a name or a mark.
        {"0\thome\tany\t\n7\t" + off + "8\tnew" + off, false, {"REMOVE_NETWORK 7"}},
    };
    for (const auto& row : rows) {
        supplicant_->answers["LIST_NETWORKS"] = head + row.networks;
        before->isOnOne = row.wasOnOne;
        std::unique_ptr<WirelessJoin> back;
        EXPECT_EQ("", leaveBySupplicant("wlan0", before, back).reason());
        Lines changes = supplicant_->changes();
        if (back) {
            EXPECT_EQ("the wireless network of before is not there now, and is joined when it comes",
                      wait(*back));
            supplicant_->join(0);
            changes.push_back(wait(*back));
        }
        EXPECT_EQ(row.changes, changes);
    }
}

TEST_F(SupplicantTest, TellsWhyItFailed) {
    const WirelessSettings settings{{}, "printer", "12345678"};
    for (const auto& [notice, reason] :
         {std::pair{"CTRL-EVENT-SSID-TEMP-DISABLED id=0 ssid=\"printer\" reason=WRONG_KEY",
                    "the network refused the key"},
          {"CTRL-EVENT-ASSOC-REJECT status_code=1", "the network refused the card"},
          {"CTRL-EVENT-NETWORK-NOT-FOUND ", "the network was not found"}}) {
        supplicant_->notice = notice;
        EXPECT_EQ(reason, join(settings).back());
    }
    std::unique_ptr<WirelessJoin> join;
    supplicant_->answers["SET_NETWORK 3"] = "FAIL\n";
    EXPECT_EQ("the wireless supplicant refused to mark a network",
              joinBySupplicant("wlan0", settings, false, join).reason());
    supplicant_.reset();
    EXPECT_TRUE(joinBySupplicant("wlan0", settings, false, join).ok() && !join);
    EXPECT_TRUE(leaveBySupplicant("wlan0", {}, join).ok());
}

}  // namespace
}  // namespace platform::apply
