#include "platform/apply/direct/WirelessMessages.h"

#include <gtest/gtest.h>
#include <linux/nl80211.h>

#include <map>
#include <sstream>
#include <string>
#include <vector>

#include "platform/apply/direct/KernelWireless.h"
#include "tests/unit/support/Hexadecimal.h"
#include "tests/unit/support/Transcript.h"

namespace platform::apply {
namespace {

using netlink::Bytes;
using netlink::ByteView;
using netlink::Message;
using testing_support::fromHex;
using testing_support::toHex;
using Inputs = testing_support::Transcript::Inputs;

// The message that stands under a name, or is given one; with one run of its bytes replaced: in words.
std::string meaningOf(const Inputs& inputs) {
    static std::map<std::string, std::string> known;
    std::string message = known.try_emplace(inputs[0], inputs.back()).first->second;
    for (std::size_t at = 0; inputs.size() > 2 && (at = message.find(inputs[1], at)) != std::string::npos;
         at += inputs[2].size()) {
        message.replace(at, inputs[1].size(), inputs[2]);
    }
    const Bytes payload = fromHex(message);
    for (std::size_t length = 0; length < payload.size(); ++length) {
        const Bytes part(payload.begin(), payload.begin() + static_cast<std::ptrdiff_t>(length));
        (void)decodeScanEntry(Message(0, 0, ByteView(part)));
    }
    const auto entry = decodeScanEntry(Message(0, 0, ByteView(payload)));
    return entry->network + (entry->isAdHoc ? " cell " : " access point ") + toHex(entry->bssid) + " " +
           std::to_string(entry->frequency) + " " + std::to_string(entry->signal) + " " +
           std::to_string(entry->age.count()) + (entry->isCurrent ? " current" : "") + " security " +
           std::to_string(static_cast<int>(entry->security)) + " keys " +
           std::to_string(entry->keyManagement);
}

// The request to join a cell with a key.
std::string requestOf(const Inputs& inputs) {
    const ScanEntry cell{"WepCell1", {}, 2412, 0, {}, true};
    return toHex(makeJoinRequest({32, {}}, 3, cell, inputs[0]).payload());
}

// A notice by its command and interface, with a status, or -1 for none, and whether its time ran out.
std::string noticeOf(const Inputs& inputs) {
    static const std::map<std::string, std::uint8_t> commands{{"new results", NL80211_CMD_NEW_SCAN_RESULTS},
                                                              {"aborted", NL80211_CMD_SCAN_ABORTED},
                                                              {"trigger", NL80211_CMD_TRIGGER_SCAN},
                                                              {"connect", NL80211_CMD_CONNECT}};
    Message message = makeRequest({32, {}}, std::stoi(inputs[1]), commands.at(inputs[0]));
    if (inputs.size() > 2) {
        message.addValue(NL80211_ATTR_STATUS_CODE, static_cast<std::uint16_t>(std::stoi(inputs[2])));
    }
    if (inputs.size() > 3) {
        message.add(NL80211_ATTR_TIMED_OUT, {});
    }
    const auto notice = decodeNotice(message, 3);
    return !notice             ? "nothing"
           : notice->isScanEnd ? "scan over"
                               : "status " + std::to_string(notice->joinStatus.value_or(1));
}

// Of networks called Printer, "SECURITY SIGNAL AGE" in ms, and a key: the signal of the one that is joined,
// or why there is none.
std::string choiceOf(const Inputs& inputs) {
    std::vector<ScanEntry> heard{{"Home"}};
    std::istringstream air(inputs[0]);
    for (std::string each; std::getline(air, each, ',');) {
        std::istringstream words(each);
        std::string security;
        int signal = 0, age = 0;
        words >> security >> signal >> age;
        heard.push_back({"Printer",
                         {},
                         2412,
                         signal,
                         std::chrono::milliseconds(age),
                         false,
                         false,
                         security == "open"  ? Security::open
                         : security == "wep" ? Security::wep
                                             : Security::wpa,
                         managementSAE});
    }
    heard.resize(inputs[0] == "nothing" ? 1 : heard.size());
    const auto key = inputs.size() > 1 ? std::optional(inputs[1]) : std::nullopt;
    const EntryChoice choice = chooseEntry(heard, "Printer", key, std::chrono::milliseconds(100));
    EXPECT_EQ(choice.reason.empty(), choice.entry.has_value());
    return choice.entry ? std::to_string(choice.entry->signal)
                        : choice.reason + (choice.isHopeless ? ", for good" : "");
}

TEST(KernelWireless, IsReadAndAsked) {
    testing_support::Transcript transcript("kernel_wireless");
    transcript.replay("entries of a scan as a kernel of the 6.1 series gave them for simulated radios",
                      meaningOf);
    transcript.replay("requests to join", requestOf);
    transcript.replay("notices", noticeOf);
    transcript.replay("what was heard, and a key", choiceOf);
}

}  // namespace
}  // namespace platform::apply
