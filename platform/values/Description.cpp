#include <utility>

#include "platform/base/Hexadecimal.h"
#include "platform/values/Containers.h"
#include "platform/values/PropertyListXML.h"
#include "platform/values/Scalars.h"

using namespace platform::values;

namespace {

void describe(std::string& text, CFTypeRef value, int depth);

void describeText(std::string& text, std::string_view content) {
    for (const char character : content) {
        text.push_back(character == '\n' || character == '\r' ? ' ' : character);
    }
}

void describeBytes(std::string& text, std::string_view bytes) {
    text.push_back('<');
    text += platform::hexOf(bytes);
    text.push_back('>');
}

// A value that its container does not look at is shown as "?".
void describeContainer(std::string& text, CFDictionaryRef dictionary, int depth) {
    const char* separator = "{";
    for (const Entry& entry : entriesOf(dictionary)) {
        text += std::exchange(separator, "; ");
        describe(text, entry.key, depth);
        text += " = ";
        dictionary->retainsValues() ? describe(text, entry.value, depth) : text.push_back('?');
    }
    text += dictionary->count() == 0 ? "{}" : "}";
}

void describeContainer(std::string& text, CFArrayRef array, int depth) {
    const char* separator = "(";
    for (const CFTypeRef item : itemsOf(array)) {
        text += std::exchange(separator, ", ");
        array->retainsValues() ? describe(text, item, depth) : text.push_back('?');
    }
    text += array->count() == 0 ? "()" : ")";
}

void describe(std::string& text, CFTypeRef value, int depth) {
    if (depth > deepestPropertyList) {
        text += "...";
        return;
    }
    switch (static_cast<const Object*>(value)->propertyListType()) {
        case PropertyListType::string:
            describeText(text, static_cast<CFStringRef>(value)->text());
            return;
        case PropertyListType::dictionary:
            describeContainer(text, static_cast<CFDictionaryRef>(value), depth + 1);
            return;
        case PropertyListType::array:
            describeContainer(text, static_cast<CFArrayRef>(value), depth + 1);
            return;
        case PropertyListType::number: {
            const auto* const number = static_cast<CFNumberRef>(value);
            text += number->isReal ? realText(number->real) : std::to_string(number->integer);
            return;
        }
        case PropertyListType::boolean:
            text += static_cast<CFBooleanRef>(value)->value ? "true" : "false";
            return;
        case PropertyListType::data:
            describeBytes(text, static_cast<CFDataRef>(value)->bytes);
            return;
        case PropertyListType::date:
            text += dateText(static_cast<CFDateRef>(value)->seconds);
            return;
        case PropertyListType::none: {
            const auto* const url = static_cast<CFURLRef>(value);
            text += url->type() == Type::url ? url->text.get()->text() : "<object>";
            return;
        }
    }
}

}  // namespace

std::string platform::values::descriptionOf(CFTypeRef value) {
    if (value == nullptr) {
        return "(null)";
    }
    std::string text;
    describe(text, value, 0);
    return text;
}

CFStringRef CFCopyDescription(CFTypeRef value) noexcept {
    return makeString(descriptionOf(value)).take();
}
