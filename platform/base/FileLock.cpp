#include "platform/base/FileLock.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>

#include <cerrno>
#include <thread>
#include <utility>

#include "platform/base/DurableFile.h"

namespace platform {
namespace {

// The kernel's own waiting has no end that could be given in advance.
constexpr std::chrono::milliseconds pauseBetweenTries{5};

}  // namespace

Outcome takeFileLock(const std::string& path, std::chrono::milliseconds wait, FileDescriptor& lock,
                     int busy) {
    FileDescriptor file = openFile(path, O_RDWR | O_CREAT);
    struct stat status {};
    if (!file.isOpen() || ::fstat(file.get(), &status) != 0) {
        return Outcome::fromErrno("cannot open " + path);
    }
    RETURN_IF_FAILED(checkRegular(status, path));
    RETURN_IF_FAILED(checkTrusted(status, path));
    const auto deadline = std::chrono::steady_clock::now() + wait;
    // flock(2), not fcntl's locks: those would go as soon as this process closes any descriptor of the file.
    while (::flock(file.get(), LOCK_EX | LOCK_NB) != 0) {
        if (errno != EWOULDBLOCK && errno != EINTR) {
            return Outcome::fromErrno("cannot lock " + path);
        }
        if (std::chrono::steady_clock::now() >= deadline) {
            return {busy, "another process holds " + path};
        }
        std::this_thread::sleep_for(pauseBetweenTries);
    }
    lock = std::move(file);
    return {};
}

}  // namespace platform
