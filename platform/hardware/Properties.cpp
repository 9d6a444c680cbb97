#include "platform/hardware/Properties.h"

#include <new>
#include <string>

#include "platform/values/Values.h"

namespace platform::hardware {
namespace {

template <class Ref>
values::Owned<Ref> made(values::Owned<Ref> value) {
    if (!value) {
        throw std::bad_alloc();
    }
    return value;
}

}  // namespace

Properties::Properties()
    : dictionary_(made(values::Owned<CFMutableDictionaryRef>::adopt(CFDictionaryCreateMutable(
          kCFAllocatorDefault, 0, &kCFTypeDictionaryKeyCallBacks, &kCFTypeDictionaryValueCallBacks)))) {}

void Properties::setText(CFStringRef key, std::string_view text) {
    if (const values::Owned<CFStringRef> string = values::makeString(text)) {
        CFDictionarySetValue(dictionary_.get(), key, string.get());
    }
}

void Properties::setNumber(CFStringRef key, std::int64_t number) {
    CFDictionarySetValue(dictionary_.get(), key, made(values::makeNumber(number)).get());
}

void Properties::setData(CFStringRef key, std::span<const std::uint8_t> bytes) {
    const auto data = made(values::Owned<CFDataRef>::adopt(
        CFDataCreate(kCFAllocatorDefault, bytes.data(), static_cast<CFIndex>(bytes.size()))));
    CFDictionarySetValue(dictionary_.get(), key, data.get());
}

void Properties::setFirmwareText(CFStringRef key, std::string_view text) {
    const std::string terminated(text);
    setData(key, {reinterpret_cast<const std::uint8_t*>(terminated.c_str()), terminated.size() + 1});
}

values::Owned<CFDictionaryRef> Properties::take() {
    return values::Owned<CFDictionaryRef>::adopt(dictionary_.take());
}

}  // namespace platform::hardware
