// What every value has in common: its references, its type, equality and hash.
#include <algorithm>
#include <bit>
#include <cmath>
#include <optional>
#include <utility>
#include <vector>

#include "platform/values/Containers.h"
#include "platform/values/Scalars.h"

using namespace platform::values;

namespace {

const Object& objectOf(CFTypeRef value) {
    return *static_cast<const Object*>(value);
}

// The integer that a number is equal to.
std::optional<std::int64_t> integerIn(const OpaqueCFNumber& number) {
    std::int64_t integer = 0;
    const bool isInteger = CFNumberGetValue(&number, kCFNumberSInt64Type, &integer) != 0;
    return isInteger ? std::optional(integer) : std::nullopt;
}

using Pairs = std::vector<std::pair<CFTypeRef, CFTypeRef>>;

// Notes two values that must be equal as well; false when they are known not to be.
bool note(const Container& holder, CFTypeRef lhs, CFTypeRef rhs, Pairs& pairs) {
    if (lhs != rhs) {
        pairs.emplace_back(lhs, rhs);
    }
    return lhs == rhs || holder.retainsValues();
}

// Whether two different values of the same type are equal, as long as each of the pairs noted is.

bool equalSoFar(const OpaqueCFString& lhs, const OpaqueCFString& rhs, Pairs&) {
    return lhs.text() == rhs.text();
}
bool equalSoFar(const OpaqueCFArray& lhs, const OpaqueCFArray& rhs, Pairs& pairs) {
    return lhs.retainsValues() == rhs.retainsValues() &&
           std::ranges::equal(lhs.slots(), rhs.slots(),
                              [&](CFTypeRef left, CFTypeRef right) { return note(lhs, left, right, pairs); });
}
bool equalSoFar(const OpaqueCFDictionary& lhs, const OpaqueCFDictionary& rhs, Pairs& pairs) {
    return lhs.count() == rhs.count() && lhs.retainsValues() == rhs.retainsValues() &&
           std::ranges::all_of(lhs.entries(), [&](const Entry& left) {
               const Entry* const right = rhs.find(left.key);
               return right != nullptr && note(lhs, left.value, right->value, pairs);
           });
}
bool equalSoFar(const OpaqueCFNumber& lhs, const OpaqueCFNumber& rhs, Pairs&) {
    if (lhs.isReal && rhs.isReal) {
        return lhs.real == rhs.real || (std::isnan(lhs.real) && std::isnan(rhs.real));
    }
    return integerIn(lhs) == integerIn(rhs);
}
bool equalSoFar(const OpaqueCFData& lhs, const OpaqueCFData& rhs, Pairs&) {
    return lhs.bytes == rhs.bytes;
}
bool equalSoFar(const OpaqueCFDate& lhs, const OpaqueCFDate& rhs, Pairs&) {
    return lhs.seconds == rhs.seconds;
}
bool equalSoFar(const OpaqueCFURL& lhs, const OpaqueCFURL& rhs, Pairs&) {
    return equalValues(lhs.text.get(), rhs.text.get());
}
bool equalSoFar(const Object&, const Object&, Pairs&) {
    return false;
}

std::uint32_t contentHash(const OpaqueCFString& string) {
    return string.hash();
}
std::uint32_t contentHash(const OpaqueCFArray& array) {
    return hashOf(array.count());
}
std::uint32_t contentHash(const OpaqueCFDictionary& dictionary) {
    return hashOf(dictionary.count());
}
std::uint32_t contentHash(const OpaqueCFNumber& number) {
    if (const auto integer = integerIn(number)) {
        return hashOf(*integer);
    }
    return hashOf(std::isnan(number.real) ? 0 : std::bit_cast<std::int64_t>(number.real));
}
std::uint32_t contentHash(const OpaqueCFData& data) {
    return hashOf(data.bytes);
}
std::uint32_t contentHash(const OpaqueCFDate& date) {
    return hashOf(date.seconds);
}
std::uint32_t contentHash(const OpaqueCFURL& url) {
    return url.text.get()->hash();
}
std::uint32_t contentHash(const Object& object) {
    return hashOf(&object);
}

}  // namespace

bool platform::values::equalValues(CFTypeRef lhs, CFTypeRef rhs) {
    // A list instead of recursion, so that no nesting is too deep for the stack.
    Pairs pairs;
    const auto areEqual = [&pairs](CFTypeRef left, CFTypeRef right) {
        return left == right ||
               (objectOf(left).type() == objectOf(right).type() && visit(left, [&](const auto& value) {
                    return equalSoFar(value, static_cast<decltype(value)>(objectOf(right)), pairs);
                }));
    };
    bool equal = areEqual(lhs, rhs);
    while (equal && !pairs.empty()) {
        const auto [left, right] = pairs.back();
        pairs.pop_back();
        equal = areEqual(left, right);
    }
    return equal;
}

std::uint32_t platform::values::hashOfValue(CFTypeRef value) noexcept {
    return visit(value, [](const auto& each) { return contentHash(each); });
}

// Destroying a value nested in a value nested in a value ... does not recurse: what the inner ones held waits
// for the outermost one.
void Container::releaseAll(std::span<const CFTypeRef> held) noexcept {
    constinit thread_local std::vector<CFTypeRef>* waiting = nullptr;
    if (waiting != nullptr) {
        waiting->insert(waiting->end(), held.begin(), held.end());
        return;
    }
    std::vector<CFTypeRef> own(held.begin(), held.end());
    waiting = &own;
    while (!own.empty()) {
        const CFTypeRef next = own.back();
        own.pop_back();
        if (next != nullptr) {
            CFRelease(next);
        }
    }
    waiting = nullptr;
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
