#include "platform/apply/direct/KernelWireless.h"

#include <linux/nl80211.h>

#include <cerrno>
#include <utility>
#include <vector>

#include "platform/apply/WirelessChoice.h"

namespace platform::apply {
namespace {

using Clock = std::chrono::steady_clock;

// After these a notice is taken for lost. A card looks through both bands in 3 to 10 s.
constexpr std::chrono::seconds longestScan{15};
constexpr std::chrono::seconds longestJoining{10};
// The kernel sends nothing until it has taken note of the carrier, up to a second after it is there.
constexpr std::chrono::seconds longestCarrier{2};
// Hundredths of a dBm: so good that it need not be compared with what the rest of a scan might find.
constexpr int goodSignal = -6500;
// An access point that says no is not asked again at once.
constexpr std::chrono::seconds pauseAfterRefusal{1};
// The kernel counts an entry's age in ticks of its clock.
constexpr std::chrono::milliseconds ageError{20};
constexpr const char* notHeard = "no network of that name was heard";

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

// Why a network can't be joined with that key, or without one; empty when it can.
std::string obstacleTo(const ScanEntry& entry, const std::optional<std::string>& key) {
    if (entry.security == Security::open) {
        return key ? "an open network of that name is on the air, and with a key none is joined" : "";
    }
    if (entry.security == Security::wep) {
        return !key ? "the network asks for a key and the location holds none"
               : !fitsWEP(*key)
                   ? "the key fits no WEP network, whose keys have 5 or 13 characters or 10 or 26 "
                     "hexadecimal digits"
                   : "";
    }
    return "the network asks for WPA" + describe(entry.keyManagement) +
           ", and no wireless supplicant runs for this card";
}

class KernelJoin : public WirelessJoin {
  public:
    // The card is on no network.
    KernelJoin(WirelessCard card, std::string network, std::optional<std::string> key)
        : card_(std::move(card)), network_(std::move(network)), key_(std::move(key)) {}
    // Joined already, or, for a reason, given up.
    explicit KernelJoin(std::string reason)
        : phase_(reason.empty() ? Phase::joined : Phase::givenUp), reason_(std::move(reason)) {}

    Outcome poll(State& state, std::string& reason) override;

  private:
    // idle: a scan is to be started.
    enum class Phase { idle, scanning, joining, joined, givenUp };

    Outcome goOn();
    Outcome scan();
    Outcome choose(EntryChoice& choice);
    Outcome endScanEarly();
    Outcome join();
    Outcome checkJoined(std::optional<std::uint16_t> joinStatus);

