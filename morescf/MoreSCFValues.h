// How this library reads values that others wrote, makes its own and hands them over.
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

// 0 for a value; -4960 for one that could not be made, or that the tree lacks.
inline OSStatus ErrorIfMissing(const void* value) {
    return value != nullptr ? static_cast<OSStatus>(0) : static_cast<OSStatus>(coreFoundationUnknownErr);
}
// 0 for an argument that is there, else -50.
inline OSStatus ErrorIfNotGiven(const void* argument) {
    return argument != nullptr ? static_cast<OSStatus>(0) : static_cast<OSStatus>(paramErr);
}

// The value with one more reference, as the type that it came in; null stays null.
template <class Ref>
Ref Retained(Ref value) {
    CFQRetain(value);
    return value;
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
    *value = Retained(GetStringValue(dict, key));
    return ErrorIfMissing(*value);
}
// Whether that very string is under the key.
inline bool HasStringValue(CFDictionaryRef dict, CFStringRef key, CFStringRef wanted) {
    CFStringRef value = GetStringValue(dict, key);
    return value != nullptr && CFEqual(value, wanted);
}

// The system's version as a BCD number (0x1020 is 10.2.0); one that cannot be had is 0, which is an old one.
inline constexpr UInt32 kVersionTenOneThree = 0x1013;
inline constexpr UInt32 kVersionTenTwo = 0x1020;
inline UInt32 GetSystemVersion() {
    SInt32 version = 0;
    return Gestalt(gestaltSystemVersion, &version) == noErr ? static_cast<UInt32>(version) : 0;
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
