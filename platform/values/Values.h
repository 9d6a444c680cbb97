// What the other folders of the platform need of values beyond CoreFoundation.h: building and reading them
// without a detour through C, values that nobody can change, and editing a tree of such values in place.
#pragma once

#include <cstdint>
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

// Null when the bytes are not well-formed UTF-8.
[[nodiscard]] Owned<CFStringRef> makeString(std::string_view text);
// The string's bytes, NUL-terminated, borrowed until it is changed or released.
[[nodiscard]] std::string_view textOf(CFStringRef string) noexcept;
// CFCopyDescription as text; a null value gives "(null)".
[[nodiscard]] std::string descriptionOf(CFTypeRef value);

[[nodiscard]] Owned<CFNumberRef> makeNumber(std::int64_t value);
[[nodiscard]] Owned<CFNumberRef> makeReal(double value);
// Seconds since the beginning of 1970, UTC.
[[nodiscard]] Owned<CFDateRef> makeDate(std::int64_t seconds);
[[nodiscard]] std::int64_t secondsOf(CFDateRef date) noexcept;

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
// shares every part that is. Costs the parts that are not known to be frozen; a container that was found
// frozen remembers it. Null when the value, or something in it, is no property-list value (keys are strings),
// or when it is nested deeper than deepestPropertyList.
[[nodiscard]] Owned<CFPropertyListRef> frozen(CFPropertyListRef value);
// How many containers are nested in a frozen value, itself included.
[[nodiscard]] int levelsOf(CFPropertyListRef frozen) noexcept;

// --- Editing in place ---
//
// A tree of frozen dictionaries is edited without copying what nobody else holds, and without changing what
// anybody else holds:
//
//     claim(root);                                      // Owned<CFDictionaryRef> root
//     CFDictionaryRef sets = claimedChild(root.get(), CFSTR("Sets"));
//     setClaimed(sets, CFSTR("7"), frozen(set));
//
// A dictionary is claimed when one single owner holds it, and everything on the way to it is claimed as well.
// It looks immutable to everybody else, so only the tree's owner may hold claims, and a claim ends when
// anybody takes a reference to the dictionary or to one above it. Claim anew, from the root, for each change:
// it costs a look-up a level, plus one copy of the entries (not of what they hold) of each dictionary on the
// way that somebody else shares.

// Makes the root claimed, replacing it by a new handle on the same entries when others hold it too or it is
// mutable.
void claim(Owned<CFDictionaryRef>& root);
// The dictionary under the key, claimed and borrowed from its parent; null when there is none or the value is
// no dictionary. The parent must be claimed.
[[nodiscard]] CFDictionaryRef claimedChild(CFDictionaryRef parent, CFTypeRef key);
// Adds, or replaces in place. The dictionary must be claimed, the value frozen and not null.
void setClaimed(CFDictionaryRef dictionary, CFStringRef key, const Owned<CFPropertyListRef>& value);
// The dictionary must be claimed. Nothing happens when the key is not there.
void removeClaimed(CFDictionaryRef dictionary, CFTypeRef key);

}  // namespace platform::values
