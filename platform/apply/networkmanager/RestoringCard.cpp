// A card that is given back: what was active on it before is active again.
#include <utility>

#include "platform/apply/Radio.h"
#include "platform/apply/networkmanager/Card.h"
#include "platform/base/Log.h"

namespace platform::apply {
namespace {

// On both bands, by a card that is on a network.
constexpr std::chrono::seconds longestScan{10};

class RestoringCard final : public Card {
  public:
    RestoringCard(Daemon& daemon, Task& task, CardSnapshot earlier, std::shared_ptr<Place> place,
                  Clock::time_point deadline)
        : Card(daemon, task, deadline), before_(std::move(earlier)), place_(std::move(place)) {}
    RestoringCard(const RestoringCard&) = delete;
    RestoringCard& operator=(const RestoringCard&) = delete;
    ~RestoringCard() override { place_->isTaken = true; }

  private:
    // One of the steps below; each names the one that comes next.
    using Stage = Outcome (RestoringCard::*)();

    Outcome advance() override { return (this->*stage_)(); }

    [[nodiscard]] const ProfileSnapshot& before() const { return before_.profile; }

    Outcome begin() {
        // The card comes back also where iwd does not answer, which the next run asks again.
        iwdOutcome_ = daemon_.iwd().limitAutoconnect(before_.iwdAutoconnect, std::nullopt);
        std::optional<Device> device;
        RETURN_IF_FAILED(findCard(device));
        if (!device) {
            return leave();
        }
        device_ = std::move(*device);
        RETURN_IF_FAILED(daemon_.findActive(device_, active_));
        if (active_ && active_->uuid != before().uuid && active_->uuid != profileUUID(interface_)) {
            logLine(LogLevel::notice,
                    interface_ + ": somebody else has taken it over, and it is left to them");
            return leave();
        }
        readyDeadline_ = Clock::now();
        if (!device_.managed) {
            RETURN_IF_FAILED(daemon_.setManaged(device_, true));
            readyDeadline_ += readyBound;
        }
        stage_ = &RestoringCard::becomeReady;
        return {};
    }

    Outcome leave() {
        settle();
        RETURN_IF_FAILED(removeProfile());
        return iwdOutcome_;
    }

    Outcome becomeReady() {
        std::uint32_t state = 0;
        RETURN_IF_FAILED(daemon_.deviceState(device_.path, state));
        if (state < deviceDisconnected && Clock::now() < readyDeadline_) {
            waitUntil(readyDeadline_);
            return {};
        }
        if (before().uuid.empty()) {
            stage_ = &RestoringCard::comeToRest;
            return daemon_.disconnect(device_);
        }
        return activateEarlier(state >= deviceDisconnected);
    }

    Outcome comeToRest() {
        std::uint32_t state = 0;
        RETURN_IF_FAILED(daemon_.deviceState(device_.path, state));
        if (state <= deviceDisconnected) {
            stage_ = &RestoringCard::finish;
        } else if (isLate()) {
            return {kSCStatusFailed, "NetworkManager did not switch the card off in time"};
        } else {
            waitUntil(deadline_);
        }
        return {};
    }

    Outcome activateEarlier(bool isReady) {
        std::optional<Profile> profile;
        RETURN_IF_FAILED(daemon_.findProfile(before().uuid, profile));
        if (!profile || !isReady) {
            // What is active next is up to the daemon, as if this system had never been there.
            task_.trouble = profile ? "no profile can be active on it now"
                                    : "the profile that was active on it is deleted";
            stage_ = &RestoringCard::finish;
            return {};
        }
        profile_ = profile->path;
        network_ = networkOf(profile->sections);
        placeDeadline_ = Clock::now() + placeBound;
        stage_ = &RestoringCard::awaitPlace;
        return {};
    }

    Outcome awaitPlace() {
        const bool isBack = active_ && active_->uuid == before().uuid;
        if (!isBack && place_->before && !place_->before->isTaken && Clock::now() < placeDeadline_) {
            waitUntil(placeDeadline_);
            return {};
        }
        changesOnAir_ = daemon_.changesOnAir();
        if (!network_.empty()) {
            RETURN_IF_FAILED(daemon_.readLastScan(device_, lastScan_));
        }
        if (!isBack) {
            active_.emplace().uuid = before().uuid;
            RETURN_IF_FAILED(daemon_.activate(profile_, device_, active_->path));
        }
        placeDeadline_ = Clock::now() + placeBound;
        stage_ = &RestoringCard::comeUp;
        return {};
    }

