#include <algorithm>

#include "platform/values/Containers.h"

namespace platform::values {

namespace {

// Up to here a look-up compares each key; beyond, the index pays.
constexpr std::size_t linearLimit = 16;

// Destroying a value nested in a value nested in a value ... recurses only so deep; the rest waits in a list.
constexpr int deepestDestruction = 128;
thread_local int destructionDepth = 0;
// The list of the outermost destruction.
constinit thread_local std::vector<Storage*>* waiting = nullptr;

}  // namespace

Storage::Storage(Shape shape, std::span<Owned<CFTypeRef>> slots)
    : shape_(shape), retainsValues_(true), slots_(slots.size()), live_(slots.size() / width()) {
    std::ranges::transform(slots, slots_.begin(), [](Owned<CFTypeRef>& slot) { return slot.take(); });
}

Storage::~Storage() {
    for (std::size_t slot = 0; slot < slots_.size(); ++slot) {
        releaseSlot(slot);
    }
}

void Storage::release() noexcept {
    if (references_.fetch_sub(1, std::memory_order_acq_rel) != 1) {
        return;
    }
    if (destructionDepth >= deepestDestruction) {
        waiting->push_back(this);
        return;
    }
    std::vector<Storage*> own;
    if (destructionDepth == 0) {
        waiting = &own;
    }
    ++destructionDepth;
    delete this;
    while (!own.empty()) {
        Storage* const next = own.back();
        own.pop_back();
        delete next;
    }
    if (--destructionDepth == 0) {
        waiting = nullptr;
    }
}

// Nothing of a hole.
void Storage::releaseSlot(std::size_t slot) const noexcept {
    const bool isKey = shape_ == Shape::dictionary && slot % 2 == 0;
    if ((isKey || retainsValues_) && slots_[slot] != nullptr) {
        CFRelease(slots_[slot]);
    }
}

Storage* Storage::writable() {
    if (references_.load(std::memory_order_acquire) == 1) {
        return this;
    }
    fillHoles();
    auto* const own = new Storage(shape_, retainsValues_);
    own->slots_ = slots_;
    own->live_ = live_;
    for (std::size_t slot = 0; slot < slots_.size(); ++slot) {
        if (retainsValues_ || (shape_ == Shape::dictionary && slot % 2 == 0)) {
            CFRetain(slots_[slot]);
        }
    }
    release();
    return own;
}

void Storage::append(CFTypeRef value) {
    slots_.push_back(retainsValues_ ? CFRetain(value) : value);
    ++live_;
}

void Storage::removeItem(std::size_t position) {
    releaseSlot(position);
    slots_.erase(slots_.begin() + static_cast<std::ptrdiff_t>(position));
    --live_;
}

void Storage::reorder(std::span<const CFTypeRef> items, std::size_t position) noexcept {
    std::ranges::copy(items, slots_.begin() + static_cast<std::ptrdiff_t>(position));
}

std::span<const Entry> Storage::entries() {
    static_assert(sizeof(Entry) == 2 * sizeof(CFTypeRef) && alignof(Entry) == alignof(CFTypeRef));
    fillHoles();
    return {reinterpret_cast<const Entry*>(slots_.data()), live_};
}

void Storage::fillHoles() {
    if (live_ * width() == slots_.size()) {
        return;
    }
    std::size_t to = 0;
    for (std::size_t from = 0; from < slots_.size(); from += 2) {
        if (slots_[from] != nullptr) {
            slots_[to++] = slots_[from];
            slots_[to++] = slots_[from + 1];
        }
    }
    slots_.resize(to);
    index_.reset();
}

bool Storage::isIndexed() const noexcept {
    return slots_.size() > linearLimit * 2;
}

void Storage::buildIndex() {
    fillHoles();
    index_ = std::make_unique<Index>(live_);
    for (std::size_t position = 0; position < live_; ++position) {
        index_->emplace(slots_[position * 2], position);
    }
}

std::size_t Storage::find(CFTypeRef key) {
    if (isIndexed()) {
        if (!index_) {
            buildIndex();
        }
        const auto found = index_->find(key);
        return found != index_->end() ? found->second : absent;
    }
    const std::uint32_t hash = hashOfValue(key);
    for (std::size_t slot = 0; slot < slots_.size(); slot += 2) {
        const CFTypeRef candidate = slots_[slot];
        if (candidate == key ||
            (candidate != nullptr && hashOfValue(candidate) == hash && equalValues(candidate, key))) {
            return slot / 2;
        }
    }
    return absent;
}

bool Storage::hasDistinctKeys() {
    if (isIndexed()) {
        buildIndex();
        return index_->size() == live_;
    }
    std::size_t position = 0;
    while (position < live_ && find(slots_[position * 2]) == position) {
        ++position;
    }
    return position == live_;
}

void Storage::addEntry(CFTypeRef key, CFTypeRef value) {
    if (slots_.size() > 4 * (live_ + linearLimit)) {
        fillHoles();
    }
    // A key that somebody could still change would be lost in the index.
    const auto* const text = as<CFStringRef>(key);
    slots_.push_back(text != nullptr ? CFStringCreateCopy(nullptr, text) : CFRetain(key));
    slots_.push_back(retainsValues_ ? CFRetain(value) : value);
    ++live_;
    if (index_) {
        index_->emplace(slots_[slots_.size() - 2], slots_.size() / 2 - 1);
    }
}

void Storage::replaceValue(std::size_t position, CFTypeRef value) {
    const CFTypeRef replaced = std::exchange(slots_[position * 2 + 1], value);
    if (retainsValues_) {
        CFRetain(value);
        CFRelease(replaced);
    }
}

void Storage::removeEntry(std::size_t position) {
    if (index_) {
        index_->erase(slots_[position * 2]);
    }
    // Out of the way before anything is released.
    const CFTypeRef key = std::exchange(slots_[position * 2], nullptr);
    const CFTypeRef value = std::exchange(slots_[position * 2 + 1], nullptr);
    --live_;
    CFRelease(key);
    if (retainsValues_) {
        CFRelease(value);
    }
}

}  // namespace platform::values
