#include "platform/apply/direct/KernelWireless.h"

#include <linux/nl80211.h>

#include <algorithm>
#include <cerrno>
#include <utility>

namespace platform::apply {
namespace {

using netlink::OwnedMessage;

// After these a notice is taken for lost. A card looks through both bands in 3 to 10 s.
constexpr std::chrono::seconds longestScan{15};
constexpr std::chrono::seconds longestJoining{10};
// Hundredths of a dBm: so good that it need not be compared with what the rest of a scan might find.
constexpr int goodSignal = -6500;
// An access point that says no is not asked again at once.
constexpr std::chrono::seconds pauseAfterRefusal{1};
// The kernel counts an entry's age in ticks of its clock.
constexpr std::chrono::milliseconds ageError{20};

std::string describe(unsigned keyManagement) {
    std::string text;
    for (const auto& [bit, name] :
         {std::pair{managementPSK, "PSK"}, {managementSAE, "SAE"}, {management8021X, "802.1X"}}) {
        if ((keyManagement & bit) != 0) {
            text += text.empty() ? " by " : " or ";
            text += name;
        }
    }
    return text;
}

// Why this network can't be joined with that key, or without one; empty when it can.
std::string obstacleTo(const HeardNetwork& network, const std::optional<std::string>& key) {
    if (network.security == Security::wpa) {
        return "the network asks for WPA" + describe(network.keyManagement) +
               ", and no wireless supplicant runs for this card";
    }
    if (network.security == Security::open && key) {
        return "a network of that name is there, but it is open although there is a key for it";
    }
    Security security = network.security;
    return chooseSecurity(network.security, key, security).reason();
}

}  // namespace

NetworkChoice chooseNetwork(const std::vector<HeardNetwork>& heard, const std::string& name,
                            const std::optional<std::string>& key, std::chrono::milliseconds age) {
    NetworkChoice choice{std::nullopt, false, "no network of that name was heard"};
    for (const HeardNetwork& network : heard) {
        if (network.network != name || network.age > age) {
            continue;
        }
        std::string obstacle = obstacleTo(network, key);
        if (!obstacle.empty()) {
            choice.isHopeless = true;
            choice.reason = std::move(obstacle);
        } else if (!choice.network || network.signal > choice.network->signal) {
            choice.network = network;
        }
    }
    if (choice.network) {
        choice.isHopeless = false;
        choice.reason.clear();
    }
    return choice;
}

Outcome KernelWireless::open(const std::string& interface, bool& isWireless) {
    isWireless = false;
    interface_ = interface;
    Outcome done = kernel_.open();
    if (done.ok()) {
        done = kernel_.findLink(interface, link_);
    }
    if (done.ok()) {
        done = socket_.openGeneric();
    }
    if (done.ok()) {
        done = netlink::findFamily(socket_, NL80211_GENL_NAME, family_);
    }
    if (!done.ok() || !link_ || !family_) {
        return done;
    }
    OwnedMessage answer;
    done = socket_.ask(requests().getInterface(), answer, {ENODEV, EINVAL, EOPNOTSUPP});
    isWireless = done.ok() && decodeInterfaceType(answer.view()).has_value();
    return done;
}

Outcome KernelWireless::read(WirelessState& state) {
    state = {};
    OwnedMessage answer;
    Outcome done = socket_.ask(requests().getInterface(), answer);
    if (!done.ok()) {
        return done;
    }
    state.type = decodeInterfaceType(answer.view()).value_or(NL80211_IFTYPE_UNSPECIFIED);
    std::optional<HeardNetwork> current;
    done = readCurrent(current);
    if (done.ok() && current) {
        state.network = current->network;
        state.isProtected = current->security != Security::open;
    }
    return done;
}

Outcome KernelWireless::readHeard(std::vector<HeardNetwork>& heard) {
    heard.clear();
    std::vector<OwnedMessage> messages;
    Outcome done = socket_.dump(requests().getHeard(), messages);
    for (const OwnedMessage& message : messages) {
        if (auto network = decodeHeardNetwork(message.view())) {
            heard.push_back(std::move(*network));
        }
    }
    return done;
}

Outcome KernelWireless::readCurrent(std::optional<HeardNetwork>& current) {
    std::vector<HeardNetwork> heard;
    Outcome done = readHeard(heard);
    const auto found = std::ranges::find(heard, true, &HeardNetwork::isCurrent);
    current = found == heard.end() ? std::nullopt : std::optional(*found);
    return done;
}

Outcome KernelWireless::listen() {
    if (notices_.isOpen()) {
        return {};
    }
    Outcome done = notices_.openGeneric();
    for (const char* group : {NL80211_MULTICAST_GROUP_SCAN, NL80211_MULTICAST_GROUP_MLME}) {
        const auto found = family_->groups.find(group);
        if (done.ok() && found != family_->groups.end()) {
            done = notices_.joinGroup(found->second);
        }
    }
    return done;
}

Outcome KernelWireless::leave() {
    WirelessState now;
    Outcome done = read(now);
    if (done.ok()) {
        // What it is not on, or has no part in, it need not leave.
        done = socket_.request(requests().leave(now.type == NL80211_IFTYPE_ADHOC),
                               {ENOTCONN, ENOLINK, ENETDOWN, EOPNOTSUPP});
    }
    return done;
}

// Cards of many makers change only while they are down.
Outcome KernelWireless::setType(std::uint32_t type) {
    WirelessState now;
    Outcome done = read(now);
    if (!done.ok() || now.type == type) {
        return done;
    }
    done = kernel_.findLink(interface_, link_);
    if (!done.ok() || !link_) {
        return done;
    }
    done = link_->up ? kernel_.setUp(*link_, false) : Outcome();
    if (done.ok()) {
        done = socket_.request(requests().setType(type));
    }
    const Outcome up = link_->up ? kernel_.setUp(*link_, true) : Outcome();
    return done.ok() ? up : done;
}

Outcome KernelWireless::look(const std::string& network, const std::optional<std::string>& key) {
    network_ = network;
    key_ = key;
    phase_ = Phase::idle;
    notBefore_ = {};
    reason_ = "no network of that name was heard";
    return listen();
}

Outcome KernelWireless::startJoining(const std::string& network, const std::optional<std::string>& key,
                                     bool mayStay) {
    WirelessState now;
    Outcome done = read(now);
    if (done.ok() && mayStay && now.network == network) {
        phase_ = Phase::done;
        return listen();
    }
    if (done.ok()) {
        done = leave();
    }
    if (done.ok() && now.type != NL80211_IFTYPE_ADHOC) {
        done = setType(NL80211_IFTYPE_STATION);
    }
    return done.ok() ? look(network, key) : done;
}

Outcome KernelWireless::startRestoring(const WirelessState& before) {
    WirelessState now;
    Outcome done = read(now);
    phase_ = Phase::done;
    if (!done.ok() || now == before) {
        return done;
    }
    done = leave();
    if (done.ok()) {
        done = refuse(setType(before.type));
    }
    if (done.ok() && phase_ != Phase::refused && before.isProtected) {
        phase_ = Phase::refused;
        reason_ = "it was on a network with a key, which only the one who joined it has";
        return done;
    }
    return done.ok() && phase_ != Phase::refused && !before.network.empty()
               ? look(before.network, std::nullopt)
               : done;
}

Outcome KernelWireless::refuse(Outcome refused) {
    if (refused.ok() || socket_.error() == 0 || refused.status() == kSCStatusAccessError) {
        return refused;
    }
    phase_ = Phase::refused;
    reason_ = refused.reason();
    return {};
}

void KernelWireless::takeNotices(bool& isScanOver, std::optional<std::uint16_t>& joinStatus) {
    for (const OwnedMessage& message : notices_.takeNotices(isScanOver)) {
        if (const auto notice = decodeNotice(message.view(), link_->index)) {
            isScanOver = isScanOver || notice->isScanEnd;
            joinStatus = notice->joinStatus ? notice->joinStatus : joinStatus;
        }
    }
}

Outcome KernelWireless::goOn(Progress& progress) {
    bool isScanOver = false;
    std::optional<std::uint16_t> joinStatus;
    if (phase_ != Phase::done && phase_ != Phase::refused) {
        takeNotices(isScanOver, joinStatus);
    }
    Outcome done;
    if (phase_ == Phase::scanning && (isScanOver || Clock::now() - since_ > longestScan)) {
        done = join();
    } else if (phase_ == Phase::scanning && !isScanEnding_) {
        done = endScanEarly();
    } else if (phase_ == Phase::joining) {
        done = checkJoined(joinStatus);
    }
    if (done.ok() && phase_ == Phase::idle && Clock::now() >= notBefore_) {
        done = scan();
    }
    switch (phase_) {
        case Phase::idle:
        case Phase::scanning:
            progress = Progress::looking;
            break;
        case Phase::joining:
            progress = Progress::joining;
            break;
        case Phase::done:
            progress = Progress::done;
            break;
        case Phase::refused:
            progress = Progress::refused;
            break;
    }
    return done;
}

Outcome KernelWireless::scan() {
    since_ = Clock::now();
    // Somebody else's scan goes on, or the link is down for a moment: asked again the next time.
    Outcome done = socket_.request(requests().scan(network_), {EBUSY, ENETDOWN});
    if (done.ok() && socket_.error() == 0) {
        phase_ = Phase::scanning;
        isScanEnding_ = false;
    }
    return refuse(std::move(done));
}

// Only what was heard since this scan began: the kernel remembers for long what has gone since.
Outcome KernelWireless::choose(NetworkChoice& choice) {
    std::vector<HeardNetwork> heard;
    Outcome done = readHeard(heard);
    const auto age = std::chrono::duration_cast<std::chrono::milliseconds>(Clock::now() - since_);
    choice = chooseNetwork(heard, network_, key_, age + ageError);
    return refuse(std::move(done));
}

Outcome KernelWireless::endScanEarly() {
    NetworkChoice choice;
    Outcome done = choose(choice);
    if (done.ok() && choice.network && choice.network->signal >= goodSignal) {
        isScanEnding_ = true;
        // A card that can't end it sends its notice later.
        (void)socket_.request(requests().endScan());
    }
    return done;
}

Outcome KernelWireless::join() {
    NetworkChoice choice;
    Outcome done = choose(choice);
    if (!done.ok() || phase_ == Phase::refused) {
        return done;
    }
    reason_ = choice.reason;
    phase_ = choice.isHopeless ? Phase::refused : Phase::idle;
    if (!choice.network) {
        return {};
    }
    chosen_ = std::move(choice.network);
    done = refuse(setType(chosen_->isAdHoc ? NL80211_IFTYPE_ADHOC : NL80211_IFTYPE_STATION));
    if (done.ok() && phase_ != Phase::refused) {
        phase_ = Phase::joining;
        since_ = Clock::now();
        reason_ = "the network did not let the card in yet";
        done = refuse(socket_.request(requests().join(*chosen_, key_)));
    }
    return done;
}

Outcome KernelWireless::checkJoined(std::optional<std::uint16_t> joinStatus) {
    std::optional<HeardNetwork> current;
    Outcome done = readCurrent(current);
    if (!done.ok()) {
        return refuse(std::move(done));
    }
    const bool isThere = current && current->network == network_ && current->bssid == chosen_->bssid;
    // A card that joins a cell whose last member has just left forms it anew, and hears nobody then.
    if (isThere && (!current->isAdHoc || current->age + ageError < Clock::now() - since_)) {
        phase_ = Phase::done;
        reason_.clear();
    } else if (joinStatus.value_or(0) != 0 || Clock::now() - since_ > longestJoining) {
        reason_ = joinStatus.value_or(WirelessNotice::noAnswer) == WirelessNotice::noAnswer
                      ? "the network did not answer the card"
                      : "the network did not let the card in (status " + std::to_string(*joinStatus) + ")";
        phase_ = Phase::idle;
        notBefore_ = Clock::now() + pauseAfterRefusal;
        done = leave();
    }
    return done;
}

}  // namespace platform::apply
