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

void describeDictionary(std::string& text, CFDictionaryRef dictionary, int depth) {
    text.push_back('{');
    bool isFirst = true;
    for (const Entry& entry : entriesOf(dictionary)) {
        text += isFirst ? "" : "; ";
        isFirst = false;
        describe(text, entry.key, depth);
        text += " = ";
        if (dictionary->retainsValues()) {
            describe(text, entry.value, depth);
        } else {
            text += "?";
        }
    }
    text.push_back('}');
}

void describeArray(std::string& text, CFArrayRef array, int depth) {
    text.push_back('(');
    bool isFirst = true;
    for (const CFTypeRef item : array->items()) {
        text += isFirst ? "" : ", ";
        isFirst = false;
        if (array->retainsValues()) {
            describe(text, item, depth);
        } else {
            text += "?";
        }
    }
    text.push_back(')');
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
            describeDictionary(text, static_cast<CFDictionaryRef>(value), depth + 1);
            return;
        case PropertyListType::array:
            describeArray(text, static_cast<CFArrayRef>(value), depth + 1);
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
    std::string text;
    if (value == nullptr) {
        text = "(null)";
    } else {
        describe(text, value, 0);
    }
    return text;
}

CFStringRef CFCopyDescription(CFTypeRef value) noexcept {
    return makeString(descriptionOf(value)).take();
}
