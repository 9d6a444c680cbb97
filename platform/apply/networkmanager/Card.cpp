#include "platform/apply/networkmanager/Card.h"

namespace platform::apply {

bool Card::step() {
    isWaiting_ = false;
    while (!isSettled_ && !isWaiting_) {
        task_.refusal = advance();
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
