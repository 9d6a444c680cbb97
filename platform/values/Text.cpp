#include "platform/values/Text.h"

#include <unicode/utf8.h>

#include <array>

// ICU's macros are careful with each byte, but not in the way that these ask for.
#pragma GCC diagnostic ignored "-Wconversion"
#pragma GCC diagnostic ignored "-Wsign-conversion"

namespace platform::values {

namespace {

constexpr std::array<TextTraits, 256> makeByteTraits() {
    std::array<TextTraits, 256> traits{};
    for (std::size_t byte = 0; byte < 0x20; ++byte) {
        traits[byte] = textBeyondXml;
    }
    traits['\t'] = 0;
    traits['\n'] = 0;
    traits['\r'] = textNeedsEscape;
    traits['&'] = textNeedsEscape;
    traits['<'] = textNeedsEscape;
    traits['>'] = textNeedsEscape;
    for (std::size_t byte = 0x80; byte < 0x100; ++byte) {
        traits[byte] = textBeyondAscii;
    }
    return traits;
}

constexpr std::array<TextTraits, 256> byteTraits = makeByteTraits();

}  // namespace

std::optional<TextTraits> scanText(std::string_view bytes) noexcept {
    TextTraits traits = 0;
    for (const char byte : bytes) {
        traits |= byteTraits[static_cast<unsigned char>(byte)];
    }
    if ((traits & textBeyondAscii) == 0) {
        return traits;
    }
    for (std::size_t position = 0; position < bytes.size();) {
        UChar32 codePoint = 0;
        U8_NEXT(bytes.data(), position, bytes.size(), codePoint);
        if (codePoint < 0) {
            return std::nullopt;
        }
        if (codePoint == 0xFFFE || codePoint == 0xFFFF) {
            traits |= textBeyondXml;
        }
    }
    return traits;
}

std::size_t unitCount(std::string_view text) noexcept {
    std::size_t count = 0;
    for (const char character : text) {
        const auto byte = static_cast<unsigned char>(character);
        count += static_cast<std::size_t>((byte & 0xC0) != 0x80) + static_cast<std::size_t>(byte >= 0xF0);
    }
    return count;
}

}  // namespace platform::values
