// Short ways to write values in tests.
#pragma once

#include <string>
#include <string_view>

#include "platform/values/PropertyListXML.h"
#include "tests/unit/support/Notation.h"

namespace values_test {

using namespace platform::values;
using testing_support::read;
using testing_support::show;

inline Owned<CFStringRef> str(std::string_view text) {
    return makeString(text);
}

// The value of a property list without its frame, or null.
inline Owned<CFPropertyListRef> parsed(std::string_view inner) {
    ParseError error;
    return parsePropertyListXML("<plist version=\"1.0\">" + std::string(inner) + "</plist>", error);
}

// Empty, or of what the notation says.
inline Owned<CFMutableDictionaryRef> mutableDictionary(std::string_view notation = "{}") {
    return Owned<CFMutableDictionaryRef>::adopt(
        const_cast<CFMutableDictionaryRef>(as<CFDictionaryRef>(read(notation).take())));
}
inline Owned<CFMutableArrayRef> arrayOf(std::string_view notation) {
    return Owned<CFMutableArrayRef>::adopt(
        const_cast<CFMutableArrayRef>(as<CFArrayRef>(read(notation).take())));
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
