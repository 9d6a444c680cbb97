#include <algorithm>

#include "platform/values/Scalars.h"

using namespace platform::values;

namespace {

bool isLetter(char character) {
    return (character >= 'a' && character <= 'z') || (character >= 'A' && character <= 'Z');
}

bool isDigit(char character) {
    return character >= '0' && character <= '9';
}

bool isHexDigit(char character) {
    return isDigit(character) || (character >= 'a' && character <= 'f') ||
           (character >= 'A' && character <= 'F');
}

bool isAnyOf(char character, std::string_view set) {
    return set.find(character) != std::string_view::npos;
}

// Takes a scheme and its colon from the front.
bool takeScheme(std::string_view& text) {
    const std::size_t colon = text.find(':');
    if (colon == std::string_view::npos || colon == 0 || !isLetter(text.front())) {
        return false;
    }
    const std::string_view scheme = text.substr(0, colon);
    text.remove_prefix(colon + 1);
    return std::ranges::all_of(scheme, [](char c) { return isLetter(c) || isDigit(c) || isAnyOf(c, "+-."); });
}

// Letters, digits, escapes, and the marks that may stand in every part, besides the extra ones.
bool holdsOnly(std::string_view text, std::string_view extra) {
    for (std::size_t i = 0; i < text.size(); ++i) {
        const char character = text[i];
        if (character == '%') {
            if (text.size() - i < 3 || !isHexDigit(text[i + 1]) || !isHexDigit(text[i + 2])) {
                return false;
            }
            i += 2;
        } else if (!isLetter(character) && !isDigit(character) && !isAnyOf(character, "-._~!$&'()*+,;=:@") &&
                   !isAnyOf(character, extra)) {
            return false;
        }
    }
    return true;
}

bool isURL(std::string_view text) {
    if (!takeScheme(text)) {
        return false;
    }
    const std::size_t fragment = std::min(text.find('#'), text.size());
    if (fragment < text.size() && !holdsOnly(text.substr(fragment + 1), "/?")) {
        return false;
    }
    text = text.substr(0, fragment);
    const std::size_t query = std::min(text.find('?'), text.size());
    if (query < text.size() && !holdsOnly(text.substr(query + 1), "/?")) {
        return false;
    }
    text = text.substr(0, query);
    if (!text.starts_with("//")) {
        return holdsOnly(text, "/");
    }
    text.remove_prefix(2);
    const std::size_t path = std::min(text.find('/'), text.size());
    // Brackets stand around an address in the host's place only.
    return holdsOnly(text.substr(0, path), "[]") && holdsOnly(text.substr(path), "/");
}

}  // namespace

CFTypeID CFURLGetTypeID() noexcept {
    return static_cast<CFTypeID>(Type::url);
}

CFURLRef CFURLCreateWithString(CFAllocatorRef, CFStringRef text, CFURLRef) noexcept {
    if (!isURL(text->text())) {
        return nullptr;
    }
    return new OpaqueCFURL(Owned<CFStringRef>::adopt(CFStringCreateCopy(nullptr, text)));
}

CFStringRef CFURLGetString(CFURLRef url) noexcept {
    return url->text.get();
}
