// Comparison and case. Everything that depends on a language uses ICU's root locale, never the environment's.
#include <unicode/coll.h>
#include <unicode/unistr.h>

#include <array>
#include <cassert>
#include <memory>
#include <optional>

#include "platform/values/ICUStatus.h"
#include "platform/values/Scalars.h"

using namespace platform::values;

namespace {

using Collator = std::unique_ptr<icu::Collator>;

Collator openCollator(bool ignoreCase, bool numeric) {
    UErrorCode status = U_ZERO_ERROR;
    Collator collator(icu::Collator::createInstance(icu::Locale::getRoot(), status));
    if (succeeded(status)) {
        collator->setAttribute(UCOL_STRENGTH, ignoreCase ? UCOL_SECONDARY : UCOL_TERTIARY, status);
        collator->setAttribute(UCOL_NUMERIC_COLLATION, numeric ? UCOL_ON : UCOL_OFF, status);
    }
    return succeeded(status) ? std::move(collator) : nullptr;
}

// Null when ICU has no collation data. Opened on first use: most runs compare nothing.
const icu::Collator* collatorFor(CFStringCompareFlags flags) {
    thread_local std::array<std::optional<Collator>, 4> collators;
    const bool ignoreCase = (flags & kCFCompareCaseInsensitive) != 0;
    const bool numeric = (flags & kCFCompareNumerically) != 0;
    std::optional<Collator>& collator = collators.at((ignoreCase ? 1U : 0U) | (numeric ? 2U : 0U));
    if (!collator) {
        collator = openCollator(ignoreCase, numeric);
    }
    return collator->get();
}

}  // namespace

CFComparisonResult CFStringCompare(CFStringRef lhs, CFStringRef rhs, CFStringCompareFlags flags) noexcept {
    const std::string_view left = lhs->text();
    const std::string_view right = rhs->text();
    // The bytes of UTF-8 sort as the code points do.
    int order = left.compare(right);
    if (order != 0 && (flags & kCFCompareLocalized) != 0) {
        if (const icu::Collator* const collator = collatorFor(flags)) {
            UErrorCode status = U_ZERO_ERROR;
            const UCollationResult result = collator->compareUTF8(left, right, status);
            order = succeeded(status) ? result : order;
        }
    }
    return order < 0 ? kCFCompareLessThan : order > 0 ? kCFCompareGreaterThan : kCFCompareEqualTo;
}

void CFStringLowercase(CFMutableStringRef string, const void*) noexcept {
    assert(string->isMutable());
    if (string->isMutable()) {
        std::string lower;
        icu::UnicodeString::fromUTF8(string->text()).toLower(icu::Locale::getRoot()).toUTF8String(lower);
        static_cast<MutableString*>(string)->assign(std::move(lower));
    }
}
