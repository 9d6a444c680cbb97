// The preferences tree in memory, addressed by paths.
//
// A path is a slash and keys with slashes between them, "/Sets/0/Network"; "/" alone is the root. A key is
// never empty. Links are not followed. The tree shares structure with what it was made from and with what it
// handed out: nothing that somebody else holds ever changes, and what nobody else holds is changed in place.
#pragma once

#include <span>
#include <string_view>

#include "platform/CoreFoundation.h"
#include "platform/values/Object.h"

namespace platform::preferences {

// Every status is 0, 1002 for a malformed path or a tree that would be nested too deep to be written, 1004
// for nothing there, or 1001 for something on the way that is no dictionary. A failed call changes nothing.
class Tree {
  public:
    Tree() = default;
    // The root must be frozen.
    explicit Tree(values::Owned<CFDictionaryRef> root);

    [[nodiscard]] const values::Owned<CFDictionaryRef>& root() const noexcept { return root_; }

    // The value at the path, of whatever type, borrowed until the tree changes at the path or above; null on
    // failure.
    [[nodiscard]] int find(std::string_view path, CFPropertyListRef& value) const;
    // Stores the value as it is now, making dictionaries that are missing on the way. 1002 for a value that
    // is no property list, or would make the tree too deep to be written; only a dictionary can be the root.
    [[nodiscard]] int set(std::string_view path, CFPropertyListRef value);
    // The root itself cannot be removed (1002).
    [[nodiscard]] int remove(std::string_view path);

    // The same for one key of the root, which may hold a slash or be empty.
    [[nodiscard]] CFPropertyListRef topValue(CFStringRef key) const;
    [[nodiscard]] int setTopValue(CFStringRef key, CFPropertyListRef value);

  private:
    [[nodiscard]] int set(std::span<const values::Owned<CFStringRef>> keys, CFPropertyListRef value);

    values::Owned<CFDictionaryRef> root_;
};

}  // namespace platform::preferences
