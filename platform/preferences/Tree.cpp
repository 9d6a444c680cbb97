#include "platform/preferences/Tree.h"

#include <optional>
#include <utility>
#include <vector>

#include "platform/SystemConfiguration.h"
#include "platform/values/PropertyListXML.h"
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
int follow(CFDictionaryRef root, const Keys& keys, CFPropertyListRef& value) {
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

// Whether a tree that holds the value under so many dictionaries is one that can be written.
bool fitsBelow(std::size_t dictionaries, CFPropertyListRef frozen) {
    return dictionaries + static_cast<std::size_t>(values::levelsOf(frozen)) <= values::deepestPropertyList;
}

values::Owned<CFPropertyListRef> makeEmptyDictionary() {
    return values::Owned<CFPropertyListRef>::adopt(CFDictionaryCreate(kCFAllocatorDefault, nullptr, nullptr,
                                                                      0, &kCFTypeDictionaryKeyCallBacks,
                                                                      &kCFTypeDictionaryValueCallBacks));
}

}  // namespace

Tree::Tree(values::Owned<CFDictionaryRef> root) : root_(std::move(root)) {}

int Tree::find(std::string_view path, CFPropertyListRef& value) const {
    value = nullptr;
    const std::optional<Keys> keys = keysOf(path);
    return keys ? follow(root_.get(), *keys, value) : kSCStatusInvalidArgument;
}

int Tree::set(std::string_view path, const values::Owned<CFPropertyListRef>& value) {
    std::optional<Keys> keys = keysOf(path);
    if (!keys) {
        return kSCStatusInvalidArgument;
    }
    if (keys->empty()) {
        const auto dictionary = values::as<CFDictionaryRef>(value.get());
        if (dictionary == nullptr) {
            return kSCStatusInvalidArgument;
        }
        root_ = values::Owned<CFDictionaryRef>::retained(dictionary);
        return kSCStatusOK;
    }
    if (!fitsBelow(keys->size(), value.get())) {
        return kSCStatusInvalidArgument;
    }
    CFPropertyListRef present = nullptr;
    if (follow(root_.get(), *keys, present) == kSCStatusFailed) {
        return kSCStatusFailed;
    }
    const values::Owned<CFStringRef> last = std::move(keys->back());
    keys->pop_back();
    values::claim(root_);
    CFDictionaryRef dictionary = root_.get();
    for (const auto& key : *keys) {
        CFDictionaryRef child = values::claimedChild(dictionary, key.get());
        if (child == nullptr) {
            values::setClaimed(dictionary, key.get(), values::frozen(makeEmptyDictionary().get()));
            child = values::claimedChild(dictionary, key.get());
        }
        dictionary = child;
    }
    values::setClaimed(dictionary, last.get(), value);
    return kSCStatusOK;
}

int Tree::remove(std::string_view path) {
    std::optional<Keys> keys = keysOf(path);
    if (!keys || keys->empty()) {
        return kSCStatusInvalidArgument;
    }
    CFPropertyListRef present = nullptr;
    const int status = follow(root_.get(), *keys, present);
    if (status != kSCStatusOK) {
        return status;
    }
    const values::Owned<CFStringRef> last = std::move(keys->back());
    keys->pop_back();
    values::claim(root_);
    CFDictionaryRef dictionary = root_.get();
    for (const auto& key : *keys) {
        dictionary = values::claimedChild(dictionary, key.get());
    }
    values::removeClaimed(dictionary, last.get());
    return kSCStatusOK;
}

CFPropertyListRef Tree::topValue(CFStringRef key) const {
    return CFDictionaryGetValue(root_.get(), key);
}

int Tree::setTopValue(CFStringRef key, const values::Owned<CFPropertyListRef>& value) {
    if (!fitsBelow(1, value.get())) {
        return kSCStatusInvalidArgument;
    }
    values::claim(root_);
    values::setClaimed(root_.get(), key, value);
    return kSCStatusOK;
}

}  // namespace platform::preferences
