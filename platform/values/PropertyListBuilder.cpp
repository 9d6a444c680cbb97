#include "platform/values/PropertyListBuilder.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <chrono>

#include "platform/values/PropertyListXML.h"

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

// Takes a number of exactly that many digits and what must follow it.
std::optional<unsigned> takeDigits(std::string_view& text, std::size_t digits, char after) {
    unsigned number = 0;
    for (std::size_t i = 0; i <= digits; ++i) {
        if (text.empty()) {
            return std::nullopt;
        }
        const char character = text.front();
        text.remove_prefix(1);
        if (i == digits) {
            return character == after ? std::optional(number) : std::nullopt;
        }
        if (character < '0' || character > '9') {
            return std::nullopt;
        }
        number = number * 10 + static_cast<unsigned>(character - '0');
    }
    return std::nullopt;
}

std::optional<std::int64_t> secondsFrom(std::string_view text) {
    using namespace std::chrono;
    text = trimmed(text);
    const auto years = takeDigits(text, 4, '-');
    const auto months = takeDigits(text, 2, '-');
    const auto days = takeDigits(text, 2, 'T');
    const auto hours = takeDigits(text, 2, ':');
    const auto minutes = takeDigits(text, 2, ':');
    const auto seconds = takeDigits(text, 2, 'Z');
    if (!years || !months || !days || !hours || !minutes || !seconds || !text.empty()) {
        return std::nullopt;
    }
    const year_month_day date(year(static_cast<int>(*years)), month(*months), day(*days));
    if (!date.ok() || *hours > 23 || *minutes > 59 || *seconds > 59) {
        return std::nullopt;
    }
    const std::int64_t midnight = sys_days(date).time_since_epoch().count() * 86'400LL;
    return midnight + *hours * 3600LL + *minutes * 60LL + *seconds;
}

constexpr std::array<std::int16_t, 256> makeBase64Values() {
    std::array<std::int16_t, 256> values{};
    values.fill(-1);
    constexpr std::string_view alphabet = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    for (std::size_t i = 0; i < alphabet.size(); ++i) {
        values[static_cast<unsigned char>(alphabet[i])] = static_cast<std::int16_t>(i);
    }
    return values;
}

std::optional<std::string> bytesFromBase64(std::string_view text) {
    static constexpr std::array<std::int16_t, 256> values = makeBase64Values();
    std::string bytes;
    bytes.reserve(text.size() / 4 * 3);
    std::uint32_t group = 0;
    unsigned size = 0;
    unsigned padding = 0;
    for (const char character : text) {
        if (isXMLSpace(character)) {
            continue;
        }
        const int value = values[static_cast<unsigned char>(character)];
        if (character == '=') {
            ++padding;
        } else if (value < 0 || padding > 0) {
            return std::nullopt;
        }
        group = (group << 6) | static_cast<std::uint32_t>(std::max(value, 0));
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

const char* faultOf(Element leaf) {
    switch (leaf) {
        case Element::integer:
            return "not an integer, or one that does not fit 64 bits";
        case Element::real:
            return "not a real, or one that is out of range";
        case Element::trueValue:
        case Element::falseValue:
            return "a boolean with text in it";
        case Element::data:
            return "not data in base 64";
        case Element::date:
            return "not a date";
        case Element::key:
        case Element::string:
        case Element::unknown:
        case Element::plist:
        case Element::dict:
        case Element::array:
            break;
    }
    return "text that XML cannot carry";
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
        Owned<CFTypeRef> value = leafOf(text);
        if (!value) {
            return faultOf(leaf_);
        }
        leaf_ = Element::unknown;
        values_.push_back(std::move(value));
        return nullptr;
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
    const auto shape = isDictionary ? Storage::Shape::dictionary : Storage::Shape::array;
    Storage* const storage = slots.empty() ? nullptr : Storage::create(shape, slots);
    auto container = isDictionary ? Owned<CFTypeRef>::adopt(new OpaqueCFDictionary(false, true, storage))
                                  : Owned<CFTypeRef>::adopt(new OpaqueCFArray(false, true, storage));
    if (isDictionary && storage != nullptr && !storage->hasDistinctKeys()) {
        return "a dictionary with the same key twice";
    }
    values_.resize(level.firstValue);
    levels_.pop_back();
    values_.push_back(std::move(container));
    return nullptr;
}

// The value of the leaf that is open, or none when the text is no such value.
Owned<CFTypeRef> PropertyListBuilder::leafOf(std::string_view text) {
    const auto adopted = [](CFTypeRef value) { return Owned<CFTypeRef>::adopt(value); };
    switch (leaf_) {
        case Element::key: {
            if (const auto known = keys_.find(text); known != keys_.end()) {
                return known->second;
            }
            const auto key = Owned<CFStringRef>::adopt(xmlString(text));
            return key ? keys_.emplace(textOf(key.get()), Owned<CFTypeRef>::retained(key.get())).first->second
                       : Owned<CFTypeRef>();
        }
        case Element::string:
            return adopted(xmlString(text));
        case Element::integer: {
            const auto number = numberFrom<std::int64_t>(text);
            return adopted(number ? makeNumber(*number).take() : nullptr);
        }
        case Element::real: {
            const auto number = numberFrom<double>(text);
            return adopted(number ? makeReal(*number).take() : nullptr);
        }
        case Element::trueValue:
        case Element::falseValue:
            return Owned<CFTypeRef>::retained(!text.empty()                 ? nullptr
                                              : leaf_ == Element::trueValue ? kCFBooleanTrue
                                                                            : kCFBooleanFalse);
        case Element::data: {
            auto bytes = bytesFromBase64(text);
            return adopted(bytes ? new OpaqueCFData(std::move(*bytes)) : nullptr);
        }
        case Element::date: {
            const auto seconds = secondsFrom(text);
            return adopted(seconds ? makeDate(*seconds).take() : nullptr);
        }
        case Element::unknown:
        case Element::plist:
        case Element::dict:
        case Element::array:
            break;
    }
    return {};
}

}  // namespace platform::values
