// Values that nobody can change, deep copies, and trees edited in place.
#include <algorithm>
#include <vector>

#include "platform/values/Containers.h"
#include "platform/values/PropertyListXML.h"
#include "platform/values/Scalars.h"

namespace platform::values {

namespace {

enum class Copying { frozen, allMutable };

Owned<CFTypeRef> copyDeep(CFTypeRef value, Copying how, int depth);

// Its items, for a dictionary key, value, key, value, ...
std::span<const CFTypeRef> slotsOf(const OpaqueCFArray& array) {
    return array.storage().items();
}
std::span<const CFTypeRef> slotsOf(const OpaqueCFDictionary& dictionary) {
    (void)dictionary.storage().entries();
    return dictionary.storage().items();
}

template <class Handle>
Owned<CFTypeRef> copyContainer(const Handle& container, Copying how, int depth) {
    const bool isMutable = how == Copying::allMutable;
    if (depth >= deepestPropertyList || !container.retainsValues()) {
        return {};
    }
    const std::span<const CFTypeRef> from = slotsOf(container);
    std::vector<Owned<CFTypeRef>> copies(from.size());
    bool isSame = !isMutable;
    for (std::size_t i = 0; i < from.size(); ++i) {
        if (Handle::shape == Storage::Shape::dictionary && i % 2 == 0) {
            copies[i] = Owned<CFTypeRef>::retained(as<CFStringRef>(from[i]));
        } else {
            copies[i] = copyDeep(from[i], how, depth + 1);
        }
        if (!copies[i]) {
            return {};
        }
        isSame = isSame && copies[i].get() == from[i];
    }
    if (isSame && !container.isMutable()) {
        return Owned<CFTypeRef>::retained(&container);
    }
    return Owned<CFTypeRef>::adopt(isSame ? shareStorage(container, false)
                                          : new Handle(isMutable, new Storage(Handle::shape, copies)));
}

Owned<CFTypeRef> copyDeep(CFTypeRef value, Copying how, int depth) {
    switch (static_cast<const Object*>(value)->propertyListType()) {
        case PropertyListType::string: {
            const auto* const string = static_cast<CFStringRef>(value);
            return Owned<CFTypeRef>::adopt(how == Copying::frozen
                                               ? CFStringCreateCopy(nullptr, string)
                                               : CFStringCreateMutableCopy(nullptr, 0, string));
        }
        case PropertyListType::dictionary:
            return copyContainer(*static_cast<CFDictionaryRef>(value), how, depth);
        case PropertyListType::array:
            return copyContainer(*static_cast<CFArrayRef>(value), how, depth);
        case PropertyListType::number:
        case PropertyListType::boolean:
        case PropertyListType::data:
        case PropertyListType::date:
            return Owned<CFTypeRef>::retained(value);
        case PropertyListType::none:
            break;
    }
    return {};
}

// The dictionary at the path, owned by nobody but its parent, and so on up to the root: what is shared with
// somebody else is replaced by a handle of its own on the same entries, which are copied when it is written
// to. Missing dictionaries are made.
OpaqueCFDictionary& uniquelyOwned(Owned<CFDictionaryRef>& root, std::span<const Owned<CFStringRef>> path) {
    const auto isUnique = [](CFDictionaryRef dictionary) {
        return dictionary->retainCount() == 1 && !dictionary->isMutable();
    };
    if (!isUnique(root.get())) {
        root = Owned<CFDictionaryRef>::adopt(shareStorage(*root.get(), false));
    }
    // Nobody else can see it: the root is this owner's alone.
    auto* dictionary = const_cast<OpaqueCFDictionary*>(root.get());
    for (const Owned<CFStringRef>& key : path) {
        // Once the parent's entries are its own, the child's count tells whether anybody else holds the
        // child.
        Storage& entries = dictionary->writable();
        const std::size_t position = entries.find(key.get());
        Owned<CFDictionaryRef> own;
        if (position == Storage::absent) {
            own = Owned<CFDictionaryRef>::adopt(makeContainer<OpaqueCFDictionary>(false, true));
            entries.addEntry(key.get(), own.get());
        } else if (const auto child = as<CFDictionaryRef>(entries.valueAt(position)); !isUnique(child)) {
            own = Owned<CFDictionaryRef>::adopt(shareStorage(*child, false));
            entries.replaceValue(position, own.get());
        } else {
            dictionary = const_cast<OpaqueCFDictionary*>(child);
            continue;
        }
        dictionary = const_cast<OpaqueCFDictionary*>(own.get());
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
