// The tree on disk, with the last one that this process read or wrote kept in memory.
#pragma once

#include <optional>

#include "platform/CoreFoundation.h"
#include "platform/base/Outcome.h"
#include "platform/preferences/StoreFile.h"
#include "platform/values/Object.h"

namespace platform::preferences {

// What the store holds at one moment.
struct Snapshot {
    values::Owned<CFDictionaryRef> tree;  // frozen
    std::optional<KnownFile> file;        // nothing without a file: the tree is the first-run tree

    // Whether a look at the file found the one that the tree is from.
    [[nodiscard]] bool isOf(const std::optional<FileIdentity>& now) const {
        return file.has_value() == now.has_value() && (!file || file->identity == *now);
    }
};

// The store as it is now. An unchanged file costs one look at it; a changed one is read and parsed.
Outcome load(const StoreFile& file, Snapshot& snapshot);
// Notes what was just written, so that the next load need not read it.
void remember(const Snapshot& snapshot);

// The tree of the host's preferences directory as it is on disk now, for who only reads it.
Outcome loadCommittedTree(values::Owned<CFDictionaryRef>& tree);

}  // namespace platform::preferences
