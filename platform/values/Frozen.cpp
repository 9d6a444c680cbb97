// Values that nobody can change, deep copies, and trees edited in place.
#include <algorithm>
#include <cassert>
#include <vector>

#include "platform/values/Containers.h"
#include "platform/values/PropertyListXML.h"
#include "platform/values/Scalars.h"

namespace platform::values {

namespace {

enum class Copying { frozen, allMutable };

Owned<CFTypeRef> copyDeep(CFTypeRef value, Copying how, int depth);

// References to copies of a container's items, until a storage has its own.
class Slots {
  public:
    explicit Slots(std::size_t count) { slots_.reserve(count); }
    ~Slots() {
        for (const CFTypeRef slot : slots_) {
            CFRelease(slot);
        }
    }
    Slots(const Slots&) = delete;
    Slots& operator=(const Slots&) = delete;

    void add(Owned<CFTypeRef> value) { slots_.push_back(value.take()); }
    [[nodiscard]] std::span<const CFTypeRef> get() const { return slots_; }

  private:
    std::vector<CFTypeRef> slots_;
};

bool isKey(CFTypeRef value) {
    return as<CFStringRef>(value) != nullptr;
}

template <class Handle>
Owned<CFTypeRef> copyContainer(const Handle& container, Storage::Shape shape, Copying how, int depth) {
    const bool isMutable = how == Copying::allMutable;
    if (depth >= deepestPropertyList || !container.retainsValues()) {
        return {};
    }
    if (container.count() == 0) {
        return Owned<CFTypeRef>::adopt(new Handle(isMutable, true, nullptr));
    }
    const bool isDictionary = shape == Storage::Shape::dictionary;
    std::span<const CFTypeRef> from = container.storage()->items();
    if (isDictionary) {
        const std::span<const Entry> entries = container.storage()->entries();
        from = {&entries.front().key, entries.size() * 2};
    }
    Slots copies(from.size());
    int levels = 0;
    bool isSame = true;
    for (std::size_t i = 0; i < from.size(); ++i) {
        if (isDictionary && i % 2 == 0) {
            if (!isKey(from[i])) {
                return {};
            }
            copies.add(Owned<CFTypeRef>::retained(from[i]));
            continue;
        }
        Owned<CFTypeRef> copy = copyDeep(from[i], how, depth + 1);
        if (!copy) {
            return {};
        }
        isSame = isSame && copy.get() == from[i];
        levels = std::max(levels, knownFrozenLevels(copy.get()));
        copies.add(std::move(copy));
    }
    if (isMutable) {
        return Owned<CFTypeRef>::adopt(new Handle(true, true, Storage::create(shape, copies.get(), 0)));
    }
    const auto frozenLevels = static_cast<std::uint16_t>(levels + 1);
    if (!isSame) {
        return Owned<CFTypeRef>::adopt(
            new Handle(false, true, Storage::create(shape, copies.get(), frozenLevels)));
    }
    container.storage()->setFrozenLevels(frozenLevels);
    if (!container.isMutable()) {
        return Owned<CFTypeRef>::retained(&container);
    }
    return Owned<CFTypeRef>::adopt(shareStorage(container, false));
}

Owned<CFTypeRef> copyDeep(CFTypeRef value, Copying how, int depth) {
    if (how == Copying::frozen) {
        if (const int levels = knownFrozenLevels(value); levels >= 0) {
            return depth + levels <= deepestPropertyList ? Owned<CFTypeRef>::retained(value)
                                                         : Owned<CFTypeRef>();
        }
    }
    switch (static_cast<const Object*>(value)->type()) {
        case Type::string: {
            const auto* const string = static_cast<CFStringRef>(value);
            return Owned<CFTypeRef>::adopt(how == Copying::frozen
                                               ? CFStringCreateCopy(nullptr, string)
                                               : CFStringCreateMutableCopy(nullptr, 0, string));
        }
        case Type::dictionary:
            return copyContainer(*static_cast<CFDictionaryRef>(value), Storage::Shape::dictionary, how,
                                 depth);
        case Type::array:
            return copyContainer(*static_cast<CFArrayRef>(value), Storage::Shape::array, how, depth);
        case Type::number:
        case Type::boolean:
        case Type::data:
        case Type::date:
            return Owned<CFTypeRef>::retained(value);
        case Type::url:
        case Type::runLoop:
        case Type::runLoopSource:
        case Type::preferences:
        case Type::dynamicStore:
            break;
    }
    return {};
}

// The handle behind a claim; whoever has claimed it may write to it.
OpaqueCFDictionary& claimedHandle(CFDictionaryRef dictionary) {
    assert(dictionary->retainCount() == 1 && !dictionary->isMutable());
    return *const_cast<OpaqueCFDictionary*>(dictionary);
}

bool isClaimable(CFDictionaryRef dictionary) {
    return dictionary->retainCount() == 1 && !dictionary->isMutable();
}

}  // namespace

Owned<CFPropertyListRef> frozen(CFPropertyListRef value) {
    return copyDeep(value, Copying::frozen, 0);
}

int levelsOf(CFPropertyListRef frozen) noexcept {
    return knownFrozenLevels(frozen);
}

void claim(Owned<CFDictionaryRef>& root) {
    if (!isClaimable(root.get())) {
        root = Owned<CFDictionaryRef>::adopt(shareStorage(*root.get(), false));
    }
}

CFDictionaryRef claimedChild(CFDictionaryRef parent, CFTypeRef key) {
    OpaqueCFDictionary& handle = claimedHandle(parent);
    CFTypeRef value = nullptr;
    if (!handle.find(key, &value) || as<CFDictionaryRef>(value) == nullptr) {
        return nullptr;
    }
    // Once the parent's entries are its own, the child's count tells whether anybody else holds the child.
    Storage& entries = handle.writable();
    const auto* child = static_cast<CFDictionaryRef>(value);
    if (!isClaimable(child)) {
        const auto own = Owned<CFDictionaryRef>::adopt(shareStorage(*child, false));
        child = own.get();
        entries.replaceValue(entries.find(key), child);
    }
    // What happens to the child from here on, the parent will not hear of.
    entries.setFrozenLevels(0);
    return child;
}

void setClaimed(CFDictionaryRef dictionary, CFStringRef key, const Owned<CFPropertyListRef>& value) {
    assert(knownFrozenLevels(value.get()) >= 0);
    claimedHandle(dictionary).set(key, value.get(), true);
}

void removeClaimed(CFDictionaryRef dictionary, CFTypeRef key) {
    claimedHandle(dictionary).remove(key);
}

}  // namespace platform::values

using namespace platform::values;

CFPropertyListRef CFPropertyListCreateDeepCopy(CFAllocatorRef, CFPropertyListRef value,
                                               CFPropertyListMutabilityOptions options) noexcept {
    return copyDeep(value, options == kCFPropertyListImmutable ? Copying::frozen : Copying::allMutable, 0)
        .take();
}
