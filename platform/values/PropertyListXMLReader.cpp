// Read with expat: of the parsers measured it is the one that is strict about everything XML forbids, bounded
// in memory, and still ahead of the property-list library; a tree-building one is faster but lets ill-formed
// text, stray characters and unknown entities pass, each of which would have to be caught again here.
#include <expat.h>

#include <algorithm>
#include <array>
#include <charconv>
#include <chrono>
#include <limits>
#include <memory>
#include <vector>

#include "platform/values/Containers.h"
#include "platform/values/PropertyListXML.h"
#include "platform/values/Scalars.h"

namespace platform::values {

namespace {

enum class Element : std::uint8_t {
    unknown,
    plist,
    dict,
    array,
    key,
    string,
    integer,
    real,
    trueValue,
    falseValue,
    data,
    date,
};

Element elementNamed(std::string_view name) {
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

bool isSpace(char character) {
    return character == ' ' || character == '\n' || character == '\t' || character == '\r';
}

std::string_view trimmed(std::string_view text) {
    while (!text.empty() && isSpace(text.front())) {
        text.remove_prefix(1);
    }
    while (!text.empty() && isSpace(text.back())) {
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

constexpr std::array<std::int8_t, 256> makeBase64Values() {
    std::array<std::int8_t, 256> values{};
    values.fill(-1);
    constexpr std::string_view alphabet = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    for (std::size_t i = 0; i < alphabet.size(); ++i) {
        values[static_cast<unsigned char>(alphabet[i])] = static_cast<std::int8_t>(i);
    }
    return values;
}

std::optional<std::string> bytesFromBase64(std::string_view text) {
    static constexpr std::array<std::int8_t, 256> values = makeBase64Values();
    std::string bytes;
    bytes.reserve(text.size() / 4 * 3);
    std::uint32_t group = 0;
    unsigned size = 0;
    unsigned padding = 0;
    for (const char character : text) {
        if (isSpace(character)) {
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

// Each distinct value of a document is made once, containers included: the services of a preferences file
// repeat each other's defaults, and what is there a thousand times is then compared a thousand times instead
// of made. It also lets keys and items be compared by address.
class ValuePool {
  public:
    ValuePool() : places_(1024) {}

    // The pooled value with the hash that isSame(CFTypeRef) accepts, or the one that make() hands over; null
    // when make does not. Borrowed; the pool holds it.
    template <class IsSame, class Make>
    [[nodiscard]] CFTypeRef get(std::uint32_t hash, IsSame isSame, Make make) {
        std::size_t place = hash & (places_.size() - 1);
        for (; places_[place].value; place = (place + 1) & (places_.size() - 1)) {
            if (places_[place].hash == hash && isSame(places_[place].value.get())) {
                return places_[place].value.get();
            }
        }
        places_[place] = {hash, Owned<CFTypeRef>::adopt(make())};
        const CFTypeRef made = places_[place].value.get();
        if (made != nullptr && ++count_ * 2 > places_.size()) {
            grow();
        }
        return made;
    }

    // The same for one of the opaque types, from what tells its values apart. Types get hashes of their own.
    template <class Ref, class IsSame, class Make>
    [[nodiscard]] CFTypeRef getTyped(std::string_view bytes, IsSame isSame, Make make) {
        return get(
            hashOfText(bytes) + static_cast<std::uint32_t>(typeOf<Ref>),
            [&](CFTypeRef value) { return as<Ref>(value) != nullptr && isSame(*static_cast<Ref>(value)); },
            make);
    }

  private:
    struct Place {
        std::uint32_t hash = 0;
        Owned<CFTypeRef> value;
    };

    void grow() {
        std::vector<Place> larger(places_.size() * 2);
        for (Place& old : places_) {
            if (old.value) {
                std::size_t place = old.hash & (larger.size() - 1);
                while (larger[place].value) {
                    place = (place + 1) & (larger.size() - 1);
                }
                larger[place] = std::move(old);
            }
        }
        places_ = std::move(larger);
    }

    std::vector<Place> places_;
    std::size_t count_ = 0;
};

template <class T>
std::string_view bytesOf(const T& value) {
    return {reinterpret_cast<const char*>(&value), sizeof value};
}

class Reader {
  public:
    explicit Reader(XML_Parser parser) : parser_(parser) {}

    void start(const char* name, const char** attributes);
    void end();
    void characters(std::string_view text);
    void refuse(const char* reason) {
        if (reason_ == nullptr) {
            reason_ = reason;
            // Stopped, the parser tells the place behind what it was stopped at.
            refusedAt_ = XML_GetCurrentByteIndex(parser_);
            XML_StopParser(parser_, XML_FALSE);
        }
    }

    // Null when nothing was refused here.
    [[nodiscard]] const char* reason() const { return reason_; }
    [[nodiscard]] XML_Index refusedAt() const { return refusedAt_; }
    [[nodiscard]] Owned<CFPropertyListRef> value() const {
        return Owned<CFPropertyListRef>::retained(values_.back());
    }

  private:
    struct Level {
        Element element;
        std::uint16_t frozenLevels;
        std::size_t firstValue;
    };

    void add(CFTypeRef value, int frozenLevels);
    template <class Handle>
    [[nodiscard]] CFTypeRef containerOf(std::span<const CFTypeRef> slots, std::uint16_t frozenLevels);
    void endContainer();
    [[nodiscard]] CFTypeRef leafOf(std::string_view text);
    void endLeaf();
    // Whether the next thing in the innermost dictionary must be a key.
    [[nodiscard]] bool wantsKey() const { return (values_.size() - levels_.back().firstValue) % 2 == 0; }

    XML_Parser parser_;
    const char* reason_ = nullptr;
    XML_Index refusedAt_ = 0;
    // The containers that are open, plist first, and the values (and keys) in them that are complete, all
    // held by the pool.
    std::vector<Level> levels_;
    std::vector<CFTypeRef> values_;
    // The leaf that is open, unknown when none is, and its text.
    Element leaf_ = Element::unknown;
    std::string text_;
    ValuePool pool_;
};

void Reader::start(const char* name, const char** attributes) {
    const Element element = elementNamed(name);
    if (leaf_ != Element::unknown) {
        refuse("an element inside a value that holds none");
        return;
    }
    if (levels_.empty() != (element == Element::plist)) {
        refuse(levels_.empty() ? "not a property list" : "a property list inside another");
        return;
    }
    if (element == Element::plist) {
        const bool isKnown = attributes[0] == nullptr ||
                             (std::string_view(attributes[0]) == "version" &&
                              std::string_view(attributes[1]) == "1.0" && attributes[2] == nullptr);
        if (!isKnown) {
            refuse("not a property list of version 1.0");
        }
        levels_.push_back({element, 0, 0});
        return;
    }
    if (element == Element::unknown) {
        refuse("an element that property lists do not have");
        return;
    }
    if (attributes[0] != nullptr) {
        refuse("an attribute that property lists do not have");
        return;
    }
    const Element container = levels_.back().element;
    if ((element == Element::key) != (container == Element::dict && wantsKey())) {
        refuse(element == Element::key ? "a key where a value belongs" : "a value without a key");
        return;
    }
    if (container == Element::plist && !values_.empty()) {
        refuse("a second value in the property list");
        return;
    }
    if (element != Element::dict && element != Element::array) {
        leaf_ = element;
        text_.clear();
    } else if (levels_.size() > deepestPropertyList) {
        refuse("nested too deep");
    } else {
        levels_.push_back({element, 1, values_.size()});
    }
}

void Reader::characters(std::string_view text) {
    if (leaf_ != Element::unknown) {
        text_.append(text);
    } else if (!std::ranges::all_of(text, isSpace)) {
        refuse("text outside a value");
    }
}

void Reader::end() {
    if (leaf_ != Element::unknown) {
        endLeaf();
    } else if (levels_.back().element != Element::plist) {
        endContainer();
    } else if (values_.empty()) {
        refuse("a property list without a value");
    } else {
        levels_.pop_back();
    }
}

void Reader::add(CFTypeRef value, int frozenLevels) {
    values_.push_back(value);
    Level& level = levels_.back();
    level.frozenLevels = std::max(level.frozenLevels, static_cast<std::uint16_t>(frozenLevels + 1));
}

// Null when a key is there twice.
template <class Handle>
CFTypeRef Reader::containerOf(std::span<const CFTypeRef> slots, std::uint16_t frozenLevels) {
    constexpr bool isDictionary = std::is_same_v<Handle, OpaqueCFDictionary>;
    constexpr auto shape = isDictionary ? Storage::Shape::dictionary : Storage::Shape::array;
    const auto isSame = [&](const Handle& pooled) {
        const Storage* const storage = pooled.storage();
        return std::ranges::equal(storage != nullptr ? storage->slots() : std::span<const CFTypeRef>(),
                                  slots);
    };
    const auto make = [&]() -> const Handle* {
        Storage* const storage = slots.empty() ? nullptr : Storage::create(shape, slots, frozenLevels);
        auto made = Owned<const Handle*>::adopt(new Handle(false, true, storage));
        return isDictionary && storage != nullptr && !storage->hasDistinctKeys() ? nullptr : made.take();
    };
    return pool_.getTyped<const Handle*>({reinterpret_cast<const char*>(slots.data()), slots.size_bytes()},
                                         isSame, make);
}

void Reader::endContainer() {
    const Level level = levels_.back();
    const bool isDictionary = level.element == Element::dict;
    if (isDictionary && !wantsKey()) {
        refuse("a key without a value");
        return;
    }
    const std::span<const CFTypeRef> slots = std::span<const CFTypeRef>(values_).subspan(level.firstValue);
    const CFTypeRef container = isDictionary ? containerOf<OpaqueCFDictionary>(slots, level.frozenLevels)
                                             : containerOf<OpaqueCFArray>(slots, level.frozenLevels);
    if (container == nullptr) {
        refuse("a dictionary with the same key twice");
        return;
    }
    values_.resize(level.firstValue);
    levels_.pop_back();
    add(container, level.frozenLevels);
}

// The value of the leaf that is open, or null when the text is none.
CFTypeRef Reader::leafOf(std::string_view text) {
    switch (leaf_) {
        case Element::key:
        case Element::string:
            return pool_.getTyped<CFStringRef>(
                text, [&](const OpaqueCFString& pooled) { return pooled.text() == text; },
                [&] { return makeString(text).take(); });
        case Element::integer: {
            const auto number = numberFrom<std::int64_t>(text);
            return !number ? nullptr
                           : pool_.getTyped<CFNumberRef>(
                                 bytesOf(*number),
                                 [&](const OpaqueCFNumber& pooled) {
                                     return !pooled.isReal && pooled.integer == *number;
                                 },
                                 [&] { return makeNumber(*number).take(); });
        }
        case Element::real: {
            const auto number = numberFrom<double>(text);
            return !number ? nullptr
                           : pool_.getTyped<CFNumberRef>(
                                 bytesOf(*number),
                                 [&](const OpaqueCFNumber& pooled) {
                                     return pooled.isReal && bytesOf(pooled.real) == bytesOf(*number);
                                 },
                                 [&] { return makeReal(*number).take(); });
        }
        case Element::trueValue:
            return text.empty() ? kCFBooleanTrue : nullptr;
        case Element::falseValue:
            return text.empty() ? kCFBooleanFalse : nullptr;
        case Element::data: {
            auto bytes = bytesFromBase64(text);
            return !bytes ? nullptr
                          : pool_.getTyped<CFDataRef>(
                                *bytes, [&](const OpaqueCFData& pooled) { return pooled.bytes == *bytes; },
                                [&] { return new OpaqueCFData(std::move(*bytes)); });
        }
        case Element::date: {
            const auto seconds = secondsFrom(text);
            return !seconds ? nullptr
                            : pool_.getTyped<CFDateRef>(
                                  bytesOf(*seconds),
                                  [&](const OpaqueCFDate& pooled) { return pooled.seconds == *seconds; },
                                  [&] { return makeDate(*seconds).take(); });
        }
        case Element::unknown:
        case Element::plist:
        case Element::dict:
        case Element::array:
            break;
    }
    return nullptr;
}

const char* faultOf(Element leaf) {
    switch (leaf) {
        case Element::integer:
            return "an integer that is none or does not fit 64 bits";
        case Element::real:
            return "a real that is none or is out of range";
        case Element::trueValue:
        case Element::falseValue:
            return "a boolean with text in it";
        case Element::data:
            return "data that is not base 64";
        case Element::date:
            return "a date that is none";
        case Element::key:
        case Element::string:
        case Element::unknown:
        case Element::plist:
        case Element::dict:
        case Element::array:
            break;
    }
    return "text that is too long";
}

void Reader::endLeaf() {
    const CFTypeRef value = leafOf(text_);
    if (value == nullptr) {
        refuse(faultOf(leaf_));
    } else {
        leaf_ = Element::unknown;
        add(value, 0);
    }
}

Reader& readerOf(void* context) {
    return *static_cast<Reader*>(context);
}

// A parser that was told to stop still reports the end of an element like <a/>.

void XMLCALL onStart(void* context, const char* name, const char** attributes) {
    if (Reader& reader = readerOf(context); reader.reason() == nullptr) {
        reader.start(name, attributes);
    }
}

void XMLCALL onEnd(void* context, const char*) {
    if (Reader& reader = readerOf(context); reader.reason() == nullptr) {
        reader.end();
    }
}

void XMLCALL onCharacters(void* context, const char* text, int size) {
    if (Reader& reader = readerOf(context); reader.reason() == nullptr) {
        reader.characters({text, static_cast<std::size_t>(size)});
    }
}

void XMLCALL onDoctype(void* context, const char* name, const char*, const char*, int hasInternalSubset) {
    if (hasInternalSubset != 0 || std::string_view(name) != "plist") {
        readerOf(context).refuse("a document type other than that of property lists");
    }
}

// A document type that is not read makes every entity unknown but not an error.
void XMLCALL onSkippedEntity(void* context, const char*, int) {
    readerOf(context).refuse("an entity that property lists do not have");
}

void XMLCALL onDeclaration(void* context, const char*, const char* encoding, int) {
    constexpr std::string_view wanted = "utf-8";
    const std::string_view declared = encoding != nullptr ? encoding : wanted;
    const bool isWanted = std::ranges::equal(declared, wanted, [](char lhs, char rhs) {
        return (lhs >= 'A' && lhs <= 'Z' ? lhs + ('a' - 'A') : lhs) == rhs;
    });
    if (!isWanted) {
        readerOf(context).refuse("an encoding other than UTF-8");
    }
}

ParseError errorAt(std::string_view text, std::size_t position, std::string reason) {
    const std::string_view before = text.substr(0, std::min(position, text.size()));
    const auto lines = static_cast<std::size_t>(std::ranges::count(before, '\n'));
    // Without a line break before it, npos + 1 is the beginning of the text.
    const std::size_t lineStart = before.rfind('\n') + 1;
    return {lines + 1, before.size() - lineStart + 1, std::move(reason)};
}

struct ParserCloser {
    void operator()(XML_Parser parser) const { XML_ParserFree(parser); }
};

}  // namespace

Owned<CFPropertyListRef> parsePropertyListXML(std::string_view text, ParseError& error) {
    const std::unique_ptr<XML_ParserStruct, ParserCloser> parser(XML_ParserCreate("UTF-8"));
    if (!parser || text.size() > static_cast<std::size_t>(std::numeric_limits<int>::max())) {
        error = {1, 1, parser ? "too large" : "out of memory"};
        return {};
    }
    Reader reader(parser.get());
    XML_SetUserData(parser.get(), &reader);
    XML_SetElementHandler(parser.get(), onStart, onEnd);
    XML_SetCharacterDataHandler(parser.get(), onCharacters);
    XML_SetStartDoctypeDeclHandler(parser.get(), onDoctype);
    XML_SetSkippedEntityHandler(parser.get(), onSkippedEntity);
    XML_SetXmlDeclHandler(parser.get(), onDeclaration);
    if (XML_Parse(parser.get(), text.data(), static_cast<int>(text.size()), XML_TRUE) == XML_STATUS_OK) {
        return reader.value();
    }
    const bool isRefused = reader.reason() != nullptr;
    const XML_Index place = isRefused ? reader.refusedAt() : XML_GetCurrentByteIndex(parser.get());
    error = errorAt(text, static_cast<std::size_t>(std::max<XML_Index>(0, place)),
                    isRefused ? reader.reason() : XML_ErrorString(XML_GetErrorCode(parser.get())));
    return {};
}

}  // namespace platform::values
