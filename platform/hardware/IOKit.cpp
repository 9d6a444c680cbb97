#include "platform/IOKit.h"

#include <map>
#include <string_view>
#include <utility>
#include <variant>

#include "platform/base/Host.h"
#include "platform/hardware/Entry.h"
#include "platform/values/Values.h"

namespace platform::hardware {
namespace {

using values::Owned;

// The handle through which the registry is asked.
struct Master {};

struct Iterator {
    std::vector<EntryRef> entries;
    std::size_t next = 0;
};

// What a handle is one of.
using Object = std::variant<Master, Iterator, EntryRef>;

std::map<io_object_t, Object>& handles() {
    static std::map<io_object_t, Object> ofThisProcess;
    return ofThisProcess;
}

// A number is not given out again, so that a handle that was given back is found out; once all were given
// out, the next free one is.
io_object_t addHandle(Object object) {
    static io_object_t last = IO_OBJECT_NULL;
    do {
        ++last;
    } while (last == IO_OBJECT_NULL || handles().count(last) != 0);
    handles().emplace(last, std::move(object));
    return last;
}

// Null when the handle is not one, or not of that kind.
template <class Kind>
Kind* find(io_object_t handle) {
    const auto found = handles().find(handle);
    return found == handles().end() ? nullptr : std::get_if<Kind>(&found->second);
}

const Entry* findEntry(io_object_t handle) {
    const EntryRef* entry = find<EntryRef>(handle);
    return entry == nullptr ? nullptr : entry->get();
}

std::string_view wantedClass(CFDictionaryRef matching) {
    const auto name = values::as<CFStringRef>(CFDictionaryGetValue(matching, CFSTR("IOProviderClass")));
    return name == nullptr ? std::string_view() : values::textOf(name);
}

// The class was matched by the scan; what else the dictionary holds must be among the entry's properties.
bool matches(const Entry& entry, CFDictionaryRef matching) {
    for (const auto& [key, value] : values::entriesOf(matching)) {
        if (CFEqual(key, CFSTR("IOProviderClass"))) {
            continue;
        }
        const CFTypeRef property = CFDictionaryGetValue(entry.properties.get(), key);
        if (property == nullptr || !CFEqual(property, value)) {
            return false;
        }
    }
    return true;
}

// Nothing when the hardware cannot be listed whole.
std::optional<std::vector<EntryRef>> matchingEntries(CFDictionaryRef matching) {
    const std::string& root = currentHost().sysfsRoot;
    const std::string_view className = wantedClass(matching);
    std::optional<std::vector<EntryRef>> entries{std::in_place};
    if (className == ethernetClass) {
        entries = scanEthernet(root);
    } else if (className == serialClass) {
        entries = scanSerial(root);
    }
    if (entries) {
        std::erase_if(*entries, [matching](const EntryRef& entry) { return !matches(*entry, matching); });
    }
    return entries;
}

}  // namespace
}  // namespace platform::hardware

using namespace platform::hardware;
using platform::values::Owned;

kern_return_t IOMasterPort(mach_port_t /*bootstrapPort*/, mach_port_t* masterPort) noexcept {
    if (masterPort == nullptr) {
        return kIOReturnBadArgument;
    }
    *masterPort = addHandle(Master{});
    return KERN_SUCCESS;
}

CFMutableDictionaryRef IOServiceMatching(const char* className) noexcept {
    const auto name = platform::values::makeString(className != nullptr ? className : "");
    if (className == nullptr || !name) {
        return nullptr;
    }
    auto* matching = CFDictionaryCreateMutable(kCFAllocatorDefault, 0, &kCFTypeDictionaryKeyCallBacks,
                                               &kCFTypeDictionaryValueCallBacks);
    CFDictionarySetValue(matching, CFSTR("IOProviderClass"), name.get());
    return matching;
}

kern_return_t IOServiceGetMatchingServices(mach_port_t masterPort, CFDictionaryRef matching,
                                           io_iterator_t* iterator) noexcept {
    const auto consumed = Owned<CFDictionaryRef>::adopt(matching);
    if (matching == nullptr || iterator == nullptr || find<Master>(masterPort) == nullptr) {
        return kIOReturnBadArgument;
    }
    auto entries = matchingEntries(matching);
    if (!entries) {
        return kIOReturnError;
    }
    *iterator = addHandle(Iterator{std::move(*entries)});
    return KERN_SUCCESS;
}

io_object_t IOIteratorNext(io_iterator_t iterator) noexcept {
    Iterator* position = find<Iterator>(iterator);
    if (position == nullptr || position->next == position->entries.size()) {
        return IO_OBJECT_NULL;
    }
    return addHandle(position->entries[position->next++]);
}

CFTypeRef IORegistryEntryCreateCFProperty(io_registry_entry_t entry, CFStringRef key,
                                          CFAllocatorRef /*allocator*/, IOOptionBits /*options*/) noexcept {
    const Entry* found = findEntry(entry);
    if (found == nullptr || key == nullptr) {
        return nullptr;
    }
    return Owned<CFTypeRef>::retained(CFDictionaryGetValue(found->properties.get(), key)).take();
}

kern_return_t IORegistryEntryCreateCFProperties(io_registry_entry_t entry, CFMutableDictionaryRef* properties,
                                                CFAllocatorRef allocator, IOOptionBits /*options*/) noexcept {
    if (properties == nullptr) {
        return kIOReturnBadArgument;
    }
    *properties = nullptr;
    const Entry* found = findEntry(entry);
    if (found == nullptr) {
        return kIOReturnBadArgument;
    }
    *properties = CFDictionaryCreateMutableCopy(allocator, 0, found->properties.get());
    return KERN_SUCCESS;
}

kern_return_t IORegistryEntryGetParentEntry(io_registry_entry_t entry, const char* plane,
                                            io_registry_entry_t* parent) noexcept {
    if (parent == nullptr) {
        return kIOReturnBadArgument;
    }
    *parent = IO_OBJECT_NULL;
    const Entry* found = findEntry(entry);
    if (found == nullptr || plane == nullptr || std::string_view(plane) != kIOServicePlane) {
        return kIOReturnBadArgument;
    }
    if (!found->parent) {
        return kIOReturnNoDevice;
    }
    *parent = addHandle(found->parent);
    return KERN_SUCCESS;
}

Boolean IOObjectConformsTo(io_object_t object, const char* className) noexcept {
    const Entry* found = findEntry(object);
    return found != nullptr && className != nullptr && !found->className.empty() &&
           found->className == className;
}

kern_return_t IOObjectRelease(io_object_t object) noexcept {
    return handles().erase(object) != 0 ? KERN_SUCCESS : kIOReturnBadArgument;
}
