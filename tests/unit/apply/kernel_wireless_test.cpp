#include "platform/apply/direct/WirelessMessages.h"

#include <gtest/gtest.h>
#include <linux/nl80211.h>

#include <string>
#include <vector>

#include "platform/apply/direct/KernelWireless.h"
#include "tests/unit/support/Hexadecimal.h"
#include "tests/unit/support/PrivateNetwork.h"

namespace platform::apply {
namespace {

using netlink::Bytes;
using netlink::MessageView;
using testing_support::fromHex;
using testing_support::PrivateNetwork;
using testing_support::shell;
using testing_support::toHex;

// Entries of a scan as a kernel of the 6.1 series gave them for simulated radios.
const std::string openAccessPoint =
    "2201000008002e009800000008000300020000000c0099000100000000000000dc002f000a00010002000000020000000400"
    "0e000c0003009022a622cd6006003200060000084f70656e486f6d65010882848b960c1218240301062a010432043048606c"
    "3b0251007f08040040020000004000000c000d00c580a622cd60060038000b0000084f70656e486f6d65010882848b960c12"
    "18240301060504000200002a010432043048606c3b0251007f08040040020000004006000400640000000600050001040000"
    "0800020085090000080014000000000008000c000000000008000a00140000000c000f00ec3147f01e0000000800070048f4"
    "ffff";
const std::string accessPointWithSAE =
    "2201000008002e009800000008000300020000000c009900010000000000000008012f000a00010002000000010000000400"
    "0e000c0003009140a122cd600600470006000007577061334e6574010882848b960c1218240301012a010432043048606c30"
    "140100000fac040100000fac040100000fac08c0003b0251007f080400400200000040000c000d00cc60d522cd6006004d00"
    "0b000007577061334e6574010882848b960c1218240301010504000200002a010432043048606c30140100000fac04010000"
    "0fac040100000fac08c0003b0251007f08040040020000004000000006000400640000000600050011040000080002006c09"
    "0000080014000000000008000c000000000008000a00140000000c000f00f24b62a71f0000000800070048f4ffff";

// The entry with one run of bytes replaced, in words.
std::string meaning(std::string message, const std::string& from = "", const std::string& to = "") {
    for (std::size_t at = 0; !from.empty() && (at = message.find(from, at)) != std::string::npos;
         at += to.size()) {
        message.replace(at, from.size(), to);
    }
    const Bytes payload = fromHex(message);
    const auto entry = decodeScanEntry(MessageView({}, payload));
    return entry->network + (entry->isAdHoc ? " cell " : " access point ") + toHex(entry->bssid) + " " +
           std::to_string(entry->frequency) + " " + std::to_string(entry->signal) + " " +
           std::to_string(entry->age.count()) + (entry->isCurrent ? " current" : "") + " security " +
           std::to_string(static_cast<int>(entry->security)) + " keys " +
           std::to_string(entry->keyManagement);
}

TEST(WirelessMessages, TellsWhatAScanHeard) {
    const std::string open = " access point 020000000200 2437 -3000 20 security 0 keys 0";
    const std::string protectedOne = "Wpa3Net access point 020000000100 2412 -3000 20 security ";
    const std::string suites = "30140100000fac040100000fac040100000fac08c000";
    EXPECT_EQ("OpenHome" + open, meaning(openAccessPoint));
    EXPECT_EQ(open, meaning(openAccessPoint, "4f70656e486f6d65", "0000000000000000")) << "it hides its name";
    EXPECT_EQ(protectedOne + "2 keys 2", meaning(accessPointWithSAE));
    EXPECT_EQ("Wpa3Net cell 020000000100 2412 -3000 20 security 2 keys 2",
              meaning(accessPointWithSAE, "0600050011040000", "0600050012040000"));
    const struct {
        const char *from, *to, *keys;
    } rows[] = {
        {"0fac08c0", "0fac02c0", "2 keys 1"},
        {"0fac08c0", "0fac01c0", "2 keys 4"},
        {"0100000fac08", "ffff000fac08", "2 keys 2"},  // more suites than bytes
        {suites.c_str(), "dd140050f20101000050f202000001000050f2020000", "2 keys 1"},  // WPA's own element
        {"30140100", "30ff0100", "1 keys 0"}};                                         // longer than the rest
    for (const auto& row : rows) {
        EXPECT_EQ(protectedOne + row.keys, meaning(accessPointWithSAE, row.from, row.to));
    }
    const Bytes whole = fromHex(accessPointWithSAE);
    for (std::size_t length = 0; length < whole.size(); ++length) {
        const Bytes part(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(length));
        (void)decodeScanEntry(MessageView({}, part));
    }
}

TEST(WirelessMessages, AsksWithAKeyAsTheKernelWantsIt) {
    const WirelessRequests requests({32, {}}, 3);
    const ScanEntry cell{"WepCell1", {}, 2412, 0, {}, true};
    const std::string head = "0008000300030000000c00340057657043656c6c310a000600000000000000000008002600";
    EXPECT_EQ("2b0000" + head +
                  "6c09000004003c0004004600280051802400018009000100616263646500000008000300"
                  "01ac0f00050002000000000004000500",
              toHex(requests.join(cell, "abcde").payload()));
    const std::string longKey = toHex(requests.join(cell, "6162636465666768696a6b6c6d").payload());
    EXPECT_NE(std::string::npos, longKey.find("6162636465666768696a6b6c6d0000000800030005ac0f00"));
}

TEST(WirelessMessages, TellsWhatANoticeMeans) {
    const netlink::GenericFamily family{32, {}};
    const auto meaning = [&family](std::uint8_t command, std::uint32_t index, int status = -1,
                                   bool isTimedOut = false) {
        netlink::Message message = family.request(command, 0);
        message.addValue(NL80211_ATTR_IFINDEX, index);
        if (status >= 0) {
            message.addValue(NL80211_ATTR_STATUS_CODE, static_cast<std::uint16_t>(status));
        }
        if (isTimedOut) {
            message.add(NL80211_ATTR_TIMED_OUT, {});
        }
        const auto notice = decodeNotice(MessageView({}, message.payload()), 3);
        return !notice             ? "nothing"
               : notice->isScanEnd ? "scan over"
                                   : std::to_string(notice->joinStatus.value_or(1));
    };
    EXPECT_EQ("scan over", meaning(NL80211_CMD_NEW_SCAN_RESULTS, 3));
    EXPECT_EQ("scan over", meaning(NL80211_CMD_SCAN_ABORTED, 3));
    EXPECT_EQ("nothing", meaning(NL80211_CMD_SCAN_ABORTED, 4));
    EXPECT_EQ("nothing", meaning(NL80211_CMD_TRIGGER_SCAN, 3));
    EXPECT_EQ("15", meaning(NL80211_CMD_CONNECT, 3, 15));
    EXPECT_EQ("65535", meaning(NL80211_CMD_CONNECT, 3, 1, true));
}

TEST(KernelWireless, ChoosesOnlyWhatWasHeardAndCanBeJoined) {
    const auto heard = [](Security security, int signal, int age = 0) {
        return ScanEntry{"Printer", {},    2412,     signal,       std::chrono::milliseconds(age),
                         false,     false, security, managementSAE};
    };
    const std::string notHeard = "no network of that name was heard";
    const std::string noKey = "the network asks for a key and the location holds none";
    const struct {
        std::vector<ScanEntry> heard;
        std::optional<std::string> key;
        std::string
            choice;  // the signal of the chosen one, or why there is none; "!" when there will be none
    } rows[] = {
        {{}, {}, notHeard},
        {{{"Home"}}, {}, notHeard},
        {{heard(Security::open, -30, 101)}, {}, notHeard},
        {{heard(Security::open, -50), heard(Security::open, -40, 100), heard(Security::open, -30, 101),
          heard(Security::wep, -20)},
         {},
         "-40"},
        {{heard(Security::open, -50)},
         "abcde",
         "an open network of that name is on the air, and with a key none is joined"},
        {{heard(Security::open, -30), heard(Security::wep, -50)}, "abcde", "-50"},
        {{heard(Security::wep, -50)}, {}, "!" + noKey},
        {{heard(Security::wep, -50), heard(Security::open, -60)},
         "abcdef",
         "!an open network of that name is on the air, and with a key none is joined"},
        {{heard(Security::wpa, -50)},
         "long enough",
         "!the network asks for WPA by SAE, and no wireless supplicant runs for this card"},
    };
    for (const auto& row : rows) {
        const EntryChoice choice = chooseEntry(row.heard, "Printer", row.key, std::chrono::milliseconds(100));
        EXPECT_EQ(row.choice, (choice.isHopeless ? "!" : "") +
                                  (choice.entry ? std::to_string(choice.entry->signal) : choice.reason));
        EXPECT_EQ(choice.reason.empty(), choice.entry.has_value());
    }
}

class KernelWirelessTest : public testing_support::PrivateNetworkTest {};

TEST_F(KernelWirelessTest, NeighboursThatDidNotAnswerAreForgotten) {
    PrivateNetwork::run([] {
        shell(
            "ip link add card0 type veth peer name far0; ip link set far0 up; ip link set card0 up;"
            "ip neigh add 10.1.0.1 dev card0 nud failed; ip neigh add 10.1.0.2 dev far0 nud failed;"
            "ip neigh add 10.1.0.3 dev card0 lladdr 02:00:00:00:00:03 nud reachable;"
            "ip neigh add 10.1.0.4 dev card0 nud incomplete");
        Kernel kernel;
        std::optional<Link> link;
        ASSERT_TRUE(kernel.open().ok() && kernel.findLink("card0", link).ok() && link);
        EXPECT_EQ("", kernel.forgetSilentNeighbours(*link).reason());
        EXPECT_EQ("10.1.0.2 dev far0 FAILED \n10.1.0.3 dev card0 lladdr 02:00:00:00:00:03 REACHABLE \n",
                  shell("ip -4 neigh show nud all | sort"));
    });
}

}  // namespace
}  // namespace platform::apply
