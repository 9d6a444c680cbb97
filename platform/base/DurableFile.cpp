#include "platform/base/DurableFile.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>

#include "platform/base/Host.h"

namespace platform {
namespace {

bool unlinkFile(const std::string& path) {
    return isStepAllowed("unlink", path) && ::unlink(path.c_str()) == 0;
}

Outcome writeAll(int descriptor, std::string_view content, const std::string& path) {
    while (!content.empty()) {
        const ssize_t written =
            isStepAllowed("write", path) ? ::write(descriptor, content.data(), content.size()) : -1;
        if (written < 0 && errno == EINTR) {
            continue;
        }
        if (written <= 0) {
            return Outcome::fromErrno("cannot write " + path, written < 0 ? errno : EIO);
        }
        content.remove_prefix(static_cast<std::size_t>(written));
    }
    return {};
}

Outcome sync(int descriptor, const std::string& path) {
    return isStepAllowed("fsync", path) && ::fsync(descriptor) == 0
               ? Outcome()
               : Outcome::fromErrno("cannot put " + path + " on the disk");
}

Outcome overwrite(const std::string& path, std::string_view content) {
    const FileDescriptor file = openFile(path, O_WRONLY | O_TRUNC);
    if (!file.isOpen()) {
        return Outcome::fromErrno("cannot open " + path);
    }
    RETURN_IF_FAILED(writeAll(file.get(), content, path));
    return sync(file.get(), path);
}

Outcome fill(int descriptor, std::string_view content, const FileOwnership& ownership,
             const std::string& path) {
    RETURN_IF_FAILED(writeAll(descriptor, content, path));
    if (::fchown(descriptor, ownership.user, ownership.group) != 0 ||
        ::fchmod(descriptor, ownership.mode) != 0) {
        return Outcome::fromErrno("cannot give " + path + " its owner and mode");
    }
    return sync(descriptor, path);
}

Outcome writeTemporary(const std::string& path, std::string_view content, const FileOwnership& ownership,
                       struct stat* written) {
    // Nobody but the lock's holder makes this file, so one that is there was left behind by a crash.
    if (!unlinkFile(path) && errno != ENOENT) {
        return Outcome::fromErrno("cannot remove " + path);
    }
    FileDescriptor file = openFile(path, O_WRONLY | O_CREAT | O_EXCL);
    if (!file.isOpen()) {
        return Outcome::fromErrno("cannot make " + path);
    }
    Outcome done = fill(file.get(), content, ownership, path);
    if (done.ok() && written != nullptr && ::fstat(file.get(), written) != 0) {
        done = Outcome::fromErrno("cannot look at " + path);
    }
    const bool mayClose = isStepAllowed("close", path);
    if ((::close(file.release()) != 0 || !mayClose) && done.ok()) {
        done = Outcome::fromErrno("cannot close " + path);
    }
    return done;
}

Outcome replace(const std::string& path, std::string_view content, const FileOwnership& ownership,
                struct stat* written, bool& isMount) {
    const std::string temporary = temporaryFor(path);
    Outcome done = writeTemporary(temporary, content, ownership, written);
    if (done.ok() && (!isStepAllowed("rename", path) || ::rename(temporary.c_str(), path.c_str()) != 0)) {
        // Something is mounted upon the name, as containers do with /etc/resolv.conf.
        isMount = errno == EBUSY;
        done = Outcome::fromErrno("cannot replace " + path);
    }
    if (!done.ok()) {
        (void)unlinkFile(temporary);
        return done;
    }
    return syncDirectory(parentOf(path));
}

}  // namespace

bool isStepAllowed(const char* step, const std::string& path) {
    return !currentHost().fileStep || currentHost().fileStep(step, path);
}

FileDescriptor openFile(const std::string& path, int flags) {
    // Neither through a link that somebody planted, nor waiting for the other end of a FIFO.
    return FileDescriptor(isStepAllowed("open", path)
                              ? ::open(path.c_str(), flags | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK, 0600)
                              : -1);
}

std::string parentOf(const std::string& path) {
    const std::size_t slash = path.find_last_of('/');
    return slash == std::string::npos ? "." : slash == 0 ? "/" : path.substr(0, slash);
}

Outcome checkRegular(const struct stat& status, const std::string& path) {
    if (S_ISLNK(status.st_mode)) {
        return {kSCStatusFailed, path + " is a symbolic link"};
    }
    return S_ISREG(status.st_mode) ? Outcome() : Outcome(kSCStatusFailed, path + " is not a regular file");
}

Outcome checkTrusted(const struct stat& status, const std::string& path) {
    if ((status.st_uid != ::geteuid() && status.st_uid != 0) || (status.st_mode & (S_IWGRP | S_IWOTH)) != 0) {
        return {kSCStatusFailed, path + " belongs to somebody else, or others may write to it"};
    }
    return {};
}

Outcome readDescriptor(int descriptor, const std::string& path, std::size_t largest, std::string& content) {
    struct stat status {};
    if (::fstat(descriptor, &status) != 0) {
        return Outcome::fromErrno("cannot look at " + path);
    }
    RETURN_IF_FAILED(checkRegular(status, path));
    std::size_t filled = 0;
    const auto size = static_cast<std::size_t>(status.st_size);
    // One byte more than the file has, to see its end; those that the kernel makes up have size 0.
    content.resize(std::max<std::size_t>(std::min(size, largest) + 1, 4096));
    while (size <= largest && filled <= largest) {
        const ssize_t got = ::read(descriptor, content.data() + filled, content.size() - filled);
        if (got < 0 && errno != EINTR) {
            return Outcome::fromErrno("cannot read " + path);
        }
        if (got == 0) {
            content.resize(filled);
            return {};
        }
        filled += static_cast<std::size_t>(std::max<ssize_t>(got, 0));
        content.resize(filled == content.size() ? filled * 2 : content.size());
    }
    return {kSCStatusFailed, path + " is larger than " + std::to_string(largest) + " bytes"};
}

Outcome readWholeFile(const std::string& path, std::string& content, std::size_t largest) {
    const FileDescriptor file(::open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC));
    return file.isOpen() ? readDescriptor(file.get(), path, largest, content)
                         : Outcome::fromErrno("cannot open " + path);
}

std::string temporaryFor(const std::string& path) {
    return path + ".la-new";
}

Outcome replaceFile(const std::string& path, std::string_view content, const FileOwnership& ownership,
                    struct stat* written) {
    bool isMount = false;
    return replace(path, content, ownership, written, isMount);
}

Outcome replaceFileOrMount(const std::string& path, std::string_view content,
                           const FileOwnership& ownership) {
    bool isMount = false;
    Outcome done = replace(path, content, ownership, nullptr, isMount);
    return isMount ? overwrite(path, content) : done;
}

Outcome removeFile(const std::string& path) {
    // With what a run that was ended left beside it.
    (void)unlinkFile(temporaryFor(path));
    if (!unlinkFile(path)) {
        return errno == ENOENT ? Outcome() : Outcome::fromErrno("cannot remove " + path);
    }
    return syncDirectory(parentOf(path));
}

Outcome syncDirectory(const std::string& path) {
    // By its "." it is opened through a link as well, which openFile would refuse.
    const FileDescriptor directory = openFile(path + "/.", O_RDONLY | O_DIRECTORY);
    return directory.isOpen() ? sync(directory.get(), path)
                              : Outcome::fromErrno("cannot put " + path + " on the disk");
}

}  // namespace platform
