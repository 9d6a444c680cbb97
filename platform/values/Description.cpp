#include <utility>

#include "platform/base/Hexadecimal.h"
#include "platform/values/Containers.h"
#include "platform/values/PropertyListXML.h"
#include "platform/values/Scalars.h"

using namespace platform::values;

namespace {

void describe(std::string& text, CFTypeRef value, int depth);

// A value that its container does not look at is shown as "?".
void describeHeld(std::string& text, const Container& holder, CFTypeRef value, int depth) {
    holder.retainsValues() ? describe(text, value, depth) : text.push_back('?');
}

void describe(std::string& text, const OpaqueCFString& string, int) {
    for (const char character : string.text()) {
        text.push_back(character == '\n' || character == '\r' ? ' ' : character);
    }
}
void describe(std::string& text, const OpaqueCFDictionary& dictionary, int depth) {
    const char* separator = "{";
    for (const Entry& entry : dictionary.entries()) {
        text += std::exchange(separator, "; ");
        describe(text, entry.key, depth + 1);
        text += " = ";
        describeHeld(text, dictionary, entry.value, depth + 1);
    }
    text += dictionary.count() == 0 ? "{}" : "}";
}
void describe(std::string& text, const OpaqueCFArray& array, int depth) {
    const char* separator = "(";
    for (const CFTypeRef item : array.slots()) {
        text += std::exchange(separator, ", ");
        describeHeld(text, array, item, depth + 1);
    }
    text += array.count() == 0 ? "()" : ")";
}
void describe(std::string& text, const OpaqueCFNumber& number, int) {
    text += number.isReal ? realText(number.real) : std::to_string(number.integer);
}
void describe(std::string& text, const OpaqueCFBoolean& boolean, int) {
    text += boolean.value ? "true" : "false";
}
void describe(std::string& text, const OpaqueCFData& data, int) {
    text += "<" + platform::hexOf(data.bytes) + ">";
}
void describe(std::string& text, const OpaqueCFDate& date, int) {
    text += dateText(date.seconds);
}
void describe(std::string& text, const OpaqueCFURL& url, int) {
    text += url.text.get()->text();
}
void describe(std::string& text, const Object&, int) {
    text += "<object>";
}

void describe(std::string& text, CFTypeRef value, int depth) {
    if (depth > deepestPropertyList) {
        text += "...";
        return;
    }
    visit(value, [&](const auto& each) { describe(text, each, depth); });
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
