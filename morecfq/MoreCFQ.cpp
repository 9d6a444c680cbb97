#include "morecfq/MoreCFQ.h"

#include <cstdlib>

#include "platform/CoreServices.h"

namespace {

bool IsDictionary(CFTypeRef value) {
    return value != nullptr && CFGetTypeID(value) == CFDictionaryGetTypeID();
}

bool IsArray(CFTypeRef value) {
    return value != nullptr && CFGetTypeID(value) == CFArrayGetTypeID();
}

// A buffer of that many slots, to be freed. None is needed for zero slots, and malloc(0) may be null.
OSStatus AllocateSlots(CFIndex count, const void*** slots) {
    OSStatus err = 0;
    *slots = nullptr;
    if (count > 0) {
        *slots = static_cast<const void**>(std::calloc(static_cast<std::size_t>(count), sizeof(const void*)));
        if (*slots == nullptr) {
            err = memFullErr;
        }
    }
    return err;
}

OSStatus CreateArrayWithKeysOrValues(CFDictionaryRef dict, bool wantKeys, CFArrayRef* result) {
    const CFIndex count = CFDictionaryGetCount(dict);
    const void** slots = nullptr;
    OSStatus err = AllocateSlots(count, &slots);
    if (err == 0) {
        CFDictionaryGetKeysAndValues(dict, wantKeys ? slots : nullptr, wantKeys ? nullptr : slots);
        *result = CFArrayCreate(kCFAllocatorDefault, slots, count, &kCFTypeArrayCallBacks);
        if (*result == nullptr) {
            err = coreFoundationUnknownErr;
        }
    }
    std::free(slots);
    return err;
}

// The keys that a dictionary has now, held on to whatever the walk's function does to it meanwhile. A walk
// leaves nothing out: without memory for the keys the process ends, as it does everywhere below.
CFArrayRef CreateArrayOfKeysForWalk(CFDictionaryRef dict) {
    CFArrayRef keys = nullptr;
    if (CFQArrayCreateWithDictionaryKeys(dict, &keys) != 0) {
        std::abort();
    }
    return keys;
}

// The path's keys as a vector, to be freed; they stay borrowed from the array.
OSStatus PathArrayHelper(CFArrayRef path, const void*** elements) {
    const CFIndex count = CFArrayGetCount(path);
    OSStatus err = AllocateSlots(count, elements);
    if (err == 0 && *elements == nullptr) {
        err = paramErr;
    }
    if (err == 0) {
        CFArrayGetValues(path, CFRangeMake(0, count), *elements);
    }
    return err;
}

// The dictionary under a key that is not the path's last one.
OSStatus GetInnerDictionary(CFDictionaryRef parent, CFTypeRef key, CFDictionaryRef* dict) {
    OSStatus err = 0;
    CFTypeRef value = nullptr;
    if (!CFDictionaryGetValueIfPresent(parent, key, &value)) {
        err = kCFQPathKeyMissingErr;
    } else if (!IsDictionary(value)) {
        err = kCFQPathNotDictionaryErr;
    } else {
        *dict = static_cast<CFDictionaryRef>(value);
    }
    return err;
}

// The dictionary that holds the path's last key, after every one on the way to it was replaced by a mutable
// copy. Whether one is mutable already is not asked: it may be held, and relied upon, by somebody outside the
// tree.
OSStatus CFQMutableDictionaryGetParentForPath(CFMutableDictionaryRef dict, const CFTypeRef* path,
                                              CFIndex count, CFMutableDictionaryRef* parent) {
    OSStatus err = 0;
    CFMutableDictionaryRef current = dict;
    for (CFIndex i = 0; err == 0 && i < count - 1; ++i) {
        CFDictionaryRef found = nullptr;
        CFMutableDictionaryRef copy = nullptr;
        err = GetInnerDictionary(current, path[i], &found);
        if (err == 0) {
            copy = CFDictionaryCreateMutableCopy(kCFAllocatorDefault, 0, found);
            if (copy == nullptr) {
                err = coreFoundationUnknownErr;
            }
        }
        if (err == 0) {
            CFDictionarySetValue(current, path[i], copy);
            current = copy;
        }
        CFQRelease(copy);
    }
    if (err == 0) {
        *parent = current;
    }
    return err;
}

struct DeepWalk {
    CFQPropertyListDeepApplierFunction func;
    void* context;
};

// One node of a deep walk, then what is in it.
void WalkDeep(CFTypeRef /*key*/, CFPropertyListRef node, void* context) {
    const auto* walk = static_cast<const DeepWalk*>(context);
    // The walk's function may take the node out of the container that held it.
    CFQRetain(node);
    walk->func(node, walk->context);
    CFQPropertyListShallowApplyFunction(node, WalkDeep, context);
    CFQRelease(node);
}

}  // namespace

