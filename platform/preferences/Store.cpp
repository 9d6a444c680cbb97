#include "platform/preferences/Store.h"

#include <string>
#include <utility>

#include "platform/base/Host.h"
#include "platform/preferences/FirstRunTree.h"
#include "platform/values/PropertyListXML.h"
#include "platform/values/Values.h"

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

Outcome parse(const std::string& path, const std::string& content, values::Owned<CFDictionaryRef>& tree) {
    values::ParseError error;
    values::Owned<CFPropertyListRef> value = values::parsePropertyListXML(content, error);
    if (!value) {
        return {kSCStatusFailed, path + ", line " + std::to_string(error.line) + ", column " +
                                     std::to_string(error.column) + ": " + error.reason};
    }
    tree = values::Owned<CFDictionaryRef>::retained(values::as<CFDictionaryRef>(value.get()));
    return tree ? Outcome() : Outcome(kSCStatusFailed, path + " holds no dictionary");
}

}  // namespace

Outcome load(const StoreFile& file, Snapshot& snapshot) {
    snapshot = {};
    std::optional<FileIdentity> now;
    Outcome done = file.look(now);
    if (!done.ok()) {
        return done;
    }
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
    done = file.read(content, known);
    if (done.ok()) {
        done = parse(file.path(), content, snapshot.tree);
    }
    if (done.ok()) {
        file.keepPrivate(known);
        snapshot.file = std::move(known);
        remember(file, snapshot);
    }
    return done;
}

void remember(const StoreFile& file, const Snapshot& snapshot) {
    remembered() = {file.path(), snapshot};
}

Outcome loadCommittedTree(values::Owned<CFDictionaryRef>& tree) {
    Snapshot snapshot;
    Outcome done = load(StoreFile(currentHost().preferencesDirectory, systemFileOperations()), snapshot);
    tree = std::move(snapshot.tree);
    return done;
}

}  // namespace platform::preferences
