// Short ways to write values in tests.
#pragma once

#include <string>
#include <string_view>

#include "platform/values/PropertyListXML.h"
#include "platform/values/Values.h"

namespace values_test {

using namespace platform::values;

inline Owned<CFStringRef> str(std::string_view text) {
    return makeString(text);
}

// The value of a property list without its frame, or null.
inline Owned<CFPropertyListRef> parsed(std::string_view inner) {
    ParseError error;
    return parsePropertyListXML("<plist version=\"1.0\">" + std::string(inner) + "</plist>", error);
}

template <class Ref>
Owned<Ref> parsedAs(std::string_view inner) {
    return Owned<Ref>::adopt(as<Ref>(parsed(inner).take()));
}

inline Owned<CFMutableDictionaryRef> mutableDictionary() {
    return Owned<CFMutableDictionaryRef>::adopt(CFDictionaryCreateMutable(
        nullptr, 0, &kCFTypeDictionaryKeyCallBacks, &kCFTypeDictionaryValueCallBacks));
}

inline Owned<CFMutableArrayRef> mutableArray() {
    return Owned<CFMutableArrayRef>::adopt(CFArrayCreateMutable(nullptr, 0, &kCFTypeArrayCallBacks));
}

// Immutable arrays, one inside the other.
inline Owned<CFPropertyListRef> nestedArrays(int levels) {
    Owned<CFPropertyListRef> value = Owned<CFPropertyListRef>::adopt(str("innermost").take());
    for (int i = 0; i < levels; ++i) {
        CFTypeRef item = value.get();
        value = Owned<CFPropertyListRef>::adopt(CFArrayCreate(nullptr, &item, 1, &kCFTypeArrayCallBacks));
    }
    return value;
}

}  // namespace values_test
