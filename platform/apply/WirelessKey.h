// Which protection a wireless network's key is for.
#pragma once

#include <optional>
#include <string>

#include "platform/Outcome.h"

namespace platform::apply {

enum class Security { open, wep, wpa };

// WEP: 5 or 13 ASCII characters, or 10 or 26 hexadecimal digits. WPA: 8 to 63 bytes of text, or 64
// hexadecimal digits. A key with a control character fits neither.
[[nodiscard]] bool fitsWEP(const std::string& key);
[[nodiscard]] bool fitsWPA(const std::string& key);
// Whether a key that fits is given in digits rather than in characters.
[[nodiscard]] bool isInDigits(const std::string& key);

// The protection to join with: what the network announces when it was seen, else what the key's form says (a
// key that could be both is taken for WEP's, since the older networks are the ones that need it). Fails when
// the key does not fit it or is missing. No reason holds the key.
Outcome chooseSecurity(std::optional<Security> announced, const std::optional<std::string>& key,
                       Security& security);

}  // namespace platform::apply
