// Values that nobody can change, deep copies, and trees edited in place.
#include <algorithm>
#include <concepts>
#include <vector>

#include "platform/values/Containers.h"
#include "platform/values/PropertyListXML.h"
#include "platform/values/Scalars.h"

namespace platform::values {

namespace {

enum class Copying { frozen, allMutable };

Owned<CFTypeRef> copyDeep(CFTypeRef value, Copying how, int depth);

Owned<CFTypeRef> copyOf(const OpaqueCFString& string, Copying how, int) {
    return Owned<CFTypeRef>::adopt(how == Copying::frozen ? CFStringCreateCopy(nullptr, &string)
                                                          : CFStringCreateMutableCopy(nullptr, 0, &string));
}

template <class Handle>
requires std::derived_from<Handle, Container> Owned<CFTypeRef> copyOf(const Handle& container, Copying how,
                                                                      int depth) {
    if (depth >= deepestPropertyList || !container.retainsValues()) {
        return {};
    }
    const std::span<const CFTypeRef> from = container.slots();
    std::vector<Owned<CFTypeRef>> copies(from.size());
    bool isFrozen = how == Copying::frozen && !container.isMutable();
    for (std::size_t i = 0; i < from.size(); ++i) {
        if (std::same_as<Handle, OpaqueCFDictionary> && i % 2 == 0) {
            copies[i] = Owned<CFTypeRef>::retained(as<CFStringRef>(from[i]));
        } else {
            copies[i] = copyDeep(from[i], how, depth + 1);
        }
        if (!copies[i]) {
            return {};
        }
        isFrozen = isFrozen && copies[i].get() == from[i];
    }
    return isFrozen ? Owned<CFTypeRef>::retained(&container)
                    : Owned<CFTypeRef>::adopt(new Handle(how == Copying::allMutable, copies));
}

// The rest cannot be changed; of what is no property-list value there is no copy.
Owned<CFTypeRef> copyOf(const Object& value, Copying, int) {
    return value.type() <= Type::date ? Owned<CFTypeRef>::retained(&value) : Owned<CFTypeRef>();
}

Owned<CFTypeRef> copyDeep(CFTypeRef value, Copying how, int depth) {
    // NOLINTNEXTLINE(clang-analyzer-cplusplus.NewDeleteLeaks): it is owned
    return visit(value, [&](const auto& each) { return copyOf(each, how, depth); });
}

// The dictionary at the path, owned by nobody but its parent, and so on up to the root: what is shared with
// somebody else is replaced by a copy of its own, one level deep. Missing dictionaries are made.
OpaqueCFDictionary& uniquelyOwned(Owned<CFDictionaryRef>& root, std::span<const Owned<CFStringRef>> path) {
    const auto isUnique = [](CFDictionaryRef dictionary) {
        return dictionary->retainCount() == 1 && !dictionary->isMutable();
    };
    if (!isUnique(root.get())) {
        root = Owned<CFDictionaryRef>::adopt(new OpaqueCFDictionary(false, *root.get()));
    }
    // Nobody else can see it: the root is this owner's alone, and so is each child in turn.
    auto* dictionary = const_cast<OpaqueCFDictionary*>(root.get());
    for (const Owned<CFStringRef>& key : path) {
        auto child = valueIn<CFDictionaryRef>(dictionary, key.get());
        if (child == nullptr || !isUnique(child)) {
            child = child == nullptr ? new OpaqueCFDictionary(false, true)
                                     : new OpaqueCFDictionary(false, *child);
            dictionary->set(key.get(), Owned<CFDictionaryRef>::adopt(child).get(), true);
        }
        dictionary = const_cast<OpaqueCFDictionary*>(child);
    }
    return *dictionary;
}

}  // namespace

Owned<CFPropertyListRef> frozen(CFPropertyListRef value, std::size_t containersAbove) {
    return copyDeep(value, Copying::frozen, static_cast<int>(std::min<std::size_t>(containersAbove, 1000)));
}

void setAtPath(Owned<CFDictionaryRef>& root, std::span<const Owned<CFStringRef>> path, CFTypeRef value) {
    uniquelyOwned(root, path.first(path.size() - 1)).set(path.back().get(), value, true);
}

void removeAtPath(Owned<CFDictionaryRef>& root, std::span<const Owned<CFStringRef>> path) {
    uniquelyOwned(root, path.first(path.size() - 1)).remove(path.back().get());
}

}  // namespace platform::values

using namespace platform::values;

CFPropertyListRef CFPropertyListCreateDeepCopy(CFAllocatorRef, CFPropertyListRef value,
                                               CFPropertyListMutabilityOptions options) noexcept {
    return copyDeep(value, options == kCFPropertyListImmutable ? Copying::frozen : Copying::allMutable, 0)
        .take();
}
