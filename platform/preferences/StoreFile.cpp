#include "platform/preferences/StoreFile.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <thread>
#include <utility>
#include <vector>

namespace platform::preferences {
namespace {

constexpr mode_t newFileMode = 0600;
constexpr mode_t newDirectoryMode = 0700;
constexpr mode_t newParentMode = 0755;
constexpr auto pauseBetweenLockTries = std::chrono::milliseconds(5);
constexpr int readTries = 3;

std::int64_t nanoseconds(const timespec& time) {
    return static_cast<std::int64_t>(time.tv_sec) * 1'000'000'000 + time.tv_nsec;
}

FileIdentity identityOf(const struct stat& status) {
    return {status.st_dev, status.st_ino, status.st_size, nanoseconds(status.st_mtim),
            nanoseconds(status.st_ctim)};
}

std::string parentOf(const std::string& path) {
    const std::size_t slash = path.find_last_of('/');
    if (slash == std::string::npos) {
        return ".";
    }
    return slash == 0 ? "/" : path.substr(0, slash);
}

Outcome checkRegular(const struct stat& status, const std::string& path) {
    if (S_ISLNK(status.st_mode)) {
        return {kSCStatusFailed, path + " is a symbolic link"};
    }
    if (!S_ISREG(status.st_mode)) {
        return {kSCStatusFailed, path + " is not a regular file"};
    }
    return {};
}

// Whether nobody but this process's user, or root, can change what is there.
Outcome checkTrusted(const struct stat& status, const std::string& path) {
    if ((status.st_uid != ::geteuid() && status.st_uid != 0) || (status.st_mode & (S_IWGRP | S_IWOTH)) != 0) {
        return {kSCStatusFailed, path + " belongs to somebody else, or others may write to it"};
    }
    return {};
}

// Whether the directory, or the nearest one above it that exists, can be written to.
Outcome checkCouldMake(std::string directory) {
    while (::faccessat(AT_FDCWD, directory.c_str(), W_OK | X_OK, AT_EACCESS) != 0) {
        if (errno != ENOENT || directory == "/" || directory == ".") {
            return Outcome::fromErrno("cannot write to " + directory);
        }
        directory = parentOf(directory);
    }
    return {};
}

Outcome readAll(int descriptor, off_t size, const std::string& path, std::string& content) {
    if (size > static_cast<off_t>(largestPreferencesFile)) {
        return {kSCStatusFailed,
                path + " is larger than " + std::to_string(largestPreferencesFile) + " bytes"};
    }
    // One byte more than the file has, so that a file that grows meanwhile is noticed.
    content.resize(static_cast<std::size_t>(size) + 1);
    std::size_t filled = 0;
    while (filled < content.size()) {
        const ssize_t got = ::read(descriptor, content.data() + filled, content.size() - filled);
        if (got < 0 && errno == EINTR) {
            continue;
        }
        if (got < 0) {
            return Outcome::fromErrno("cannot read " + path);
        }
        if (got == 0) {
            break;
        }
        filled += static_cast<std::size_t>(got);
    }
    content.resize(filled);
    return {};
}

}  // namespace

StoreFile::StoreFile(std::string directory, FileOperations& operations)
    : directory_(std::move(directory)),
      path_(directory_ + "/preferences.plist"),
      temporaryPath_(path_ + ".new"),
      operations_(&operations) {}

Outcome StoreFile::checkDirectory() const {
    struct stat status {};
    if (::lstat(directory_.c_str(), &status) != 0) {
        return Outcome::fromErrno("cannot look at " + directory_);
    }
    if (!S_ISDIR(status.st_mode)) {
        return {kSCStatusFailed, directory_ + " is not a directory"};
    }
    return checkTrusted(status, directory_);
}

Outcome StoreFile::look(std::optional<FileIdentity>& identity) const {
    identity.reset();
    struct stat status {};
    if (::lstat(path_.c_str(), &status) != 0) {
        return errno == ENOENT ? checkCouldMake(directory_) : Outcome::fromErrno("cannot look at " + path_);
    }
    Outcome regular = checkRegular(status, path_);
    if (regular.ok()) {
        identity = identityOf(status);
    }
    return regular;
}

Outcome StoreFile::read(std::string& content, KnownFile& known) const {
    FileDescriptor file(operations_->open(path_, O_RDONLY, 0));
    if (!file.isOpen()) {
        return Outcome::fromErrno("cannot open " + path_);
    }
    Outcome trusted = checkDirectory();
    if (!trusted.ok()) {
        return trusted;
    }
    for (int attempt = 0; attempt < readTries; ++attempt) {
        struct stat status {};
        if (::fstat(file.get(), &status) != 0 || ::lseek(file.get(), 0, SEEK_SET) != 0) {
            return Outcome::fromErrno("cannot look at " + path_);
        }
        Outcome done = checkRegular(status, path_);
        if (done.ok()) {
            done = readAll(file.get(), status.st_size, path_, content);
        }
        if (!done.ok()) {
            return done;
        }
        const FileIdentity identity = identityOf(status);
        if (::fstat(file.get(), &status) == 0 && identityOf(status) == identity) {
            known = {identity, std::make_shared<const FileDescriptor>(std::move(file))};
            return {};
        }
    }
    return {kSCStatusFailed, path_ + " changes while it is read"};
}

Outcome StoreFile::makeDirectories() {
    std::vector<std::string> missing;
    for (std::string path = directory_; ::access(path.c_str(), F_OK) != 0 && errno == ENOENT;) {
        missing.push_back(path);
        path = parentOf(path);
    }
    for (auto path = missing.rbegin(); path != missing.rend(); ++path) {
        const mode_t mode = *path == directory_ ? newDirectoryMode : newParentMode;
        if (operations_->makeDirectory(*path, mode) != 0 && errno != EEXIST) {
            return Outcome::fromErrno("cannot make " + *path);
        }
        Outcome synced = syncDirectory(parentOf(*path));
        if (!synced.ok()) {
            return synced;
        }
    }
    return checkDirectory();
}

void StoreFile::keepPrivate(KnownFile& known) const {
    struct stat status {};
    const int file = known.pin->get();
    if (::fstat(file, &status) == 0 && (status.st_mode & (S_IRWXG | S_IRWXO)) != 0 &&
        status.st_uid == ::geteuid() && ::fchmod(file, S_IRUSR | S_IWUSR) == 0 &&
        ::fstat(file, &status) == 0) {
        known.identity = identityOf(status);
    }
}

Outcome StoreFile::lock(std::chrono::milliseconds wait, FileDescriptor& lock) {
    Outcome made = makeDirectories();
    if (!made.ok()) {
        return made;
    }
    const std::string path = directory_ + "/preferences.lock";
    FileDescriptor file(operations_->open(path, O_RDWR | O_CREAT, newFileMode));
    if (!file.isOpen()) {
        return Outcome::fromErrno("cannot open " + path);
    }
    struct stat status {};
    if (::fstat(file.get(), &status) != 0) {
        return Outcome::fromErrno("cannot look at " + path);
    }
    Outcome usable = checkRegular(status, path);
    if (usable.ok()) {
        usable = checkTrusted(status, path);
    }
    if (!usable.ok()) {
        return usable;
    }
    const auto deadline = std::chrono::steady_clock::now() + wait;
    while (::flock(file.get(), LOCK_EX | LOCK_NB) != 0) {
        if (errno != EWOULDBLOCK && errno != EINTR) {
            return Outcome::fromErrno("cannot lock " + path);
        }
        if (std::chrono::steady_clock::now() >= deadline) {
            return {kSCStatusPrefsBusy, "another process holds " + path};
        }
        std::this_thread::sleep_for(pauseBetweenLockTries);
    }
    lock = std::move(file);
    return {};
}

Outcome StoreFile::fill(int descriptor, std::string_view content) {
    while (!content.empty()) {
        const ssize_t written = operations_->write(descriptor, content);
        if (written < 0 && errno == EINTR) {
            continue;
        }
        if (written <= 0) {
            return Outcome::fromErrno("cannot write " + temporaryPath_, written < 0 ? errno : EIO);
        }
        content.remove_prefix(static_cast<std::size_t>(written));
    }
    return {};
}

Outcome StoreFile::writeTemporary(std::string_view content, std::optional<FileIdentity>& identity) {
    // Nobody but the lock's holder makes this file, so one that is there was left behind by a crash.
    if (operations_->remove(temporaryPath_) != 0 && errno != ENOENT) {
        return Outcome::fromErrno("cannot remove " + temporaryPath_);
    }
    FileDescriptor file(operations_->open(temporaryPath_, O_WRONLY | O_CREAT | O_EXCL, newFileMode));
    if (!file.isOpen()) {
        return Outcome::fromErrno("cannot make " + temporaryPath_);
    }
    Outcome done = fill(file.get(), content);
    if (done.ok() && operations_->sync(file.get()) != 0) {
        done = Outcome::fromErrno("cannot put " + temporaryPath_ + " on the disk");
    }
    struct stat status {};
    if (::fstat(file.get(), &status) == 0) {
        identity = identityOf(status);
    }
    if (operations_->close(file.release()) != 0 && done.ok()) {
        done = Outcome::fromErrno("cannot close " + temporaryPath_);
    }
    return done;
}

Outcome StoreFile::syncDirectory(const std::string& path) {
    const FileDescriptor directory(operations_->open(path + "/.", O_RDONLY | O_DIRECTORY, 0));
    if (!directory.isOpen() || operations_->sync(directory.get()) != 0) {
        return Outcome::fromErrno("cannot put " + path + " on the disk");
    }
    return {};
}

// The file that has just been given its name, which set the time of change and nothing but that.
std::optional<KnownFile> StoreFile::recognize(FileIdentity written) const {
    FileDescriptor file(::open(path_.c_str(), O_PATH | O_NOFOLLOW | O_CLOEXEC));
    struct stat status {};
    if (!file.isOpen() || ::fstat(file.get(), &status) != 0) {
        return std::nullopt;
    }
    const FileIdentity now = identityOf(status);
    written.changed = now.changed;
    if (now != written) {
        return std::nullopt;
    }
    return KnownFile{now, std::make_shared<const FileDescriptor>(std::move(file))};
}

Outcome StoreFile::replace(std::string_view content, std::optional<KnownFile>& known) {
    known.reset();
    std::optional<FileIdentity> written;
    Outcome done = writeTemporary(content, written);
    if (done.ok() && operations_->rename(temporaryPath_, path_) != 0) {
        done = Outcome::fromErrno("cannot replace " + path_);
    }
    if (!done.ok()) {
        (void)operations_->remove(temporaryPath_);
        return done;
    }
    if (written) {
        known = recognize(*written);
    }
    return syncDirectory(directory_);
}

}  // namespace platform::preferences
