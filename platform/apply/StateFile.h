// The small files of the runtime directory: property lists that tell the next run what this one did.
#pragma once

#include <chrono>
#include <optional>
#include <string>
#include <string_view>

#include "platform/CoreFoundation.h"
#include "platform/base/FileDescriptor.h"
#include "platform/base/Outcome.h"
#include "platform/values/Fields.h"

namespace platform::apply {

inline constexpr std::size_t largestStateFile = std::size_t{16} << 20U;

// Makes the host's runtime directory, mode 0700, when it is not there. Fails when it is no directory, belongs
// to somebody else, or others may write to it.
Outcome makeRuntimeDirectory();
// The path of a file in it.
[[nodiscard]] std::string runtimePath(std::string_view name);

// The dictionary that a file holds; null, and success, when there is no such file. Links are not followed.
// Fails for anything that is not a property list with a dictionary, or is larger than largestStateFile.
Outcome readStateFile(const std::string& path, values::Owned<CFDictionaryRef>& content);
// All of it or nothing, mode 0600, on the disk when the call returns.
Outcome writeStateFile(const std::string& path, CFDictionaryRef content);
// The same for a struct that lists its fields (Fields.h). Nothing, and success, when there is no such file.
template <class T>
Outcome readState(const std::string& path, std::optional<T>& state) {
    state.reset();
    values::Owned<CFDictionaryRef> content;
    RETURN_IF_FAILED(readStateFile(path, content));
    if (content && !values::fromPropertyList(content.get(), state.emplace())) {
        state.reset();
        return {kSCStatusFailed, path + " is not what this system wrote"};
    }
    return {};
}
template <class T>
Outcome writeState(const std::string& path, const T& state) {
    return writeStateFile(path, values::toPropertyList(state).get());
}
// Success when it is not there. What a writer that was ended half-way left beside it goes too.
Outcome removeStateFile(const std::string& path);

// The same two steps for plain content, which the name servers' file shares. mode, uid and gid are set before
// the file has its name. A file that is a mount of its own, as containers have it, cannot be replaced: it is
// written in place, and keeps its mode and owner.
Outcome readWholeFile(const std::string& path, std::string& content);
struct FileOwnership {
    unsigned mode = 0600;
    unsigned user = 0;
    unsigned group = 0;
};
// Where that is prepared, in the same directory.
[[nodiscard]] std::string temporaryFor(const std::string& path);
Outcome replaceFile(const std::string& path, std::string_view content, const FileOwnership& ownership);
// Puts the directory of a path on the disk.
Outcome syncDirectoryOf(const std::string& path);

// A lock between processes, held until the end of the scope, in a file of its own.
class StateLock {
  public:
    Outcome acquire(const std::string& path, std::chrono::milliseconds bound);

  private:
    FileDescriptor descriptor_;
};

}  // namespace platform::apply
