#include "platform/preferences/Session.h"

#include <optional>
#include <utility>

#include "platform/base/Host.h"
#include "platform/values/PropertyListXML.h"

namespace platform::preferences {

Session::Session(std::string name, StoreFile file, Snapshot read)
    : Object(values::Type::preferences),
      name_(std::move(name)),
      file_(std::move(file)),
      onDisk_(std::move(read)),
      tree_(onDisk_.tree) {}

Outcome Session::open(std::string name, values::Owned<SCPreferencesRef>& session) {
    StoreFile file(currentHost().preferencesDirectory);
    Snapshot snapshot;
    RETURN_IF_FAILED(load(file, snapshot));
    Object* const object = new Session(std::move(name), std::move(file), std::move(snapshot));
    session =
        values::Owned<SCPreferencesRef>::adopt(static_cast<SCPreferencesRef>(static_cast<void*>(object)));
    return {};
}

Session* Session::from(SCPreferencesRef reference) noexcept {
    auto* const object = static_cast<Object*>(static_cast<void*>(reference));
    return object != nullptr && object->type() == values::Type::preferences ? static_cast<Session*>(object)
                                                                            : nullptr;
}

Outcome Session::checkFresh() const {
    std::optional<FileIdentity> now;
    Outcome looked = file_.look(now);
    if (looked.ok() && !onDisk_.isOf(now)) {
        return {kSCStatusStale, file_.path() + " was changed by another process"};
    }
    return looked;
}

bool Session::isChanged() const {
    // Most sessions only read, and then the two are one object. What was changed and changed back is no
    // change either.
    return tree_.root().get() != onDisk_.tree.get() && CFEqual(tree_.root().get(), onDisk_.tree.get()) == 0;
}

Outcome Session::lock(std::chrono::milliseconds wait) {
    if (lock_.isOpen()) {
        return {};
    }
    FileDescriptor lock;
    RETURN_IF_FAILED(file_.lock(wait, lock));
    // Behind the lock: whoever held it until now may have committed.
    RETURN_IF_FAILED(checkFresh());
    lock_ = std::move(lock);
    return {};
}

Outcome Session::unlock() {
    if (!lock_.isOpen()) {
        return {kSCStatusNeedLock, "the lock is not held"};
    }
    lock_.reset();
    return {};
}

Outcome Session::write() {
    const std::optional<std::string> content = values::writePropertyListXML(tree_.root().get());
    if (!content) {
        return {kSCStatusFailed, "the tree holds a value that an XML property list cannot carry"};
    }
    // Or no session could read it again.
    if (content->size() > largestPreferencesFile) {
        return {kSCStatusFailed, "the tree is larger than a preferences file may be"};
    }
    std::optional<KnownFile> known;
    Outcome done = file_.replace(*content, known);
    if (done.ok()) {
        isUncertain_ = false;
        onDisk_ = {tree_.root(), std::move(known)};
        remember(onDisk_);
    } else if (known) {
        // In its place, but perhaps not durable: the next commit is not stale, and writes once more, also
        // when its tree is the one of before.
        isUncertain_ = true;
        onDisk_.file = std::move(known);
    }
    return done;
}

Outcome Session::commit(std::chrono::milliseconds wait) {
    values::Owned<CFDictionaryRef> replaced = replaced_ ? replaced_ : onDisk_.tree;
    RETURN_IF_FAILED(makeDurable(wait));
    replaced_ = std::move(replaced);
    return {};
}

Outcome Session::makeDurable(std::chrono::milliseconds wait) {
    // Without a file the first-run tree is written as it is: from then on there is one.
    if (onDisk_.file && !isUncertain_ && !isChanged()) {
        return checkFresh();
    }
    const bool held = lock_.isOpen();
    Outcome done = held ? checkFresh() : lock(wait);
    if (done.ok()) {
        done = write();
    }
    if (!held) {
        lock_.reset();
    }
    return done;
}

}  // namespace platform::preferences
