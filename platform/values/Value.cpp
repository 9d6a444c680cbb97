// What every value has in common: its references, its type, equality and hash.
#include <bit>
#include <cmath>
#include <utility>
#include <vector>

#include "platform/values/Containers.h"
#include "platform/values/Scalars.h"

using namespace platform::values;

namespace {

const Object& objectOf(CFTypeRef value) {
    return *static_cast<const Object*>(value);
}

bool equalNumbers(const OpaqueCFNumber& lhs, const OpaqueCFNumber& rhs) {
    if (!lhs.isReal && !rhs.isReal) {
        return lhs.integer == rhs.integer;
    }
    if (lhs.isReal && rhs.isReal) {
        return lhs.real == rhs.real || (std::isnan(lhs.real) && std::isnan(rhs.real));
    }
    const OpaqueCFNumber& real = lhs.isReal ? lhs : rhs;
    const OpaqueCFNumber& integer = lhs.isReal ? rhs : lhs;
    std::int64_t value = 0;
    return CFNumberGetValue(&real, kCFNumberSInt64Type, &value) != 0 && value == integer.integer;
}

std::uint32_t hashOfNumber(const OpaqueCFNumber& number) {
    std::int64_t integer = 0;
    const bool isInteger = CFNumberGetValue(&number, kCFNumberSInt64Type, &integer) != 0;
    return hashOf(isInteger || std::isnan(number.real) ? integer : std::bit_cast<std::int64_t>(number.real));
}

using Pair = std::pair<CFTypeRef, CFTypeRef>;

// Whether two containers of the same kind are equal, as long as each of the pairs noted is.
bool equalSoFar(const Container& lhs, const Container& rhs, std::vector<Pair>& pairs) {
    if (lhs.count() != rhs.count() || lhs.retainsValues() != rhs.retainsValues()) {
        return false;
    }
    if (&lhs.storage() == &rhs.storage()) {
        return true;
    }
    const auto note = [&](CFTypeRef left, CFTypeRef right) {
        if (left != right) {
            pairs.emplace_back(left, right);
        }
        return left == right || lhs.retainsValues();
    };
    if (lhs.type() == Type::array) {
        const std::span<const CFTypeRef> left = lhs.storage().items();
        const std::span<const CFTypeRef> right = rhs.storage().items();
        for (std::size_t i = 0; i < left.size(); ++i) {
            if (!note(left[i], right[i])) {
                return false;
            }
        }
        return true;
    }
    for (const Entry& entry : lhs.storage().entries()) {
        const std::size_t position = rhs.storage().find(entry.key);
        if (position == Storage::absent || !note(entry.value, rhs.storage().valueAt(position))) {
            return false;
        }
    }
    return true;
}

// Whether two values of the same type are equal, as above.
bool equalSoFar(const Object& lhs, const Object& rhs, std::vector<Pair>& pairs) {
    switch (lhs.propertyListType()) {
        case PropertyListType::string:
            return static_cast<const OpaqueCFString&>(lhs).equals(static_cast<const OpaqueCFString&>(rhs));
        case PropertyListType::dictionary:
        case PropertyListType::array:
            return equalSoFar(static_cast<const Container&>(lhs), static_cast<const Container&>(rhs), pairs);
        case PropertyListType::number:
            return equalNumbers(static_cast<const OpaqueCFNumber&>(lhs),
                                static_cast<const OpaqueCFNumber&>(rhs));
        case PropertyListType::data:
            return static_cast<const OpaqueCFData&>(lhs).bytes == static_cast<const OpaqueCFData&>(rhs).bytes;
        case PropertyListType::date:
            return static_cast<const OpaqueCFDate&>(lhs).seconds ==
                   static_cast<const OpaqueCFDate&>(rhs).seconds;
        case PropertyListType::boolean:
            break;
        case PropertyListType::none:
            return lhs.type() == Type::url && equalValues(static_cast<const OpaqueCFURL&>(lhs).text.get(),
                                                          static_cast<const OpaqueCFURL&>(rhs).text.get());
    }
    return false;
}

}  // namespace

bool platform::values::equalValues(CFTypeRef lhs, CFTypeRef rhs) {
    if (lhs == rhs) {
        return true;
    }
    if (objectOf(lhs).type() != objectOf(rhs).type()) {
        return false;
    }
    // A list instead of recursion, so that no nesting is too deep for the stack.
    std::vector<Pair> pairs;
    bool equal = equalSoFar(objectOf(lhs), objectOf(rhs), pairs);
    while (equal && !pairs.empty()) {
        const auto [left, right] = pairs.back();
        pairs.pop_back();
        equal = objectOf(left).type() == objectOf(right).type() &&
                equalSoFar(objectOf(left), objectOf(right), pairs);
    }
    return equal;
}

std::uint32_t platform::values::hashOfValue(CFTypeRef value) noexcept {
    switch (objectOf(value).propertyListType()) {
        case PropertyListType::string:
            return static_cast<const OpaqueCFString*>(value)->hash();
        case PropertyListType::dictionary:
        case PropertyListType::array:
            return hashOf(static_cast<const Container*>(value)->count());
        case PropertyListType::number:
            return hashOfNumber(*static_cast<const OpaqueCFNumber*>(value));
        case PropertyListType::data:
            return hashOf(std::string_view(static_cast<const OpaqueCFData*>(value)->bytes));
        case PropertyListType::date:
            return hashOf(static_cast<const OpaqueCFDate*>(value)->seconds);
        case PropertyListType::boolean:
            break;
        case PropertyListType::none:
            if (const auto* const url = static_cast<const OpaqueCFURL*>(value); url->type() == Type::url) {
                return url->text.get()->hash();
            }
            break;
    }
    return hashOf(value);
}

CFTypeRef CFRetain(CFTypeRef value) noexcept {
    objectOf(value).retain();
    return value;
}

void CFRelease(CFTypeRef value) noexcept {
    objectOf(value).release();
}

CFIndex CFGetRetainCount(CFTypeRef value) noexcept {
    return objectOf(value).retainCount();
}

CFTypeID CFGetTypeID(CFTypeRef value) noexcept {
    return static_cast<CFTypeID>(objectOf(value).type());
}

Boolean CFEqual(CFTypeRef lhs, CFTypeRef rhs) noexcept {
    return static_cast<Boolean>(equalValues(lhs, rhs));
}
