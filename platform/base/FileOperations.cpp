#include "platform/base/FileOperations.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>

#include "platform/base/Host.h"

namespace platform {

int FileOperations::makeDirectory(const std::string& path, mode_t mode) {
    return ::mkdir(path.c_str(), mode);
}

int FileOperations::open(const std::string& path, int flags, mode_t mode) {
    return ::open(path.c_str(), flags | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK, mode);
}

ssize_t FileOperations::write(int descriptor, std::string_view bytes) {
    return ::write(descriptor, bytes.data(), bytes.size());
}

int FileOperations::sync(int descriptor) {
    return ::fsync(descriptor);
}

int FileOperations::close(int descriptor) {
    return ::close(descriptor);
}

int FileOperations::rename(const std::string& from, const std::string& to) {
    return ::rename(from.c_str(), to.c_str());
}

int FileOperations::remove(const std::string& path) {
    return ::unlink(path.c_str());
}

FileOperations& fileOperations() {
    static FileOperations system;
    return currentHost().files ? *currentHost().files : system;
}

}  // namespace platform
