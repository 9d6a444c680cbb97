#include "platform/apply/direct/WirelessCard.h"

#include <linux/nl80211.h>

#include <algorithm>
#include <cerrno>
#include <utility>

namespace platform::apply {

using netlink::Message;

Outcome WirelessCard::open(const std::string& interface, bool& isWireless) {
    isWireless = false;
    RETURN_IF_FAILED(kernel_.open(interface));
    RETURN_IF_FAILED(socket_.openGeneric());
    RETURN_IF_FAILED(netlink::findFamily(socket_, NL80211_GENL_NAME, family_));
    if (!kernel_.link() || !family_) {
        return {};
    }
    index_ = kernel_.link()->index;
    Message answer;
    RETURN_IF_FAILED(
        socket_.ask(requestFor(NL80211_CMD_GET_INTERFACE), answer, {ENODEV, EINVAL, EOPNOTSUPP}));
    isWireless = answer.attributes<genlmsghdr>().u32(NL80211_ATTR_IFTYPE).has_value();
    return {};
}

Outcome WirelessCard::read(WirelessState& state) {
    state = {};
    Message answer;
    RETURN_IF_FAILED(socket_.ask(requestFor(NL80211_CMD_GET_INTERFACE), answer));
    state.type =
        answer.attributes<genlmsghdr>().u32(NL80211_ATTR_IFTYPE).value_or(NL80211_IFTYPE_UNSPECIFIED);
    std::optional<ScanEntry> current;
    RETURN_IF_FAILED(readCurrent(current));
    if (current) {
        state.network = current->network;
        state.isProtected = current->security != Security::open;
    }
    return {};
}

Outcome WirelessCard::readEntries(std::vector<ScanEntry>& entries) {
    entries.clear();
    std::vector<Message> messages;
    RETURN_IF_FAILED(socket_.dump(requestFor(NL80211_CMD_GET_SCAN, NLM_F_DUMP), messages));
    for (const Message& message : messages) {
        if (auto entry = decodeScanEntry(message)) {
            entries.push_back(std::move(*entry));
        }
    }
    return {};
}

Outcome WirelessCard::readCurrent(std::optional<ScanEntry>& current) {
    std::vector<ScanEntry> entries;
    RETURN_IF_FAILED(readEntries(entries));
    const auto found = std::ranges::find(entries, true, &ScanEntry::isCurrent);
    current = found == entries.end() ? std::nullopt : std::optional(std::move(*found));
    return {};
}

Outcome WirelessCard::readRunning(bool& isRunning) {
    RETURN_IF_FAILED(kernel_.refresh());
    isRunning = kernel_.link() && kernel_.link()->running;
    return {};
}

Outcome WirelessCard::setType(std::uint32_t type) {
    WirelessState now;
    RETURN_IF_FAILED(read(now));
    RETURN_IF_FAILED(kernel_.refresh());
    if (now.type == type || !kernel_.link()) {
        return {};
    }
    Message request = requestFor(NL80211_CMD_SET_INTERFACE);
    request.addValue(NL80211_ATTR_IFTYPE, type);
    if (!kernel_.link()->up) {
        return socket_.request(std::move(request));
    }
    // Cards of many makers change only while they are down, and the routes go with the link.
    InterfaceState state;
    RETURN_IF_FAILED(kernel_.read(state));
    RETURN_IF_FAILED(kernel_.setUp(false));
    const Outcome changed = socket_.request(std::move(request));
    RETURN_IF_FAILED(kernel_.setUp(true));
    RETURN_IF_FAILED(kernel_.makeAddresses(state.addresses));
    RETURN_IF_FAILED(kernel_.makeRoutes(state.routes, true));
    return changed;
}

Outcome WirelessCard::scan(const std::string& network) {
    Message request = requestFor(NL80211_CMD_TRIGGER_SCAN);
    request.addNested(NL80211_ATTR_SCAN_SSIDS,
                      [&network](Message& names) { names.add(1, std::as_bytes(std::span(network))); });
    return socket_.request(std::move(request), {EBUSY, ENETDOWN});
}

void WirelessCard::endScan() {
    (void)socket_.request(requestFor(NL80211_CMD_ABORT_SCAN));
}

Outcome WirelessCard::join(const ScanEntry& network, const std::optional<std::string>& key) {
    return socket_.request(makeJoinRequest(*family_, index_, network, key));
}

Outcome WirelessCard::leave() {
    WirelessState now;
    RETURN_IF_FAILED(read(now));
    // What it is not on, or has no part in, it need not leave.
    return socket_.request(
        requestFor(now.type == NL80211_IFTYPE_ADHOC ? NL80211_CMD_LEAVE_IBSS : NL80211_CMD_DISCONNECT),
        {ENOTCONN, ENOLINK, ENETDOWN, EOPNOTSUPP});
}

Outcome WirelessCard::listen() {
    RETURN_IF_FAILED(notices_.openGeneric());
    for (const char* name : {NL80211_MULTICAST_GROUP_SCAN, NL80211_MULTICAST_GROUP_MLME}) {
        if (const auto group = family_->groups.find(name); group != family_->groups.end()) {
            RETURN_IF_FAILED(notices_.joinGroup(group->second));
        }
    }
    return {};
}

void WirelessCard::takeNotices(bool& isScanOver, std::optional<std::uint16_t>& joinStatus) {
    for (const Message& message : notices_.takeNotices(isScanOver)) {
        if (const auto notice = decodeNotice(message, index_)) {
            isScanOver = isScanOver || notice->isScanEnd;
            joinStatus = notice->joinStatus ? notice->joinStatus : joinStatus;
        }
    }
}

}  // namespace platform::apply
