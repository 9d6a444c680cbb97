#include "platform/apply/WirelessChoice.h"

#include <algorithm>
#include <utility>

namespace platform::apply {
namespace {

bool isHexadecimal(const std::string& text) {
    return text.find_first_not_of("0123456789abcdefABCDEF") == std::string::npos;
}

bool holdsControl(const std::string& text) {
    return std::any_of(text.begin(), text.end(), [](unsigned char c) { return c < ' ' || c == 0x7F; });
}

bool isASCII(const std::string& text) {
    return std::all_of(text.begin(), text.end(), [](unsigned char c) { return c < 0x80; });
}

// Why a network is not joined with this key; null when it can be.
const char* whyNot(const HeardNetwork& network, const std::optional<std::string>& key) {
    switch (network.security) {
        case Security::open:
            return key ? "an open network of that name is on the air, and with a key none is joined"
                       : nullptr;
        case Security::wep:
            return !key ? "the network asks for a key and the location holds none"
                   : !fitsWEP(*key)
                       ? "the key fits no WEP network, whose keys have 5 or 13 characters or 10 or "
                         "26 hexadecimal digits"
                       : nullptr;
        case Security::wpa:
        case Security::sae:
            return !key             ? "the network asks for a key and the location holds none"
                   : !fitsWPA(*key) ? "the key fits no WPA network, whose keys have 8 to 63 characters or 64 "
                                      "hexadecimal digits"
                                    : nullptr;
        case Security::enterprise:
            return "the network asks each user for a name and a password, which a location does not hold";
    }
    return nullptr;
}

bool isBetter(const HeardNetwork& network, const HeardNetwork& other) {
    return std::pair(network.security, network.strength) > std::pair(other.security, other.strength);
}

}  // namespace

bool fitsWEP(const std::string& key) {
    const std::size_t size = key.size();
    return isASCII(key) && !holdsControl(key) &&
           (size == 5 || size == 13 || ((size == 10 || size == 26) && isHexadecimal(key)));
}

bool fitsWPA(const std::string& key) {
    const std::size_t size = key.size();
    return !holdsControl(key) && ((size >= 8 && size <= 63) || (size == 64 && isHexadecimal(key)));
}

bool isInDigits(const std::string& key) {
    return (key.size() == 10 || key.size() == 26 || key.size() == 64) && isHexadecimal(key);
}

JoinDecision chooseNetwork(std::span<const HeardNetwork> heard, const std::optional<std::string>& key) {
    if (key && !fitsWEP(*key) && !fitsWPA(*key)) {
        return {{}, "the network's key has no form that a key can have"};
    }
    const HeardNetwork* best = nullptr;
    std::string reason;
    bool isHopeless = false;
    for (const HeardNetwork& network : heard) {
        const char* const against = whyNot(network, key);
        if (against != nullptr) {
            reason = against;
            // An open network may be anybody's: the one that the key is for may still appear.
            isHopeless = isHopeless || network.security != Security::open;
        } else if (!network.isAdHoc || network.age <= oldestCell) {
            best = best == nullptr || isBetter(network, *best) ? &network : best;
        }
    }
    if (best != nullptr) {
        return {JoinChoice{true, best->isAdHoc, best->security, best->isAdHoc ? best->frequency : 0}, ""};
    }
    if (isHopeless) {
        return {{}, std::move(reason)};
    }
    const Security security = !key ? Security::open : fitsWPA(*key) ? Security::wpa : Security::wep;
    return {JoinChoice{false, false, security, 0}, std::move(reason)};
}

}  // namespace platform::apply