CFTypeRef CFQRetain(CFTypeRef value) {
    if (value != nullptr) {
        CFRetain(value);
    }
    return value;
}

void CFQRelease(CFTypeRef value) {
    if (value != nullptr) {
        CFRelease(value);
    }
}

OSStatus CFQDictionaryCreateMutable(CFMutableDictionaryRef* result) {
    *result = CFDictionaryCreateMutable(kCFAllocatorDefault, 0, &kCFTypeDictionaryKeyCallBacks,
                                        &kCFTypeDictionaryValueCallBacks);
    return *result != nullptr ? 0 : coreFoundationUnknownErr;
}

OSStatus CFQArrayCreateMutable(CFMutableArrayRef* result) {
    *result = CFArrayCreateMutable(kCFAllocatorDefault, 0, &kCFTypeArrayCallBacks);
    return *result != nullptr ? 0 : coreFoundationUnknownErr;
}

OSStatus CFQArrayCreateWithDictionaryKeys(CFDictionaryRef dict, CFArrayRef* result) {
    return CreateArrayWithKeysOrValues(dict, true, result);
}

OSStatus CFQArrayCreateWithDictionaryValues(CFDictionaryRef dict, CFArrayRef* result) {
    return CreateArrayWithKeysOrValues(dict, false, result);
}

OSStatus CFQDictionaryCreateWithArrayOfKeysAndValues(CFArrayRef keys, CFArrayRef values,
                                                     CFDictionaryRef* result) {
    OSStatus err = 0;
    const void** keySlots = nullptr;
    const void** valueSlots = nullptr;
    const CFIndex count = CFArrayGetCount(keys);
    if (CFArrayGetCount(values) != count) {
        err = paramErr;
    }
    if (err == 0) {
        err = AllocateSlots(count, &keySlots);
    }
    if (err == 0) {
        err = AllocateSlots(count, &valueSlots);
    }
    if (err == 0) {
        CFArrayGetValues(keys, CFRangeMake(0, count), keySlots);
        CFArrayGetValues(values, CFRangeMake(0, count), valueSlots);
        *result = CFDictionaryCreate(kCFAllocatorDefault, keySlots, valueSlots, count,
                                     &kCFTypeDictionaryKeyCallBacks, &kCFTypeDictionaryValueCallBacks);
        if (*result == nullptr) {
            err = coreFoundationUnknownErr;
        }
    }
    std::free(keySlots);
    std::free(valueSlots);
    return err;
}

OSStatus CFQDictionarySetNumber(CFMutableDictionaryRef dict, const void* key, SInt32 value) {
    OSStatus err = 0;
    CFNumberRef number = CFNumberCreate(kCFAllocatorDefault, kCFNumberLongType, &value);
    if (number == nullptr) {
        err = coreFoundationUnknownErr;
    }
    if (err == 0) {
        CFDictionarySetValue(dict, key, number);
    }
    CFQRelease(number);
    return err;
}

OSStatus CFQDictionaryGetValueAtPath(CFDictionaryRef dict, const CFTypeRef* path, CFIndex count,
                                     CFTypeRef* result) {
    OSStatus err = 0;
    CFDictionaryRef parent = dict;
    for (CFIndex i = 0; err == 0 && i < count - 1; ++i) {
        err = GetInnerDictionary(parent, path[i], &parent);
    }
    if (err == 0) {
        CFTypeRef value = nullptr;
        if (CFDictionaryGetValueIfPresent(parent, path[count - 1], &value)) {
            *result = value;
        } else {
            err = kCFQPathKeyMissingErr;
        }
    }
    return err;
}

