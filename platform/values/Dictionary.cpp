#include <cassert>

#include "platform/values/Containers.h"
#include "platform/values/Values.h"

using namespace platform::values;

struct CFDictionaryKeyCallBacks {};
struct CFDictionaryValueCallBacks {};

const CFDictionaryKeyCallBacks kCFTypeDictionaryKeyCallBacks{};
const CFDictionaryValueCallBacks kCFTypeDictionaryValueCallBacks{};

bool OpaqueCFDictionary::find(CFTypeRef key, CFTypeRef* value) const {
    if (storage() == nullptr) {
        return false;
    }
    const std::size_t position = storage()->find(key);
    if (position == Storage::absent) {
        return false;
    }
    *value = storage()->valueAt(position);
    return true;
}

void OpaqueCFDictionary::set(CFTypeRef key, CFTypeRef value, bool replace) {
    if (storage() != nullptr) {
        std::size_t position = storage()->find(key);
        if (position != Storage::absent) {
            if (replace && storage()->valueAt(position) != value) {
                // Making room may fill holes, and with them move the entry.
                Storage& own = writable();
                position = own.find(key);
                own.replaceValue(position, value);
            }
            return;
        }
    }
    writable().addEntry(key, value);
}

void OpaqueCFDictionary::remove(CFTypeRef key) {
    if (storage() == nullptr || storage()->find(key) == Storage::absent) {
        return;
    }
    Storage& own = writable();
    own.removeEntry(own.find(key));
}

OpaqueCFDictionary* platform::values::shareStorage(const OpaqueCFDictionary& dictionary, bool isMutable) {
    Storage* const storage = dictionary.storage();
    auto* const handle = new OpaqueCFDictionary(isMutable, dictionary.retainsValues(), storage);
    if (storage != nullptr) {
        storage->retain();
    }
    return handle;
}

std::span<const Entry> platform::values::entriesOf(CFDictionaryRef dictionary) {
    return dictionary->storage() != nullptr ? dictionary->storage()->entries() : std::span<const Entry>();
}

CFTypeID CFDictionaryGetTypeID() noexcept {
    return static_cast<CFTypeID>(Type::dictionary);
}

CFDictionaryRef CFDictionaryCreate(CFAllocatorRef, const void** keys, const void** values, CFIndex count,
                                   const CFDictionaryKeyCallBacks*,
                                   const CFDictionaryValueCallBacks* valueCallBacks) noexcept {
    auto* const dictionary = new OpaqueCFDictionary(false, valueCallBacks != nullptr, nullptr);
    for (CFIndex i = 0; i < count; ++i) {
        dictionary->set(keys[i], values[i], false);
    }
    return dictionary;
}

CFMutableDictionaryRef CFDictionaryCreateMutable(CFAllocatorRef, CFIndex, const CFDictionaryKeyCallBacks*,
                                                 const CFDictionaryValueCallBacks* valueCallBacks) noexcept {
    return new OpaqueCFDictionary(true, valueCallBacks != nullptr, nullptr);
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
    return dictionary->find(key, &value) ? value : nullptr;
}

Boolean CFDictionaryGetValueIfPresent(CFDictionaryRef dictionary, const void* key,
                                      const void** value) noexcept {
    CFTypeRef found = nullptr;
    if (!dictionary->find(key, &found)) {
        return 0;
    }
    if (value != nullptr) {
        *value = found;
    }
    return 1;
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
