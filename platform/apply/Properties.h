// Typed looks into property lists that come from files, where any value may be missing or of the wrong type.
#pragma once

#include <optional>
#include <string>

#include "platform/CoreFoundation.h"
#include "platform/values/Values.h"

namespace platform::apply {

// The value under a key; null when there is none. A null dictionary holds nothing. Borrowed.
[[nodiscard]] inline CFTypeRef valueIn(CFDictionaryRef dictionary, CFStringRef key) noexcept {
    return dictionary == nullptr ? nullptr : CFDictionaryGetValue(dictionary, key);
}
[[nodiscard]] inline CFDictionaryRef dictionaryIn(CFDictionaryRef dictionary, CFStringRef key) noexcept {
    return values::as<CFDictionaryRef>(valueIn(dictionary, key));
}

// The content of a string; nothing for another value, and for null.
[[nodiscard]] inline std::optional<std::string> asText(CFTypeRef value) {
    const auto string = values::as<CFStringRef>(value);
    return string == nullptr ? std::nullopt : std::optional<std::string>(values::textOf(string));
}
[[nodiscard]] inline std::optional<std::string> textIn(CFDictionaryRef dictionary, CFStringRef key) {
    return asText(valueIn(dictionary, key));
}

}  // namespace platform::apply
