#include "platform/preferences/Tree.h"

#include <optional>
#include <utility>
#include <vector>

#include "platform/SystemConfiguration.h"
#include "platform/values/Values.h"

namespace platform::preferences {
namespace {

using Keys = std::vector<values::Owned<CFStringRef>>;

std::optional<Keys> keysOf(std::string_view path) {
    if (path.empty() || path.front() != '/') {
        return std::nullopt;
    }
    Keys keys;
    for (std::string_view rest = path.substr(1); path.size() > 1;) {
        const std::size_t slash = rest.find('/');
        const std::string_view key = rest.substr(0, slash);
        if (key.empty()) {
            return std::nullopt;
        }
        values::Owned<CFStringRef> string = values::makeString(key);
        if (!string) {
            return std::nullopt;
        }
        keys.push_back(std::move(string));
        if (slash == std::string_view::npos) {
            break;
        }
        rest.remove_prefix(slash + 1);
    }
    return keys;
}

// Follows the keys as far as they lead. value is what was reached, null when the next key is missing.
int follow(CFDictionaryRef root, std::span<const values::Owned<CFStringRef>> keys, CFPropertyListRef& value) {
    value = root;
    for (const auto& key : keys) {
        const auto dictionary = values::as<CFDictionaryRef>(value);
        if (dictionary == nullptr) {
            value = nullptr;
            return kSCStatusFailed;
        }
        value = CFDictionaryGetValue(dictionary, key.get());
        if (value == nullptr) {
            return kSCStatusNoKey;
        }
    }
    return kSCStatusOK;
}

}  // namespace

Tree::Tree(values::Owned<CFDictionaryRef> root) : root_(std::move(root)) {}

int Tree::find(std::string_view path, CFPropertyListRef& value) const {
    value = nullptr;
    const std::optional<Keys> keys = keysOf(path);
    return keys ? follow(root_.get(), *keys, value) : kSCStatusInvalidArgument;
}

int Tree::set(std::string_view path, CFPropertyListRef value) {
    const std::optional<Keys> keys = keysOf(path);
    if (!keys) {
        return kSCStatusInvalidArgument;
    }
    return set(*keys, value);
}

int Tree::set(std::span<const values::Owned<CFStringRef>> keys, CFPropertyListRef value) {
    // Deeper than a file may be is refused here, where the caller still knows what it is about.
    values::Owned<CFPropertyListRef> frozen = values::frozen(value, keys.size());
    const auto dictionary = values::as<CFDictionaryRef>(frozen.get());
    if (!frozen || (keys.empty() && dictionary == nullptr)) {
        return kSCStatusInvalidArgument;
    }
    // What is missing on the way is made; what is no dictionary is not written over.
    CFPropertyListRef present = nullptr;
    if (follow(root_.get(), keys, present) == kSCStatusFailed) {
        return kSCStatusFailed;
    }
    if (keys.empty()) {
        root_ = values::Owned<CFDictionaryRef>::retained(dictionary);
    } else {
        values::setAtPath(root_, keys, frozen.get());
    }
    return kSCStatusOK;
}

int Tree::remove(std::string_view path) {
    const std::optional<Keys> keys = keysOf(path);
    if (!keys || keys->empty()) {
        return kSCStatusInvalidArgument;
    }
    CFPropertyListRef present = nullptr;
    const int status = follow(root_.get(), *keys, present);
    if (status == kSCStatusOK) {
        values::removeAtPath(root_, *keys);
    }
    return status;
}

CFPropertyListRef Tree::topValue(CFStringRef key) const {
    return CFDictionaryGetValue(root_.get(), key);
}

int Tree::setTopValue(CFStringRef key, CFPropertyListRef value) {
    const auto ownKey = values::Owned<CFStringRef>::adopt(CFStringCreateCopy(nullptr, key));
    return set(std::span(&ownKey, 1), value);
}

}  // namespace platform::preferences
