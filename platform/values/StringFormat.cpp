#include <algorithm>
#include <cstdarg>
#include <cstdio>
#include <optional>

#include "platform/values/Scalars.h"
#include "platform/values/Values.h"

using namespace platform::values;

namespace {

struct Conversion {
    std::string directive;  // as printf takes it
    bool isLong = false;
    char kind = '\0';
};

// printf on one directive that was put together at run time from parts that are known to be good.
template <class Argument>
bool appendFormatted(std::string& text, const std::string& directive, Argument argument) {
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wformat-nonliteral"
    const int size = std::snprintf(nullptr, 0, directive.c_str(), argument);
    if (size < 0) {
        return false;
    }
    const std::size_t before = text.size();
    text.resize(before + static_cast<std::size_t>(size) + 1);
    std::snprintf(text.data() + before, static_cast<std::size_t>(size) + 1, directive.c_str(), argument);
#pragma GCC diagnostic pop
    text.pop_back();
    return true;
}

// The arguments of a call, which must outlive it, so that they can be taken in more than one place.
class Arguments {
  public:
    explicit Arguments(std::va_list* list) : list_(list) {}
    template <class T>
    T next() {
        return va_arg(*list_, T);
    }

  private:
    std::va_list* list_;
};

// Takes one directive from the front of the format, its '%' included.
std::optional<Conversion> takeConversion(std::string_view& format) {
    constexpr std::string_view flagsAndSizes = "-+ #.0123456789";
    std::size_t size = std::min(format.find_first_not_of(flagsAndSizes, 1), format.size());
    const bool isLong = size < format.size() && format[size] == 'l';
    size += isLong ? 2 : 1;
    if (size > format.size()) {
        return std::nullopt;
    }
    Conversion conversion{std::string(format.substr(0, size)), isLong, format[size - 1]};
    format.remove_prefix(size);
    return conversion;
}

bool appendConversion(std::string& text, const Conversion& conversion, Arguments& arguments) {
    const std::string& directive = conversion.directive;
    if (conversion.isLong && std::string_view("diux").find(conversion.kind) == std::string_view::npos) {
        return false;
    }
    switch (conversion.kind) {
        case 'd':
        case 'i':
            return conversion.isLong ? appendFormatted(text, directive, arguments.next<long>())
                                     : appendFormatted(text, directive, arguments.next<int>());
        case 'u':
        case 'x':
            return conversion.isLong ? appendFormatted(text, directive, arguments.next<unsigned long>())
                                     : appendFormatted(text, directive, arguments.next<unsigned>());
        case 'c':
            return appendFormatted(text, directive, arguments.next<int>());
        case 's':
            return appendFormatted(text, directive, arguments.next<const char*>());
        case '@': {
            const CFTypeRef value = arguments.next<CFTypeRef>();
            // A description is one line; a string stands for itself, line breaks included.
            if (value != nullptr && CFGetTypeID(value) == CFStringGetTypeID()) {
                text += textOf(static_cast<CFStringRef>(value));
            } else {
                text += descriptionOf(value);
            }
            return true;
        }
        case '%':
            text.push_back('%');
            return true;
        default:
            return false;
    }
}

std::optional<std::string> formatted(std::string_view format, Arguments arguments) {
    std::string text;
    while (!format.empty()) {
        const std::size_t plain = std::min(format.find('%'), format.size());
        text.append(format.substr(0, plain));
        format.remove_prefix(plain);
        if (!format.empty()) {
            const std::optional<Conversion> conversion = takeConversion(format);
            if (!conversion.has_value() || !appendConversion(text, *conversion, arguments)) {
                return std::nullopt;
            }
        }
    }
    return text;
}

}  // namespace

CFStringRef CFStringCreateWithFormat(CFAllocatorRef, CFDictionaryRef, CFStringRef format, ...) noexcept {
    std::va_list list;
    va_start(list, format);
    const std::optional<std::string> text = formatted(format->text(), Arguments(&list));
    va_end(list);
    return text.has_value() ? makeString(*text).take() : nullptr;
}
