// Dictionaries and arrays, and telling the kinds of values apart.
#pragma once

#include <cassert>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>
#include <unordered_map>
#include <vector>

#include "platform/CoreFoundation.h"
#include "platform/values/Object.h"
#include "platform/values/Scalars.h"
#include "platform/values/Values.h"

namespace platform::values {

// What the two kinds of containers have in common.
class Container : public Object {
  public:
    [[nodiscard]] bool isMutable() const noexcept { return mutable_; }
    // For the operations that change a container: one that is not mutable is a mistake of the caller's.
    [[nodiscard]] bool mayChange() const noexcept {
        assert(mutable_);
        return mutable_;
    }
    [[nodiscard]] bool retainsValues() const noexcept { return retainsValues_; }

  protected:
    Container(Type type, bool isMutable, bool retainsValues) noexcept
        : Object(type), mutable_(isMutable), retainsValues_(retainsValues) {}
    [[nodiscard]] CFTypeRef retained(CFTypeRef value) const noexcept {
        return retainsValues_ ? CFRetain(value) : value;
    }
    void releaseValue(CFTypeRef value) const noexcept {
        if (retainsValues_) {
            CFRelease(value);
        }
    }
    // Gives back what a container held that is being destroyed; null counts for nothing.
    static void releaseAll(std::span<const CFTypeRef> held) noexcept;

  private:
    bool mutable_;
    bool retainsValues_;
};

}  // namespace platform::values

struct OpaqueCFArray final : platform::values::Container {
    OpaqueCFArray(bool isMutable, bool retainsValues) noexcept
        : Container(platform::values::Type::array, isMutable, retainsValues) {}
    // With these items, which it takes over.
    OpaqueCFArray(bool isMutable, std::span<platform::values::Owned<CFTypeRef>> items);
    // A copy, one level deep.
    OpaqueCFArray(bool isMutable, const OpaqueCFArray& other);
    ~OpaqueCFArray() override;

    [[nodiscard]] std::size_t count() const noexcept { return items_.size(); }
    [[nodiscard]] std::span<const CFTypeRef> slots() const noexcept { return items_; }
    void append(CFTypeRef value) { items_.push_back(retained(value)); }
    void remove(std::size_t position);
    // Puts items that it holds in another order, from a position on.
    void reorder(std::span<const CFTypeRef> items, std::size_t position) noexcept;

  private:
    std::vector<CFTypeRef> items_;
};

// A removed entry leaves a hole (a null key) until the next enumeration, so that removing thousands of
// entries one by one does not move the rest thousands of times. Look-up is linear in a small dictionary and
// through an index of positions in a large one.
struct OpaqueCFDictionary final : platform::values::Container {
    OpaqueCFDictionary(bool isMutable, bool retainsValues) noexcept
        : Container(platform::values::Type::dictionary, isMutable, retainsValues) {}
    // With these keys and values (key, value, key, value, ...), which it takes over.
    OpaqueCFDictionary(bool isMutable, std::span<platform::values::Owned<CFTypeRef>> slots);
    // A copy, one level deep.
    OpaqueCFDictionary(bool isMutable, const OpaqueCFDictionary& other);
    ~OpaqueCFDictionary() override;

    [[nodiscard]] std::size_t count() const noexcept { return live_; }
    // Both without the holes, which they fill.
    [[nodiscard]] std::span<const platform::values::Entry> entries() const;
    [[nodiscard]] std::span<const CFTypeRef> slots() const;
    // Null when the key is not there; borrowed until the dictionary is changed or enumerated.
    [[nodiscard]] const platform::values::Entry* find(CFTypeRef key) const;
    void set(CFTypeRef key, CFTypeRef value, bool replace);
    void remove(CFTypeRef key);
    // Whether no two keys are equal, as they are in every dictionary that was not made from slots.
    [[nodiscard]] bool hasDistinctKeys() const;

  private:
    struct KeyHash {
        std::size_t operator()(CFTypeRef key) const noexcept { return platform::values::hashOfValue(key); }
    };
    struct KeyEqual {
        bool operator()(CFTypeRef lhs, CFTypeRef rhs) const {
            return platform::values::equalValues(lhs, rhs);
        }
    };
    using Index = std::unordered_map<CFTypeRef, std::size_t, KeyHash, KeyEqual>;

    [[nodiscard]] bool isIndexed() const noexcept;
    void fillHoles() const;
    void buildIndex() const;

    mutable std::vector<platform::values::Entry> entries_;
    mutable std::unique_ptr<Index> index_;
    std::size_t live_ = 0;
};

namespace platform::values {

// Calls the function with the value as what it is: as an Object when it is none of these.
template <class Function>
decltype(auto) visit(CFTypeRef value, Function&& function) {
    const auto& object = *static_cast<const Object*>(value);
    switch (object.type()) {
        case Type::string:
            return function(static_cast<const OpaqueCFString&>(object));
        case Type::dictionary:
            return function(static_cast<const OpaqueCFDictionary&>(object));
        case Type::array:
            return function(static_cast<const OpaqueCFArray&>(object));
        case Type::number:
            return function(static_cast<const OpaqueCFNumber&>(object));
        case Type::boolean:
            return function(static_cast<const OpaqueCFBoolean&>(object));
        case Type::data:
            return function(static_cast<const OpaqueCFData&>(object));
        case Type::date:
            return function(static_cast<const OpaqueCFDate&>(object));
        case Type::url:
            return function(static_cast<const OpaqueCFURL&>(object));
        default:
            return function(object);
    }
}

}  // namespace platform::values
