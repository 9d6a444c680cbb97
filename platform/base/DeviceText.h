// Text that others choose: what a device or the firmware says of itself, and the names of interfaces, devices
// and files. It goes into traces, to root's terminal and into the store.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace platform {

inline constexpr std::size_t longestDeviceText = 64;  // bytes

// The text as it may be shown and stored: valid UTF-8 of at most 64 bytes, cut between two characters,
// without blanks at its ends. A '?' replaces each byte that is not UTF-8 and for each character that does
// not print: control characters and escapes, direction overrides and other formats, line separators, private
// and unassigned ones. Empty when nothing of it prints.
[[nodiscard]] std::string deviceText(std::string_view text);

// Whether a name may be shown and stored as it is. Another one cannot be taken: changed, it would not lead
// back to what it names.
[[nodiscard]] bool isDeviceText(std::string_view name);

}  // namespace platform
