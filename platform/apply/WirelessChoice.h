// How a wireless network is joined, decided from its key and from what is on the air. No reason holds the
// key.
#pragma once

#include <chrono>
#include <optional>
#include <span>
#include <string>

#include "platform/base/Outcome.h"

namespace platform::apply {

// What protects a network. wpa stands for a key that all share (WPA, WPA2, and WPA3 where the network still
// takes WPA2), sae for a network that takes WPA3 alone, enterprise for one that asks each user.
enum class Security { open, wep, wpa, sae, enterprise };

// WEP: 5 or 13 ASCII characters, or 10 or 26 hexadecimal digits. WPA: 8 to 63 bytes of text, or 64
// hexadecimal digits. A key with a control character fits neither.
[[nodiscard]] bool fitsWEP(const std::string& key);
[[nodiscard]] bool fitsWPA(const std::string& key);
// Whether a key that fits is given in digits rather than in characters.
[[nodiscard]] bool isInDigits(const std::string& key);

// A network of the wanted name, as a scan heard it: an access point, or a cell of a network without one.
struct HeardNetwork {
    bool isAdHoc = false;
    Security security = Security::open;
    int strength = 0;   // the higher the better, in a unit of the caller's
    int frequency = 0;  // MHz
    std::string bssid = {};
    std::chrono::seconds age{0};  // since it was last heard
};

struct JoinChoice {
    // False: nothing on the air fits, and the network is to be joined as an access point when it appears. A
    // network without an access point is only ever joined, never formed.
    bool isHeard = false;
    bool isAdHoc = false;
    Security security = Security::open;
    int frequency = 0;  // of an ad-hoc cell
    // Whether another choice asks for the same settings.
    [[nodiscard]] bool isSameJoin(const JoinChoice& other) const noexcept {
        return isAdHoc == other.isAdHoc && security == other.security && frequency == other.frequency;
    }
};

struct JoinDecision {
    // Nothing when no network can be joined with this key, or what was heard will not be.
    std::optional<JoinChoice> choice;
    // Why nothing that was heard is joined; empty when something is.
    std::string reason;
};

// A cell that was heard longer ago than this may not be there any more, and joining it would form it anew.
inline constexpr std::chrono::seconds oldestCell{15};

// With a key no open network of the name is joined, and without one no other: whoever sends the same name is
// not the network that the key is for. A key of a form that WEP and WPA have is taken for WPA's unless only a
// WEP network was heard; among the networks that fit, the better protected and then the stronger one is
// joined.
[[nodiscard]] JoinDecision chooseNetwork(std::span<const HeardNetwork> heard,
                                         const std::optional<std::string>& key);

}  // namespace platform::apply
