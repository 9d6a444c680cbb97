#include "platform/hardware/Entry.h"

#include <utility>

namespace platform::hardware {
namespace {

using values::Owned;

Owned<CFDictionaryRef> dictionaryOf(const std::vector<Property>& properties) {
    auto* dictionary = CFDictionaryCreateMutable(kCFAllocatorDefault, 0, &kCFTypeDictionaryKeyCallBacks,
                                                 &kCFTypeDictionaryValueCallBacks);
    for (const auto& [key, value] : properties) {
        if (value) {
            CFDictionarySetValue(dictionary, key, value.get());
        }
    }
    return Owned<CFDictionaryRef>::adopt(dictionary);
}

}  // namespace

Owned<CFTypeRef> textValue(std::string_view text) {
    return Owned<CFTypeRef>::adopt(values::makeString(text).take());
}

Owned<CFTypeRef> firmwareValue(const std::string& text) {
    return dataValue({reinterpret_cast<const std::uint8_t*>(text.c_str()), text.size() + 1});
}

Owned<CFTypeRef> dataValue(std::span<const std::uint8_t> bytes) {
    return Owned<CFTypeRef>::adopt(
        CFDataCreate(kCFAllocatorDefault, bytes.data(), static_cast<CFIndex>(bytes.size())));
}

Owned<CFTypeRef> numberValue(std::int64_t number) {
    return Owned<CFTypeRef>::adopt(values::makeNumber(number).take());
}

Entry::Entry(std::string_view ofClass, const std::vector<Property>& with, std::shared_ptr<const Entry> above)
    : className(ofClass), properties(dictionaryOf(with)), parent(std::move(above)) {}

}  // namespace platform::hardware
