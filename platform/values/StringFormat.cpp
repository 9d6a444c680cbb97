#include <algorithm>
#include <cstdarg>
#include <optional>

#include "platform/values/Scalars.h"
#include "platform/values/Values.h"

using namespace platform::values;

namespace {

// Nothing for a format that has a conversion of another kind.
std::optional<std::string> formatted(std::string_view format, std::va_list* arguments) {
    std::string text;
    while (!format.empty()) {
        const std::size_t plain = std::min(format.find('%'), format.size());
        text.append(format.substr(0, plain));
        format.remove_prefix(plain);
        const std::string_view conversion = format.substr(0, format.starts_with("%l") ? 3 : 2);
        format.remove_prefix(conversion.size());
        if (conversion == "%@") {
            const auto* const value = va_arg(*arguments, CFTypeRef);
            const auto* const string = as<CFStringRef>(value);
            // A description is one line; a string stands for itself, line breaks included.
            text += string != nullptr ? string->text() : descriptionOf(value);
        } else if (conversion == "%d" || conversion == "%i") {
            text += std::to_string(va_arg(*arguments, int));
        } else if (conversion == "%ld") {
            text += std::to_string(va_arg(*arguments, long));
        } else if (conversion == "%%") {
            text.push_back('%');
        } else if (!conversion.empty()) {
            return std::nullopt;
        }
    }
    return text;
}

}  // namespace

CFStringRef CFStringCreateWithFormat(CFAllocatorRef, CFDictionaryRef, CFStringRef format, ...) noexcept {
    std::va_list list;
    va_start(list, format);
    const std::optional<std::string> text = formatted(format->text(), &list);
    va_end(list);
    return text.has_value() ? makeString(*text).take() : nullptr;
}
