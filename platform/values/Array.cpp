#include <algorithm>
#include <vector>

#include "platform/values/Containers.h"
#include "platform/values/Scalars.h"

using namespace platform::values;

struct CFArrayCallBacks {};

const CFArrayCallBacks kCFTypeArrayCallBacks{};

namespace {

std::span<const CFTypeRef> itemsIn(CFArrayRef array, CFRange range) {
    return itemsOf(array).subspan(static_cast<std::size_t>(range.location),
                                  static_cast<std::size_t>(range.length));
}

}  // namespace

OpaqueCFArray::OpaqueCFArray(bool isMutable, std::span<Owned<CFTypeRef>> items)
    : OpaqueCFArray(isMutable, true) {
    items_.reserve(items.size());
    for (Owned<CFTypeRef>& item : items) {
        items_.push_back(item.take());
    }
}

OpaqueCFArray::OpaqueCFArray(bool isMutable, const OpaqueCFArray& other)
    : OpaqueCFArray(isMutable, other.retainsValues()) {
    items_.reserve(other.count());
    std::ranges::for_each(other.items_, [this](CFTypeRef item) { append(item); });
}

OpaqueCFArray::~OpaqueCFArray() {
    if (retainsValues()) {
        releaseAll(items_);
    }
}

void OpaqueCFArray::remove(std::size_t position) {
    const auto place = items_.begin() + static_cast<std::ptrdiff_t>(position);
    releaseValue(*place);
    items_.erase(place);
}

void OpaqueCFArray::reorder(std::span<const CFTypeRef> items, std::size_t position) noexcept {
    std::ranges::copy(items, items_.begin() + static_cast<std::ptrdiff_t>(position));
}

std::span<const CFTypeRef> platform::values::itemsOf(CFArrayRef array) noexcept {
    return array->slots();
}

CFTypeID CFArrayGetTypeID() noexcept {
    return static_cast<CFTypeID>(Type::array);
}

CFArrayRef CFArrayCreate(CFAllocatorRef, const void** values, CFIndex count,
                         const CFArrayCallBacks* callBacks) noexcept {
    auto* const array = new OpaqueCFArray(false, callBacks != nullptr);
    for (CFIndex i = 0; i < count; ++i) {
        array->append(values[i]);
    }
    return array;
}

CFMutableArrayRef CFArrayCreateMutable(CFAllocatorRef, CFIndex, const CFArrayCallBacks* callBacks) noexcept {
    return new OpaqueCFArray(true, callBacks != nullptr);
}

CFMutableArrayRef CFArrayCreateMutableCopy(CFAllocatorRef, CFIndex, CFArrayRef array) noexcept {
    return new OpaqueCFArray(true, *array);
}

CFIndex CFArrayGetCount(CFArrayRef array) noexcept {
    return static_cast<CFIndex>(array->count());
}

const void* CFArrayGetValueAtIndex(CFArrayRef array, CFIndex index) noexcept {
    return itemsOf(array)[static_cast<std::size_t>(index)];
}

void CFArrayGetValues(CFArrayRef array, CFRange range, const void** values) noexcept {
    std::ranges::copy(itemsIn(array, range), values);
}

CFIndex CFArrayGetFirstIndexOfValue(CFArrayRef array, CFRange range, const void* value) noexcept {
    const std::span<const CFTypeRef> items = itemsIn(array, range);
    const auto found = std::ranges::find_if(items, [&](CFTypeRef item) { return equalValues(item, value); });
    return found == items.end() ? kCFNotFound : range.location + (found - items.begin());
}

void CFArrayAppendValue(CFMutableArrayRef array, const void* value) noexcept {
    if (array->mayChange()) {
        array->append(value);
    }
}

void CFArrayRemoveValueAtIndex(CFMutableArrayRef array, CFIndex index) noexcept {
    if (array->mayChange() && index >= 0 && index < CFArrayGetCount(array)) {
        array->remove(static_cast<std::size_t>(index));
    }
}

void CFArraySortValues(CFMutableArrayRef array, CFRange range, CFComparatorFunction comparator,
                       void* context) noexcept {
    if (!array->mayChange() || range.length < 2) {
        return;
    }
    // The comparator never sees the array half sorted.
    const std::span<const CFTypeRef> items = itemsIn(array, range);
    std::vector<CFTypeRef> sorted(items.begin(), items.end());
    std::ranges::stable_sort(sorted, [&](CFTypeRef lhs, CFTypeRef rhs) {
        return comparator(lhs, rhs, context) == kCFCompareLessThan;
    });
    array->reorder(sorted, static_cast<std::size_t>(range.location));
}

CFIndex CFArrayBSearchValues(CFArrayRef array, CFRange range, const void* value,
                             CFComparatorFunction comparator, void* context) noexcept {
    const std::span<const CFTypeRef> items = itemsIn(array, range);
    const auto found = std::ranges::lower_bound(items, value, [&](CFTypeRef lhs, CFTypeRef rhs) {
        return comparator(lhs, rhs, context) == kCFCompareLessThan;
    });
    return range.location + (found - items.begin());
}
