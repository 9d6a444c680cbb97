#include "platform/values/PropertyListBuilder.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <ctime>

#include "platform/values/PropertyListXML.h"
#include "platform/values/PropertyListXMLForms.h"

namespace platform::values {

namespace {

std::string_view trimmed(std::string_view text) {
    while (!text.empty() && isXMLSpace(text.front())) {
        text.remove_prefix(1);
    }
    while (!text.empty() && isXMLSpace(text.back())) {
        text.remove_suffix(1);
    }
    return text;
}

template <class Number>
std::optional<Number> numberFrom(std::string_view text) {
    text = trimmed(text);
    if (text.size() > 1 && text.front() == '+' && text[1] != '-') {
        text.remove_prefix(1);
    }
    Number number{};
    const char* const end = text.data() + text.size();
    const std::from_chars_result result = std::from_chars(text.data(), end, number);
    return result.ec == std::errc() && result.ptr == end ? std::optional(number) : std::nullopt;
}

std::optional<std::int64_t> secondsFrom(std::string_view text) {
    const std::string date(trimmed(text));
    std::tm time{};
    if (strptime(date.c_str(), "%Y-%m-%dT%H:%M:%SZ", &time) == nullptr) {
        return std::nullopt;
    }
    // What is no date, or is written in another way, comes back as another text.
    const std::int64_t seconds = timegm(&time);
    return dateText(seconds) == date ? std::optional(seconds) : std::nullopt;
}

std::optional<std::string> bytesFromBase64(std::string_view text) {
    std::string bytes;
    bytes.reserve(text.size() / 4 * 3);
    std::uint32_t group = 0;
    unsigned size = 0;
    unsigned padding = 0;
    for (const char character : text) {
        if (isXMLSpace(character)) {
            continue;
        }
        const std::size_t value = base64Alphabet.find(character);
        const bool isPadding = character == '=';
        padding += isPadding ? 1 : 0;
        if (!isPadding && (value == std::string_view::npos || padding > 0)) {
            return std::nullopt;
        }
        group = (group << 6) | static_cast<std::uint32_t>(isPadding ? 0 : value);
        if (++size == 4) {
            if (padding > 2) {
                return std::nullopt;
            }
            for (unsigned i = 0; i < 3 - padding; ++i) {
                bytes.push_back(static_cast<char>(group >> (16 - 8 * i)));
            }
            size = group = 0;
            // Whatever follows a padded group is one too much.
            padding = padding > 0 ? 4 : 0;
        }
    }
    return size == 0 ? std::optional(std::move(bytes)) : std::nullopt;
}

// Null when the bytes are no text that a document can hold.
CFStringRef xmlString(std::string_view text) {
    const std::optional<TextTraits> traits = scanText(text);
    const bool isGood = traits.has_value() && (*traits & textBeyondXml) == 0;
    return isGood ? OpaqueCFString::create(text, *traits) : nullptr;
}

}  // namespace

Element elementNamed(std::string_view name) noexcept {
    struct Name {
        std::string_view name;
        Element element;
    };
    // The frequent ones first.
    static constexpr std::array<Name, 11> names{{{"key", Element::key},
                                                 {"string", Element::string},
                                                 {"integer", Element::integer},
                                                 {"dict", Element::dict},
                                                 {"array", Element::array},
                                                 {"true", Element::trueValue},
                                                 {"false", Element::falseValue},
                                                 {"data", Element::data},
                                                 {"real", Element::real},
                                                 {"date", Element::date},
                                                 {"plist", Element::plist}}};
    for (const Name& candidate : names) {
        if (candidate.name == name) {
            return candidate.element;
        }
    }
    return Element::unknown;
}

const char* PropertyListBuilder::begin(Element element) {
    if (isInLeaf()) {
        return "an element inside a value that holds none";
    }
    if (levels_.empty() != (element == Element::plist)) {
        return levels_.empty() ? "not a property list" : "a property list inside another";
    }
    if (element == Element::plist) {
        levels_.push_back({element, 0});
        return nullptr;
    }
    if (element == Element::unknown) {
        return "an element that property lists do not have";
    }
    const Element container = levels_.back().element;
    if ((element == Element::key) != (container == Element::dict && wantsKey())) {
        return element == Element::key ? "a key where a value belongs" : "a value without a key";
    }
    if (container == Element::plist && !values_.empty()) {
        return "a second value in the property list";
    }
    if (element != Element::dict && element != Element::array) {
        leaf_ = element;
    } else if (levels_.size() > deepestPropertyList) {
        return "nested too deep";
    } else {
        levels_.push_back({element, values_.size()});
    }
    return nullptr;
}

const char* PropertyListBuilder::end(std::string_view text) {
    if (isInLeaf()) {
        const char* const reason = endLeaf(text);
        leaf_ = Element::unknown;
        return reason;
    }
    if (levels_.back().element != Element::plist) {
        return endContainer();
    }
    if (values_.empty()) {
        return "a property list without a value";
    }
    levels_.pop_back();
    return nullptr;
}

const char* PropertyListBuilder::endContainer() {
    const Level level = levels_.back();
    const bool isDictionary = level.element == Element::dict;
    if (isDictionary && !wantsKey()) {
        return "a key without a value";
    }
    const std::span<Owned<CFTypeRef>> slots = std::span(values_).subspan(level.firstValue);
    Owned<CFTypeRef> container;
    if (isDictionary) {
        const auto* const dictionary = new OpaqueCFDictionary(false, slots);
        container = Owned<CFTypeRef>::adopt(dictionary);
        if (!dictionary->hasDistinctKeys()) {
            return "a dictionary with the same key twice";
        }
    } else {
        container = Owned<CFTypeRef>::adopt(new OpaqueCFArray(false, slots));
    }
    values_.resize(level.firstValue);
    levels_.pop_back();
    values_.push_back(std::move(container));
    return nullptr;
}

const char* PropertyListBuilder::endLeaf(std::string_view text) {
    const auto take = [this](CFTypeRef value, const char* reason) {
        if (value != nullptr) {
            values_.push_back(Owned<CFTypeRef>::adopt(value));
        }
        return value != nullptr ? nullptr : reason;
    };
    constexpr const char* notText = "text that XML cannot carry";
    switch (leaf_) {
        case Element::key: {
            if (const auto known = keys_.find(text); known != keys_.end()) {
                values_.push_back(known->second);
                return nullptr;
            }
            CFStringRef const key = xmlString(text);
            if (key != nullptr) {
                keys_.emplace(textOf(key), Owned<CFTypeRef>::retained(key));
            }
            return take(key, notText);
        }
        case Element::string:
            return take(xmlString(text), notText);
        case Element::integer: {
            const auto number = numberFrom<std::int64_t>(text);
            return take(number ? makeNumber(*number).take() : nullptr,
                        "not an integer, or one that does not fit 64 bits");
        }
        case Element::real: {
            const auto number = numberFrom<double>(text);
            return take(number ? makeReal(*number).take() : nullptr,
                        "not a real, or one that is out of range");
        }
        case Element::trueValue:
        case Element::falseValue:
            return text.empty()
                       ? take(CFRetain(leaf_ == Element::trueValue ? kCFBooleanTrue : kCFBooleanFalse),
                              nullptr)
                       : "a boolean with text in it";
        case Element::data: {
            auto bytes = bytesFromBase64(text);
            return take(bytes ? new OpaqueCFData(std::move(*bytes)) : nullptr, "not data in base 64");
        }
        case Element::date: {
            const auto seconds = secondsFrom(text);
            return take(seconds ? makeDate(*seconds).take() : nullptr, "not a date");
        }
        case Element::unknown:
        case Element::plist:
        case Element::dict:
        case Element::array:
            break;
    }
    return notText;
}

}  // namespace platform::values
