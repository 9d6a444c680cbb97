// An entry of the hardware registry, and the two scans that make them from sysfs. IOKit.h lists the
// properties that the entries carry.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/CoreFoundation.h"
#include "platform/values/Object.h"

namespace platform::hardware {

inline constexpr std::string_view ethernetClass = "IOEthernetInterface";
inline constexpr std::string_view serialClass = "IOSerialBSDClient";

// Never changes once it is made, and keeps its parents alive.
struct Entry {
    // Empty for a parent, of which only the properties are of interest.
    std::string_view className;
    values::Owned<CFDictionaryRef> properties;
    std::shared_ptr<const Entry> parent;
};
using EntryRef = std::shared_ptr<const Entry>;

// Both are in the order of the names, numbers in them by value, and empty where there is no sysfs. Nothing
// when a class cannot be read whole.
[[nodiscard]] std::optional<std::vector<EntryRef>> scanEthernet(const std::string& sysfsRoot);
[[nodiscard]] std::optional<std::vector<EntryRef>> scanSerial(const std::string& sysfsRoot);

}  // namespace platform::hardware
