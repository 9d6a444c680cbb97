// Comparison and case. Everything that depends on a language uses ICU's root locale, never the environment's.
#include <unicode/ucasemap.h>
#include <unicode/ucol.h>

#include <array>
#include <cassert>
#include <memory>

#include "platform/values/ICUStatus.h"
#include "platform/values/Scalars.h"

using namespace platform::values;

namespace {

struct CollatorCloser {
    void operator()(UCollator* collator) const { ucol_close(collator); }
};
using Collator = std::unique_ptr<UCollator, CollatorCloser>;

Collator openCollator(bool ignoreCase, bool numeric) {
    UErrorCode status = U_ZERO_ERROR;
    // The empty name is the root locale; a null one would be the environment's.
    Collator collator(ucol_open("", &status));
    if (succeeded(status)) {
        ucol_setAttribute(collator.get(), UCOL_STRENGTH, ignoreCase ? UCOL_SECONDARY : UCOL_TERTIARY,
                          &status);
        ucol_setAttribute(collator.get(), UCOL_NUMERIC_COLLATION, numeric ? UCOL_ON : UCOL_OFF, &status);
    }
    return succeeded(status) ? std::move(collator) : nullptr;
}

// Null when ICU has no collation data. Opened on first use: most runs compare nothing.
const UCollator* collatorFor(bool ignoreCase, bool numeric) {
    struct Slot {
        bool tried = false;
        Collator collator;
    };
    thread_local std::array<Slot, 4> slots;
    Slot& slot = slots.at((ignoreCase ? 1U : 0U) | (numeric ? 2U : 0U));
    if (!slot.tried) {
        slot.tried = true;
        slot.collator = openCollator(ignoreCase, numeric);
    }
    return slot.collator.get();
}

struct CaseMapCloser {
    void operator()(UCaseMap* map) const { ucasemap_close(map); }
};

using CaseFunction = std::int32_t (*)(const UCaseMap*, char*, std::int32_t, const char*, std::int32_t,
                                      UErrorCode*);

char asciiLower(char character) {
    return character >= 'A' && character <= 'Z' ? static_cast<char>(character + ('a' - 'A')) : character;
}

// The text in lower case or with its case folded; the text itself when ICU cannot say.
std::string mapCase(std::string_view text, bool isAscii, CaseFunction map) {
    std::string mapped(text);
    if (isAscii) {
        for (char& character : mapped) {
            character = asciiLower(character);
        }
        return mapped;
    }
    UErrorCode status = U_ZERO_ERROR;
    const std::unique_ptr<UCaseMap, CaseMapCloser> root(ucasemap_open("", 0, &status));
    const auto size = static_cast<std::int32_t>(text.size());
    if (!succeeded(status)) {
        return mapped;
    }
    const std::int32_t needed = map(root.get(), nullptr, 0, text.data(), size, &status);
    if (status != U_BUFFER_OVERFLOW_ERROR && !succeeded(status)) {
        return mapped;
    }
    std::string result(static_cast<std::size_t>(needed), '\0');
    status = U_ZERO_ERROR;
    map(root.get(), result.data(), needed, text.data(), size, &status);
    return succeeded(status) ? result : mapped;
}

bool isDigit(char character) {
    return character >= '0' && character <= '9';
}

// Takes a run of digits from the front of the text; gives it without leading zeros.
std::string_view takeNumber(std::string_view& text) {
    std::size_t size = 0;
    while (size < text.size() && isDigit(text[size])) {
        ++size;
    }
    std::string_view digits = text.substr(0, size);
    text.remove_prefix(size);
    while (!digits.empty() && digits.front() == '0') {
        digits.remove_prefix(1);
    }
    return digits;
}

int compareLiterally(std::string_view lhs, std::string_view rhs, bool numeric) {
    while (numeric && !lhs.empty() && !rhs.empty()) {
        if (isDigit(lhs.front()) && isDigit(rhs.front())) {
            const std::string_view left = takeNumber(lhs);
            const std::string_view right = takeNumber(rhs);
            if (left.size() != right.size()) {
                return left.size() < right.size() ? -1 : 1;
            }
            if (const int order = left.compare(right); order != 0) {
                return order;
            }
        } else if (lhs.front() == rhs.front()) {
            lhs.remove_prefix(1);
            rhs.remove_prefix(1);
        } else {
            break;
        }
    }
    // The bytes of UTF-8 sort as the code points do.
    return lhs.compare(rhs);
}

CFComparisonResult resultOf(int order) {
    return order < 0 ? kCFCompareLessThan : order > 0 ? kCFCompareGreaterThan : kCFCompareEqualTo;
}

}  // namespace

CFComparisonResult CFStringCompare(CFStringRef lhs, CFStringRef rhs, CFStringCompareFlags flags) noexcept {
    const bool ignoreCase = (flags & kCFCompareCaseInsensitive) != 0;
    const bool numeric = (flags & kCFCompareNumerically) != 0;
    const std::string_view left = lhs->text();
    const std::string_view right = rhs->text();
    if (left == right) {
        return kCFCompareEqualTo;
    }
    if ((flags & kCFCompareLocalized) != 0) {
        if (const UCollator* const collator = collatorFor(ignoreCase, numeric); collator != nullptr) {
            UErrorCode status = U_ZERO_ERROR;
            const UCollationResult order =
                ucol_strcollUTF8(collator, left.data(), static_cast<std::int32_t>(left.size()), right.data(),
                                 static_cast<std::int32_t>(right.size()), &status);
            if (succeeded(status)) {
                return resultOf(order);
            }
        }
    }
    if (!ignoreCase) {
        return resultOf(compareLiterally(left, right, numeric));
    }
    return resultOf(compareLiterally(mapCase(left, lhs->isAscii(), ucasemap_utf8FoldCase),
                                     mapCase(right, rhs->isAscii(), ucasemap_utf8FoldCase), numeric));
}

void CFStringLowercase(CFMutableStringRef string, const void*) noexcept {
    assert(string->isMutable());
    if (string->isMutable()) {
        static_cast<MutableString*>(string)->assign(
            mapCase(string->text(), string->isAscii(), ucasemap_utf8ToLower));
    }
}
