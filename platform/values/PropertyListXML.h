// Property lists as XML (the document type "PLIST 1.0"), read and written.
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

#include "platform/CoreFoundation.h"
#include "platform/base/Outcome.h"
#include "platform/values/Object.h"

namespace platform::values {

// Containers nested deeper than this are refused, read or written.
inline constexpr int deepestPropertyList = 512;

struct ParseError {
    std::size_t line = 0;    // from 1
    std::size_t column = 0;  // in bytes, from 1
    std::string reason;      // one English phrase
};

// The value of a document, every value in it immutable, or null with the error filled in. Strict: well-formed
// XML in UTF-8, one plist element with one value, dictionaries with a key before each value and no key twice,
// integers that fit 64 bits, dates in UTC, data in base 64; entities other than the five of XML and character
// references are refused.
[[nodiscard]] Owned<CFPropertyListRef> parsePropertyListXML(std::string_view text, ParseError& error);
// The dictionary that a file with this text holds. Fails, with the place in the reason, for anything else.
Outcome parseDictionaryFile(const std::string& path, std::string_view text,
                            Owned<CFDictionaryRef>& dictionary);

// The document for a value, in UTF-8, indented with tabs, entries in their own order, ending in a line break;
// it reads back as an equal value. Nothing when the value holds something that XML cannot carry (a string
// with a control character other than tab, line feed and carriage return, or with U+FFFE or U+FFFF), a date
// outside the years 0 to 9999, a key that is not a string, a value that is no property-list value, or is
// nested too deep.
[[nodiscard]] std::optional<std::string> writePropertyListXML(CFPropertyListRef value);

}  // namespace platform::values
