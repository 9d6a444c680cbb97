// The preferences file and its lock, as bytes: looked at, read, replaced.
#pragma once

#include <sys/stat.h>

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/base/FileDescriptor.h"
#include "platform/base/Outcome.h"

namespace platform::preferences {

inline constexpr std::size_t largestPreferencesFile = std::size_t{64} << 20U;

// Tells one state of the file from every other. A commit makes a new file, an editor changes the times.
struct FileIdentity {
    dev_t device = 0;
    ino_t inode = 0;
    off_t size = 0;
    std::int64_t modified = 0;  // nanoseconds, as is changed
    std::int64_t changed = 0;
    bool operator==(const FileIdentity&) const = default;
};

// A file that this process has read or written. The descriptor keeps the inode's number from being given to
// another file, which could otherwise look the same to the last detail within one tick of the file system's
// clock.
struct KnownFile {
    FileIdentity identity;
    std::shared_ptr<const FileDescriptor> pin;
};

// "preferences.plist" in one directory, "preferences.lock" beside it, and a new file of its name while a
// commit writes. A symbolic link in the place of any of them is refused, wherever it leads: the store of a
// tool that runs as root has no business elsewhere. So is everything else that is no regular file, and none
// of it is ever waited for. The directory and the lock must belong to this process's user or to root, and
// nobody else may write to them: whoever could would choose the network that root configures.
class StoreFile {
  public:
    explicit StoreFile(std::string directory);

    [[nodiscard]] const std::string& path() const noexcept { return path_; }

    // The file as it is now; nothing when there is none. Fails when there is none and this process could not
    // make one.
    Outcome look(std::optional<FileIdentity>& identity) const;
    // All of the file, and what it was when it was read. Fails beyond largestPreferencesFile.
    Outcome read(std::string& content, KnownFile& known) const;
    // Takes the rights of group and others away from a file of this user's own, which holds passwords and may
    // come from a copy or an editor. known becomes what the file then is.
    void keepPrivate(KnownFile& known) const;
    // Takes the lock, which goes with the descriptor. Makes the directory (0700) and its parents when they
    // are missing, on the disk before anything is put into them. 3002 when another process keeps it for the
    // whole wait.
    Outcome lock(std::chrono::milliseconds wait, FileDescriptor& lock) const;
    // Puts the content in the file's place, all of it or nothing, on the disk when the call returns. The file
    // then has mode 0600, whatever it had before: it holds passwords. The lock must be held. known is what
    // the file then is: set as soon as the new content has its place, even when the call fails after that,
    // and nothing, on success too, when somebody else touched the file at that very moment.
    Outcome replace(std::string_view content, std::optional<KnownFile>& known) const;

  private:
    // That the directory is one, and nobody else can change what is in it.
    [[nodiscard]] Outcome checkDirectory() const;
    [[nodiscard]] std::optional<KnownFile> recognize(const struct stat& written) const;

    std::string directory_;
    std::string path_;
};

}  // namespace platform::preferences
