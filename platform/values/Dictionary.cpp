#include <algorithm>
#include <utility>

#include "platform/values/Containers.h"
#include "platform/values/Values.h"

using namespace platform::values;

struct CFDictionaryKeyCallBacks {};
struct CFDictionaryValueCallBacks {};

const CFDictionaryKeyCallBacks kCFTypeDictionaryKeyCallBacks{};
const CFDictionaryValueCallBacks kCFTypeDictionaryValueCallBacks{};

namespace {

// Up to here a look-up compares each key; beyond, the index pays.
constexpr std::size_t linearLimit = 16;

// The entries as keys and values one behind the other.
std::span<const CFTypeRef> flattened(std::span<const Entry> entries) {
    static_assert(sizeof(Entry) == 2 * sizeof(CFTypeRef) && alignof(Entry) == alignof(CFTypeRef));
    return {reinterpret_cast<const CFTypeRef*>(entries.data()), entries.size() * 2};
}

}  // namespace

OpaqueCFDictionary::OpaqueCFDictionary(bool isMutable, std::span<Owned<CFTypeRef>> slots)
    : OpaqueCFDictionary(isMutable, true) {
    live_ = slots.size() / 2;
    entries_.reserve(live_);
    for (std::size_t i = 0; i < slots.size(); i += 2) {
        entries_.push_back({slots[i].take(), slots[i + 1].take()});
    }
}

OpaqueCFDictionary::OpaqueCFDictionary(bool isMutable, const OpaqueCFDictionary& other)
    : OpaqueCFDictionary(isMutable, other.retainsValues()) {
    live_ = other.live_;
    entries_.reserve(live_);
    for (const Entry& entry : other.entries()) {
        entries_.push_back({CFRetain(entry.key), retained(entry.value)});
    }
}

OpaqueCFDictionary::~OpaqueCFDictionary() {
    if (!retainsValues()) {
        std::ranges::for_each(entries_, [](Entry& entry) { entry.value = nullptr; });
    }
    releaseAll(flattened(entries_));
}

std::span<const Entry> OpaqueCFDictionary::entries() const {
    fillHoles();
    return entries_;
}

std::span<const CFTypeRef> OpaqueCFDictionary::slots() const {
    return flattened(entries());
}

void OpaqueCFDictionary::fillHoles() const {
    if (live_ != entries_.size()) {
        std::erase_if(entries_, [](const Entry& entry) { return entry.key == nullptr; });
        index_.reset();
    }
}

bool OpaqueCFDictionary::isIndexed() const noexcept {
    return entries_.size() > linearLimit;
}

void OpaqueCFDictionary::buildIndex() const {
    fillHoles();
    index_ = std::make_unique<Index>(live_);
    for (const Entry& entry : entries_) {
        index_->emplace(entry.key, &entry - entries_.data());
    }
}

const Entry* OpaqueCFDictionary::find(CFTypeRef key) const {
    if (isIndexed()) {
        if (!index_) {
            buildIndex();
        }
        const auto found = index_->find(key);
        return found != index_->end() ? &entries_[found->second] : nullptr;
    }
    const std::uint32_t hash = hashOfValue(key);
    for (const Entry& entry : entries_) {
        if (entry.key == key ||
            (entry.key != nullptr && hashOfValue(entry.key) == hash && equalValues(entry.key, key))) {
            return &entry;
        }
    }
    return nullptr;
}

bool OpaqueCFDictionary::hasDistinctKeys() const {
    if (isIndexed()) {
        buildIndex();
        return index_->size() == live_;
    }
    return std::ranges::all_of(entries_, [this](const Entry& entry) { return find(entry.key) == &entry; });
}

