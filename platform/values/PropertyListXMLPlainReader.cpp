// Reads a property list in the plain form in which every tool writes it.
//
// This is what makes reading faster than the property-list libraries. It knows so little of XML that it
// cannot be lenient: what is not plainly well-formed here, be it right or wrong, is left to the real parser.
#include <algorithm>
#include <iterator>
#include <optional>
#include <string>

#include "platform/values/PropertyListBuilder.h"
#include "platform/values/PropertyListXMLForms.h"

namespace platform::values {

namespace {

class PlainReader {
  public:
    explicit PlainReader(std::string_view text) : rest_(text) {}

    [[nodiscard]] Owned<CFPropertyListRef> read() {
        return readProlog() && readElements() && rest_.empty() ? builder_.value()
                                                               : Owned<CFPropertyListRef>();
    }

  private:
    void skipSpace() {
        std::size_t size = 0;
        while (size < rest_.size() && isXMLSpace(rest_[size])) {
            ++size;
        }
        rest_.remove_prefix(size);
    }
    [[nodiscard]] bool take(std::string_view wanted) {
        const bool isThere = rest_.starts_with(wanted);
        rest_.remove_prefix(isThere ? wanted.size() : 0);
        return isThere;
    }
    // What stands before the character, which is taken as well; nothing when it is not there.
    [[nodiscard]] std::optional<std::string_view> takeUpTo(char character) {
        const std::size_t size = rest_.find(character);
        if (size == std::string_view::npos) {
            return std::nullopt;
        }
        const std::string_view taken = rest_.substr(0, size);
        rest_.remove_prefix(size + 1);
        return taken;
    }
    [[nodiscard]] bool readProlog() {
        // White space behind each is that of the pieces themselves, and of whoever edits them by hand.
        for (const std::string_view piece : {xmlDeclaration, documentType}) {
            if (take(piece)) {
                skipSpace();
            }
        }
        return take(plistStart) && builder_.begin(Element::plist) == nullptr;
    }
    [[nodiscard]] bool readElements();
    [[nodiscard]] bool readLeaf(std::string_view name);
    [[nodiscard]] bool decode(std::string_view text);

    std::string_view rest_;
    PropertyListBuilder builder_;
    std::string decoded_;
};

bool PlainReader::readElements() {
    while (builder_.open() != Element::unknown) {
        skipSpace();
        if (!take("<")) {
            return false;
        }
        std::optional<std::string_view> name = takeUpTo('>');
        if (!name.has_value()) {
            return false;
        }
        if (name->starts_with('/')) {
            if (elementNamed(name->substr(1)) != builder_.open() || builder_.end({}) != nullptr) {
                return false;
            }
            continue;
        }
        const bool isEmpty = name->ends_with('/');
        name->remove_suffix(isEmpty ? 1 : 0);
        if (builder_.begin(elementNamed(*name)) != nullptr) {
            return false;
        }
        if (isEmpty ? builder_.end({}) != nullptr : builder_.isInLeaf() && !readLeaf(*name)) {
            return false;
        }
    }
    skipSpace();
    return true;
}

bool PlainReader::readLeaf(std::string_view name) {
    const std::optional<std::string_view> text = takeUpTo('<');
    if (!text.has_value() || !take("/") || !take(name) || !take(">")) {
        return false;
    }
    if (text->find('&') == std::string_view::npos) {
        return builder_.end(*text) == nullptr;
    }
    return decode(*text) && builder_.end(decoded_) == nullptr;
}

bool PlainReader::decode(std::string_view text) {
    struct Escape {
        std::string_view escape;
        char character;
    };
    static constexpr Escape escapes[] = {{"&amp;", '&'},  {"&lt;", '<'},    {"&gt;", '>'},
                                         {"&quot;", '"'}, {"&apos;", '\''}, {"&#13;", '\r'}};
    decoded_.clear();
    while (!text.empty()) {
        const std::size_t size = std::min(text.find('&'), text.size());
        decoded_.append(text.substr(0, size));
        text.remove_prefix(size);
        if (text.empty()) {
            break;
        }
        const auto* const escape = std::ranges::find_if(
            escapes, [&](const Escape& candidate) { return text.starts_with(candidate.escape); });
        if (escape == std::end(escapes)) {
            return false;
        }
        decoded_.push_back(escape->character);
        text.remove_prefix(escape->escape.size());
    }
    return true;
}

}  // namespace

Owned<CFPropertyListRef> parsePlainPropertyListXML(std::string_view text) {
    // A carriage return is read as a line feed, and "]]>" may not stand in text.
    const bool isPlain =
        text.find('\r') == std::string_view::npos && text.find("]]>") == std::string_view::npos;
    return isPlain ? PlainReader(text).read() : Owned<CFPropertyListRef>();
}

}  // namespace platform::values
