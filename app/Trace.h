// The trace log: the steps of a command, on standard output as they happen.
#pragma once

#include <cstdio>
#include <string>

#include "platform/CoreFoundation.h"

// Where the trace goes: standard output from the start. Null silences it.
extern std::FILE* TRACE_FP;

// Writes the formatted text to TRACE_FP, adding nothing to it, and flushes, so that the trace interleaves
// with a prompt in the order of events. A trace that cannot be written (a closed pipe, a full disk) stops
// nothing.
void TRACE(const char* format, ...) __attribute__((format(printf, 1, 2)));

// The characters of a string in the system's text encoding, for "%s". Lives as long as the string it was made
// from. A null string gives an empty text.
class SystemText {
  public:
    explicit SystemText(CFStringRef string);
    SystemText(const SystemText&) = delete;
    SystemText& operator=(const SystemText&) = delete;

    [[nodiscard]] const char* c_str() const { return text_; }

  private:
    std::string converted_;
    const char* text_ = "";
};
