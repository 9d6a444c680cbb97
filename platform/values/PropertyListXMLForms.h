// The fixed pieces of a property-list document, and the reading of documents that consist of nothing else.
#pragma once

#include <string_view>

#include "platform/CoreFoundation.h"
#include "platform/values/Object.h"

namespace platform::values {

inline constexpr std::string_view xmlDeclaration = "<?xml version=\"1.0\" encoding=\"UTF-8\"?>";
inline constexpr std::string_view documentType =
    "<!DOCTYPE plist PUBLIC \"-//Apple//DTD PLIST 1.0//EN\" "
    "\"http://www.apple.com/DTDs/PropertyList-1.0.dtd\">";
inline constexpr std::string_view plistStart = "<plist version=\"1.0\">";
inline constexpr std::string_view base64Alphabet =
    "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";

// The value of a document in plain form: the pieces above, elements without attributes, text, the five
// entities and "&#13;". Null for everything else, which may or may not be a property list.
[[nodiscard]] Owned<CFPropertyListRef> parsePlainPropertyListXML(std::string_view text);
// The same for every property list, whatever XML allows it to look like.
struct ParseError;
[[nodiscard]] Owned<CFPropertyListRef> parseAnyPropertyListXML(std::string_view text, ParseError& error);

}  // namespace platform::values
