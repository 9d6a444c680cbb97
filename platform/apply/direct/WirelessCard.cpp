#include "platform/apply/direct/WirelessCard.h"

#include <linux/nl80211.h>

#include <algorithm>
#include <cerrno>
#include <utility>

namespace platform::apply {

using netlink::OwnedMessage;

Outcome WirelessCard::open(const std::string& interface, bool& isWireless) {
    isWireless = false;
    interface_ = interface;
    RETURN_IF_FAILED(kernel_.open());
    RETURN_IF_FAILED(kernel_.findLink(interface, link_));
    RETURN_IF_FAILED(socket_.openGeneric());
    RETURN_IF_FAILED(netlink::findFamily(socket_, NL80211_GENL_NAME, family_));
    if (!link_ || !family_) {
        return {};
    }
    OwnedMessage answer;
    RETURN_IF_FAILED(socket_.ask(requests().getInterface(), answer, {ENODEV, EINVAL, EOPNOTSUPP}));
    isWireless = decodeInterfaceType(answer.view()).has_value();
    return {};
}

Outcome WirelessCard::read(WirelessState& state) {
    state = {};
    OwnedMessage answer;
    RETURN_IF_FAILED(socket_.ask(requests().getInterface(), answer));
    state.type = decodeInterfaceType(answer.view()).value_or(NL80211_IFTYPE_UNSPECIFIED);
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
    std::vector<OwnedMessage> messages;
    RETURN_IF_FAILED(socket_.dump(requests().getEntries(), messages));
    for (const OwnedMessage& message : messages) {
        if (auto entry = decodeScanEntry(message.view())) {
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
    std::optional<Link> link;
    RETURN_IF_FAILED(kernel_.findLink(interface_, link));
    isRunning = link && link->running;
    return {};
}

Outcome WirelessCard::setType(std::uint32_t type) {
    WirelessState now;
    RETURN_IF_FAILED(read(now));
    std::optional<Link> link;
    RETURN_IF_FAILED(kernel_.findLink(interface_, link));
    if (now.type == type || !link) {
        return {};
    }
    if (!link->up) {
        return socket_.request(requests().setType(type));
    }
    // Cards of many makers change only while they are down, and the routes go with the link.
    InterfaceState state;
    RETURN_IF_FAILED(kernel_.read(*link, state));
    RETURN_IF_FAILED(kernel_.setUp(*link, false));
    const Outcome changed = socket_.request(requests().setType(type));
    RETURN_IF_FAILED(kernel_.setUp(*link, true));
    RETURN_IF_FAILED(kernel_.makeAddresses(*link, state.addresses));
    RETURN_IF_FAILED(kernel_.makeRoutes(*link, state.routes, true));
    return changed;
}

Outcome WirelessCard::leave() {
    WirelessState now;
    RETURN_IF_FAILED(read(now));
    // What it is not on, or has no part in, it need not leave.
    return socket_.request(requests().leave(now.type == NL80211_IFTYPE_ADHOC),
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
    for (const OwnedMessage& message : notices_.takeNotices(isScanOver)) {
        if (const auto notice = decodeNotice(message.view(), link_->index)) {
            isScanOver = isScanOver || notice->isScanEnd;
            joinStatus = notice->joinStatus ? notice->joinStatus : joinStatus;
        }
    }
}

}  // namespace platform::apply
