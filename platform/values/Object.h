// The base of everything that CFRetain and CFRelease count, and the owner that counts for C++ code.
#pragma once

#include <atomic>
#include <cstdint>
#include <utility>

#include "platform/CoreFoundation.h"

namespace platform::values {

// The types that CFGetTypeID tells apart; property lists are made of those up to date.
enum class Type : std::uint8_t {
    string = 1,
    dictionary,
    array,
    number,
    boolean,
    data,
    date,
    url,
    runLoop,
    runLoopSource,
    preferences,
    dynamicStore,
};

// Every opaque type of the faces is a class derived from this one, with Object as its only base, so that a
// CFTypeRef is always a pointer to an Object.
class Object {
  public:
    virtual ~Object() = default;
    Object(const Object&) = delete;
    Object& operator=(const Object&) = delete;

    [[nodiscard]] Type type() const noexcept { return type_; }
    void retain() const noexcept { count_.fetch_add(1, std::memory_order_relaxed); }
    void release() const noexcept {
        if (count_.fetch_sub(1, std::memory_order_acq_rel) == 1) {
            delete this;
        }
    }
    [[nodiscard]] std::int32_t retainCount() const noexcept { return count_.load(std::memory_order_acquire); }

  protected:
    // A new object starts with one reference, which its creator owns.
    constexpr explicit Object(Type type) noexcept : type_(type) {}

  private:
    mutable std::atomic<std::int32_t> count_{1};
    Type type_;
};

// Owns one reference to a value of the faces, or none.
template <class Ref>
class Owned {
  public:
    Owned() = default;
    // Takes over the reference that a Create or Copy function handed out.
    [[nodiscard]] static Owned adopt(Ref value) noexcept {
        Owned owned;
        owned.value_ = value;
        return owned;
    }
    // Takes a reference of its own to a borrowed value.
    [[nodiscard]] static Owned retained(Ref value) noexcept {
        if (value != nullptr) {
            CFRetain(value);
        }
        return adopt(value);
    }
    Owned(const Owned& other) noexcept : value_(retained(other.value_).take()) {}
    Owned(Owned&& other) noexcept : value_(std::exchange(other.value_, nullptr)) {}
    Owned& operator=(Owned other) noexcept {
        std::swap(value_, other.value_);
        return *this;
    }
    ~Owned() {
        if (value_ != nullptr) {
            CFRelease(value_);
        }
    }

    [[nodiscard]] Ref get() const noexcept { return value_; }
    [[nodiscard]] Ref take() noexcept { return std::exchange(value_, nullptr); }
    explicit operator bool() const noexcept { return value_ != nullptr; }

  private:
    Ref value_ = nullptr;
};

}  // namespace platform::values
