// The steps by which a file changes on disk, one function each, so that a test can make any of them fail.
#pragma once

#include <sys/types.h>

#include <string>
#include <string_view>

namespace platform {

// Every function is the system call that its name suggests: -1 and errno on failure.
class FileOperations {
  public:
    FileOperations() = default;
    FileOperations(const FileOperations&) = delete;
    FileOperations& operator=(const FileOperations&) = delete;
    virtual ~FileOperations() = default;

    virtual int makeDirectory(const std::string& path, mode_t mode);
    // O_CLOEXEC, O_NOFOLLOW and O_NONBLOCK are added to the flags.
    virtual int open(const std::string& path, int flags, mode_t mode);
    virtual ssize_t write(int descriptor, std::string_view bytes);
    virtual int sync(int descriptor);
    // The descriptor is closed on failure too.
    virtual int close(int descriptor);
    virtual int rename(const std::string& from, const std::string& to);
    virtual int remove(const std::string& path);
};

// Those of the host in force.
[[nodiscard]] FileOperations& fileOperations();

}  // namespace platform
