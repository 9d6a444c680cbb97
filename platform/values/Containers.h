// Dictionaries and arrays: handles on storage that they share until one of them writes.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <span>

#include "platform/CoreFoundation.h"
#include "platform/values/Object.h"
#include "platform/values/Values.h"

namespace platform::values {

// A counted block of items in their order: one pointer an item for an array, key and value for a dictionary.
// A handle without one is empty.
//
// A removed dictionary entry leaves a hole (a null key) until the next enumeration or growth, so that
// removing thousands of entries one by one does not move the rest thousands of times. Look-up is linear in a
// small dictionary and through an index of positions in a large one.
class Storage {
  public:
    enum class Shape : std::uint8_t { array = 1, dictionary = 2 };

    Storage(const Storage&) = delete;
    Storage& operator=(const Storage&) = delete;

    [[nodiscard]] static Storage* create(Shape shape, bool retainsValues, std::size_t capacity);
    // With these items (for a dictionary key, value, key, value, ...), which it takes over.
    [[nodiscard]] static Storage* create(Shape shape, std::span<Owned<CFTypeRef>> slots);
    void retain() noexcept { references_.fetch_add(1, std::memory_order_relaxed); }
    void release() noexcept;
    // Storage with this content and room for one more item that nobody else holds; consumes a reference.
    [[nodiscard]] Storage* writable();

    [[nodiscard]] std::size_t count() const noexcept { return live_; }
    [[nodiscard]] bool retainsValues() const noexcept { return retainsValues_; }

    // The items, with the holes and keys of a dictionary.
    [[nodiscard]] std::span<const CFTypeRef> slots() const noexcept { return {firstSlot(), used_ * width()}; }

    [[nodiscard]] std::span<const CFTypeRef> items() const noexcept { return slots(); }
    void append(CFTypeRef value);
    void removeItem(std::size_t position);
    void reorder(std::span<const CFTypeRef> items, std::size_t position) noexcept;

    static constexpr std::size_t absent = SIZE_MAX;
    // Fills the holes first.
    [[nodiscard]] std::span<const Entry> entries();
    // The position of the entry, or absent.
    [[nodiscard]] std::size_t find(CFTypeRef key);
    [[nodiscard]] CFTypeRef valueAt(std::size_t position) const noexcept {
        return firstSlot()[2 * position + 1];
    }
    // The key must not be there.
    void addEntry(CFTypeRef key, CFTypeRef value);
    void replaceValue(std::size_t position, CFTypeRef value);
    void removeEntry(std::size_t position);
    // Whether no two keys are equal, as they are in every dictionary that was not made from slots.
    [[nodiscard]] bool hasDistinctKeys();

  private:
    Storage(Shape shape, bool retainsValues, std::uint32_t capacity) noexcept
        : shape_(shape), retainsValues_(retainsValues), capacity_(capacity) {}
    ~Storage() = default;

    [[nodiscard]] CFTypeRef* firstSlot() noexcept { return reinterpret_cast<CFTypeRef*>(this + 1); }
    [[nodiscard]] const CFTypeRef* firstSlot() const noexcept {
        return reinterpret_cast<const CFTypeRef*>(this + 1);
    }
    [[nodiscard]] std::size_t width() const noexcept { return static_cast<std::size_t>(shape_); }
    [[nodiscard]] Storage* copy(std::size_t capacity) const;
    void fillHoles() noexcept;
    void buildIndex();
    void dropIndex() noexcept;
    void enterIntoIndex(std::uint32_t position) noexcept;
    [[nodiscard]] std::size_t indexSize() const noexcept;
    static void destroy(Storage* storage) noexcept;
    void releaseContent() noexcept;

    std::atomic<std::int32_t> references_{1};
    Shape shape_;
    bool retainsValues_;
    std::uint32_t used_ = 0;
    std::uint32_t live_ = 0;
    std::uint32_t capacity_;
    union {
        // Open addressing: positions from 1, 0 for a free place. Holes stay in it until it is built anew.
        std::uint32_t* index_ = nullptr;
        // While the storage waits for its destruction.
        Storage* nextDoomed_;
    };
};

// What the two kinds of handles have in common.
class Container : public Object {
  public:
    ~Container() override {
        if (storage_ != nullptr) {
            storage_->release();
        }
    }

    [[nodiscard]] std::size_t count() const noexcept { return storage_ != nullptr ? storage_->count() : 0; }
    [[nodiscard]] bool isMutable() const noexcept { return mutable_; }
    [[nodiscard]] bool retainsValues() const noexcept { return retainsValues_; }
    // Null for an empty one.
    [[nodiscard]] Storage* storage() const noexcept { return storage_; }
    // Storage that may be written to, with room for one more item.
    [[nodiscard]] Storage& writable();

  protected:
    // Takes over a reference to the storage.
    Container(Type type, bool isMutable, bool retainsValues, Storage* storage) noexcept
        : Object(type), mutable_(isMutable), retainsValues_(retainsValues), storage_(storage) {}

  private:
    bool mutable_;
    bool retainsValues_;
    Storage* storage_;
};

}  // namespace platform::values

struct OpaqueCFDictionary final : platform::values::Container {
    OpaqueCFDictionary(bool isMutable, bool retainsValues, platform::values::Storage* storage) noexcept
        : Container(platform::values::Type::dictionary, isMutable, retainsValues, storage) {}

    // False when the key is not there.
    [[nodiscard]] bool find(CFTypeRef key, CFTypeRef* value) const;
    void set(CFTypeRef key, CFTypeRef value, bool replace);
    void remove(CFTypeRef key);
};

struct OpaqueCFArray final : platform::values::Container {
    OpaqueCFArray(bool isMutable, bool retainsValues, platform::values::Storage* storage) noexcept
        : Container(platform::values::Type::array, isMutable, retainsValues, storage) {}

    [[nodiscard]] std::span<const CFTypeRef> items() const noexcept {
        return storage() != nullptr ? storage()->items() : std::span<const CFTypeRef>();
    }
};

namespace platform::values {

// A second handle on the container's storage.
[[nodiscard]] OpaqueCFDictionary* shareStorage(const OpaqueCFDictionary& dictionary, bool isMutable);
[[nodiscard]] OpaqueCFArray* shareStorage(const OpaqueCFArray& array, bool isMutable);

}  // namespace platform::values
