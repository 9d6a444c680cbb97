#include "platform/preferences/Store.h"

#include <string>
#include <utility>

#include "platform/base/Host.h"
#include "platform/preferences/FirstRunTree.h"
#include "platform/values/PropertyListXML.h"

namespace platform::preferences {
namespace {

struct Remembered {
    std::string path;
    Snapshot snapshot;
};

// One is enough: a process works on one store.
Remembered& remembered() {
    static Remembered last;
    return last;
}

}  // namespace

Outcome load(const StoreFile& file, Snapshot& snapshot) {
    snapshot = {};
    std::optional<FileIdentity> now;
    RETURN_IF_FAILED(file.look(now));
    if (!now) {
        snapshot.tree = makeFirstRunTree();
        return {};
    }
    const Remembered& last = remembered();
    if (last.path == file.path() && last.snapshot.isOf(now)) {
        snapshot = last.snapshot;
        return {};
    }
    std::string content;
    KnownFile known;
    RETURN_IF_FAILED(file.read(content, known));
    RETURN_IF_FAILED(values::parseDictionaryFile(file.path(), content, snapshot.tree));
    file.keepPrivate(known);
    snapshot.file = std::move(known);
    remember(file, snapshot);
    return {};
}

void remember(const StoreFile& file, const Snapshot& snapshot) {
    remembered() = {file.path(), snapshot};
}

Outcome loadCommittedTree(values::Owned<CFDictionaryRef>& tree) {
    Snapshot snapshot;
    Outcome done = load(StoreFile(currentHost().preferencesDirectory), snapshot);
    tree = std::move(snapshot.tree);
    return done;
}

}  // namespace platform::preferences
