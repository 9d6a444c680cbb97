// How this library reads values that others wrote, and hands over its own.
#pragma once

#include "morecfq/MoreCFQ.h"
#include "platform/CoreFoundation.h"
#include "platform/CoreServices.h"

inline bool IsString(CFTypeRef value) {
    return value != nullptr && CFGetTypeID(value) == CFStringGetTypeID();
}
inline bool IsArray(CFTypeRef value) {
    return value != nullptr && CFGetTypeID(value) == CFArrayGetTypeID();
}
inline bool IsDictionary(CFTypeRef value) {
    return value != nullptr && CFGetTypeID(value) == CFDictionaryGetTypeID();
}

// The value under the key, borrowed; null when it is absent or of another type.
inline CFStringRef GetStringValue(CFDictionaryRef dict, CFStringRef key) {
    CFTypeRef value = CFDictionaryGetValue(dict, key);
    return IsString(value) ? static_cast<CFStringRef>(value) : nullptr;
}
inline CFArrayRef GetArrayValue(CFDictionaryRef dict, CFStringRef key) {
    CFTypeRef value = CFDictionaryGetValue(dict, key);
    return IsArray(value) ? static_cast<CFArrayRef>(value) : nullptr;
}

// The string under the key as a new reference; -4960 when there is none.
inline OSStatus CopyStringValue(CFDictionaryRef dict, CFStringRef key, CFStringRef* value) {
    *value = static_cast<CFStringRef>(CFQRetain(GetStringValue(dict, key)));
    return *value != nullptr ? 0 : coreFoundationUnknownErr;
}
// Whether that very string is under the key.
inline bool HasStringValue(CFDictionaryRef dict, CFStringRef key, CFStringRef wanted) {
    CFStringRef value = GetStringValue(dict, key);
    return value != nullptr && CFEqual(value, wanted);
}

// Hands a reference to the caller on success, when it is wanted; else gives it back.
template <class Ref>
void HandOver(OSStatus err, Ref value, Ref* output) {
    if (err == 0 && output != nullptr) {
        *output = value;
    } else {
        CFQRelease(value);
    }
}
// The same for an operation that promises a null output on failure.
template <class Ref>
void HandOverOrNull(OSStatus err, Ref value, Ref* output) {
    if (err != 0 && output != nullptr) {
        *output = nullptr;
    }
    HandOver(err, value, output);
}
