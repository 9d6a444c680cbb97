// A card that is given the settings of a plan.
#include <algorithm>
#include <utility>

#include "platform/apply/Radio.h"
#include "platform/apply/networkmanager/Card.h"

namespace platform::apply {
namespace {

// Between two looks at what is on the air when nothing tells of a change.
constexpr std::chrono::seconds lookAgain{2};
constexpr std::chrono::seconds scanAgain{3};

class ConfiguringCard final : public Card {
  public:
    ConfiguringCard(Daemon& daemon, Task& task, CardSnapshot earlier, Clock::time_point deadline)
        : Card(daemon, task, std::move(earlier), deadline), plan_(*task.plan) {
        next(&ConfiguringCard::begin);
    }

  private:
    [[nodiscard]] std::optional<std::string> network() const {
        return plan_.wireless ? plan_.wireless->network : std::nullopt;
    }
    [[nodiscard]] std::optional<std::string> key() const {
        return plan_.wireless ? plan_.wireless->key : std::nullopt;
    }
    [[nodiscard]] bool isWireless() const { return device_.kind == Device::Kind::wireless; }

    Outcome begin() {
        std::optional<Device> device;
        RETURN_IF_FAILED(findCard(device));
        if (!device) {
            settle(isOff(plan_) ? "" : "there is no such interface");
            return {};
        }
        device_ = std::move(*device);
        if (isOff(plan_)) {
            next(&ConfiguringCard::comeToRest);
            return daemon_.disconnect(device_);
        }
        if (!isWireless() && network()) {
            task_.trouble = "a network to join is named, and the card is not a wireless one";
        }
        if (!device_.managed) {
            RETURN_IF_FAILED(daemon_.setManaged(device_, true));
        }
        readyDeadline_ = Clock::now() + readyBound;
        if (isWireless()) {
            RETURN_IF_FAILED(switchRadioOn());
        }
        next(&ConfiguringCard::becomeReady);
        return {};
    }

    Outcome switchRadioOn() {
        const bool isWanted = plan_.wireless && plan_.wireless->powerEnabled.value_or(false);
        if (!isWanted) {
            return {};
        }
        const std::optional<Radio> radio = readRadio(interface_);
        // The card's own switch, when it has one: the daemon switches all cards, and follows this one.
        if (radio && radio->isOff) {
            RETURN_IF_FAILED(switchRadio(interface_, true));
            readyDeadline_ = Clock::now() + radioBound;
        } else if (!daemon_.isRadioOn()) {
            RETURN_IF_FAILED(daemon_.setRadio(true));
            readyDeadline_ = Clock::now() + radioBound;
        }
        if (daemon_.isRadioBlocked()) {
            task_.trouble = "the radio is switched off by a switch on the computer";
            readyDeadline_ = Clock::now();
        }
        return {};
    }

    // Nothing is active on it any more.
    Outcome comeToRest() {
        RETURN_IF_FAILED(awaitRest());
        if (isWaiting()) {
            return {};
        }
        // Only after it has come to rest: it then stays unmanaged through a restart of the daemon.
        if (device_.managed) {
            RETURN_IF_FAILED(daemon_.setManaged(device_, false));
        }
        RETURN_IF_FAILED(removeProfile());
        settle();
        return {};
    }

    Outcome becomeReady() {
        RETURN_IF_FAILED(awaitReady(isReady_));
        if (isWaiting()) {
            return {};
        }
        RETURN_IF_FAILED(daemon_.findActive(device_, active_));
        next(isWireless() ? &ConfiguringCard::chooseLink : &ConfiguringCard::store);
        return {};
    }

