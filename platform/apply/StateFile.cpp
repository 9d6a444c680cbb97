#include "platform/apply/StateFile.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <optional>
#include <thread>

#include "platform/apply/Properties.h"
#include "platform/base/Host.h"
#include "platform/values/PropertyListXML.h"

namespace platform::apply {
namespace {

Outcome writeAll(int descriptor, std::string_view content, const std::string& path) {
    while (!content.empty()) {
        const ssize_t written = ::write(descriptor, content.data(), content.size());
        if (written < 0 && errno != EINTR) {
            return Outcome::fromErrno("cannot write " + path);
        }
        if (written > 0) {
            content.remove_prefix(static_cast<std::size_t>(written));
        }
    }
    return {};
}

Outcome readOpen(int descriptor, const std::string& path, std::string& content) {
    struct stat status {};
    if (::fstat(descriptor, &status) != 0) {
        return Outcome::fromErrno("cannot look at " + path);
    }
    if (!S_ISREG(status.st_mode)) {
        return {kSCStatusFailed, path + " is not a regular file"};
    }
    content.clear();
    char piece[16384];
    for (;;) {
        const ssize_t size = ::read(descriptor, piece, sizeof piece);
        if (size < 0 && errno == EINTR) {
            continue;
        }
        if (size < 0) {
            return Outcome::fromErrno("cannot read " + path);
        }
        if (size == 0) {
            return {};
        }
        content.append(piece, static_cast<std::size_t>(size));
        if (content.size() > largestStateFile) {
            return {kSCStatusFailed, path + " is too large"};
        }
    }
}

// For a file that is a mount of its own, as containers have them: nothing can be put in its place.
Outcome overwrite(const std::string& path, std::string_view content) {
    const FileDescriptor file(::open(path.c_str(), O_WRONLY | O_TRUNC | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
    if (!file.isOpen()) {
        return Outcome::fromErrno("cannot open " + path);
    }
    Outcome done = writeAll(file.get(), content, path);
    if (done.ok() && ::fsync(file.get()) != 0) {
        done = Outcome::fromErrno("cannot put " + path + " on the disk");
    }
    return done;
}

}  // namespace

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
    if (status.st_uid != ::geteuid() || (status.st_mode & (S_IWGRP | S_IWOTH)) != 0) {
        return {kSCStatusFailed, path + " belongs to somebody else, or others may write to it"};
    }
    return {};
}

std::string runtimePath(std::string_view name) {
    return currentHost().runtimeDirectory + "/" + std::string(name);
}

Outcome readWholeFile(const std::string& path, std::string& content) {
    const FileDescriptor file(::open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC));
    if (!file.isOpen()) {
        return Outcome::fromErrno("cannot open " + path);
    }
    return readOpen(file.get(), path, content);
}

Outcome readStateFile(const std::string& path, values::Owned<CFDictionaryRef>& content) {
    content = {};
    const FileDescriptor file(::open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
    if (!file.isOpen()) {
        return errno == ENOENT ? Outcome() : Outcome::fromErrno("cannot open " + path);
    }
    std::string text;
    Outcome read = readOpen(file.get(), path, text);
    if (!read.ok()) {
        return read;
    }
    values::ParseError error;
    const values::Owned<CFPropertyListRef> value = values::parsePropertyListXML(text, error);
    if (!value) {
        return {kSCStatusFailed, path + " line " + std::to_string(error.line) + " column " +
                                     std::to_string(error.column) + ": " + error.reason};
    }
    content = values::Owned<CFDictionaryRef>::retained(asDictionary(value.get()));
    if (!content) {
        return {kSCStatusFailed, path + " holds no dictionary"};
    }
    return {};
}

Outcome syncDirectoryOf(const std::string& path) {
    const std::size_t slash = path.rfind('/');
    const std::string folder = slash == std::string::npos ? "." : slash == 0 ? "/" : path.substr(0, slash);
    const FileDescriptor directory(::open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!directory.isOpen() || ::fsync(directory.get()) != 0) {
        return Outcome::fromErrno("cannot put " + folder + " on the disk");
    }
    return {};
}

Outcome replaceFile(const std::string& path, std::string_view content, const FileOwnership& ownership) {
    const std::string temporary = temporaryFor(path);
    // One that a crash left behind; every writer of a path holds that path's lock.
    (void)::unlink(temporary.c_str());
    FileDescriptor file(
        ::open(temporary.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600));
    if (!file.isOpen()) {
        return Outcome::fromErrno("cannot make " + temporary);
    }
    Outcome done = writeAll(file.get(), content, temporary);
    if (done.ok() && (::fchown(file.get(), ownership.user, ownership.group) != 0 ||
                      ::fchmod(file.get(), ownership.mode) != 0)) {
        done = Outcome::fromErrno("cannot give " + temporary + " its owner and mode");
    }
    if (done.ok() && ::fsync(file.get()) != 0) {
        done = Outcome::fromErrno("cannot put " + temporary + " on the disk");
    }
    if (::close(file.release()) != 0 && done.ok()) {
        done = Outcome::fromErrno("cannot close " + temporary);
    }
    if (done.ok() && ::rename(temporary.c_str(), path.c_str()) != 0) {
        const int error = errno;
        (void)::unlink(temporary.c_str());
        return error == EBUSY ? overwrite(path, content)
                              : Outcome::fromErrno("cannot replace " + path, error);
    }
    if (!done.ok()) {
        (void)::unlink(temporary.c_str());
        return done;
    }
    return syncDirectoryOf(path);
}

Outcome writeStateFile(const std::string& path, CFDictionaryRef content) {
    const std::optional<std::string> text = values::writePropertyListXML(content);
    if (!text) {
        return {kSCStatusFailed, "what belongs into " + path + " cannot be written as a property list"};
    }
    return replaceFile(path, *text, {0600, ::geteuid(), ::getegid()});
}

std::string temporaryFor(const std::string& path) {
    return path + ".la-new";
}

Outcome removeStateFile(const std::string& path) {
    (void)::unlink(temporaryFor(path).c_str());
    if (::unlink(path.c_str()) != 0) {
        return errno == ENOENT ? Outcome() : Outcome::fromErrno("cannot remove " + path);
    }
    return syncDirectoryOf(path);
}

Outcome StateLock::acquire(const std::string& path, std::chrono::milliseconds bound) {
    FileDescriptor file(::open(path.c_str(), O_RDWR | O_CREAT | O_NOFOLLOW | O_CLOEXEC, 0600));
    if (!file.isOpen()) {
        return Outcome::fromErrno("cannot open " + path);
    }
    const auto deadline = std::chrono::steady_clock::now() + bound;
    while (::flock(file.get(), LOCK_EX | LOCK_NB) != 0) {
        if (errno != EWOULDBLOCK && errno != EINTR) {
            return Outcome::fromErrno("cannot lock " + path);
        }
        if (std::chrono::steady_clock::now() >= deadline) {
            return {kSCStatusFailed, "another process holds " + path};
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
    }
    descriptor_ = std::move(file);
    return {};
}

}  // namespace platform::apply
