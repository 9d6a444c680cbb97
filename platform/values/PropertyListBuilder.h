// Builds the value of a property list out of the elements of a document.
#pragma once

#include <cstdint>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "platform/values/Containers.h"
#include "platform/values/Scalars.h"

namespace platform::values {

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

// unknown for a name that property lists do not have.
[[nodiscard]] Element elementNamed(std::string_view name) noexcept;

[[nodiscard]] constexpr bool isXMLSpace(char character) noexcept {
    return character == ' ' || character == '\n' || character == '\t' || character == '\r';
}

class PropertyListBuilder {
  public:
    // Both give null, or what is wrong with the document: then the builder is of no further use.
    [[nodiscard]] const char* begin(Element element);
    // Ends the element that was begun last. The text is that of a leaf.
    [[nodiscard]] const char* end(std::string_view text);

    // The element that is open, unknown outside of the property list.
    [[nodiscard]] Element open() const noexcept {
        return leaf_ != Element::unknown ? leaf_
               : levels_.empty()         ? Element::unknown
                                         : levels_.back().element;
    }
    [[nodiscard]] bool isInLeaf() const noexcept { return leaf_ != Element::unknown; }
    // Once the property list has ended.
    [[nodiscard]] Owned<CFPropertyListRef> value() const { return values_.back(); }

  private:
    struct Level {
        Element element;
        std::size_t firstValue;
    };

    [[nodiscard]] const char* endContainer();
    [[nodiscard]] const char* endLeaf(std::string_view text);
    // Whether the next thing in the innermost dictionary must be a key.
    [[nodiscard]] bool wantsKey() const { return (values_.size() - levels_.back().firstValue) % 2 == 0; }

    // The containers that are open, plist first, and the values (and keys) in them that are complete.
    std::vector<Level> levels_;
    std::vector<Owned<CFTypeRef>> values_;
    // The keys so far by their text: a document has few of them, each a thousand times.
    std::unordered_map<std::string_view, Owned<CFTypeRef>> keys_;
    // The leaf that is open, unknown when none is.
    Element leaf_ = Element::unknown;
};

}  // namespace platform::values
