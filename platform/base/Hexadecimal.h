// Bytes as hexadecimal digits, two lower-case ones each, the upper half first.
#pragma once

#include <string>
#include <string_view>

namespace platform {

inline std::string hexOf(std::string_view bytes) {
    constexpr const char* digits = "0123456789abcdef";
    std::string text;
    for (const char c : bytes) {
        const auto byte = static_cast<unsigned char>(c);
        text += digits[byte >> 4U];
        text += digits[byte & 0xFU];
    }
    return text;
}

}  // namespace platform
