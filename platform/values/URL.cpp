#include <regex.h>

#include <string>

#include "platform/values/Scalars.h"

using namespace platform::values;

namespace {

// RFC 3986: scheme, authority and path, or a path alone, query, fragment. Brackets stand around an address in
// the host's place only.
bool isURL(const std::string& text) {
    const std::string character = "([A-Za-z0-9._~!$&'()*+,;=:@-]|%[0-9A-Fa-f]{2})";
    const std::string path = "(/|" + character + ")*";
    const std::string expression = "^[A-Za-z][A-Za-z0-9+.-]*:(//([][]|" + character + ")*(/" + path + ")?|" +
                                   path + ")([?]([/?]|" + character + ")*)?(#([/?]|" + character + ")*)?$";
    regex_t compiled{};
    if (::regcomp(&compiled, expression.c_str(), REG_EXTENDED | REG_NOSUB) != 0) {
        return false;
    }
    // The expression would end at a NUL.
    const bool matches =
        text.find('\0') == std::string::npos && ::regexec(&compiled, text.c_str(), 0, nullptr, 0) == 0;
    ::regfree(&compiled);
    return matches;
}

}  // namespace

CFTypeID CFURLGetTypeID() noexcept {
    return static_cast<CFTypeID>(Type::url);
}

CFURLRef CFURLCreateWithString(CFAllocatorRef, CFStringRef text, CFURLRef) noexcept {
    if (!isURL(std::string(text->text()))) {
        return nullptr;
    }
    return new OpaqueCFURL(Owned<CFStringRef>::adopt(CFStringCreateCopy(nullptr, text)));
}

CFStringRef CFURLGetString(CFURLRef url) noexcept {
    return url->text.get();
}
