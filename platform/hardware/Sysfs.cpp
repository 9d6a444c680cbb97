#include "platform/hardware/Sysfs.h"

#include <dirent.h>
#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <utility>

#include "platform/base/DeviceText.h"
#include "platform/base/FileDescriptor.h"

namespace platform::hardware {
namespace {

struct Closer {
    void operator()(DIR* directory) const noexcept { closedir(directory); }
};
struct Freer {
    void operator()(char* text) const noexcept { std::free(text); }
};

}  // namespace

std::optional<std::string> readAttribute(const std::string& path) {
    // Never blocking, and never a controlling terminal: the root may be a tree that somebody made.
    const FileDescriptor file(open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
    if (!file.isOpen()) {
        return std::nullopt;
    }
    std::array<char, 4096> page;
    ssize_t got;
    do {
        got = read(file.get(), page.data(), page.size());
    } while (got < 0 && errno == EINTR);
    if (got < 0) {
        return std::nullopt;
    }
    std::string text(page.data(), static_cast<std::size_t>(got));
    if (!text.empty() && text.back() == '\n') {
        text.pop_back();
    }
    return text;
}

bool exists(const std::string& path) {
    return access(path.c_str(), F_OK) == 0;
}

std::optional<std::string> resolved(const std::string& path) {
    const std::unique_ptr<char, Freer> real(realpath(path.c_str(), nullptr));
    if (!real) {
        return std::nullopt;
    }
    return std::string(real.get());
}

std::optional<std::string> linkedName(const std::string& path) {
    std::array<char, PATH_MAX> target;
    const ssize_t got = readlink(path.c_str(), target.data(), target.size());
    if (got <= 0 || static_cast<std::size_t>(got) == target.size()) {
        return std::nullopt;
    }
    return std::string(lastComponent({target.data(), static_cast<std::size_t>(got)}));
}

std::string_view lastComponent(std::string_view path) noexcept {
    const std::size_t slash = path.rfind('/');
    return slash == std::string_view::npos ? path : path.substr(slash + 1);
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
    const std::unique_ptr<DIR, Closer> directory(opendir(folder.c_str()));
    if (!directory) {
        return errno == ENOENT || errno == ENOTDIR ? std::optional(names) : std::nullopt;
    }
    errno = 0;
    while (const dirent* entry = readdir(directory.get())) {
        std::string name = entry->d_name;
        if (name != "." && name != ".." && isWanted(name)) {
            names.push_back(std::move(name));
        }
        if (names.size() > most) {
            return std::nullopt;
        }
        errno = 0;
    }
    if (errno != 0) {
        return std::nullopt;
    }
    std::sort(names.begin(), names.end(), [](const std::string& lhs, const std::string& rhs) {
        return strverscmp(lhs.c_str(), rhs.c_str()) < 0;
    });
    return names;
}

std::optional<std::vector<std::string>> namesInClass(const std::string& folder) {
    return namesIn(folder, [&folder](const std::string& name) {
        return exists(folder + "/" + name + "/device") && isDeviceText(name);
    });
}

}  // namespace platform::hardware
