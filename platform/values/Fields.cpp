#include "platform/values/Fields.h"

#include <algorithm>
#include <optional>

#include "platform/values/Text.h"

namespace platform::values {
namespace {

std::span<const std::byte> bytesOf(CFDataRef data) {
    return std::as_bytes(std::span(CFDataGetBytePtr(data), static_cast<std::size_t>(CFDataGetLength(data))));
}

}  // namespace

FieldWriter::FieldWriter()
    : dictionary_(Owned<CFMutableDictionaryRef>::adopt(CFDictionaryCreateMutable(
          kCFAllocatorDefault, 0, &kCFTypeDictionaryKeyCallBacks, &kCFTypeDictionaryValueCallBacks))) {}

Owned<CFDictionaryRef> FieldWriter::take() noexcept {
    return Owned<CFDictionaryRef>::adopt(dictionary_.take());
}

void FieldWriter::set(const char* key, const Owned<CFTypeRef>& value) {
    if (value) {
        CFDictionarySetValue(dictionary_.get(), makeString(key).get(), value.get());
    }
}

Owned<CFTypeRef> FieldWriter::encode(bool flag) {
    return Owned<CFTypeRef>::retained(flag ? kCFBooleanTrue : kCFBooleanFalse);
}

Owned<CFTypeRef> FieldWriter::encode(const std::string& text) {
    // The SSID of a network, or a file of somebody else's, may hold any byte.
    const std::optional<TextTraits> traits = scanText(text);
    const bool isForXml = traits && (*traits & textBeyondXml) == 0;
    return isForXml ? Owned<CFTypeRef>::adopt(makeString(text).take())
                    : encodeData(std::as_bytes(std::span(text)));
}

Owned<CFTypeRef> FieldWriter::encode(const std::vector<std::byte>& bytes) {
    return encodeData(bytes);
}

Owned<CFTypeRef> FieldWriter::encode(const Owned<CFDictionaryRef>& dictionary) {
    return Owned<CFTypeRef>::retained(dictionary.get());
}

Owned<CFTypeRef> FieldWriter::encodeData(std::span<const std::byte> bytes) {
    return Owned<CFTypeRef>::adopt(CFDataCreate(kCFAllocatorDefault,
                                                reinterpret_cast<const UInt8*>(bytes.data()),
                                                static_cast<CFIndex>(bytes.size())));
}

Owned<CFTypeRef> FieldWriter::encodeList(const std::vector<Owned<CFTypeRef>>& items) {
    CFMutableArrayRef const array = CFArrayCreateMutable(kCFAllocatorDefault, 0, &kCFTypeArrayCallBacks);
    for (const Owned<CFTypeRef>& item : items) {
        CFArrayAppendValue(array, item.get());
    }
    return Owned<CFTypeRef>::adopt(array);
}

CFTypeRef FieldReader::valueAt(const char* key) const {
    return dictionary_ == nullptr ? nullptr : CFDictionaryGetValue(dictionary_, makeString(key).get());
}

bool FieldReader::decode(CFTypeRef value, bool& flag) {
    const auto boolean = as<CFBooleanRef>(value);
    flag = boolean == kCFBooleanTrue;
    return boolean != nullptr;
}

bool FieldReader::decode(CFTypeRef value, std::string& text) {
    if (const auto string = as<CFStringRef>(value); string != nullptr) {
        text = textOf(string);
        return true;
    }
    const auto data = as<CFDataRef>(value);
    if (data != nullptr) {
        const std::span<const std::byte> bytes = bytesOf(data);
        text.assign(reinterpret_cast<const char*>(bytes.data()), bytes.size());
    }
    return data != nullptr;
}

bool FieldReader::decode(CFTypeRef value, std::vector<std::byte>& bytes) {
    const auto data = as<CFDataRef>(value);
    if (data != nullptr) {
        const std::span<const std::byte> content = bytesOf(data);
        bytes.assign(content.begin(), content.end());
    }
    return data != nullptr;
}

bool FieldReader::decode(CFTypeRef value, Owned<CFDictionaryRef>& dictionary) {
    dictionary = Owned<CFDictionaryRef>::retained(as<CFDictionaryRef>(value));
    return static_cast<bool>(dictionary);
}

bool FieldReader::decodeNumber(CFTypeRef value, std::int64_t& number) {
    const auto found = as<CFNumberRef>(value);
    return found != nullptr && CFNumberGetValue(found, kCFNumberSInt64Type, &number) != 0;
}

bool FieldReader::decodeData(CFTypeRef value, std::span<std::byte> bytes) {
    const auto data = as<CFDataRef>(value);
    if (data == nullptr || bytesOf(data).size() != bytes.size()) {
        return false;
    }
    std::ranges::copy(bytesOf(data), bytes.begin());
    return true;
}

}  // namespace platform::values
