// Text from and to the encodings of the faces.
#include <unicode/ucnv.h>
#include <unicode/ustring.h>

#include <algorithm>
#include <cstring>
#include <memory>
#include <vector>

#include "platform/values/ICUStatus.h"
#include "platform/values/Scalars.h"
#include "platform/values/Values.h"

using namespace platform::values;

namespace {

struct ConverterCloser {
    void operator()(UConverter* converter) const { ucnv_close(converter); }
};
using Converter = std::unique_ptr<UConverter, ConverterCloser>;

// ICU's own table and not one of ours: the encoding has had two meanings of byte 0xDB and a private-use
// character, and nobody here reads Mac OS Roman often enough to feel the converter being opened. Plain ASCII
// never comes here.
Converter openMacRoman() {
    UErrorCode status = U_ZERO_ERROR;
    Converter converter(ucnv_open("macintosh", &status));
    if (succeeded(status)) {
        ucnv_setToUCallBack(converter.get(), UCNV_TO_U_CALLBACK_STOP, nullptr, nullptr, nullptr, &status);
    }
    return succeeded(status) ? std::move(converter) : nullptr;
}

CFStringRef createFromMacRoman(std::string_view bytes) {
    const Converter converter = openMacRoman();
    if (!converter || bytes.size() > OpaqueCFString::longestText) {
        return nullptr;
    }
    std::vector<UChar> units(bytes.size());
    UErrorCode status = U_ZERO_ERROR;
    const auto size = static_cast<std::int32_t>(bytes.size());
    const std::int32_t count =
        ucnv_toUChars(converter.get(), units.data(), size, bytes.data(), size, &status);
    if (!succeeded(status)) {
        return nullptr;
    }
    return CFStringCreateWithCharacters(nullptr, reinterpret_cast<const UniChar*>(units.data()), count);
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
    const std::string_view text = string->text();
    std::vector<UChar> units(static_cast<std::size_t>(CFStringGetLength(string)));
    UErrorCode status = U_ZERO_ERROR;
    u_strFromUTF8(units.data(), static_cast<std::int32_t>(units.size()), nullptr, text.data(),
                  static_cast<std::int32_t>(text.size()), &status);
    const auto end = std::min(units.size(), static_cast<std::size_t>(range.location + range.length));
    for (auto unit = static_cast<std::size_t>(range.location); unit < end; ++unit) {
        *buffer++ = units[unit];
    }
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
