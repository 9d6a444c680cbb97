// The small files of the runtime directory: property lists that tell the next run what this one did.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/CoreFoundation.h"
#include "platform/base/DurableFile.h"
#include "platform/base/Outcome.h"
#include "platform/values/Fields.h"

namespace platform::apply {

// Makes the host's runtime directory, mode 0700, when it is not there. Fails when it is no directory, belongs
// to somebody else, or others may write to it.
Outcome makeRuntimeDirectory();
// The path of a file in it.
[[nodiscard]] std::string runtimePath(std::string_view name);

// The dictionary that a file holds; null, and success, when there is no such file. Links are not followed.
// Fails for anything that is not a property list with a dictionary, or is larger than 16 MiB.
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
}  // namespace platform::apply
