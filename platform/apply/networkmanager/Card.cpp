#include "platform/apply/networkmanager/Card.h"

namespace platform::apply {

bool Card::step() {
    isWaiting_ = false;
    while (!isSettled_ && !isWaiting_) {
        task_.refusal = (this->*next_)();
        isSettled_ = isSettled_ || !task_.refusal.ok();
    }
    return isSettled_;
}

void Card::settle(const std::string& trouble) {
    if (task_.trouble.empty()) {
        task_.trouble = trouble;
    }
    isSettled_ = true;
}

Outcome Card::findCard(std::optional<Device>& device) {
    RETURN_IF_FAILED(daemon_.findDevice(interface_, device));
    return device && device->kind == Device::Kind::wireless ? daemon_.listenToAir() : Outcome();
}

Outcome Card::awaitReady(bool& isReady) {
    std::uint32_t state = 0;
    RETURN_IF_FAILED(daemon_.deviceState(device_.path, state));
    isReady = state >= deviceDisconnected;
    if (!isReady) {
        waitsUntil(readyDeadline_);
    }
    return {};
}

Outcome Card::awaitRest() {
    std::uint32_t state = 0;
    RETURN_IF_FAILED(daemon_.deviceState(device_.path, state));
    if (state > deviceDisconnected) {
        if (isLate()) {
            return {kSCStatusFailed, "NetworkManager did not switch the card off in time"};
        }
        waitUntil(deadline_);
    }
    return {};
}

std::uint32_t Card::awaitReason() {
    const std::uint32_t reason = daemon_.failureOf(device_.path);
    if (reason == 0) {
        waitsUntil(reasonDeadline_);
    }
    return reason;
}

Outcome Card::findOurProfile(std::optional<Profile>& profile, bool& isForeign) {
    RETURN_IF_FAILED(daemon_.findProfile(profileUUID(interface_), profile));
    isForeign = profile && !isOurs(profile->sections);
    if (isForeign) {
        profile.reset();
    }
    return {};
}

Outcome Card::removeProfile() {
    std::optional<Profile> profile;
    bool isForeign = false;
    RETURN_IF_FAILED(findOurProfile(profile, isForeign));
    return profile ? daemon_.deleteProfile(profile->path) : Outcome();
}

}  // namespace platform::apply
