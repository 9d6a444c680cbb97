// Bytes from and to hexadecimal text.
#pragma once

#include <cstddef>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/base/Hexadecimal.h"

namespace testing_support {

inline std::vector<std::byte> fromHex(std::string_view text) {
    std::vector<std::byte> bytes;
    for (std::size_t i = 0; i + 1 < text.size(); i += 2) {
        bytes.push_back(std::byte(std::stoi(std::string(text.substr(i, 2)), nullptr, 16)));
    }
    return bytes;
}

inline std::string toHex(std::span<const std::byte> bytes) {
    return platform::hexOf({reinterpret_cast<const char*>(bytes.data()), bytes.size()});
}

}  // namespace testing_support
