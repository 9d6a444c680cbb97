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
    [[nodiscard]] bool write(CFTypeRef value, std::size_t depth);
    bool writeText(std::string_view open, CFStringRef string, std::string_view close);
    bool writeDictionary(CFDictionaryRef dictionary, std::size_t depth);
    bool writeArray(CFArrayRef array, std::size_t depth);
    void writeNumber(CFNumberRef number);
    bool writeDate(std::int64_t seconds);
    void writeData(std::string_view bytes, std::size_t depth);

    void put(char character) { text_.push_back(character); }
    void put(std::string_view piece) { text_.append(piece); }
    void indent(std::size_t depth) { text_.append(depth, '\t'); }

    std::string text_;
};

bool Writer::writeText(std::string_view open, CFStringRef string, std::string_view close) {
    const TextTraits traits = string->traits();
    if ((traits & textBeyondXml) != 0) {
        return false;
    }
    put(open);
    if ((traits & textNeedsEscape) == 0) {
        put(string->text());
    } else {
        for (const char character : string->text()) {
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
    }
    put(close);
    return true;
}

bool Writer::writeDictionary(CFDictionaryRef dictionary, std::size_t depth) {
    if (dictionary->count() == 0) {
        put("<dict/>\n");
        return true;
    }
    put("<dict>\n");
    for (const Entry& entry : entriesOf(dictionary)) {
        const auto* const key = as<CFStringRef>(entry.key);
        indent(depth + 1);
        if (key == nullptr || !writeText("<key>", key, "</key>\n") || !write(entry.value, depth + 1)) {
            return false;
        }
    }
    indent(depth);
    put("</dict>\n");
    return true;
}

bool Writer::writeArray(CFArrayRef array, std::size_t depth) {
    if (array->count() == 0) {
        put("<array/>\n");
        return true;
    }
    put("<array>\n");
    for (const CFTypeRef item : itemsOf(array)) {
        if (!write(item, depth + 1)) {
            return false;
        }
    }
    indent(depth);
    put("</array>\n");
    return true;
}

void Writer::writeNumber(CFNumberRef number) {
    if (number->isReal) {
        put("<real>");
        put(realText(number->real));
        put("</real>\n");
        return;
    }
    char digits[24];
    const std::to_chars_result result = std::to_chars(std::begin(digits), std::end(digits), number->integer);
    put("<integer>");
    put({std::begin(digits), result.ptr});
    put("</integer>\n");
}

void Writer::writeData(std::string_view bytes, std::size_t depth) {
    constexpr std::string_view alphabet = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    constexpr std::size_t bytesInLine = 51;
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
            put(i <= group.size() ? alphabet[(bits >> (18 - 6 * i)) & 0x3F] : '=');
        }
    }
    if (!bytes.empty()) {
        put('\n');
    }
    indent(depth);
    put("</data>\n");
}

bool Writer::writeDate(std::int64_t seconds) {
    // Four digits carry the years 0 to 9999.
    constexpr std::int64_t first = -62'167'219'200;
    constexpr std::int64_t last = 253'402'300'799;
    if (seconds < first || seconds > last) {
        return false;
    }
    put("<date>");
    put(dateText(seconds));
    put("</date>\n");
    return true;
}

bool Writer::write(CFTypeRef value, std::size_t depth) {
    indent(depth);
    switch (static_cast<const Object*>(value)->propertyListType()) {
        case PropertyListType::string:
            return writeText("<string>", static_cast<CFStringRef>(value), "</string>\n");
        case PropertyListType::dictionary: {
            const auto* const dictionary = static_cast<CFDictionaryRef>(value);
            return depth < deepestPropertyList && dictionary->retainsValues() &&
                   writeDictionary(dictionary, depth);
        }
        case PropertyListType::array: {
            const auto* const array = static_cast<CFArrayRef>(value);
            return depth < deepestPropertyList && array->retainsValues() && writeArray(array, depth);
        }
        case PropertyListType::number:
            writeNumber(static_cast<CFNumberRef>(value));
            return true;
        case PropertyListType::boolean:
            put(static_cast<CFBooleanRef>(value)->value ? "<true/>\n" : "<false/>\n");
            return true;
        case PropertyListType::data:
            writeData(static_cast<CFDataRef>(value)->bytes, depth);
            return true;
        case PropertyListType::date:
            return writeDate(static_cast<CFDateRef>(value)->seconds);
        case PropertyListType::none:
            break;
    }
    return false;
}

}  // namespace

std::optional<std::string> writePropertyListXML(CFPropertyListRef value) {
    return Writer().document(value);
}

}  // namespace platform::values
