#include "platform/apply/Properties.h"

namespace platform::apply {
namespace {

bool isOfType(CFTypeRef value, CFTypeID type) noexcept {
    return value != nullptr && CFGetTypeID(value) == type;
}

}  // namespace

CFTypeRef valueIn(CFDictionaryRef dictionary, CFStringRef key) noexcept {
    return dictionary == nullptr ? nullptr : CFDictionaryGetValue(dictionary, key);
}

CFDictionaryRef asDictionary(CFTypeRef value) noexcept {
    return isOfType(value, CFDictionaryGetTypeID()) ? static_cast<CFDictionaryRef>(value) : nullptr;
}

CFArrayRef asArray(CFTypeRef value) noexcept {
    return isOfType(value, CFArrayGetTypeID()) ? static_cast<CFArrayRef>(value) : nullptr;
}

std::optional<std::string> asText(CFTypeRef value) {
    if (!isOfType(value, CFStringGetTypeID())) {
        return std::nullopt;
    }
    const char* text = CFStringGetCStringPtr(static_cast<CFStringRef>(value), kCFStringEncodingUTF8);
    return text == nullptr ? std::nullopt : std::optional<std::string>(text);
}

std::optional<std::int64_t> asInteger(CFTypeRef value) noexcept {
    std::int64_t number = 0;
    if (!isOfType(value, CFNumberGetTypeID()) || CFNumberIsFloatType(static_cast<CFNumberRef>(value)) != 0 ||
        CFNumberGetValue(static_cast<CFNumberRef>(value), kCFNumberSInt64Type, &number) == 0) {
        return std::nullopt;
    }
    return number;
}

std::optional<std::span<const std::byte>> asData(CFTypeRef value) noexcept {
    if (!isOfType(value, CFDataGetTypeID())) {
        return std::nullopt;
    }
    const auto* const data = static_cast<CFDataRef>(value);
    return std::as_bytes(std::span(CFDataGetBytePtr(data), static_cast<std::size_t>(CFDataGetLength(data))));
}

CFDictionaryRef dictionaryIn(CFDictionaryRef dictionary, CFStringRef key) noexcept {
    return asDictionary(valueIn(dictionary, key));
}

CFArrayRef arrayIn(CFDictionaryRef dictionary, CFStringRef key) noexcept {
    return asArray(valueIn(dictionary, key));
}

std::optional<std::string> textIn(CFDictionaryRef dictionary, CFStringRef key) {
    return asText(valueIn(dictionary, key));
}

std::optional<std::int64_t> integerIn(CFDictionaryRef dictionary, CFStringRef key) noexcept {
    return asInteger(valueIn(dictionary, key));
}

std::optional<bool> booleanIn(CFDictionaryRef dictionary, CFStringRef key) noexcept {
    const CFTypeRef value = valueIn(dictionary, key);
    if (!isOfType(value, CFBooleanGetTypeID())) {
        return std::nullopt;
    }
    return CFBooleanGetValue(static_cast<CFBooleanRef>(value)) != 0;
}

std::optional<std::span<const std::byte>> dataIn(CFDictionaryRef dictionary, CFStringRef key) noexcept {
    return asData(valueIn(dictionary, key));
}

values::Owned<CFStringRef> makeString(std::string_view text) {
    return values::Owned<CFStringRef>::adopt(
        CFStringCreateWithBytes(kCFAllocatorDefault, reinterpret_cast<const UInt8*>(text.data()),
                                static_cast<CFIndex>(text.size()), kCFStringEncodingUTF8, 0));
}

values::Owned<CFDataRef> makeData(std::span<const std::byte> bytes) {
    return values::Owned<CFDataRef>::adopt(CFDataCreate(kCFAllocatorDefault,
                                                        reinterpret_cast<const UInt8*>(bytes.data()),
                                                        static_cast<CFIndex>(bytes.size())));
}

DictionaryBuilder::DictionaryBuilder()
    : dictionary_(values::Owned<CFMutableDictionaryRef>::adopt(CFDictionaryCreateMutable(
          kCFAllocatorDefault, 0, &kCFTypeDictionaryKeyCallBacks, &kCFTypeDictionaryValueCallBacks))) {}

DictionaryBuilder& DictionaryBuilder::set(CFStringRef key, CFTypeRef value) {
    if (value != nullptr) {
        CFDictionarySetValue(dictionary_.get(), key, value);
    }
    return *this;
}

DictionaryBuilder& DictionaryBuilder::setText(CFStringRef key, std::string_view text) {
    return set(key, makeString(text).get());
}

DictionaryBuilder& DictionaryBuilder::setInteger(CFStringRef key, std::int64_t number) {
    return set(key, values::Owned<CFNumberRef>::adopt(
                        CFNumberCreate(kCFAllocatorDefault, kCFNumberSInt64Type, &number))
                        .get());
}

DictionaryBuilder& DictionaryBuilder::setBoolean(CFStringRef key, bool flag) {
    return set(key, flag ? kCFBooleanTrue : kCFBooleanFalse);
}

DictionaryBuilder& DictionaryBuilder::setData(CFStringRef key, std::span<const std::byte> bytes) {
    return set(key, makeData(bytes).get());
}

values::Owned<CFDictionaryRef> DictionaryBuilder::take() noexcept {
    return values::Owned<CFDictionaryRef>::adopt(dictionary_.take());
}

ArrayBuilder::ArrayBuilder()
    : array_(values::Owned<CFMutableArrayRef>::adopt(
          CFArrayCreateMutable(kCFAllocatorDefault, 0, &kCFTypeArrayCallBacks))) {}

ArrayBuilder& ArrayBuilder::add(CFTypeRef value) {
    if (value != nullptr) {
        CFArrayAppendValue(array_.get(), value);
    }
    return *this;
}

ArrayBuilder& ArrayBuilder::addText(std::string_view text) {
    return add(makeString(text).get());
}

ArrayBuilder& ArrayBuilder::addData(std::span<const std::byte> bytes) {
    return add(makeData(bytes).get());
}

}  // namespace platform::apply
