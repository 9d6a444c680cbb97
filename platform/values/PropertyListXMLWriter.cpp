#include <charconv>

#include "platform/values/Containers.h"
#include "platform/values/PropertyListXML.h"
#include "platform/values/Scalars.h"

namespace platform::values {

namespace {

constexpr std::string_view header =
    "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
    "<!DOCTYPE plist PUBLIC \"-//Apple//DTD PLIST 1.0//EN\" "
    "\"http://www.apple.com/DTDs/PropertyList-1.0.dtd\">\n"
    "<plist version=\"1.0\">\n";
constexpr std::string_view footer = "</plist>\n";

class Writer {
  public:
    // False when the value cannot be written; the text is then of no use.
    [[nodiscard]] bool write(CFTypeRef value, std::size_t depth);
    std::string text{header};

  private:
    void indent(std::size_t depth) { text.append(depth, '\t'); }
    bool writeText(std::string_view open, CFStringRef string, std::string_view close);
    bool writeDictionary(CFDictionaryRef dictionary, std::size_t depth);
    bool writeArray(CFArrayRef array, std::size_t depth);
    void writeNumber(CFNumberRef number);
    bool writeDate(std::int64_t seconds);
    void writeData(std::string_view bytes, std::size_t depth);
};

bool Writer::writeText(std::string_view open, CFStringRef string, std::string_view close) {
    const TextTraits traits = string->traits();
    if ((traits & textBeyondXml) != 0) {
        return false;
    }
    text += open;
    if ((traits & textNeedsEscape) == 0) {
        text += string->text();
    } else {
        for (const char character : string->text()) {
            switch (character) {
                case '&':
                    text += "&amp;";
                    break;
                case '<':
                    text += "&lt;";
                    break;
                case '>':
                    text += "&gt;";
                    break;
                case '\r':
                    // As it stands a reader would take it for a line feed.
                    text += "&#13;";
                    break;
                default:
                    text.push_back(character);
            }
        }
    }
    text += close;
    return true;
}

bool Writer::writeDictionary(CFDictionaryRef dictionary, std::size_t depth) {
    if (dictionary->count() == 0) {
        text += "<dict/>\n";
        return true;
    }
    text += "<dict>\n";
    for (const Entry& entry : entriesOf(dictionary)) {
        const auto* const key = as<CFStringRef>(entry.key);
        indent(depth + 1);
        if (key == nullptr || !writeText("<key>", key, "</key>\n") || !write(entry.value, depth + 1)) {
            return false;
        }
    }
    indent(depth);
    text += "</dict>\n";
    return true;
}

bool Writer::writeArray(CFArrayRef array, std::size_t depth) {
    if (array->count() == 0) {
        text += "<array/>\n";
        return true;
    }
    text += "<array>\n";
    for (const CFTypeRef item : array->items()) {
        if (!write(item, depth + 1)) {
            return false;
        }
    }
    indent(depth);
    text += "</array>\n";
    return true;
}

void Writer::writeNumber(CFNumberRef number) {
    if (number->isReal) {
        text += "<real>";
        text += realText(number->real);
        text += "</real>\n";
        return;
    }
    char digits[24];
    const std::to_chars_result result = std::to_chars(std::begin(digits), std::end(digits), number->integer);
    text += "<integer>";
    text.append(std::begin(digits), result.ptr);
    text += "</integer>\n";
}

void Writer::writeData(std::string_view bytes, std::size_t depth) {
    constexpr std::string_view alphabet = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    constexpr std::size_t bytesInLine = 51;
    text += "<data>\n";
    for (std::size_t start = 0; start < bytes.size(); start += 3) {
        if (start % bytesInLine == 0) {
            text += start == 0 ? "" : "\n";
            indent(depth);
        }
        const std::string_view group = bytes.substr(start, 3);
        std::uint32_t bits = 0;
        for (std::size_t i = 0; i < 3; ++i) {
            bits = (bits << 8) | (i < group.size() ? static_cast<unsigned char>(group[i]) : 0U);
        }
        for (std::size_t i = 0; i < 4; ++i) {
            text.push_back(i <= group.size() ? alphabet[(bits >> (18 - 6 * i)) & 0x3F] : '=');
        }
    }
    text += bytes.empty() ? "" : "\n";
    indent(depth);
    text += "</data>\n";
}

bool Writer::writeDate(std::int64_t seconds) {
    // Four digits carry the years 0 to 9999.
    constexpr std::int64_t first = -62'167'219'200;
    constexpr std::int64_t last = 253'402'300'799;
    if (seconds < first || seconds > last) {
        return false;
    }
    text += "<date>";
    text += dateText(seconds);
    text += "</date>\n";
    return true;
}

bool Writer::write(CFTypeRef value, std::size_t depth) {
    indent(depth);
    switch (static_cast<const Object*>(value)->type()) {
        case Type::string:
            return writeText("<string>", static_cast<CFStringRef>(value), "</string>\n");
        case Type::dictionary: {
            const auto* const dictionary = static_cast<CFDictionaryRef>(value);
            return depth < deepestPropertyList && dictionary->retainsValues() &&
                   writeDictionary(dictionary, depth);
        }
        case Type::array: {
            const auto* const array = static_cast<CFArrayRef>(value);
            return depth < deepestPropertyList && array->retainsValues() && writeArray(array, depth);
        }
        case Type::number:
            writeNumber(static_cast<CFNumberRef>(value));
            return true;
        case Type::boolean:
            text += static_cast<CFBooleanRef>(value)->value ? "<true/>\n" : "<false/>\n";
            return true;
        case Type::data:
            writeData(static_cast<CFDataRef>(value)->bytes, depth);
            return true;
        case Type::date:
            return writeDate(static_cast<CFDateRef>(value)->seconds);
        case Type::url:
        case Type::runLoop:
        case Type::runLoopSource:
        case Type::preferences:
        case Type::dynamicStore:
            break;
    }
    return false;
}

}  // namespace

std::optional<std::string> writePropertyListXML(CFPropertyListRef value) {
    Writer writer;
    if (!writer.write(value, 0)) {
        return std::nullopt;
    }
    writer.text += footer;
    return std::move(writer.text);
}

}  // namespace platform::values
