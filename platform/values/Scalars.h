// The values that hold no others.
#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <new>
#include <span>
#include <string>
#include <string_view>

#include "platform/CoreFoundation.h"
#include "platform/values/Object.h"
#include "platform/values/Text.h"

// An immutable string has its bytes behind the object, in the same allocation; MutableString keeps them in a
// buffer of its own.
struct OpaqueCFString : platform::values::Object {
    // A constant that lives as long as the program; its text is ASCII that XML takes as it stands.
    constexpr explicit OpaqueCFString(std::string_view constant) noexcept
        : Object(platform::values::Type::string),
          size_(static_cast<std::uint32_t>(constant.size())),
          bytes_(constant.data()) {}
    static void* operator new(std::size_t size) { return ::operator new(size); }
    static void operator delete(void* memory) { ::operator delete(memory); }

    // Null when the text is longer than longestText; it must be what the traits say.
    [[nodiscard]] static const OpaqueCFString* create(std::string_view text,
                                                      platform::values::TextTraits traits);
    static constexpr std::size_t longestText = 0x7FFFFFFF;

    [[nodiscard]] std::string_view text() const noexcept { return {bytes_, size_}; }
    [[nodiscard]] const char* cString() const noexcept { return bytes_; }
    [[nodiscard]] platform::values::TextTraits traits() const noexcept { return traits_; }
    [[nodiscard]] bool isAscii() const noexcept { return (traits_ & platform::values::textBeyondAscii) == 0; }
    [[nodiscard]] bool isMutable() const noexcept { return mutable_; }
    // Kept once it was asked for.
    [[nodiscard]] std::uint32_t hash() const noexcept;
    [[nodiscard]] bool equals(const OpaqueCFString& other) const noexcept {
        return this == &other || text() == other.text();
    }

  protected:
    OpaqueCFString() noexcept : Object(platform::values::Type::string), mutable_(true) {}
    void setText(std::string_view text, platform::values::TextTraits traits) noexcept {
        bytes_ = text.data();
        size_ = static_cast<std::uint32_t>(text.size());
        traits_ = traits;
        hash_.store(0, std::memory_order_relaxed);
    }

  private:
    // Room behind the object for a text and its final NUL.
    struct Room {
        std::size_t textSize;
    };
    static void* operator new(std::size_t size, Room room) {
        return ::operator new(size + room.textSize + 1);
    }
    static void operator delete(void* memory, Room) { ::operator delete(memory); }
    // To be made in room for the text, which it copies.
    OpaqueCFString(std::string_view text, platform::values::TextTraits traits) noexcept;

    bool mutable_ = false;
    platform::values::TextTraits traits_ = 0;
    std::uint32_t size_ = 0;
    mutable std::atomic<std::uint32_t> hash_{0};
    const char* bytes_ = nullptr;
};

namespace platform::values {

class MutableString final : public OpaqueCFString {
  public:
    explicit MutableString(std::string text, TextTraits traits) : text_(std::move(text)) {
        setText(text_, traits);
    }
    // Takes the text when it is well-formed and not too long; else nothing changes.
    void assign(std::string text);

  private:
    std::string text_;
};

// The one hash of everything. It need not withstand those who choose the keys: nobody but root, or the
// process's own user, does.
template <class T>
[[nodiscard]] std::uint32_t hashOf(const T& value) noexcept {
    const std::uint64_t hash = std::hash<T>()(value) * 0x9E3779B97F4A7C15U;
    return static_cast<std::uint32_t>(hash >> 32);
}

}  // namespace platform::values

struct OpaqueCFNumber final : platform::values::Object {
    explicit OpaqueCFNumber(std::int64_t value) noexcept
        : Object(platform::values::Type::number), isReal(false), integer(value) {}
    explicit OpaqueCFNumber(double value) noexcept
        : Object(platform::values::Type::number), isReal(true), real(value) {}

    const bool isReal;
    union {
        const std::int64_t integer;
        const double real;
    };
};

struct OpaqueCFBoolean final : platform::values::Object {
    constexpr explicit OpaqueCFBoolean(bool truth) noexcept
        : Object(platform::values::Type::boolean), value(truth) {}

    const bool value;
};

struct OpaqueCFData final : platform::values::Object {
    explicit OpaqueCFData(std::string content) noexcept
        : Object(platform::values::Type::data), bytes(std::move(content)) {}

    const std::string bytes;
};

struct OpaqueCFDate final : platform::values::Object {
    explicit OpaqueCFDate(std::int64_t secondsSince1970) noexcept
        : Object(platform::values::Type::date), seconds(secondsSince1970) {}

    const std::int64_t seconds;
};

struct OpaqueCFURL final : platform::values::Object {
    explicit OpaqueCFURL(platform::values::Owned<CFStringRef> url) noexcept
        : Object(platform::values::Type::url), text(std::move(url)) {}

    const platform::values::Owned<CFStringRef> text;
};

namespace platform::values {

// A value that the program's end does not destroy, so that whoever runs last may still use it.
template <class T>
union Immortal {
    template <class... Arguments>
    constexpr explicit Immortal(Arguments... arguments) noexcept : value(arguments...) {}
    ~Immortal() {}
    T value;
};

// A date as property lists and people write it, "2004-02-29T12:30:00Z".
[[nodiscard]] std::string dateText(std::int64_t seconds);
// The shortest decimal that reads back as the same number, "inf", "-inf" or "nan".
[[nodiscard]] std::string realText(double value);

// By content, through containers, as CFEqual.
[[nodiscard]] bool equalValues(CFTypeRef lhs, CFTypeRef rhs);
// Equal values have equal hashes.
[[nodiscard]] std::uint32_t hashOfValue(CFTypeRef value) noexcept;

}  // namespace platform::values
