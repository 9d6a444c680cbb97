// The properties of a registry entry while it is being made.
#pragma once

#include <cstdint>
#include <span>
#include <string_view>

#include "platform/CoreFoundation.h"
#include "platform/values/Object.h"

namespace platform::hardware {

class Properties {
  public:
    Properties();

    // Sets nothing when the text is not UTF-8.
    void setText(CFStringRef key, std::string_view text);
    void setNumber(CFStringRef key, std::int64_t number);
    void setData(CFStringRef key, std::span<const std::uint8_t> bytes);
    // The text and a NUL behind it, as firmware gives its names.
    void setFirmwareText(CFStringRef key, std::string_view text);

    // What was set, as a value that nobody can change. Call it last.
    [[nodiscard]] values::Owned<CFDictionaryRef> take();

  private:
    values::Owned<CFMutableDictionaryRef> dictionary_;
};

}  // namespace platform::hardware
