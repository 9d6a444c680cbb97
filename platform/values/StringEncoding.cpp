// Text from and to the encodings of the faces.
#include <unicode/unistr.h>
#include <unicode/ustring.h>

#include <cstring>

#include "platform/values/ICUStatus.h"
#include "platform/values/Scalars.h"
#include "platform/values/Values.h"

using namespace platform::values;

namespace {

// ICU's own table and not one of ours: the encoding has had two meanings of byte 0xDB and a private-use
// character, and nobody here reads Mac OS Roman often enough to feel the converter being opened. Plain ASCII
// never comes here.
CFStringRef createFromMacRoman(std::string_view bytes) {
    if (bytes.size() > OpaqueCFString::longestText) {
        return nullptr;
    }
    // Every byte is a character. Without the table nothing comes out.
    const icu::UnicodeString decoded(bytes.data(), static_cast<std::int32_t>(bytes.size()), "macintosh");
    std::string text;
    return decoded.isEmpty() ? nullptr : makeString(decoded.toUTF8String(text)).take();
}

}  // namespace

CFStringEncoding CFStringGetSystemEncoding() noexcept {
    return kCFStringEncodingUTF8;
}

CFStringRef CFStringCreateWithCString(CFAllocatorRef allocator, const char* text,
                                      CFStringEncoding encoding) noexcept {
    return CFStringCreateWithBytes(allocator, reinterpret_cast<const UInt8*>(text),
                                   static_cast<CFIndex>(std::strlen(text)), encoding, 0);
}

CFStringRef CFStringCreateWithBytes(CFAllocatorRef, const UInt8* bytes, CFIndex count,
                                    CFStringEncoding encoding, Boolean) noexcept {
    const std::string_view text(reinterpret_cast<const char*>(bytes), static_cast<std::size_t>(count));
    const std::optional<TextTraits> traits = scanText(text);
    if (traits.has_value() && (*traits & textBeyondAscii) == 0) {
        return OpaqueCFString::create(text, *traits);
    }
    if (encoding == kCFStringEncodingMacRoman) {
        return createFromMacRoman(text);
    }
    if (encoding == kCFStringEncodingUTF8 && traits.has_value()) {
        return OpaqueCFString::create(text, *traits);
    }
    return nullptr;
}

CFStringRef CFStringCreateWithCharacters(CFAllocatorRef, const UniChar* characters, CFIndex count) noexcept {
    // No unit needs more than three bytes.
    if (count > static_cast<CFIndex>(OpaqueCFString::longestText / 3)) {
        return nullptr;
    }
    std::string text(static_cast<std::size_t>(count) * 3, '\0');
    std::int32_t size = 0;
    UErrorCode status = U_ZERO_ERROR;
    u_strToUTF8(text.data(), static_cast<std::int32_t>(text.size()), &size,
                reinterpret_cast<const UChar*>(characters), static_cast<std::int32_t>(count), &status);
    return succeeded(status)
               ? makeString(std::string_view(text).substr(0, static_cast<std::size_t>(size))).take()
               : nullptr;
}

void CFStringGetCharacters(CFStringRef string, CFRange range, UniChar* buffer) noexcept {
    const auto units = icu::UnicodeString::fromUTF8(string->text());
    units.extract(static_cast<std::int32_t>(range.location), static_cast<std::int32_t>(range.length),
                  reinterpret_cast<char16_t*>(buffer));
}

Boolean CFStringGetCString(CFStringRef string, char* buffer, CFIndex bufferSize,
                           CFStringEncoding encoding) noexcept {
    const char* const bytes = CFStringGetCStringPtr(string, encoding);
    const std::size_t size = string->text().size() + 1;
    if (bytes == nullptr || bufferSize < 0 || size > static_cast<std::size_t>(bufferSize)) {
        return 0;
    }
    std::memcpy(buffer, bytes, size);
    return 1;
}

const char* CFStringGetCStringPtr(CFStringRef string, CFStringEncoding encoding) noexcept {
    const bool fits =
        encoding == kCFStringEncodingUTF8 ||
        (string->isAscii() && (encoding == kCFStringEncodingASCII || encoding == kCFStringEncodingMacRoman));
    return fits ? string->cString() : nullptr;
}
