// Dictionaries and arrays: handles on storage that they share until one of them writes.
#pragma once

#include <atomic>
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

// A counted block of items in their order: one pointer an item for an array, key and value for a dictionary.
//
// A removed dictionary entry leaves a hole (a null key) until the next enumeration, so that removing
// thousands of entries one by one does not move the rest thousands of times. Look-up is linear in a small
// dictionary and through an index of positions in a large one.
class Storage {
  public:
    enum class Shape : std::uint8_t { array = 1, dictionary = 2 };

    Storage(Shape shape, bool retainsValues) noexcept : shape_(shape), retainsValues_(retainsValues) {}
    // With these items (for a dictionary key, value, key, value, ...), which it takes over.
    Storage(Shape shape, std::span<Owned<CFTypeRef>> slots);
    Storage(const Storage&) = delete;
    Storage& operator=(const Storage&) = delete;

    [[nodiscard]] Storage* retain() noexcept {
        references_.fetch_add(1, std::memory_order_relaxed);
        return this;
    }
    void release() noexcept;
    // Storage with this content that nobody else holds; consumes a reference.
    [[nodiscard]] Storage* writable();

    [[nodiscard]] std::size_t count() const noexcept { return live_; }
    [[nodiscard]] bool retainsValues() const noexcept { return retainsValues_; }

    // The items of an array.
    [[nodiscard]] std::span<const CFTypeRef> items() const noexcept { return slots_; }
    void append(CFTypeRef value);
    void removeItem(std::size_t position);
    void reorder(std::span<const CFTypeRef> items, std::size_t position) noexcept;

    static constexpr std::size_t absent = SIZE_MAX;
    // The entries of a dictionary; fills the holes first.
    [[nodiscard]] std::span<const Entry> entries();
    // The position of the entry, or absent.
    [[nodiscard]] std::size_t find(CFTypeRef key);
    [[nodiscard]] CFTypeRef valueAt(std::size_t position) const noexcept { return slots_[2 * position + 1]; }
    // The key must not be there.
    void addEntry(CFTypeRef key, CFTypeRef value);
    void replaceValue(std::size_t position, CFTypeRef value);
    void removeEntry(std::size_t position);
    // Whether no two keys are equal, as they are in every dictionary that was not made from slots.
    [[nodiscard]] bool hasDistinctKeys();

  private:
    struct KeyHash {
        std::size_t operator()(CFTypeRef key) const noexcept { return hashOfValue(key); }
    };
    struct KeyEqual {
        bool operator()(CFTypeRef lhs, CFTypeRef rhs) const { return equalValues(lhs, rhs); }
    };
    using Index = std::unordered_map<CFTypeRef, std::size_t, KeyHash, KeyEqual>;

    ~Storage();
    [[nodiscard]] std::size_t width() const noexcept { return static_cast<std::size_t>(shape_); }
    [[nodiscard]] bool isIndexed() const noexcept;
    void releaseSlot(std::size_t slot) const noexcept;
    void fillHoles();
    void buildIndex();

    std::atomic<std::int32_t> references_{1};
    Shape shape_;
    bool retainsValues_;
    std::vector<CFTypeRef> slots_;
    std::size_t live_ = 0;
    std::unique_ptr<Index> index_;
};

// What the two kinds of handles have in common.
class Container : public Object {
  public:
    ~Container() override { storage_->release(); }

    [[nodiscard]] std::size_t count() const noexcept { return storage_->count(); }
    [[nodiscard]] bool isMutable() const noexcept { return mutable_; }
    [[nodiscard]] bool retainsValues() const noexcept { return storage_->retainsValues(); }
    [[nodiscard]] Storage& storage() const noexcept { return *storage_; }
    // Storage that may be written to.
    [[nodiscard]] Storage& writable() {
        storage_ = storage_->writable();
        return *storage_;
    }

  protected:
    // Takes over a reference to the storage.
    Container(Type type, bool isMutable, Storage* storage) noexcept
        : Object(type), mutable_(isMutable), storage_(storage) {}

  private:
    bool mutable_;
    Storage* storage_;
};

}  // namespace platform::values

struct OpaqueCFDictionary final : platform::values::Container {
    static constexpr auto shape = platform::values::Storage::Shape::dictionary;
    OpaqueCFDictionary(bool isMutable, platform::values::Storage* storage) noexcept
        : Container(platform::values::Type::dictionary, isMutable, storage) {}

    void set(CFTypeRef key, CFTypeRef value, bool replace);
    void remove(CFTypeRef key);
};

struct OpaqueCFArray final : platform::values::Container {
    static constexpr auto shape = platform::values::Storage::Shape::array;
    OpaqueCFArray(bool isMutable, platform::values::Storage* storage) noexcept
        : Container(platform::values::Type::array, isMutable, storage) {}
};

namespace platform::values {

template <class Handle>
[[nodiscard]] Handle* makeContainer(bool isMutable, bool retainsValues) {
    return new Handle(isMutable, new Storage(Handle::shape, retainsValues));
}
// A second handle on the container's storage.
template <class Handle>
[[nodiscard]] Handle* shareStorage(const Handle& container, bool isMutable) {
    return new Handle(isMutable, container.storage().retain());
}

}  // namespace platform::values
