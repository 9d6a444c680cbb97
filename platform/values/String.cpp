#include <unicode/unistr.h>

#include <algorithm>
#include <cassert>
#include <cstring>
#include <exception>

#include "platform/values/Scalars.h"
#include "platform/values/Values.h"

using namespace platform::values;

namespace {

// Half of a character of two units makes no string, so ranges that cut one need no look at where they do.
bool isInside(CFRange range, const icu::UnicodeString& units) {
    return range.location >= 0 && range.length >= 0 && range.location <= units.length() &&
           range.length <= units.length() - range.location;
}
const UniChar* unitsOf(const icu::UnicodeString& units) {
    return reinterpret_cast<const UniChar*>(units.getBuffer());
}

}  // namespace

OpaqueCFString::OpaqueCFString(std::string_view text, TextTraits traits) noexcept
    : Object(Type::string), traits_(traits), size_(static_cast<std::uint32_t>(text.size())) {
    char* const bytes = reinterpret_cast<char*>(this + 1);
    if (!text.empty()) {
        std::memcpy(bytes, text.data(), text.size());
    }
    bytes[text.size()] = '\0';
    bytes_ = bytes;
}

const OpaqueCFString* OpaqueCFString::create(std::string_view text, TextTraits traits) {
    return text.size() <= longestText ? new (Room{text.size()}) OpaqueCFString(text, traits) : nullptr;
}

std::uint32_t OpaqueCFString::hash() const noexcept {
    std::uint32_t hash = hash_.load(std::memory_order_relaxed);
    if (hash == 0) {
        // 0 means a hash that nobody has asked for yet.
        hash = std::max(hashOf(text()), 1U);
        hash_.store(hash, std::memory_order_relaxed);
    }
    return hash;
}

void MutableString::assign(std::string text) {
    const std::optional<TextTraits> traits = scanText(text);
    if (traits.has_value() && text.size() <= longestText) {
        text_ = std::move(text);
        setText(text_, *traits);
    }
}

Owned<CFStringRef> platform::values::makeString(std::string_view text) {
    const std::optional<TextTraits> traits = scanText(text);
    return Owned<CFStringRef>::adopt(traits.has_value() ? OpaqueCFString::create(text, *traits) : nullptr);
}

std::string_view platform::values::textOf(CFStringRef string) noexcept {
    return string->text();
}

CFTypeID CFStringGetTypeID() noexcept {
    return static_cast<CFTypeID>(Type::string);
}

CFStringRef CFStringMakeConstant(const char* text) noexcept {
    const CFStringRef constant = makeString(text).take();
    if (constant == nullptr) {
        std::terminate();
    }
    return constant;
}

CFStringRef CFStringCreateCopy(CFAllocatorRef, CFStringRef string) noexcept {
    if (!string->isMutable()) {
        string->retain();
        return string;
    }
    return OpaqueCFString::create(string->text(), string->traits());
}

CFMutableStringRef CFStringCreateMutableCopy(CFAllocatorRef, CFIndex, CFStringRef string) noexcept {
    return new MutableString(std::string(string->text()), string->traits());
}

CFStringRef CFStringCreateWithSubstring(CFAllocatorRef allocator, CFStringRef string,
                                        CFRange range) noexcept {
    const auto units = icu::UnicodeString::fromUTF8(string->text());
    return isInside(range, units)
               ? CFStringCreateWithCharacters(allocator, unitsOf(units) + range.location, range.length)
               : nullptr;
}

CFArrayRef CFStringCreateArrayBySeparatingStrings(CFAllocatorRef, CFStringRef string,
                                                  CFStringRef separator) noexcept {
    const CFMutableArrayRef pieces = CFArrayCreateMutable(nullptr, 0, &kCFTypeArrayCallBacks);
    std::string_view rest = string->text();
    const std::string_view wanted = separator->text();
    for (bool more = true; more;) {
        const std::size_t end = wanted.empty() ? std::string_view::npos : rest.find(wanted);
        more = end != std::string_view::npos;
        const Owned<CFStringRef> piece = makeString(rest.substr(0, end));
        CFArrayAppendValue(pieces, piece.get());
        if (more) {
            rest.remove_prefix(end + wanted.size());
        }
    }
    return pieces;
}

CFIndex CFStringGetLength(CFStringRef string) noexcept {
    const std::string_view text = string->text();
    return static_cast<CFIndex>(string->isAscii() ? text.size() : unitCount(text));
}

Boolean CFStringHasPrefix(CFStringRef string, CFStringRef prefix) noexcept {
    return static_cast<Boolean>(string->text().starts_with(prefix->text()));
}

CFRange CFStringFind(CFStringRef string, CFStringRef wanted, CFStringCompareFlags) noexcept {
    const std::string_view text = string->text();
    const std::size_t found = wanted->text().empty() ? std::string_view::npos : text.find(wanted->text());
    if (found == std::string_view::npos) {
        return CFRangeMake(kCFNotFound, 0);
    }
    return CFRangeMake(static_cast<CFIndex>(unitCount(text.substr(0, found))), CFStringGetLength(wanted));
}

void CFStringReplace(CFMutableStringRef string, CFRange range, CFStringRef replacement) noexcept {
    assert(string->isMutable());
    auto units = icu::UnicodeString::fromUTF8(string->text());
    if (!string->isMutable() || !isInside(range, units)) {
        return;
    }
    units.replace(static_cast<std::int32_t>(range.location), static_cast<std::int32_t>(range.length),
                  icu::UnicodeString::fromUTF8(replacement->text()));
    const auto changed =
        Owned<CFStringRef>::adopt(CFStringCreateWithCharacters(nullptr, unitsOf(units), units.length()));
    if (changed) {
        static_cast<MutableString*>(string)->assign(std::string(textOf(changed.get())));
    }
}
