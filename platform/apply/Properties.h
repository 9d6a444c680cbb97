// Typed looks into property lists that come from files, where any value may be missing or of the wrong type.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "platform/CoreFoundation.h"
#include "platform/values/Object.h"

namespace platform::apply {

// The value under a key when it has the type asked for; else null. A null dictionary holds nothing. Borrowed.
[[nodiscard]] CFTypeRef valueIn(CFDictionaryRef dictionary, CFStringRef key) noexcept;
[[nodiscard]] CFDictionaryRef dictionaryIn(CFDictionaryRef dictionary, CFStringRef key) noexcept;
[[nodiscard]] CFArrayRef arrayIn(CFDictionaryRef dictionary, CFStringRef key) noexcept;

// The content under a key when it has the type asked for; else nothing.
[[nodiscard]] std::optional<std::string> textIn(CFDictionaryRef dictionary, CFStringRef key);
[[nodiscard]] std::optional<std::int64_t> integerIn(CFDictionaryRef dictionary, CFStringRef key) noexcept;
[[nodiscard]] std::optional<bool> booleanIn(CFDictionaryRef dictionary, CFStringRef key) noexcept;
[[nodiscard]] std::optional<std::span<const std::byte>> dataIn(CFDictionaryRef dictionary,
                                                               CFStringRef key) noexcept;

// The same for a value at hand, which may be null.
[[nodiscard]] CFDictionaryRef asDictionary(CFTypeRef value) noexcept;
[[nodiscard]] CFArrayRef asArray(CFTypeRef value) noexcept;
[[nodiscard]] std::optional<std::string> asText(CFTypeRef value);
[[nodiscard]] std::optional<std::int64_t> asInteger(CFTypeRef value) noexcept;
[[nodiscard]] std::optional<std::span<const std::byte>> asData(CFTypeRef value) noexcept;

// Null when the text is not UTF-8.
[[nodiscard]] values::Owned<CFStringRef> makeString(std::string_view text);
[[nodiscard]] values::Owned<CFDataRef> makeData(std::span<const std::byte> bytes);

// A dictionary being built.
class DictionaryBuilder {
  public:
    DictionaryBuilder();
    DictionaryBuilder& set(CFStringRef key, CFTypeRef value);  // null is left out
    DictionaryBuilder& setText(CFStringRef key, std::string_view text);
    DictionaryBuilder& setInteger(CFStringRef key, std::int64_t number);
    DictionaryBuilder& setBoolean(CFStringRef key, bool flag);
    DictionaryBuilder& setData(CFStringRef key, std::span<const std::byte> bytes);
    [[nodiscard]] values::Owned<CFDictionaryRef> take() noexcept;

  private:
    values::Owned<CFMutableDictionaryRef> dictionary_;
};

class ArrayBuilder {
  public:
    ArrayBuilder();
    ArrayBuilder& add(CFTypeRef value);  // null is left out
    ArrayBuilder& addText(std::string_view text);
    ArrayBuilder& addData(std::span<const std::byte> bytes);
    [[nodiscard]] CFArrayRef get() const noexcept { return array_.get(); }

  private:
    values::Owned<CFMutableArrayRef> array_;
};

}  // namespace platform::apply