    // How a wireless card gets onto its network. Come back to as long as the card is not on it, since what is
    // on the air changes.
    Outcome chooseLink() {
        changesOnAir_ = daemon_.changesOnAir();
        lookAgainAt_ = Clock::now() + lookAgain;
        if (!link_ && active_ && !active_->external) {
            std::optional<Profile> current;
            RETURN_IF_FAILED(daemon_.findProfile(active_->uuid, current));
            if (current) {
                link_.emplace().current = wirelessSections(current->sections);
                RETURN_IF_FAILED(daemon_.readSecrets(current->path, link_->current));
            }
        }
        const bool isOnOne = link_ && !link_->current.empty();
        if (!network() || (isOnOne && !key() && networkOf(link_->current) == network())) {
            if (!isOnOne) {
                settle("no network is named and the card is on none, so it joins none");
                return {};
            }
            next(&ConfiguringCard::store);
            return {};
        }
        std::vector<HeardNetwork> heard;
        if (isReady_) {
            RETURN_IF_FAILED(daemon_.readHeard(device_, *network(), heard));
        }
        JoinDecision decision = chooseNetwork(heard, key());
        reason_ = decision.reason;
        if (!decision.choice) {
            settle(reason_);
            return holdStill();
        }
        if (!decision.choice->isHeard && reason_.empty()) {
            reason_ = "the network was not found";
        }
        // What is not heard now may be heard again: the daemon keeps what it was told.
        const bool isNew =
            !link_ || !link_->choice ||
            (decision.choice->isHeard && (isSearching_ || !decision.choice->isSameJoin(*link_->choice)));
        if (!isNew) {
            std::int64_t lastScan = 0;
            RETURN_IF_FAILED(daemon_.readLastScan(device_, lastScan));
            if (decision.choice->isHeard && lastScan != lastScan_ && !isAskedAgain_) {
                link_->choice = *decision.choice;
                isAskedAgain_ = true;
                askAgainAt_ = Clock::now() + joinsAtOnce;
            }
            next(isSearching_ ? &ConfiguringCard::search : &ConfiguringCard::comeUp);
            return {};
        }
        isAskedAgain_ = false;
        askAgainAt_.reset();
        isSearching_ = false;
        if (!link_) {
            link_.emplace();
        }
        link_->choice = *decision.choice;
        // Or it would turn to another one as soon as this one goes away.
        RETURN_IF_FAILED(daemon_.iwd().limitAutoconnect(before_.iwdAutoconnect, network()));
        next(&ConfiguringCard::store);
        return {};
    }

    // Puts the profile into the daemon and asks for it to be activated, unless it is already.
    Outcome store() {
        const Sections sections =
            makeProfile(plan_, isWireless() ? &link_.value() : nullptr, before_.profile);
        const std::string secret = key().value_or("");
        std::optional<Profile> known;
        bool isForeign = false;
        RETURN_IF_FAILED(findOurProfile(known, isForeign));
        if (isForeign) {
            return {kSCStatusFailed, "another program has a profile under this system's UUID"};
        }
        std::string path;
        bool isChanged = true;
        if (!isReady_) {
            // The daemon activates it by itself when the card can be used.
            if (known) {
                RETURN_IF_FAILED(daemon_.deleteProfile(known->path));
            }
            RETURN_IF_FAILED(daemon_.addProfile(sections, Adding::atOnce, secret, path));
            RETURN_IF_FAILED(daemon_.setAutoconnect(device_, true));
            settle(isWireless() ? "the card cannot be used now" : "it has no carrier: the cable is out");
            return {};
        }
        if (known) {
            RETURN_IF_FAILED(update(*known, sections, secret, isChanged));
            path = known->path;
        }
        if (known && (isChanged || !active_ || active_->profile != path)) {
            // iwd is given a key only at the first activation of a profile.
            bool isIwdRunning = false;
            RETURN_IF_FAILED(daemon_.iwd().isRunning(isIwdRunning));
            if (isIwdRunning) {
                RETURN_IF_FAILED(daemon_.deleteProfile(path));
                active_.reset();
                known.reset();
            }
        }
        if (!known) {
            RETURN_IF_FAILED(daemon_.addProfile(sections, Adding::heldBack, secret, path));
        }
        if (isChanged || !active_ || active_->profile != path) {
            if (isWireless() && active_ && active_->uuid != profileUUID(interface_)) {
                // The daemon turns to none of its own accord from which it was told to disconnect, however
                // long the wanted network stays away.
                RETURN_IF_FAILED(daemon_.disconnect(device_));
            }
            active_.emplace().profile = path;
            active_->uuid = profileUUID(interface_);
            if (isWireless()) {
                RETURN_IF_FAILED(daemon_.readLastScan(device_, lastScan_));
            }
            RETURN_IF_FAILED(daemon_.activate(path, device_, active_->path));
        }
        next(&ConfiguringCard::comeUp);
        return {};
    }

    // Whether it says something new is seen by reading it twice: the daemon writes a profile its own way.
    Outcome update(const Profile& known, const Sections& sections, const std::string& secret,
                   bool& isChanged) {
        Sections before = known.sections;
        RETURN_IF_FAILED(daemon_.readSecrets(known.path, before));
        RETURN_IF_FAILED(daemon_.updateProfile(known.path, sections, secret));
        std::optional<Profile> after;
        bool isForeign = false;
        RETURN_IF_FAILED(findOurProfile(after, isForeign));
        if (after) {
            RETURN_IF_FAILED(daemon_.readSecrets(known.path, after->sections));
            isChanged = after->sections != before;
        }
        return {};
    }

