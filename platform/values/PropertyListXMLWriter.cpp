#include <charconv>
#include <cstring>

#include "platform/values/Containers.h"
#include "platform/values/PropertyListXML.h"
#include "platform/values/PropertyListXMLForms.h"
#include "platform/values/Scalars.h"

namespace platform::values {

namespace {

// A document is written twice: to nowhere, which tells its size, and into a string of that size. Letting the
// string grow would cost more than the first pass, most of it in memory that is new each time.
class Measure {
  public:
    void put(char) noexcept { ++size_; }
    void put(std::string_view piece) noexcept { size_ += piece.size(); }
    void indent(std::size_t depth) noexcept { size_ += depth; }
    [[nodiscard]] std::size_t size() const noexcept { return size_; }

  private:
    std::size_t size_ = 0;
};

class Fill {
  public:
    // The text must be as large as everything that is going to be put.
    explicit Fill(std::string& text) : at_(text.data()) {}
    void put(char character) noexcept { *at_++ = character; }
    void put(std::string_view piece) noexcept {
        std::memcpy(at_, piece.data(), piece.size());
        at_ += piece.size();
    }
    void indent(std::size_t depth) noexcept {
        std::memset(at_, '\t', depth);
        at_ += depth;
    }

  private:
    char* at_;
};

template <class Output>
class Writer {
  public:
    explicit Writer(Output& to) : output_(to) {}
    // False when the value cannot be written; the output is then of no use.
    [[nodiscard]] bool writeDocument(CFTypeRef value) {
        for (const std::string_view piece : {xmlDeclaration, documentType, plistStart}) {
            output_.put(piece);
            output_.put('\n');
        }
        const bool written = write(value, 0);
        output_.put("</plist>\n");
        return written;
    }

  private:
    [[nodiscard]] bool write(CFTypeRef value, std::size_t depth);
    bool writeText(std::string_view open, CFStringRef string, std::string_view close);
    bool writeDictionary(CFDictionaryRef dictionary, std::size_t depth);
    bool writeArray(CFArrayRef array, std::size_t depth);
    void writeNumber(CFNumberRef number);
    bool writeDate(std::int64_t seconds);
    void writeData(std::string_view bytes, std::size_t depth);

    Output& output_;
};

template <class Output>
bool Writer<Output>::writeText(std::string_view open, CFStringRef string, std::string_view close) {
    const TextTraits traits = string->traits();
    if ((traits & textBeyondXml) != 0) {
        return false;
    }
    output_.put(open);
    if ((traits & textNeedsEscape) == 0) {
        output_.put(string->text());
    } else {
        for (const char character : string->text()) {
            switch (character) {
                case '&':
                    output_.put("&amp;");
                    break;
                case '<':
                    output_.put("&lt;");
                    break;
                case '>':
                    output_.put("&gt;");
                    break;
                case '\r':
                    // As it stands a reader would take it for a line feed.
                    output_.put("&#13;");
                    break;
                default:
                    output_.put(character);
            }
        }
    }
    output_.put(close);
    return true;
}

template <class Output>
bool Writer<Output>::writeDictionary(CFDictionaryRef dictionary, std::size_t depth) {
    if (dictionary->count() == 0) {
        output_.put("<dict/>\n");
        return true;
    }
    output_.put("<dict>\n");
    for (const Entry& entry : entriesOf(dictionary)) {
        const auto* const key = as<CFStringRef>(entry.key);
        output_.indent(depth + 1);
        if (key == nullptr || !writeText("<key>", key, "</key>\n") || !write(entry.value, depth + 1)) {
            return false;
        }
    }
    output_.indent(depth);
    output_.put("</dict>\n");
    return true;
}

template <class Output>
bool Writer<Output>::writeArray(CFArrayRef array, std::size_t depth) {
    if (array->count() == 0) {
        output_.put("<array/>\n");
        return true;
    }
    output_.put("<array>\n");
    for (const CFTypeRef item : array->items()) {
        if (!write(item, depth + 1)) {
            return false;
        }
    }
    output_.indent(depth);
    output_.put("</array>\n");
    return true;
}

template <class Output>
void Writer<Output>::writeNumber(CFNumberRef number) {
    if (number->isReal) {
        output_.put("<real>");
        output_.put(realText(number->real));
        output_.put("</real>\n");
        return;
    }
    char digits[24];
    const std::to_chars_result result = std::to_chars(std::begin(digits), std::end(digits), number->integer);
    output_.put("<integer>");
    output_.put({std::begin(digits), result.ptr});
    output_.put("</integer>\n");
}

template <class Output>
void Writer<Output>::writeData(std::string_view bytes, std::size_t depth) {
    constexpr std::string_view alphabet = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    constexpr std::size_t bytesInLine = 51;
    output_.put("<data>\n");
    for (std::size_t start = 0; start < bytes.size(); start += 3) {
        if (start % bytesInLine == 0) {
            if (start > 0) {
                output_.put('\n');
            }
            output_.indent(depth);
        }
        const std::string_view group = bytes.substr(start, 3);
        std::uint32_t bits = 0;
        for (std::size_t i = 0; i < 3; ++i) {
            bits = (bits << 8) | (i < group.size() ? static_cast<unsigned char>(group[i]) : 0U);
        }
        for (std::size_t i = 0; i < 4; ++i) {
            output_.put(i <= group.size() ? alphabet[(bits >> (18 - 6 * i)) & 0x3F] : '=');
        }
    }
    if (!bytes.empty()) {
        output_.put('\n');
    }
    output_.indent(depth);
    output_.put("</data>\n");
}

template <class Output>
bool Writer<Output>::writeDate(std::int64_t seconds) {
    // Four digits carry the years 0 to 9999.
    constexpr std::int64_t first = -62'167'219'200;
    constexpr std::int64_t last = 253'402'300'799;
    if (seconds < first || seconds > last) {
        return false;
    }
    output_.put("<date>");
    output_.put(dateText(seconds));
    output_.put("</date>\n");
    return true;
}

template <class Output>
bool Writer<Output>::write(CFTypeRef value, std::size_t depth) {
    output_.indent(depth);
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
            output_.put(static_cast<CFBooleanRef>(value)->value ? "<true/>\n" : "<false/>\n");
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
    Measure measure;
    if (!Writer(measure).writeDocument(value)) {
        return std::nullopt;
    }
    std::string text(measure.size(), '\0');
    Fill fill(text);
    return Writer(fill).writeDocument(value) ? std::optional(std::move(text)) : std::nullopt;
}

}  // namespace platform::values
