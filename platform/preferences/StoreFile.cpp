#include "platform/preferences/StoreFile.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <utility>

#include "platform/base/DurableFile.h"
#include "platform/base/FileLock.h"

namespace platform::preferences {
namespace {

// Whoever commits puts a new file in place of this one; only an editor writes into it while it is read.
constexpr int readTries = 3;

std::int64_t nanoseconds(const timespec& time) {
    return static_cast<std::int64_t>(time.tv_sec) * 1'000'000'000 + time.tv_nsec;
}

FileIdentity identityOf(const struct stat& status) {
    return {status.st_dev, status.st_ino, status.st_size, nanoseconds(status.st_mtim),
            nanoseconds(status.st_ctim)};
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

// Makes a directory unless it is there, and those above it, each on the disk before anything is put into it.
Outcome makeDirectory(const std::string& path, mode_t mode) {
    if (::access(path.c_str(), F_OK) == 0 || errno != ENOENT) {
        return {};
    }
    RETURN_IF_FAILED(makeDirectory(parentOf(path), 0755));
    if ((!isStepAllowed("mkdir", path) || ::mkdir(path.c_str(), mode) != 0) && errno != EEXIST) {
        return Outcome::fromErrno("cannot make " + path);
    }
    return syncDirectory(parentOf(path));
}

}  // namespace

StoreFile::StoreFile(std::string directory)
    : directory_(std::move(directory)), path_(directory_ + "/preferences.plist") {}

Outcome StoreFile::checkDirectory() const {
    struct stat status {};
    // Not through a link, whose owner would choose what is read.
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
    RETURN_IF_FAILED(checkRegular(status, path_));
    identity = identityOf(status);
    return {};
}

Outcome StoreFile::read(std::string& content, KnownFile& known) const {
    FileDescriptor file = openFile(path_, O_RDONLY);
    if (!file.isOpen()) {
        return Outcome::fromErrno("cannot open " + path_);
    }
    RETURN_IF_FAILED(checkDirectory());
    for (int attempt = 0; attempt < readTries; ++attempt) {
        struct stat status {};
        if (::fstat(file.get(), &status) != 0 || ::lseek(file.get(), 0, SEEK_SET) != 0) {
            return Outcome::fromErrno("cannot look at " + path_);
        }
        const FileIdentity identity = identityOf(status);
        RETURN_IF_FAILED(readDescriptor(file.get(), path_, largestPreferencesFile, content));
        if (::fstat(file.get(), &status) == 0 && identityOf(status) == identity) {
            known = {identity, std::make_shared<const FileDescriptor>(std::move(file))};
            return {};
        }
    }
    return {kSCStatusFailed, path_ + " changes while it is read"};
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

Outcome StoreFile::lock(std::chrono::milliseconds wait, FileDescriptor& lock) const {
    RETURN_IF_FAILED(makeDirectory(directory_, 0700));
    RETURN_IF_FAILED(checkDirectory());
    return takeFileLock(directory_ + "/preferences.lock", wait, lock, kSCStatusPrefsBusy);
}

// The file that has just been given its name, which set the time of change and nothing but that.
std::optional<KnownFile> StoreFile::recognize(const struct stat& written) const {
    FileDescriptor file(::open(path_.c_str(), O_PATH | O_NOFOLLOW | O_CLOEXEC));
    struct stat status {};
    if (!file.isOpen() || ::fstat(file.get(), &status) != 0) {
        return std::nullopt;
    }
    const FileIdentity now = identityOf(status);
    FileIdentity expected = identityOf(written);
    expected.changed = now.changed;
    if (now != expected) {
        return std::nullopt;
    }
    return KnownFile{now, std::make_shared<const FileDescriptor>(std::move(file))};
}

Outcome StoreFile::replace(std::string_view content, std::optional<KnownFile>& known) const {
    struct stat written {};
    Outcome done = replaceFile(path_, content, {0600, ::geteuid(), ::getegid()}, &written);
    known = recognize(written);
    return done;
}

}  // namespace platform::preferences