    Outcome comeUp() {
        std::uint32_t state = 0;
        RETURN_IF_FAILED(daemon_.activeState(active_->path, state));
        if (state == activeActivated) {
            settle();
        } else if (state == activeDeactivated) {
            next(&ConfiguringCard::tellFailure);
            reasonDeadline_ = Clock::now() + reasonBound;
        } else if (isLate()) {
            return giveUp();
        } else if (askAgainAt_ && Clock::now() >= *askAgainAt_) {
            askAgainAt_.reset();
            RETURN_IF_FAILED(daemon_.deviceState(device_.path, state));
            if (state < deviceGetsAddresses) {
                active_.reset();
                next(&ConfiguringCard::store);
            }
        } else if (link_ && link_->choice &&
                   (changesOnAir_ != daemon_.changesOnAir() || Clock::now() >= lookAgainAt_)) {
            next(&ConfiguringCard::chooseLink);
        } else {
            waitUntil(askAgainAt_.value_or(link_ && link_->choice ? lookAgainAt_ : deadline_));
        }
        return {};
    }

    // At the deadline.
    Outcome giveUp() {
        std::uint32_t state = 0;
        RETURN_IF_FAILED(daemon_.deviceState(device_.path, state));
        if (state >= deviceGetsAddresses && state <= deviceActivated && plan_.method == IPv4Method::dhcp) {
            settle("no DHCP server answered; NetworkManager goes on asking");
        } else {
            settle(reason_.empty() ? "it was not up in time" : reason_);
            if (link_ && link_->choice && !link_->choice->isHeard) {
                return leaveToTheDaemon();
            }
        }
        return {};
    }

    // The daemon joins a network by itself when it comes on the air, unless it has tried it in vain: so it
    // gets the profile anew.
    Outcome leaveToTheDaemon() {
        RETURN_IF_FAILED(daemon_.disconnect(device_));
        RETURN_IF_FAILED(removeProfile());
        std::string path;
        RETURN_IF_FAILED(daemon_.addProfile(makeProfile(plan_, &link_.value(), before_.profile),
                                            Adding::atOnce, key().value_or(""), path));
        return daemon_.setAutoconnect(device_, true);
    }

    // There are daemons that try only what they have heard: then it is looked for first.
    Outcome search() {
        if (isLate()) {
            return giveUp();
        }
        if (Clock::now() >= scanAgainAt_) {
            scanAgainAt_ = Clock::now() + scanAgain;
            RETURN_IF_FAILED(daemon_.scanFor(device_, network().value_or("")));
        }
        if (changesOnAir_ == daemon_.changesOnAir() && Clock::now() < lookAgainAt_) {
            waitUntil(std::min(lookAgainAt_, scanAgainAt_));
        } else {
            next(&ConfiguringCard::chooseLink);
        }
        return {};
    }

    Outcome tellFailure() {
        if (link_ && link_->choice && !link_->choice->isHeard) {
            isSearching_ = true;
            active_.reset();
            next(&ConfiguringCard::search);
            // Or it would turn to another one of its own accord.
            return daemon_.disconnect(device_);
        }
        const std::uint32_t reason = awaitReason();
        if (isWaiting()) {
            return {};
        }
        settle(describeFailure(reason));
        return isWireless() ? holdStill() : Outcome();
    }

    // The daemon would turn to another network of its own accord, and the location names this one.
    Outcome holdStill() {
        RETURN_IF_FAILED(daemon_.setAutoconnect(device_, false));
        return daemon_.disconnect(device_);
    }

    const InterfacePlan& plan_;
    bool isReady_ = false;
    Clock::time_point lookAgainAt_;
    Clock::time_point scanAgainAt_;
    bool isAskedAgain_ = false;
    std::optional<Clock::time_point> askAgainAt_;
    bool isSearching_ = false;
    std::optional<WirelessLink> link_;  // of a wireless card
    std::string reason_;                // why the card is not on its network so far
};

}  // namespace

std::unique_ptr<Card> makeConfiguringCard(Daemon& daemon, Task& task, const CardSnapshot& earlier,
                                          Clock::time_point deadline) {
    return std::make_unique<ConfiguringCard>(daemon, task, earlier, deadline);
}

}  // namespace platform::apply
