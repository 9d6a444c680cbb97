// Property-list values on one line, written and read back: {key = value; key = value}, (item, item), #5 for a
// number, #true, #false, <0041> for data; everything else is a string.
#pragma once

#include <algorithm>
#include <array>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <string_view>

#include "platform/values/Values.h"

namespace testing_support {

using Value = platform::values::Owned<CFTypeRef>;

class NotationReader {
  public:
    explicit NotationReader(std::string_view text) : rest_(text) {}

    Value read() {
        skipBlanks();
        if (take('{')) {
            auto* const dictionary = CFDictionaryCreateMutable(nullptr, 0, &kCFTypeDictionaryKeyCallBacks,
                                                               &kCFTypeDictionaryValueCallBacks);
            while (!take('}')) {
                const Value key = string(word("="));
                take('=');
                CFDictionarySetValue(dictionary, key.get(), read().get());
                take(';');
            }
            return Value::adopt(dictionary);
        }
        if (take('(')) {
            auto* const array = CFArrayCreateMutable(nullptr, 0, &kCFTypeArrayCallBacks);
            while (!take(')')) {
                CFArrayAppendValue(array, read().get());
                take(',');
            }
            return Value::adopt(array);
        }
        const std::string_view text = word(";,)}");
        if (text == "#true" || text == "#false") {
            return Value::retained(text == "#true" ? kCFBooleanTrue : kCFBooleanFalse);
        }
        if (text.starts_with('#')) {
            const SInt32 number = std::atoi(std::string(text.substr(1)).c_str());
            return Value::adopt(CFNumberCreate(nullptr, kCFNumberSInt32Type, &number));
        }
        if (text.starts_with('<')) {
            std::string bytes;
            for (std::size_t i = 1; i + 2 < text.size(); i += 2) {
                bytes += static_cast<char>(std::strtol(std::string(text.substr(i, 2)).c_str(), nullptr, 16));
            }
            return Value::adopt(CFDataCreate(nullptr, reinterpret_cast<const UInt8*>(bytes.data()),
                                             static_cast<CFIndex>(bytes.size())));
        }
        return string(text);
    }

  private:
    static Value string(std::string_view text) {
        return Value::adopt(platform::values::makeString(text).take());
    }
    void skipBlanks() { rest_.remove_prefix(std::min(rest_.find_first_not_of(" \n"), rest_.size())); }
    bool take(char wanted) {
        skipBlanks();
        const bool isThere = rest_.starts_with(wanted) || rest_.empty();
        rest_.remove_prefix(isThere && !rest_.empty() ? 1 : 0);
        return isThere;
    }
    std::string_view word(std::string_view end) {
        skipBlanks();
        const std::size_t size = std::min(rest_.find_first_of(end), rest_.size());
        std::string_view text = rest_.substr(0, size);
        rest_.remove_prefix(size);
        while (text.ends_with(' ')) {
            text.remove_suffix(1);
        }
        return text;
    }

    std::string_view rest_;
};

inline Value read(std::string_view text) {
    return NotationReader(text).read();
}

inline std::string show(CFTypeRef value) {
    using platform::values::as;
    std::string text;
    if (value == nullptr) {
        return "null";
    }
    if (const auto dictionary = as<CFDictionaryRef>(value)) {
        for (const auto& [key, item] : platform::values::entriesOf(dictionary)) {
            text += (text.empty() ? "" : "; ") + show(key) + " = " + show(item);
        }
        return "{" + text + "}";
    }
    if (const auto array = as<CFArrayRef>(value)) {
        for (CFTypeRef const item : platform::values::itemsOf(array)) {
            text += (text.empty() ? "" : ", ") + show(item);
        }
        return "(" + text + ")";
    }
    const bool isMarked = as<CFNumberRef>(value) != nullptr || as<CFBooleanRef>(value) != nullptr;
    return (isMarked ? "#" : "") + platform::values::descriptionOf(value);
}

}  // namespace testing_support
