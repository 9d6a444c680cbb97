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
        : Card(daemon, task, std::move(earlier), deadline), place_(std::move(place)) {
        next(&RestoringCard::begin);
    }
    RestoringCard(const RestoringCard&) = delete;
    RestoringCard& operator=(const RestoringCard&) = delete;
    ~RestoringCard() override { place_->isTaken = true; }

  private:
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
        next(&RestoringCard::becomeReady);
        return {};
    }

    Outcome leave() {
        settle();
        RETURN_IF_FAILED(removeProfile());
        return iwdOutcome_;
    }

    Outcome becomeReady() {
        bool isReady = false;
        RETURN_IF_FAILED(awaitReady(isReady));
        if (isWaiting()) {
            return {};
        }
        if (before().uuid.empty()) {
            next(&RestoringCard::comeToRest);
            return daemon_.disconnect(device_);
        }
        return activateEarlier(isReady);
    }

    Outcome comeToRest() {
        RETURN_IF_FAILED(awaitRest());
        return isWaiting() ? Outcome() : finishWith("");
    }

    Outcome activateEarlier(bool isReady) {
        std::optional<Profile> profile;
        RETURN_IF_FAILED(daemon_.findProfile(before().uuid, profile));
        if (!profile || !isReady) {
            // What is active next is up to the daemon, as if this system had never been there.
            return finishWith(profile ? "no profile can be active on it now"
                                      : "the profile that was active on it is deleted");
        }
        profile_ = profile->path;
        network_ = networkOf(profile->sections);
        placeDeadline_ = Clock::now() + placeBound;
        next(&RestoringCard::awaitPlace);
        return {};
    }

    Outcome awaitPlace() {
        const bool isBack = active_ && active_->uuid == before().uuid;
        if (!isBack && place_->before && !place_->before->isTaken && waitsUntil(placeDeadline_)) {
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
        next(&RestoringCard::comeUp);
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
            return finishWith("");
        }
        if (state == activeDeactivated) {
            next(&RestoringCard::tellFailure);
            reasonDeadline_ = Clock::now() + reasonBound;
        } else if (isLate()) {
            return finishWith("the profile that was active before is not up yet; NetworkManager goes on");
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
            return finishWith("the network of before is not there now, and is joined when it comes");
        }
        return std::exchange(isAskedAgain_, true) ? Outcome()
                                                  : daemon_.activate(profile_, device_, active_->path);
    }

    Outcome tellFailure() {
        const std::uint32_t reason = awaitReason();
        return isWaiting() ? Outcome()
                           : finishWith("the profile that was active before does not come up: " +
                                        describeFailure(reason));
    }

    Outcome finishWith(const std::string& trouble) {
        task_.trouble = trouble;
        next(&RestoringCard::finish);
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
            RETURN_IF_FAILED(findCard(device));
        }
        if (before_.radioOff.value_or(false)) {
            RETURN_IF_FAILED(switchRadio(interface_, false));
        } else if (!before_.radioOff && !before().radio && daemon_.isRadioOn()) {
            RETURN_IF_FAILED(daemon_.setRadio(false));
        }
        settle();
        RETURN_IF_FAILED(iwdOutcome_);
        return task_.trouble.empty() && device ? compare(*device) : Outcome();
    }

    Outcome compare(const Device& device) {
        std::optional<Active> active;
        RETURN_IF_FAILED(daemon_.findActive(device, active));
        const bool isSame = (active ? active->uuid : "") == before().uuid && device.managed &&
                            device.autoconnect == before().autoconnect;
        return isSame ? Outcome() : Outcome(kSCStatusFailed, "it is not as it was before");
    }

    const std::shared_ptr<Place> place_;
    std::string profile_;  // the path of the earlier profile
    Clock::time_point placeDeadline_;
    Outcome iwdOutcome_;
    std::string network_;  // of the earlier profile; empty for a wired card
    std::optional<Clock::time_point> decideAt_;
    bool isAskedAgain_ = false;
};

}  // namespace

std::unique_ptr<Card> makeRestoringCard(Daemon& daemon, Task& task, const CardSnapshot& earlier,
                                        std::shared_ptr<Place> place, Clock::time_point deadline) {
    return std::make_unique<RestoringCard>(daemon, task, earlier, std::move(place), deadline);
}

}  // namespace platform::apply
