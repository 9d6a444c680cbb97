#include "app/Trace.h"

#include <cstdarg>
#include <vector>

std::FILE* TRACE_FP = stdout;

void TRACE(const char* format, ...) {
    if (TRACE_FP == nullptr) {
        return;
    }
    std::va_list arguments;
    va_start(arguments, format);
    std::vfprintf(TRACE_FP, format, arguments);
    va_end(arguments);
    std::fflush(TRACE_FP);
}

SystemText::SystemText(CFStringRef string) {
    if (string == nullptr) {
        return;
    }
    const CFStringEncoding encoding = CFStringGetSystemEncoding();
    if (const char* own = CFStringGetCStringPtr(string, encoding); own != nullptr) {
        text_ = own;
        return;
    }
    // No encoding of the system needs more than four bytes for a UTF-16 unit.
    std::vector<char> buffer(static_cast<std::size_t>(CFStringGetLength(string)) * 4 + 1);
    if (CFStringGetCString(string, buffer.data(), static_cast<CFIndex>(buffer.size()), encoding) != 0) {
        converted_ = buffer.data();
    }
    text_ = converted_.c_str();
}