void OpaqueCFDictionary::set(CFTypeRef key, CFTypeRef value, bool replace) {
    if (const Entry* const entry = find(key)) {
        if (replace) {
            const CFTypeRef replaced = std::exchange(const_cast<Entry*>(entry)->value, retained(value));
            releaseValue(replaced);
        }
        return;
    }
    if (entries_.size() > 2 * (live_ + linearLimit)) {
        fillHoles();
    }
    // A key that somebody could still change would be lost in the index.
    const auto* const text = as<CFStringRef>(key);
    const CFTypeRef own = text != nullptr ? CFStringCreateCopy(nullptr, text) : CFRetain(key);
    entries_.push_back({own, retained(value)});
    ++live_;
    if (index_) {
        index_->emplace(own, entries_.size() - 1);
    }
}

void OpaqueCFDictionary::remove(CFTypeRef key) {
    const Entry* const entry = find(key);
    if (entry == nullptr) {
        return;
    }
    if (index_) {
        index_->erase(key);
    }
    // Out of the way before anything is released.
    const Entry removed = std::exchange(*const_cast<Entry*>(entry), Entry{});
    --live_;
    releaseValue(removed.value);
    CFRelease(removed.key);
}

std::span<const Entry> platform::values::entriesOf(CFDictionaryRef dictionary) {
    return dictionary->entries();
}

CFTypeID CFDictionaryGetTypeID() noexcept {
    return static_cast<CFTypeID>(Type::dictionary);
}

CFDictionaryRef CFDictionaryCreate(CFAllocatorRef, const void** keys, const void** values, CFIndex count,
                                   const CFDictionaryKeyCallBacks*,
                                   const CFDictionaryValueCallBacks* valueCallBacks) noexcept {
    auto* const dictionary = new OpaqueCFDictionary(false, valueCallBacks != nullptr);
    for (CFIndex i = 0; i < count; ++i) {
        dictionary->set(keys[i], values[i], false);
    }
    return dictionary;
}

CFMutableDictionaryRef CFDictionaryCreateMutable(CFAllocatorRef, CFIndex, const CFDictionaryKeyCallBacks*,
                                                 const CFDictionaryValueCallBacks* valueCallBacks) noexcept {
    return new OpaqueCFDictionary(true, valueCallBacks != nullptr);
}

CFMutableDictionaryRef CFDictionaryCreateMutableCopy(CFAllocatorRef, CFIndex,
                                                     CFDictionaryRef dictionary) noexcept {
    return new OpaqueCFDictionary(true, *dictionary);
}

CFIndex CFDictionaryGetCount(CFDictionaryRef dictionary) noexcept {
    return static_cast<CFIndex>(dictionary->count());
}

const void* CFDictionaryGetValue(CFDictionaryRef dictionary, const void* key) noexcept {
    CFTypeRef value = nullptr;
    CFDictionaryGetValueIfPresent(dictionary, key, &value);
    return value;
}

Boolean CFDictionaryGetValueIfPresent(CFDictionaryRef dictionary, const void* key,
                                      const void** value) noexcept {
    const Entry* const entry = dictionary->find(key);
    if (entry != nullptr && value != nullptr) {
        *value = entry->value;
    }
    return static_cast<Boolean>(entry != nullptr);
}

Boolean CFDictionaryContainsKey(CFDictionaryRef dictionary, const void* key) noexcept {
    return CFDictionaryGetValueIfPresent(dictionary, key, nullptr);
}

void CFDictionaryGetKeysAndValues(CFDictionaryRef dictionary, const void** keys,
                                  const void** values) noexcept {
    for (const Entry& entry : entriesOf(dictionary)) {
        if (keys != nullptr) {
            *keys++ = entry.key;
        }
        if (values != nullptr) {
            *values++ = entry.value;
        }
    }
}

void CFDictionarySetValue(CFMutableDictionaryRef dictionary, const void* key, const void* value) noexcept {
    if (dictionary->mayChange()) {
        dictionary->set(key, value, true);
    }
}

void CFDictionaryAddValue(CFMutableDictionaryRef dictionary, const void* key, const void* value) noexcept {
    if (dictionary->mayChange()) {
        dictionary->set(key, value, false);
    }
}

void CFDictionaryRemoveValue(CFMutableDictionaryRef dictionary, const void* key) noexcept {
    if (dictionary->mayChange()) {
        dictionary->remove(key);
    }
}
