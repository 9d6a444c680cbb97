// Builds the value of a property list out of the elements of a document.
#pragma once

#include <cstdint>
#include <string_view>
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
    [[nodiscard]] const char* endContainer();
    [[nodiscard]] CFTypeRef leafOf(std::string_view text);
    // Whether the next thing in the innermost dictionary must be a key.
    [[nodiscard]] bool wantsKey() const { return (values_.size() - levels_.back().firstValue) % 2 == 0; }

    // The containers that are open, plist first, and the values (and keys) in them that are complete, all
    // held by the pool.
    std::vector<Level> levels_;
    std::vector<CFTypeRef> values_;
    // The leaf that is open, unknown when none is.
    Element leaf_ = Element::unknown;
    ValuePool pool_;
};

}  // namespace platform::values
