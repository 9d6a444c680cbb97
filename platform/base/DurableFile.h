// Files that hold what must survive a crash: read whole, replaced whole.
#pragma once

#include <sys/stat.h>

#include <cstddef>
#include <string>
#include <string_view>

#include "platform/base/FileDescriptor.h"
#include "platform/base/Outcome.h"

namespace platform {

struct FileOwnership {
    unsigned mode = 0600;
    unsigned user = 0;
    unsigned group = 0;
    bool operator==(const FileOwnership&) const = default;
};

// "/" for "/etc", "." for a name without a slash.
[[nodiscard]] std::string parentOf(const std::string& path);

// Whether the host lets a step be taken by which a file changes on disk; errno says why not.
[[nodiscard]] bool isStepAllowed(const char* step, const std::string& path);
// Never through a link, never waiting; a file that is made has mode 0600. Not open, and errno, on failure.
[[nodiscard]] FileDescriptor openFile(const std::string& path, int flags);

// Fails for a symbolic link and for everything else that is not a regular file.
Outcome checkRegular(const struct stat& status, const std::string& path);
// Fails for what somebody other than this process's user and root can change.
Outcome checkTrusted(const struct stat& status, const std::string& path);

// All of a regular file, from its start or where the descriptor stands; the path is for the reason. Fails
// beyond `largest` bytes.
Outcome readDescriptor(int descriptor, const std::string& path, std::size_t largest, std::string& content);
// The same by its name; a link is followed, a FIFO is never waited for.
Outcome readWholeFile(const std::string& path, std::string& content,
                      std::size_t largest = std::size_t{16} << 20U);

// Where a new content is prepared, in the same directory.
[[nodiscard]] std::string temporaryFor(const std::string& path);
// Puts the content in the file's place, all of it or nothing, on the disk when the call returns. The file has
// its owner and mode before it has its name; written, unless it is null, is what the new file was right then.
// The caller holds a lock that every writer of this file takes.
Outcome replaceFile(const std::string& path, std::string_view content, const FileOwnership& ownership,
                    struct stat* written = nullptr);
// The same, but a file that is a mount of its own, as containers have it, is written in place, since nothing
// can be put there: it keeps its owner and mode, and a crash may leave it cut short.
Outcome replaceFileOrMount(const std::string& path, std::string_view content, const FileOwnership& ownership);
// Success when it is not there. What a writer that was ended half-way left beside it goes too.
Outcome removeFile(const std::string& path);
// Puts a directory's list of names on the disk.
Outcome syncDirectory(const std::string& path);

}  // namespace platform
