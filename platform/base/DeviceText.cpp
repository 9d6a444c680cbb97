#include "platform/base/DeviceText.h"

#include <unicode/uchar.h>
#include <unicode/utf8.h>

#include <algorithm>
#include <cstdint>

namespace platform {
namespace {

bool isPrintable(UChar32 character) {
    constexpr std::uint32_t others = U_GC_C_MASK | U_GC_ZL_MASK | U_GC_ZP_MASK;
    return character >= 0 && (U_GET_GC_MASK(character) & others) == 0;
}

// What the first characters print, as far as they fit.
std::string printed(std::string_view text, bool& isAnything) {
    // No character needs more bytes than this.
    const auto size = static_cast<std::int32_t>(std::min(text.size(), longestDeviceText * U8_MAX_LENGTH));
    const auto* const bytes = reinterpret_cast<const std::uint8_t*>(text.data());
    std::string result;
    for (std::int32_t at = 0; at < size;) {
        const std::int32_t start = at;
        UChar32 character = 0;
        U8_NEXT(bytes, at, size, character);
        const bool prints = isPrintable(character);
        const std::string_view piece =
            prints ? text.substr(static_cast<std::size_t>(start), static_cast<std::size_t>(at - start)) : "?";
        if (result.size() + piece.size() > longestDeviceText) {
            break;
        }
        result += piece;
        isAnything = isAnything || (prints && character != ' ');
    }
    return result;
}

}  // namespace

std::string deviceText(std::string_view text) {
    constexpr std::string_view blanks = " \t\r\n";
    text.remove_prefix(std::min(text.find_first_not_of(blanks), text.size()));
    text = text.substr(0, text.find_last_not_of(blanks) + 1);
    bool isAnything = false;
    const std::string result = printed(text, isAnything);
    return isAnything ? result.substr(0, result.find_last_not_of(' ') + 1) : "";
}

bool isDeviceText(std::string_view name) {
    bool isAnything = false;
    return printed(name, isAnything) == name && isAnything;
}

}  // namespace platform
