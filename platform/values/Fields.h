// Structs kept as property lists. A struct lists its fields once, and the list is read both ways:
//
//     struct Lease {
//         std::uint32_t seconds = 0;
//         template <class Self, class Fields>
//         static void listFields(Self& self, Fields& fields) {
//             fields("Seconds", self.seconds);
//         }
//     };
//     toPropertyList(lease); fromPropertyList(dictionary, lease);
//
// A field is a boolean, an integer, an enumeration that counts from 0 to its value "last", text, bytes, a
// dictionary, another such struct, a list of any of these, or std::optional of one, which is left out when it
// is empty.
#pragma once

#include <array>
#include <concepts>
#include <cstddef>
#include <cstdint>
#include <limits>
#include <optional>
#include <span>
#include <string>
#include <type_traits>
#include <utility>
#include <vector>

#include "platform/CoreFoundation.h"
#include "platform/values/Object.h"
#include "platform/values/Values.h"

namespace platform::values {

class FieldWriter {
  public:
    FieldWriter();
    template <class T>
    void operator()(const char* key, const T& value) {
        set(key, encode(value));
    }
    [[nodiscard]] Owned<CFDictionaryRef> take() noexcept;

    [[nodiscard]] static Owned<CFTypeRef> encode(bool flag);
    // Text that no XML document can carry is kept as data.
    [[nodiscard]] static Owned<CFTypeRef> encode(const std::string& text);
    [[nodiscard]] static Owned<CFTypeRef> encode(const std::vector<std::byte>& bytes);
    [[nodiscard]] static Owned<CFTypeRef> encode(const Owned<CFDictionaryRef>& dictionary);
    template <std::size_t size>
    [[nodiscard]] static Owned<CFTypeRef> encode(const std::array<std::uint8_t, size>& bytes) {
        return encodeData(std::as_bytes(std::span(bytes)));
    }
    template <class T>
    [[nodiscard]] static Owned<CFTypeRef> encode(const std::optional<T>& value) {
        return value ? encode(*value) : Owned<CFTypeRef>();
    }
    template <class T>
    [[nodiscard]] static Owned<CFTypeRef> encode(const std::vector<T>& list) {
        std::vector<Owned<CFTypeRef>> items;
        for (const T& each : list) {
            items.push_back(encode(each));
        }
        return encodeList(items);
    }
    template <class T>
    [[nodiscard]] static Owned<CFTypeRef> encode(const T& value) {
        if constexpr (std::integral<T> || std::is_enum_v<T>) {
            return Owned<CFTypeRef>::adopt(makeNumber(static_cast<std::int64_t>(value)).take());
        } else {
            FieldWriter writer;
            T::listFields(value, writer);
            return Owned<CFTypeRef>::adopt(writer.take().take());
        }
    }

  private:
    void set(const char* key, const Owned<CFTypeRef>& value);
    static Owned<CFTypeRef> encodeData(std::span<const std::byte> bytes);
    static Owned<CFTypeRef> encodeList(const std::vector<Owned<CFTypeRef>>& items);

    Owned<CFMutableDictionaryRef> dictionary_;
};

class FieldReader {
  public:
    // A null dictionary holds nothing.
    explicit FieldReader(CFDictionaryRef dictionary) : dictionary_(dictionary) {}
    template <class T>
    void operator()(const char* key, T& value) {
        isGood_ = decode(valueAt(key), value) && isGood_;
    }
    // Whether every field so far was there, of its type, and in its range.
    [[nodiscard]] bool isGood() const noexcept { return isGood_; }

    static bool decode(CFTypeRef value, bool& flag);
    static bool decode(CFTypeRef value, std::string& text);
    static bool decode(CFTypeRef value, std::vector<std::byte>& bytes);
    static bool decode(CFTypeRef value, Owned<CFDictionaryRef>& dictionary);
    template <std::size_t size>
    static bool decode(CFTypeRef value, std::array<std::uint8_t, size>& bytes) {
        return decodeData(value, std::as_writable_bytes(std::span(bytes)));
    }
    template <class T>
    static bool decode(CFTypeRef value, std::optional<T>& result) {
        if (value == nullptr) {
            result.reset();
            return true;
        }
        T read{};
        const bool isGood = decode(value, read);
        result = std::move(read);
        return isGood;
    }
    template <class T>
    static bool decode(CFTypeRef value, std::vector<T>& list) {
        list.clear();
        const auto array = as<CFArrayRef>(value);
        for (CFIndex i = 0; array != nullptr && i < CFArrayGetCount(array); ++i) {
            if (!decode(CFArrayGetValueAtIndex(array, i), list.emplace_back())) {
                return false;
            }
        }
        return array != nullptr;
    }
    template <class T>
    static bool decode(CFTypeRef value, T& result) {
        if constexpr (std::integral<T> || std::is_enum_v<T>) {
            std::int64_t number = 0;
            if (!decodeNumber(value, number)) {
                return false;
            }
            result = static_cast<T>(number);
            if constexpr (std::is_enum_v<T>) {
                return number >= 0 && number <= static_cast<std::int64_t>(T::last);
            } else {
                return std::in_range<T>(number);
            }
        } else {
            FieldReader reader(as<CFDictionaryRef>(value));
            T::listFields(result, reader);
            return reader.isGood();
        }
    }

  private:
    [[nodiscard]] CFTypeRef valueAt(const char* key) const;
    static bool decodeNumber(CFTypeRef value, std::int64_t& number);
    static bool decodeData(CFTypeRef value, std::span<std::byte> bytes);

    CFDictionaryRef dictionary_;
    bool isGood_ = true;
};

template <class T>
[[nodiscard]] Owned<CFDictionaryRef> toPropertyList(const T& value) {
    FieldWriter writer;
    T::listFields(value, writer);
    return writer.take();
}

// False, and the struct as it was, when a field is missing, of the wrong type or out of range.
template <class T>
[[nodiscard]] bool fromPropertyList(CFDictionaryRef dictionary, T& value) {
    T read;
    if (dictionary == nullptr || !FieldReader::decode(dictionary, read)) {
        return false;
    }
    value = std::move(read);
    return true;
}

}  // namespace platform::values
