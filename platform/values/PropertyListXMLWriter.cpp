#include <charconv>

#include "platform/values/Containers.h"
#include "platform/values/PropertyListXML.h"
#include "platform/values/PropertyListXMLForms.h"
#include "platform/values/Scalars.h"

namespace platform::values {

namespace {

class Writer {
  public:
    // Nothing when the value cannot be written.
    [[nodiscard]] std::optional<std::string> document(CFTypeRef value) && {
        for (const std::string_view piece : {xmlDeclaration, documentType, plistStart}) {
            put(piece);
            put('\n');
        }
        const bool written = write(value, 0);
        put("</plist>\n");
        return written ? std::optional(std::move(text_)) : std::nullopt;
    }

  private:
    // Each is false when the value cannot be written.
    bool write(CFTypeRef value, std::size_t depth) {
        indent(depth);
        return visit(value, [&](const auto& each) { return write(each, depth); });
    }
    bool writeText(std::string_view open, const OpaqueCFString& string, std::string_view close);
    bool write(const OpaqueCFString& string, std::size_t) {
        return writeText("<string>", string, "</string>\n");
    }
    bool write(const OpaqueCFDictionary& dictionary, std::size_t depth);
    bool write(const OpaqueCFArray& array, std::size_t depth);
    bool write(const OpaqueCFNumber& number, std::size_t);
    bool write(const OpaqueCFBoolean& boolean, std::size_t) {
        return put(boolean.value ? "<true/>\n" : "<false/>\n");
    }
    bool write(const OpaqueCFData& data, std::size_t depth);
    bool write(const OpaqueCFDate& date, std::size_t);
    // Everything else is no property-list value.
    bool write(const Object&, std::size_t) { return false; }

    void put(char character) { text_.push_back(character); }
    bool put(std::string_view piece) {
        text_.append(piece);
        return true;
    }
    void indent(std::size_t depth) { text_.append(depth, '\t'); }

    std::string text_;
};

bool Writer::writeText(std::string_view open, const OpaqueCFString& string, std::string_view close) {
    if ((string.traits() & textBeyondXml) != 0) {
        return false;
    }
    put(open);
    if ((string.traits() & textNeedsEscape) == 0) {
        put(string.text());
        return put(close);
    }
    for (const char character : string.text()) {
        switch (character) {
            case '&':
                put("&amp;");
                break;
            case '<':
                put("&lt;");
                break;
            case '>':
                put("&gt;");
                break;
            case '\r':
                // As it stands a reader would take it for a line feed.
                put("&#13;");
                break;
            default:
                put(character);
        }
    }
    return put(close);
}

bool Writer::write(const OpaqueCFDictionary& dictionary, std::size_t depth) {
    if (depth >= deepestPropertyList || !dictionary.retainsValues()) {
        return false;
    }
    if (dictionary.count() == 0) {
        return put("<dict/>\n");
    }
    put("<dict>\n");
    for (const Entry& entry : dictionary.entries()) {
        const auto* const key = as<CFStringRef>(entry.key);
        indent(depth + 1);
        if (key == nullptr || !writeText("<key>", *key, "</key>\n") || !write(entry.value, depth + 1)) {
            return false;
        }
    }
    indent(depth);
    return put("</dict>\n");
}

bool Writer::write(const OpaqueCFArray& array, std::size_t depth) {
    if (depth >= deepestPropertyList || !array.retainsValues()) {
        return false;
    }
    if (array.count() == 0) {
        return put("<array/>\n");
    }
    put("<array>\n");
    for (const CFTypeRef item : array.slots()) {
        if (!write(item, depth + 1)) {
            return false;
        }
    }
    indent(depth);
    return put("</array>\n");
}

bool Writer::write(const OpaqueCFNumber& number, std::size_t) {
    if (number.isReal) {
        return put("<real>") && put(realText(number.real)) && put("</real>\n");
    }
    char digits[24];
    const std::to_chars_result result = std::to_chars(std::begin(digits), std::end(digits), number.integer);
    return put("<integer>") && put({std::begin(digits), result.ptr}) && put("</integer>\n");
}

bool Writer::write(const OpaqueCFData& data, std::size_t depth) {
    constexpr std::size_t bytesInLine = 51;
    const std::string_view bytes = data.bytes;
    put("<data>\n");
    for (std::size_t start = 0; start < bytes.size(); start += 3) {
        if (start % bytesInLine == 0) {
            if (start > 0) {
                put('\n');
            }
            indent(depth);
        }
        const std::string_view group = bytes.substr(start, 3);
        std::uint32_t bits = 0;
        for (std::size_t i = 0; i < 3; ++i) {
            bits = (bits << 8) | (i < group.size() ? static_cast<unsigned char>(group[i]) : 0U);
        }
        for (std::size_t i = 0; i < 4; ++i) {
            put(i <= group.size() ? base64Alphabet[(bits >> (18 - 6 * i)) & 0x3F] : '=');
        }
    }
    if (!bytes.empty()) {
        put('\n');
    }
    indent(depth);
    return put("</data>\n");
}

bool Writer::write(const OpaqueCFDate& date, std::size_t) {
    // Four digits carry the years 0 to 9999.
    constexpr std::int64_t first = -62'167'219'200;
    constexpr std::int64_t last = 253'402'300'799;
    return date.seconds >= first && date.seconds <= last && put("<date>") && put(dateText(date.seconds)) &&
           put("</date>\n");
}

}  // namespace

std::optional<std::string> writePropertyListXML(CFPropertyListRef value) {
    return Writer().document(value);
}

}  // namespace platform::values
