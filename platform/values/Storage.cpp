#include <algorithm>
#include <bit>
#include <cstring>
#include <memory>
#include <new>

#include "platform/values/Containers.h"
#include "platform/values/Scalars.h"

namespace platform::values {

namespace {

// Up to here a look-up compares each key; beyond, the index pays.
constexpr std::size_t linearLimit = 16;

// Destroying a value nested in a value nested in a value ... recurses only so deep; the rest waits in a list.
constexpr int deepestDestruction = 128;
thread_local int destructionDepth = 0;
constinit thread_local Storage* doomed = nullptr;

}  // namespace

Storage* Storage::create(Shape shape, bool retainsValues, std::size_t capacity) {
    const std::size_t size = sizeof(Storage) + capacity * static_cast<std::size_t>(shape) * sizeof(CFTypeRef);
    return ::new (::operator new(size)) Storage(shape, retainsValues, static_cast<std::uint32_t>(capacity));
}

Storage* Storage::create(Shape shape, std::span<Owned<CFTypeRef>> slots) {
    const std::size_t count = slots.size() / static_cast<std::size_t>(shape);
    Storage* const storage = create(shape, true, count);
    std::ranges::transform(slots, storage->firstSlot(), [](Owned<CFTypeRef>& slot) { return slot.take(); });
    storage->used_ = storage->live_ = static_cast<std::uint32_t>(count);
    return storage;
}

void Storage::release() noexcept {
    if (references_.fetch_sub(1, std::memory_order_acq_rel) != 1) {
        return;
    }
    if (destructionDepth >= deepestDestruction) {
        dropIndex();
        nextDoomed_ = doomed;
        doomed = this;
        return;
    }
    ++destructionDepth;
    destroy(this);
    while (destructionDepth == 1 && doomed != nullptr) {
        Storage* const next = doomed;
        doomed = next->nextDoomed_;
        next->index_ = nullptr;
        destroy(next);
    }
    --destructionDepth;
}

void Storage::destroy(Storage* storage) noexcept {
    storage->releaseContent();
    storage->dropIndex();
    storage->~Storage();
    ::operator delete(storage);
}

void Storage::releaseContent() noexcept {
    CFTypeRef* const slot = firstSlot();
    const std::size_t step = width();
    for (std::size_t i = 0; i < used_ * step; i += step) {
        const CFTypeRef value = slot[i + step - 1];
        if (shape_ == Shape::dictionary) {
            if (slot[i] == nullptr) {
                continue;
            }
            CFRelease(slot[i]);
        }
        if (retainsValues_) {
            CFRelease(value);
        }
    }
}

Storage* Storage::copy(std::size_t capacity) const {
    Storage* const storage = create(shape_, retainsValues_, std::max<std::size_t>(capacity, live_));
    CFTypeRef* to = storage->firstSlot();
    const CFTypeRef* const from = firstSlot();
    const std::size_t step = width();
    for (std::size_t i = 0; i < used_ * step; i += step) {
        if (shape_ == Shape::dictionary) {
            if (from[i] == nullptr) {
                continue;
            }
            *to++ = CFRetain(from[i]);
        }
        const CFTypeRef value = from[i + step - 1];
        *to++ = retainsValues_ ? CFRetain(value) : value;
    }
    storage->used_ = storage->live_ = live_;
    return storage;
}

Storage* Storage::writable() {
    const bool isShared = references_.load(std::memory_order_acquire) != 1;
    if (!isShared && used_ < capacity_) {
        return this;
    }
    const std::size_t roomy = live_ + std::max<std::size_t>(4, live_ / 2);
    if (isShared) {
        Storage* const own = copy(live_ < capacity_ ? capacity_ : roomy);
        release();
        return own;
    }
    if (live_ < used_ - used_ / 4) {
        fillHoles();
        return this;
    }
    // The references move along with the items.
    fillHoles();
    Storage* const larger = create(shape_, retainsValues_, roomy);
    std::memcpy(larger->firstSlot(), firstSlot(), live_ * width() * sizeof(CFTypeRef));
    larger->used_ = larger->live_ = live_;
    used_ = live_ = 0;
    release();
    return larger;
}

void Storage::append(CFTypeRef value) {
    firstSlot()[used_++] = retainsValues_ ? CFRetain(value) : value;
    ++live_;
}

void Storage::removeItem(std::size_t position) {
    CFTypeRef* const slot = firstSlot() + position;
    const CFTypeRef removed = *slot;
    std::memmove(slot, slot + 1, (used_ - position - 1) * sizeof(CFTypeRef));
    --used_;
    --live_;
    if (retainsValues_) {
        CFRelease(removed);
    }
}

void Storage::reorder(std::span<const CFTypeRef> items, std::size_t position) noexcept {
    std::ranges::copy(items, firstSlot() + position);
}

std::span<const Entry> Storage::entries() {
    static_assert(sizeof(Entry) == 2 * sizeof(CFTypeRef) && alignof(Entry) == alignof(CFTypeRef));
    fillHoles();
    return {reinterpret_cast<const Entry*>(firstSlot()), live_};
}

void Storage::fillHoles() noexcept {
    if (live_ == used_) {
        return;
    }
    CFTypeRef* to = firstSlot();
    for (CFTypeRef* from = firstSlot(); from != firstSlot() + used_ * 2UL; from += 2) {
        if (from[0] != nullptr) {
            to[0] = from[0];
            to[1] = from[1];
            to += 2;
        }
    }
    used_ = live_;
    dropIndex();
}

std::size_t Storage::indexSize() const noexcept {
    return std::bit_ceil(std::size_t{capacity_} * 2);
}

void Storage::dropIndex() noexcept {
    ::operator delete(index_);
    index_ = nullptr;
}

void Storage::enterIntoIndex(std::uint32_t position) noexcept {
    const std::size_t mask = indexSize() - 1;
    std::size_t place = hashOfValue(firstSlot()[position * 2UL]) & mask;
    while (index_[place] != 0) {
        place = (place + 1) & mask;
    }
    index_[place] = position + 1;
}

void Storage::buildIndex() {
    fillHoles();
    const std::size_t size = indexSize() * sizeof(std::uint32_t);
    index_ = static_cast<std::uint32_t*>(::operator new(size));
    std::memset(index_, 0, size);
    for (std::uint32_t position = 0; position < used_; ++position) {
        enterIntoIndex(position);
    }
}

std::size_t Storage::find(CFTypeRef key) {
    const CFTypeRef* const slot = firstSlot();
    if (used_ <= linearLimit) {
        for (std::size_t position = 0; position < used_; ++position) {
            if (slot[position * 2] == key) {
                return position;
            }
        }
        const std::uint32_t hash = hashOfValue(key);
        for (std::size_t position = 0; position < used_; ++position) {
            const CFTypeRef candidate = slot[position * 2];
            if (candidate != nullptr && hashOfValue(candidate) == hash && equalValues(candidate, key)) {
                return position;
            }
        }
        return absent;
    }
    if (index_ == nullptr) {
        buildIndex();
    }
    const std::uint32_t hash = hashOfValue(key);
    const std::size_t mask = indexSize() - 1;
    for (std::size_t place = hash & mask; index_[place] != 0; place = (place + 1) & mask) {
        const std::size_t position = index_[place] - 1;
        const CFTypeRef candidate = slot[position * 2];
        if (candidate == key ||
            (candidate != nullptr && hashOfValue(candidate) == hash && equalValues(candidate, key))) {
            return position;
        }
    }
    return absent;
}

bool Storage::hasDistinctKeys() {
    const CFTypeRef* const slot = firstSlot();
    if (used_ > linearLimit) {
        std::size_t position = 0;
        while (position < used_ && find(slot[position * 2]) == position) {
            ++position;
        }
        return position == used_;
    }
    std::uint32_t hashes[linearLimit];
    for (std::size_t later = 0; later < used_; ++later) {
        hashes[later] = hashOfValue(slot[later * 2]);
        for (std::size_t earlier = 0; earlier < later; ++earlier) {
            if (hashes[earlier] == hashes[later] && equalValues(slot[earlier * 2], slot[later * 2])) {
                return false;
            }
        }
    }
    return true;
}

void Storage::addEntry(CFTypeRef key, CFTypeRef value) {
    // A key that somebody could still change would be lost in the index.
    const auto* const text = as<CFStringRef>(key);
    CFTypeRef* const slot = firstSlot() + used_ * 2UL;
    slot[0] = text != nullptr ? CFStringCreateCopy(nullptr, text) : CFRetain(key);
    slot[1] = retainsValues_ ? CFRetain(value) : value;
    if (index_ != nullptr) {
        enterIntoIndex(used_);
    }
    ++used_;
    ++live_;
}

void Storage::replaceValue(std::size_t position, CFTypeRef value) {
    CFTypeRef& slot = firstSlot()[position * 2 + 1];
    const CFTypeRef replaced = slot;
    slot = retainsValues_ ? CFRetain(value) : value;
    if (retainsValues_) {
        CFRelease(replaced);
    }
}

void Storage::removeEntry(std::size_t position) {
    CFTypeRef* const slot = firstSlot() + position * 2;
    const CFTypeRef key = slot[0];
    const CFTypeRef value = slot[1];
    slot[0] = slot[1] = nullptr;
    --live_;
    CFRelease(key);
    if (retainsValues_) {
        CFRelease(value);
    }
}

Storage& Container::writable() {
    if (storage_ == nullptr) {
        const auto shape = type() == Type::array ? Storage::Shape::array : Storage::Shape::dictionary;
        storage_ = Storage::create(shape, retainsValues_, 4);
    } else {
        storage_ = storage_->writable();
    }
    return *storage_;
}

}  // namespace platform::values
