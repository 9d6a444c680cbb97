#include "platform/preferences/Store.h"

#include <string>
#include <utility>

#include "platform/base/Host.h"
#include "platform/preferences/FirstRunTree.h"
#include "platform/values/PropertyListXML.h"

namespace platform::preferences {
namespace {

// One is enough: a process works on one store.
Snapshot& remembered() {
    static Snapshot last;
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
    if (remembered().isOf(now)) {
        snapshot = remembered();
        return {};
    }
    std::string content;
    KnownFile known;
    RETURN_IF_FAILED(file.read(content, known));
    RETURN_IF_FAILED(values::parseDictionaryFile(file.path(), content, snapshot.tree));
    file.keepPrivate(known);
    snapshot.file = std::move(known);
    remember(snapshot);
    return {};
}

void remember(const Snapshot& snapshot) {
    remembered() = snapshot;
}

Outcome loadCommittedTree(values::Owned<CFDictionaryRef>& tree) {
    Snapshot snapshot;
    Outcome done = load(StoreFile(currentHost().preferencesDirectory), snapshot);
    tree = std::move(snapshot.tree);
    return done;
}

}  // namespace platform::preferences
