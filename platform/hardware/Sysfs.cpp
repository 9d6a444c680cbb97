#include "platform/hardware/Sysfs.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <system_error>
#include <utility>

#include "platform/base/DeviceText.h"
#include "platform/base/FileDescriptor.h"

namespace platform::hardware {

std::optional<std::string> readAttribute(const std::string& path) {
    // Never blocking, and never a controlling terminal: the root may be a tree that somebody made.
    const FileDescriptor file(open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
    std::array<char, 4096> page;
    ssize_t got;
    do {
        got = read(file.get(), page.data(), page.size());
    } while (got < 0 && errno == EINTR);
    if (got < 0) {
        return std::nullopt;
    }
    std::string text(page.data(), static_cast<std::size_t>(got));
    if (text.ends_with('\n')) {
        text.pop_back();
    }
    return text;
}

bool exists(const std::string& path) {
    return access(path.c_str(), F_OK) == 0;
}

std::optional<std::string> resolved(const std::string& path) {
    std::error_code error;
    const std::filesystem::path real = std::filesystem::canonical(path, error);
    return error ? std::nullopt : std::optional(real.string());
}

std::optional<std::string> linkedName(const std::string& path) {
    std::error_code error;
    const std::filesystem::path target = std::filesystem::read_symlink(path, error);
    return error ? std::nullopt : std::optional(target.filename().string());
}

std::string_view lastComponent(std::string_view path) noexcept {
    return path.substr(path.rfind('/') + 1);
}

std::vector<std::string> upwards(const std::string& path, const std::string& root) {
    std::vector<std::string> found;
    std::string_view at = path;
    while (at.size() > root.size() + 1 && at.starts_with(root)) {
        found.emplace_back(at);
        at = at.substr(0, at.rfind('/'));
    }
    return found;
}

std::optional<std::vector<std::string>> namesIn(const std::string& folder,
                                                const std::function<bool(const std::string&)>& isWanted) {
    constexpr std::size_t most = 4096;
    std::vector<std::string> names;
    std::error_code error;
    std::filesystem::directory_iterator entry(folder, error);
    if (error == std::errc::no_such_file_or_directory || error == std::errc::not_a_directory) {
        return names;
    }
    for (; !error && entry != std::filesystem::directory_iterator(); entry.increment(error)) {
        std::string name = entry->path().filename().string();
        if (isWanted(name)) {
            names.push_back(std::move(name));
        }
        if (names.size() > most) {
            return std::nullopt;
        }
    }
    std::sort(names.begin(), names.end(), [](const std::string& lhs, const std::string& rhs) {
        return strverscmp(lhs.c_str(), rhs.c_str()) < 0;
    });
    return error ? std::nullopt : std::optional(std::move(names));
}

std::optional<std::vector<std::string>> namesInClass(const std::string& folder) {
    return namesIn(folder, [&folder](const std::string& name) {
        return exists(folder + "/" + name + "/device") && isDeviceText(name);
    });
}

}  // namespace platform::hardware
