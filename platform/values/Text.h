// UTF-8 text, measured in UTF-16 code units where the faces ask for it.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace platform::values {

// What is known of a text from looking at each of its bytes once.
using TextTraits = std::uint8_t;
inline constexpr TextTraits textBeyondAscii = 1;
inline constexpr TextTraits textNeedsEscape = 2;  // holds & < > or a carriage return
inline constexpr TextTraits textBeyondXml = 4;    // holds a character that no XML document can carry

// Nothing when the bytes are not well-formed UTF-8.
[[nodiscard]] std::optional<TextTraits> scanText(std::string_view bytes) noexcept;

// Of well-formed UTF-8.
[[nodiscard]] std::size_t unitCount(std::string_view text) noexcept;

}  // namespace platform::values
