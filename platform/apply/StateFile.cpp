#include "platform/apply/StateFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "platform/base/FileDescriptor.h"
#include "platform/base/Host.h"
#include "platform/values/PropertyListXML.h"

namespace platform::apply {

Outcome makeRuntimeDirectory() {
    const std::string& path = currentHost().runtimeDirectory;
    if (::mkdir(path.c_str(), 0700) != 0 && errno != EEXIST) {
        return Outcome::fromErrno("cannot make " + path);
    }
    const FileDescriptor directory(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    struct stat status {};
    if (!directory.isOpen() || ::fstat(directory.get(), &status) != 0) {
        return Outcome::fromErrno("cannot open " + path);
    }
    return checkTrusted(status, path);
}

std::string runtimePath(std::string_view name) {
    return currentHost().runtimeDirectory + "/" + std::string(name);
}

Outcome readStateFile(const std::string& path, values::Owned<CFDictionaryRef>& content) {
    content = {};
    const FileDescriptor file(::open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
    if (!file.isOpen()) {
        return errno == ENOENT ? Outcome() : Outcome::fromErrno("cannot open " + path);
    }
    constexpr std::size_t largest = std::size_t{16} << 20U;
    std::string text;
    RETURN_IF_FAILED(readDescriptor(file.get(), path, largest, text));
    return values::parseDictionaryFile(path, text, content);
}

Outcome writeStateFile(const std::string& path, CFDictionaryRef content) {
    const std::optional<std::string> text = values::writePropertyListXML(content);
    if (!text) {
        return {kSCStatusFailed, "what belongs into " + path + " cannot be written as a property list"};
    }
    return replaceFile(path, *text, {0600, ::geteuid(), ::getegid()});
}

}  // namespace platform::apply