    Outcome comeUp() {
        std::uint32_t state = 0;
        std::uint32_t cardState = 0;
        RETURN_IF_FAILED(daemon_.activeState(active_->path, state));
        RETURN_IF_FAILED(daemon_.deviceState(device_.path, cardState));
        place_->isTaken =
            place_->isTaken || (cardState >= deviceGetsAddresses && cardState <= deviceActivated);
        // What was not up before is asked for, and waited for only as long as its place is at stake.
        const bool isEnough = !before_.wasUp && (place_->isTaken || device_.kind == Device::Kind::wireless ||
                                                 Clock::now() >= placeDeadline_);
        if (state == activeActivated || isEnough) {
            stage_ = &RestoringCard::finish;
        } else if (state == activeDeactivated) {
            stage_ = &RestoringCard::tellFailure;
            reasonDeadline_ = Clock::now() + reasonBound;
        } else if (isLate()) {
            task_.trouble = "the profile that was active before is not up yet; NetworkManager goes on";
            stage_ = &RestoringCard::finish;
        } else if (before_.wasUp && !network_.empty() && changesOnAir_ != daemon_.changesOnAir()) {
            return lookAgain();
        } else if (decideAt_ && Clock::now() >= *decideAt_) {
            decideAt_.reset();
            return cardState < deviceGetsAddresses ? decide() : Outcome();
        } else {
            waitUntil(decideAt_.value_or(before_.wasUp ? deadline_ : placeDeadline_));
        }
        return {};
    }

    Outcome lookAgain() {
        changesOnAir_ = daemon_.changesOnAir();
        std::int64_t lastScan = 0;
        RETURN_IF_FAILED(daemon_.readLastScan(device_, lastScan));
        if (std::exchange(lastScan_, lastScan) != lastScan) {
            decideAt_ = Clock::now() + joinsAtOnce;
        }
        return {};
    }

    // What a whole scan did not hear is not waited for. One that was under way when the daemon was asked may
    // have heard it before.
    Outcome decide() {
        std::vector<HeardNetwork> heard;
        RETURN_IF_FAILED(daemon_.readHeard(device_, network_, heard));
        if (std::ranges::none_of(heard, [](const HeardNetwork& one) { return one.age <= longestScan; })) {
            task_.trouble = "the network of before is not there now, and is joined when it comes";
            stage_ = &RestoringCard::finish;
        } else if (!std::exchange(isAskedAgain_, true)) {
            return daemon_.activate(profile_, device_, active_->path);
        }
        return {};
    }

    Outcome tellFailure() {
        const std::uint32_t reason = daemon_.failureOf(device_.path);
        if (reason == 0 && Clock::now() < reasonDeadline_) {
            waitUntil(reasonDeadline_);
            return {};
        }
        task_.trouble = "the profile that was active before does not come up: " + describeFailure(reason);
        stage_ = &RestoringCard::finish;
        return {};
    }

    // Even when the earlier profile does not come up, the temporary one is not to stay in its place.
    Outcome finish() {
        RETURN_IF_FAILED(removeProfile());
        // Behind that, or the daemon would activate our profile again.
        std::optional<Device> device;
        RETURN_IF_FAILED(findCard(device));
        if (device && device->autoconnect != before().autoconnect) {
            RETURN_IF_FAILED(daemon_.setAutoconnect(*device, before().autoconnect));
        }
        if (before_.radioOff.value_or(false)) {
            RETURN_IF_FAILED(switchRadio(interface_, false));
        } else if (!before_.radioOff && !before().radio && daemon_.isRadioOn()) {
            RETURN_IF_FAILED(daemon_.setRadio(false));
        }
        settle();
        RETURN_IF_FAILED(iwdOutcome_);
        return task_.trouble.empty() ? compare() : Outcome();
    }

    Outcome compare() {
        std::optional<Device> device;
        std::optional<Active> active;
        RETURN_IF_FAILED(findCard(device));
        if (!device) {
            return {};
        }
        RETURN_IF_FAILED(daemon_.findActive(*device, active));
        const bool isSame = (active ? active->uuid : "") == before().uuid && device->managed &&
                            device->autoconnect == before().autoconnect;
        return isSame ? Outcome() : Outcome(kSCStatusFailed, "it is not as it was before");
    }

    const CardSnapshot before_;
    const std::shared_ptr<Place> place_;
    std::string profile_;  // the path of the earlier profile
    Clock::time_point placeDeadline_;
    Stage stage_ = &RestoringCard::begin;
    Outcome iwdOutcome_;
    Device device_;
    Clock::time_point readyDeadline_;
    Clock::time_point reasonDeadline_;
    std::optional<Active> active_;
    std::string network_;  // of the earlier profile; empty for a wired card
    std::int64_t lastScan_ = 0;
    unsigned changesOnAir_ = 0;
    std::optional<Clock::time_point> decideAt_;
    bool isAskedAgain_ = false;
};

}  // namespace

std::unique_ptr<Card> makeRestoringCard(Daemon& daemon, Task& task, const CardSnapshot& earlier,
                                        std::shared_ptr<Place> place, Clock::time_point deadline) {
    return std::make_unique<RestoringCard>(daemon, task, earlier, std::move(place), deadline);
}

}  // namespace platform::apply
