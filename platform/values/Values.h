// What the other folders of the platform need of values beyond CoreFoundation.h: building and reading them
// without a detour through C, values that nobody can change, and changing a tree of such values in place.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "platform/CoreFoundation.h"
#include "platform/values/Object.h"

namespace platform::values {

template <class Ref>
inline constexpr Type typeOf = Type{};
template <>
inline constexpr Type typeOf<CFStringRef> = Type::string;
template <>
inline constexpr Type typeOf<CFDictionaryRef> = Type::dictionary;
template <>
inline constexpr Type typeOf<CFArrayRef> = Type::array;
template <>
inline constexpr Type typeOf<CFNumberRef> = Type::number;
template <>
inline constexpr Type typeOf<CFBooleanRef> = Type::boolean;
template <>
inline constexpr Type typeOf<CFDataRef> = Type::data;
template <>
inline constexpr Type typeOf<CFDateRef> = Type::date;

// The value as this type, as<CFDictionaryRef>(value), or null when it is null or of another type.
template <class Ref>
[[nodiscard]] Ref as(CFTypeRef value) noexcept {
    const bool matches = value != nullptr && static_cast<const Object*>(value)->type() == typeOf<Ref>;
    return matches ? static_cast<Ref>(value) : nullptr;
}

// The value under a key, as this type; null when there is none. A null dictionary holds nothing. Borrowed.
template <class Ref>
[[nodiscard]] Ref valueIn(CFDictionaryRef dictionary, CFTypeRef key) noexcept {
    return dictionary == nullptr ? nullptr : as<Ref>(CFDictionaryGetValue(dictionary, key));
}

// Null when the bytes are not well-formed UTF-8.
[[nodiscard]] Owned<CFStringRef> makeString(std::string_view text);
// The string's bytes, NUL-terminated, borrowed until it is changed or released.
[[nodiscard]] std::string_view textOf(CFStringRef string) noexcept;
// CFCopyDescription as text; a null value gives "(null)".
[[nodiscard]] std::string descriptionOf(CFTypeRef value);

[[nodiscard]] Owned<CFNumberRef> makeNumber(std::int64_t value);
[[nodiscard]] Owned<CFNumberRef> makeReal(double value);
// Nothing for a real.
[[nodiscard]] std::optional<std::int64_t> integerOf(CFNumberRef number) noexcept;
// Seconds since the beginning of 1970, UTC.
[[nodiscard]] Owned<CFDateRef> makeDate(std::int64_t seconds);

struct Entry {
    CFTypeRef key;
    CFTypeRef value;
};
// A container's content in its own order, borrowed until the container is changed or released.
[[nodiscard]] std::span<const Entry> entriesOf(CFDictionaryRef dictionary);
[[nodiscard]] std::span<const CFTypeRef> itemsOf(CFArrayRef array) noexcept;

// --- Frozen values ---
//
// A frozen value is a property-list value without a mutable string or container anywhere inside, so that
// nothing can change it. What parsePropertyListXML returns is frozen.

// A frozen value equal to the given one: the value itself, retained, when it is frozen, else a copy that
// shares every part that is. Null when the value, or something in it, is no property-list value (keys are
// strings), or when containersAbove and those nested in it are more than deepestPropertyList.
[[nodiscard]] Owned<CFPropertyListRef> frozen(CFPropertyListRef value, std::size_t containersAbove = 0);

// A tree of frozen dictionaries is changed without copying what nobody else holds, and without changing what
// anybody else holds: it costs a look-up a level, plus one copy of the entries (not of what they hold) of
// each dictionary on the way that somebody else shares. The path has one key at least, and everything on it
// but the last is a dictionary or missing.

// Adds, or replaces in place, making what is missing on the way. The value must be frozen.
void setAtPath(Owned<CFDictionaryRef>& root, std::span<const Owned<CFStringRef>> path, CFTypeRef value);
// Nothing on the way may be missing.
void removeAtPath(Owned<CFDictionaryRef>& root, std::span<const Owned<CFStringRef>> path);

}  // namespace platform::values
