// Reading sysfs: attributes, links and folders, each of which may vanish between two looks.
//
// Whatever cannot be read is simply not there: a device that is pulled out in mid-scan fails nobody.
#pragma once

#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace platform::hardware {

// An attribute's text without the line break at its end. One read() of one page, which is as long as the
// kernel's attributes get and the only way to see one value whole.
[[nodiscard]] std::optional<std::string> readAttribute(const std::string& path);

[[nodiscard]] bool exists(const std::string& path);

// The path with every link in it followed.
[[nodiscard]] std::optional<std::string> resolved(const std::string& path);

// The last component of what a link leads to: how sysfs names a driver or a subsystem.
[[nodiscard]] std::optional<std::string> linkedName(const std::string& path);

[[nodiscard]] std::string_view lastComponent(std::string_view path) noexcept;

// The path and the folders above it, nearest first, as far down as below the root; both are resolved. The
// devices that a device hangs on are the folders above it.
[[nodiscard]] std::vector<std::string> upwards(const std::string& path, const std::string& root);

// The names in a folder that are wanted, numbers in them ordered by value (eth2 before eth10); none when
// there is no such folder. Nothing when it cannot be read, or more than 4096 are wanted: a part of a list
// would be taken for the whole.
[[nodiscard]] std::optional<std::vector<std::string>> namesIn(
    const std::string& folder, const std::function<bool(const std::string&)>& isWanted);

// The same of a class of devices: those that have hardware behind them, by names that may be shown.
[[nodiscard]] std::optional<std::vector<std::string>> namesInClass(const std::string& folder);

}  // namespace platform::hardware
