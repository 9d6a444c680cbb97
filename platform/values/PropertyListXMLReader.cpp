// Every property list that is not in plain form, and the reason why something is not one. Read with expat: of
// the parsers measured it is the one that is strict about everything XML forbids and bounded in memory; one
// that builds a tree is faster but lets ill-formed text, stray characters and unknown entities pass.
#include <expat.h>

#include <algorithm>
#include <limits>
#include <memory>
#include <new>

#include "platform/values/PropertyListBuilder.h"
#include "platform/values/PropertyListXML.h"
#include "platform/values/PropertyListXMLForms.h"
#include "platform/values/Values.h"

namespace platform::values {

namespace {

class Reader {
  public:
    explicit Reader(XML_Parser parser) : parser_(parser) {}

    void start(const char* name, const char** attributes) {
        const Element element = elementNamed(name);
        const bool isVersion = element == Element::plist && attributes[0] != nullptr &&
                               std::string_view(attributes[0]) == "version" &&
                               std::string_view(attributes[1]) == "1.0" && attributes[2] == nullptr;
        refuse(builder_.begin(element));
        refuse(attributes[0] == nullptr || isVersion ? nullptr
                                                     : "an attribute that property lists do not have");
        text_.clear();
    }
    void characters(std::string_view text) {
        if (builder_.isInLeaf()) {
            text_.append(text);
        } else if (!std::ranges::all_of(text, isXMLSpace)) {
            refuse("text outside a value");
        }
    }
    void end() { refuse(builder_.end(text_)); }
    // Does nothing for a null reason.
    void refuse(const char* reason) {
        if (reason != nullptr && reason_ == nullptr) {
            reason_ = reason;
            // Stopped, the parser tells the place behind what it was stopped at.
            refusedAt_ = XML_GetCurrentByteIndex(parser_);
            XML_StopParser(parser_, XML_FALSE);
        }
    }

    // Null when nothing was refused here.
    [[nodiscard]] const char* reason() const { return reason_; }
    [[nodiscard]] XML_Index refusedAt() const { return refusedAt_; }
    [[nodiscard]] Owned<CFPropertyListRef> value() const { return builder_.value(); }

  private:
    XML_Parser parser_;
    const char* reason_ = nullptr;
    XML_Index refusedAt_ = 0;
    std::string text_;
    PropertyListBuilder builder_;
};

Reader& readerOf(void* context) {
    return *static_cast<Reader*>(context);
}

// A parser that was stopped still reports the end of an element like <a/>.

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

Owned<CFPropertyListRef> parseAnyPropertyListXML(std::string_view text, ParseError& error) {
    const std::unique_ptr<XML_ParserStruct, ParserCloser> parser(XML_ParserCreate("UTF-8"));
    if (!parser) {
        throw std::bad_alloc();
    }
    if (text.size() > static_cast<std::size_t>(std::numeric_limits<int>::max())) {
        error = {1, 1, "too large"};
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
    if (XML_GetErrorCode(parser.get()) == XML_ERROR_NO_MEMORY) {
        throw std::bad_alloc();
    }
    const bool isRefused = reader.reason() != nullptr;
    const XML_Index place = isRefused ? reader.refusedAt() : XML_GetCurrentByteIndex(parser.get());
    error = errorAt(text, static_cast<std::size_t>(std::max<XML_Index>(0, place)),
                    isRefused ? reader.reason() : XML_ErrorString(XML_GetErrorCode(parser.get())));
    return {};
}

Owned<CFPropertyListRef> parsePropertyListXML(std::string_view text, ParseError& error) {
    Owned<CFPropertyListRef> value = parsePlainPropertyListXML(text);
    return value ? value : parseAnyPropertyListXML(text, error);
}

Outcome parseDictionaryFile(const std::string& path, std::string_view text,
                            Owned<CFDictionaryRef>& dictionary) {
    ParseError error;
    const Owned<CFPropertyListRef> value = parsePropertyListXML(text, error);
    if (!value) {
        return {kSCStatusFailed, path + ", line " + std::to_string(error.line) + ", column " +
                                     std::to_string(error.column) + ": " + error.reason};
    }
    dictionary = Owned<CFDictionaryRef>::retained(as<CFDictionaryRef>(value.get()));
    return dictionary ? Outcome() : Outcome(kSCStatusFailed, path + " holds no dictionary");
}

}  // namespace platform::values
