#include "platform/values/Text.h"

#include <array>

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

constexpr unsigned byteAt(std::string_view text, std::size_t position) {
    return static_cast<unsigned char>(text[position]);
}

// The number of bytes of the well-formed sequence that begins here, or 0.
std::size_t sequenceLength(std::string_view text, std::size_t position) noexcept {
    const unsigned lead = byteAt(text, position);
    if (lead < 0x80) {
        return 1;
    }
    const std::size_t length = lead < 0xC2 ? 0 : lead < 0xE0 ? 2 : lead < 0xF0 ? 3 : lead < 0xF5 ? 4 : 0;
    if (length == 0 || text.size() - position < length) {
        return 0;
    }
    // The second byte is what tells overlong forms, surrogates and what lies beyond Unicode from the rest.
    const unsigned second = byteAt(text, position + 1);
    const unsigned least = lead == 0xE0 ? 0xA0 : lead == 0xF0 ? 0x90 : 0x80;
    const unsigned most = lead == 0xED ? 0x9F : lead == 0xF4 ? 0x8F : 0xBF;
    if (second < least || second > most) {
        return 0;
    }
    for (std::size_t i = 2; i < length; ++i) {
        if ((byteAt(text, position + i) & 0xC0) != 0x80) {
            return 0;
        }
    }
    return length;
}

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
        const std::size_t length = sequenceLength(bytes, position);
        if (length == 0) {
            return std::nullopt;
        }
        const std::string_view sequence = bytes.substr(position, length);
        if (sequence == "\xEF\xBF\xBE" || sequence == "\xEF\xBF\xBF") {
            traits |= textBeyondXml;
        }
        position += length;
    }
    return traits;
}

char32_t nextCodePoint(std::string_view text, std::size_t& position) noexcept {
    const unsigned lead = byteAt(text, position++);
    if (lead < 0x80) {
        return lead;
    }
    const int more = lead < 0xE0 ? 1 : lead < 0xF0 ? 2 : 3;
    char32_t codePoint = lead & (0x3FU >> more);
    for (int i = 0; i < more; ++i) {
        codePoint = (codePoint << 6) | (byteAt(text, position++) & 0x3F);
    }
    return codePoint;
}

void appendCodePoint(std::string& text, char32_t codePoint) {
    const auto append = [&text](char32_t byte) { text.push_back(static_cast<char>(byte)); };
    if (codePoint < 0x80) {
        append(codePoint);
        return;
    }
    if (codePoint < 0x800) {
        append(0xC0 | (codePoint >> 6));
    } else {
        if (codePoint < 0x10000) {
            append(0xE0 | (codePoint >> 12));
        } else {
            append(0xF0 | (codePoint >> 18));
            append(0x80 | ((codePoint >> 12) & 0x3F));
        }
        append(0x80 | ((codePoint >> 6) & 0x3F));
    }
    append(0x80 | (codePoint & 0x3F));
}

std::size_t unitCount(std::string_view text) noexcept {
    std::size_t count = 0;
    for (const char character : text) {
        const auto byte = static_cast<unsigned char>(character);
        count += static_cast<std::size_t>((byte & 0xC0) != 0x80) + static_cast<std::size_t>(byte >= 0xF0);
    }
    return count;
}

std::optional<std::size_t> byteOfUnit(std::string_view text, std::size_t unit) noexcept {
    std::size_t position = 0;
    std::size_t units = 0;
    while (units < unit && position < text.size()) {
        units += nextCodePoint(text, position) >= 0x10000 ? 2U : 1U;
    }
    return units == unit ? std::optional(position) : std::nullopt;
}

}  // namespace platform::values
