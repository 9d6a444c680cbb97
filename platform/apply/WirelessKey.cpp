#include "platform/apply/WirelessKey.h"

#include <algorithm>

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

Outcome chooseSecurity(std::optional<Security> announced, const std::optional<std::string>& key,
                       Security& security) {
    const auto refuse = [](const char* reason) { return Outcome(kSCStatusFailed, reason); };
    if (!announced) {
        if (key && !fitsWEP(*key) && !fitsWPA(*key)) {
            return refuse("the network's key has no form that a key can have");
        }
        security = !key ? Security::open : fitsWEP(*key) ? Security::wep : Security::wpa;
        return {};
    }
    security = *announced;
    switch (security) {
        case Security::open:
            return {};
        case Security::wep:
            return !key ? refuse("the network asks for a key and the location holds none")
                   : fitsWEP(*key)
                       ? Outcome()
                       : refuse(
                             "the key fits no WEP network, whose keys have 5 or 13 characters or 10 or "
                             "26 hexadecimal digits");
        case Security::wpa:
            return !key ? refuse("the network asks for a key and the location holds none")
                   : fitsWPA(*key)
                       ? Outcome()
                       : refuse(
                             "the key fits no WPA network, whose keys have 8 to 63 characters or 64 "
                             "hexadecimal digits");
    }
    return {};
}

}  // namespace platform::apply
