#include <cassert>

#include "platform/values/Containers.h"
#include "platform/values/Values.h"

using namespace platform::values;

struct CFDictionaryKeyCallBacks {};
struct CFDictionaryValueCallBacks {};

const CFDictionaryKeyCallBacks kCFTypeDictionaryKeyCallBacks{};
const CFDictionaryValueCallBacks kCFTypeDictionaryValueCallBacks{};

void OpaqueCFDictionary::set(CFTypeRef key, CFTypeRef value, bool replace) {
    const std::size_t position = storage().find(key);
    if (position == Storage::absent) {
        writable().addEntry(key, value);
    } else if (replace && storage().valueAt(position) != value) {
        // A copy of its own has no holes, which may move the entry.
        Storage& own = writable();
        own.replaceValue(own.find(key), value);
    }
}

void OpaqueCFDictionary::remove(CFTypeRef key) {
    if (storage().find(key) != Storage::absent) {
        Storage& own = writable();
        own.removeEntry(own.find(key));
    }
}

std::span<const Entry> platform::values::entriesOf(CFDictionaryRef dictionary) {
    return dictionary->storage().entries();
}

CFTypeID CFDictionaryGetTypeID() noexcept {
    return static_cast<CFTypeID>(Type::dictionary);
}

CFDictionaryRef CFDictionaryCreate(CFAllocatorRef, const void** keys, const void** values, CFIndex count,
                                   const CFDictionaryKeyCallBacks*,
                                   const CFDictionaryValueCallBacks* valueCallBacks) noexcept {
    auto* const dictionary = makeContainer<OpaqueCFDictionary>(false, valueCallBacks != nullptr);
    for (CFIndex i = 0; i < count; ++i) {
        dictionary->set(keys[i], values[i], false);
    }
    return dictionary;
}

CFMutableDictionaryRef CFDictionaryCreateMutable(CFAllocatorRef, CFIndex, const CFDictionaryKeyCallBacks*,
                                                 const CFDictionaryValueCallBacks* valueCallBacks) noexcept {
    return makeContainer<OpaqueCFDictionary>(true, valueCallBacks != nullptr);
}

CFMutableDictionaryRef CFDictionaryCreateMutableCopy(CFAllocatorRef, CFIndex,
                                                     CFDictionaryRef dictionary) noexcept {
    return shareStorage(*dictionary, true);
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
    const std::size_t position = dictionary->storage().find(key);
    if (position != Storage::absent && value != nullptr) {
        *value = dictionary->storage().valueAt(position);
    }
    return static_cast<Boolean>(position != Storage::absent);
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
    assert(dictionary->isMutable());
    if (dictionary->isMutable()) {
        dictionary->set(key, value, true);
    }
}

void CFDictionaryAddValue(CFMutableDictionaryRef dictionary, const void* key, const void* value) noexcept {
    assert(dictionary->isMutable());
    if (dictionary->isMutable()) {
        dictionary->set(key, value, false);
    }
}

void CFDictionaryRemoveValue(CFMutableDictionaryRef dictionary, const void* key) noexcept {
    assert(dictionary->isMutable());
    if (dictionary->isMutable()) {
        dictionary->remove(key);
    }
}
