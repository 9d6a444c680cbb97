// One session on the store: a tree that was read once, and its way back to the disk.
#pragma once

#include <chrono>
#include <string>
#include <utility>

#include "platform/SystemConfiguration.h"
#include "platform/base/FileDescriptor.h"
#include "platform/base/Outcome.h"
#include "platform/preferences/Store.h"
#include "platform/preferences/StoreFile.h"
#include "platform/preferences/Tree.h"
#include "platform/values/Object.h"

namespace platform::preferences {

// How long a commit waits for another process to finish its own, and how long a client that asked for the
// lock waits.
inline constexpr std::chrono::seconds commitWait{10};
inline constexpr std::chrono::seconds lockWait{30};

class Session final : public values::Object {
  public:
    // The host's store as it is now.
    static Outcome open(std::string name, values::Owned<SCPreferencesRef>& session);
    // Null when the reference is null or no session.
    [[nodiscard]] static Session* from(SCPreferencesRef reference) noexcept;

    // The client's name.
    [[nodiscard]] const std::string& name() const noexcept { return name_; }
    [[nodiscard]] Tree& tree() noexcept { return tree_; }

    // Holding it already is success. 3002 when another process or session keeps it for the whole wait, 3005
    // when the file is no longer the one that was read; the lock is not held then.
    Outcome lock(std::chrono::milliseconds wait);
    // 1007 when the lock is not held.
    Outcome unlock();
    // Writes the tree unless it equals what the file holds. On failure the tree stays as it is, and unless
    // the reason is that the new file could not be made durable, so does the file.
    Outcome commit(std::chrono::milliseconds wait = commitWait);
    // The tree that the commits of this session took the place of, since it was last asked for: the same as
    // the committed one when they changed nothing, null when there was none.
    [[nodiscard]] values::Owned<CFDictionaryRef> takeReplaced() noexcept { return std::move(replaced_); }

  private:
    Session(std::string name, StoreFile file, Snapshot read);

    [[nodiscard]] bool isChanged() const;
    Outcome checkFresh() const;
    Outcome makeDurable(std::chrono::milliseconds wait);
    Outcome write();

    std::string name_;
    StoreFile file_;
    Snapshot onDisk_;
    bool isUncertain_ = false;  // whether the file holds that tree
    values::Owned<CFDictionaryRef> replaced_;
    Tree tree_;
    FileDescriptor lock_;
};

}  // namespace platform::preferences