OSStatus CFQDictionaryGetValueAtPathArray(CFDictionaryRef dict, CFArrayRef path, CFTypeRef* result) {
    const void** elements = nullptr;
    OSStatus err = PathArrayHelper(path, &elements);
    if (err == 0) {
        err = CFQDictionaryGetValueAtPath(dict, elements, CFArrayGetCount(path), result);
    }
    std::free(elements);
    return err;
}

OSStatus CFQDictionarySetValueAtPath(CFMutableDictionaryRef dict, const CFTypeRef* path, CFIndex count,
                                     CFTypeRef value) {
    CFMutableDictionaryRef parent = nullptr;
    // The value may be one of the dictionaries on the way, which the walk takes out of the tree.
    CFQRetain(value);
    const OSStatus err = CFQMutableDictionaryGetParentForPath(dict, path, count, &parent);
    if (err == 0) {
        CFDictionarySetValue(parent, path[count - 1], value);
    }
    CFQRelease(value);
    return err;
}

OSStatus CFQDictionarySetValueAtPathArray(CFMutableDictionaryRef dict, CFArrayRef path, CFTypeRef value) {
    const void** elements = nullptr;
    OSStatus err = PathArrayHelper(path, &elements);
    if (err == 0) {
        err = CFQDictionarySetValueAtPath(dict, elements, CFArrayGetCount(path), value);
    }
    std::free(elements);
    return err;
}

OSStatus CFQDictionaryRemoveValueAtPath(CFMutableDictionaryRef dict, const CFTypeRef* path, CFIndex count) {
    CFMutableDictionaryRef parent = nullptr;
    OSStatus err = CFQMutableDictionaryGetParentForPath(dict, path, count, &parent);
    if (err == 0 && !CFDictionaryContainsKey(parent, path[count - 1])) {
        err = kCFQPathKeyMissingErr;
    }
    if (err == 0) {
        CFDictionaryRemoveValue(parent, path[count - 1]);
    }
    return err;
}

OSStatus CFQDictionaryRemoveValueAtPathArray(CFMutableDictionaryRef dict, CFArrayRef path) {
    const void** elements = nullptr;
    OSStatus err = PathArrayHelper(path, &elements);
    if (err == 0) {
        err = CFQDictionaryRemoveValueAtPath(dict, elements, CFArrayGetCount(path));
    }
    std::free(elements);
    return err;
}

void CFQPropertyListDeepApplyFunction(CFPropertyListRef propList, CFQPropertyListDeepApplierFunction func,
                                      void* context) {
    DeepWalk walk = {func, context};
    WalkDeep(nullptr, propList, &walk);
}

void CFQPropertyListShallowApplyFunction(CFPropertyListRef propList,
                                         CFQPropertyListShallowApplierFunction func, void* context) {
    CFQRetain(propList);
    if (IsDictionary(propList)) {
        auto* const dict = static_cast<CFDictionaryRef>(propList);
        CFArrayRef keys = CreateArrayOfKeysForWalk(dict);
        const CFIndex count = CFArrayGetCount(keys);
        for (CFIndex i = 0; i < count; ++i) {
            CFTypeRef key = CFArrayGetValueAtIndex(keys, i);
            CFTypeRef value = nullptr;
            if (CFDictionaryGetValueIfPresent(dict, key, &value)) {
                CFQRetain(value);
                func(key, value, context);
                CFQRelease(value);
            }
        }
        CFQRelease(keys);
    } else if (IsArray(propList)) {
        auto* const array = static_cast<CFArrayRef>(propList);
        for (CFIndex i = 0; i < CFArrayGetCount(array); ++i) {
            const auto index = static_cast<SInt32>(i);
            CFTypeRef value = CFQRetain(CFArrayGetValueAtIndex(array, i));
            CFNumberRef number = CFNumberCreate(kCFAllocatorDefault, kCFNumberLongType, &index);
            if (number != nullptr) {
                func(number, value, context);
            }
            CFQRelease(number);
            CFQRelease(value);
        }
    }
    CFQRelease(propList);
}

Boolean CFQPropertyListIsLeaf(CFPropertyListRef node) {
    return !IsDictionary(node) && !IsArray(node);
}
