// SipHash-2-4: a short digest under a key of 16 bytes.
#pragma once

#include <array>
#include <cstdint>
#include <string_view>

namespace platform::apply {

[[nodiscard]] std::uint64_t sipHash(const std::array<std::uint8_t, 16>& key, std::string_view text) noexcept;

}  // namespace platform::apply