    WirelessCard card_;
    std::string network_;
    std::optional<std::string> key_;
    Phase phase_ = Phase::idle;
    std::optional<ScanEntry> chosen_;
    Clock::time_point since_;      // of the scan, or of the joining
    Clock::time_point notBefore_;  // of the next scan
    bool isScanEnding_ = false;
    std::string reason_ = notHeard;
};

Outcome KernelJoin::poll(State& state, std::string& reason) {
    Outcome done = phase_ == Phase::joined || phase_ == Phase::givenUp ? Outcome() : goOn();
    // What the kernel refuses, other than for lack of rights, is what this card or network can't do.
    if (!done.ok() && card_.error() != 0 && done.status() != kSCStatusAccessError) {
        phase_ = Phase::givenUp;
        reason_ = card_.error() == ENODEV ? "the card is gone" : done.reason();
        done = {};
    }
    state = phase_ == Phase::joined    ? State::joined
            : phase_ == Phase::givenUp ? State::givenUp
                                       : State::waiting;
    reason = reason_;
    return done;
}

Outcome KernelJoin::goOn() {
    bool isScanOver = false;
    std::optional<std::uint16_t> joinStatus;
    card_.takeNotices(isScanOver, joinStatus);
    if (phase_ == Phase::joining) {
        return checkJoined(joinStatus);
    }
    if (phase_ == Phase::scanning) {
        if (isScanOver || Clock::now() - since_ > longestScan) {
            RETURN_IF_FAILED(join());
        } else if (!isScanEnding_) {
            RETURN_IF_FAILED(endScanEarly());
        }
    }
    return phase_ == Phase::idle && Clock::now() >= notBefore_ ? scan() : Outcome();
}

Outcome KernelJoin::scan() {
    since_ = Clock::now();
    RETURN_IF_FAILED(card_.scan(network_));
    // When there is none yet, it is asked for again the next time.
    if (card_.error() == 0) {
        phase_ = Phase::scanning;
        isScanEnding_ = false;
    }
    return {};
}

// Only what was heard since this scan began: the kernel remembers for long what has gone since.
Outcome KernelJoin::choose(EntryChoice& choice) {
    std::vector<ScanEntry> entries;
    RETURN_IF_FAILED(card_.readEntries(entries));
    const auto age = std::chrono::duration_cast<std::chrono::milliseconds>(Clock::now() - since_);
    choice = chooseEntry(entries, network_, key_, age + ageError);
    return {};
}

Outcome KernelJoin::endScanEarly() {
    EntryChoice choice;
    RETURN_IF_FAILED(choose(choice));
    if (choice.entry && choice.entry->signal >= goodSignal) {
        isScanEnding_ = true;
        card_.endScan();
    }
    return {};
}

Outcome KernelJoin::join() {
    EntryChoice choice;
    RETURN_IF_FAILED(choose(choice));
    reason_ = choice.reason;
    phase_ = choice.isHopeless ? Phase::givenUp : Phase::idle;
    if (!choice.entry) {
        return {};
    }
    chosen_ = std::move(choice.entry);
    RETURN_IF_FAILED(card_.setType(chosen_->isAdHoc ? NL80211_IFTYPE_ADHOC : NL80211_IFTYPE_STATION));
    phase_ = Phase::joining;
    since_ = Clock::now();
    reason_ = "the network was heard and has not let the card in yet";
    return card_.join(*chosen_, key_);
}

Outcome KernelJoin::checkJoined(std::optional<std::uint16_t> joinStatus) {
    std::optional<ScanEntry> current;
    bool isRunning = false;
    RETURN_IF_FAILED(card_.readCurrent(current));
    RETURN_IF_FAILED(card_.readRunning(isRunning));
    const auto elapsed = Clock::now() - since_;
    // A card that joins a cell whose last member has just left forms it anew, and hears nobody then.
    const bool isThere = current && current->network == network_ && current->bssid == chosen_->bssid &&
                         (!current->isAdHoc || current->age + ageError < elapsed);
    if (isThere && (isRunning || elapsed > longestCarrier)) {
        phase_ = Phase::joined;
        reason_.clear();
        return {};
    }
    if (joinStatus.value_or(0) != 0 || elapsed > longestJoining) {
        reason_ = joinStatus.value_or(WirelessNotice::noAnswer) == WirelessNotice::noAnswer
                      ? "the network did not answer the card"
                      : "the network did not let the card in (status " + std::to_string(*joinStatus) + ")";
        phase_ = Phase::idle;
        notBefore_ = Clock::now() + pauseAfterRefusal;
        return card_.leave();
    }
    return {};
}

}  // namespace

EntryChoice chooseEntry(std::span<const ScanEntry> entries, const std::string& network,
                        const std::optional<std::string>& key, std::chrono::milliseconds age) {
    EntryChoice choice{std::nullopt, false, notHeard};
    for (const ScanEntry& entry : entries) {
        if (entry.network != network || entry.age > age) {
            continue;
        }
        std::string obstacle = obstacleTo(entry, key);
        if (!obstacle.empty()) {
            // An open network may be anybody's: the one that the key is for may still appear.
            choice.isHopeless = choice.isHopeless || entry.security != Security::open;
            choice.reason = std::move(obstacle);
        } else if (!choice.entry || entry.signal > choice.entry->signal) {
            choice.entry = entry;
        }
    }
    if (choice.entry) {
        choice.isHopeless = false;
        choice.reason.clear();
    }
    return choice;
}

Outcome readWirelessState(const std::string& interface, std::optional<WirelessState>& state) {
    state.reset();
    WirelessCard card;
    bool isWireless = false;
    RETURN_IF_FAILED(card.open(interface, isWireless));
    return isWireless ? card.read(state.emplace()) : Outcome();
}

Outcome joinByKernel(const std::string& interface, const WirelessSettings& settings, bool mayStay,
                     std::unique_ptr<WirelessJoin>& join) {
    join.reset();
    WirelessCard card;
    bool isWireless = false;
    RETURN_IF_FAILED(card.open(interface, isWireless));
    if (!isWireless || !settings.network) {
        return {};
    }
    WirelessState now;
    RETURN_IF_FAILED(card.read(now));
    if (mayStay && now.network == *settings.network) {
        join = std::make_unique<KernelJoin>("");
        return {};
    }
    RETURN_IF_FAILED(card.leave());
    if (now.type != NL80211_IFTYPE_ADHOC) {
        RETURN_IF_FAILED(card.setType(NL80211_IFTYPE_STATION));
    }
    RETURN_IF_FAILED(card.listen());
    join = std::make_unique<KernelJoin>(std::move(card), *settings.network, settings.key);
    return {};
}

Outcome leaveByKernel(const std::string& interface, const std::optional<WirelessState>& before,
                      std::unique_ptr<WirelessJoin>& join) {
    join.reset();
    WirelessCard card;
    bool isWireless = false;
    RETURN_IF_FAILED(card.open(interface, isWireless));
    if (!isWireless) {
        return {};
    }
    WirelessState now;
    RETURN_IF_FAILED(card.read(now));
    if (before == now) {
        return {};
    }
    RETURN_IF_FAILED(card.leave());
    if (!before) {
        return {};
    }
    RETURN_IF_FAILED(card.setType(before->type));
    if (before->isProtected) {
        join = std::make_unique<KernelJoin>(
            "the network that the card was on had a key, and only whoever gave it can join it again");
    } else if (!before->network.empty()) {
        RETURN_IF_FAILED(card.listen());
        join = std::make_unique<KernelJoin>(std::move(card), before->network, std::nullopt);
    }
    return {};
}

}  // namespace platform::apply
