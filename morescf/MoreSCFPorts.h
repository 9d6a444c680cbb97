// What the port scan and the port names share.
#pragma once

#include "morecfq/MoreCFQ.h"
#include "platform/CoreFoundation.h"
#include "platform/IOKit.h"

// A required property, or a name, that cannot be had.
constexpr OSStatus kCannotDescribePortErr = -1;

enum : SInt32 {
    kSortInternalModem = 0,
    kSortUSBModem = 1,
    kSortModem = 2,
    kSortInfrared = 3,
    kSortSerial = 4,
    kSortBuiltInEthernet = 5,
    kSortPCIEthernet = 6,
    kSortAirPort = 7,
    kSortWireless = 8,
    kSortEthernet = 9,
    kSortUnknown = 100
};

inline const CFStringRef kSortOrderKey = CFSTR("SortOrder");
inline const CFStringRef kBSDNameKey = CFSTR("BSD Name");
inline const CFStringRef kBaseNameKey = CFSTR("IOTTYBaseName");
inline const CFStringRef kStreamTypeKey = CFSTR("IOSerialBSDClientType");
inline const CFStringRef kModemStreamType = CFSTR("IOModemSerialStream");
inline const CFStringRef kInfraredName = CFSTR("IrDA-IrCOMM");

// The name that the user sees, after the rules, the hook and the keywords; a new reference. It may change the
// port's sort order and hardware, and records in its dictionary the text that each keyword is replaced by.
OSStatus CopyUserVisiblePortName(io_object_t entry, CFMutableDictionaryRef portDict, CFStringRef* name);

// A property of that type, or null.
inline CFTypeRef CopyProperty(io_object_t entry, CFStringRef key, CFTypeID type) {
    CFTypeRef value = IORegistryEntryCreateCFProperty(entry, key, kCFAllocatorDefault, 0);
    const bool isOfType = value != nullptr && CFGetTypeID(value) == type;
    if (!isOfType) {
        CFQRelease(value);
    }
    return isOfType ? value : nullptr;
}

inline CFStringRef CopyStringProperty(io_object_t entry, CFStringRef key) {
    return static_cast<CFStringRef>(CopyProperty(entry, key, CFStringGetTypeID()));
}

// -1 when it is not there.
inline OSStatus CopyRequiredString(io_object_t entry, CFStringRef key, CFStringRef* value) {
    *value = CopyStringProperty(entry, key);
    return *value != nullptr ? 0 : kCannotDescribePortErr;
}

inline OSStatus GetParent(io_object_t entry, io_object_t* parent) {
    return IORegistryEntryGetParentEntry(entry, kIOServicePlane, parent);
}

inline OSStatus CopyProperties(io_object_t entry, CFMutableDictionaryRef* properties) {
    return IORegistryEntryCreateCFProperties(entry, properties, kCFAllocatorDefault, 0);
}

inline void ReleaseEntry(io_object_t entry) {
    if (entry != IO_OBJECT_NULL) {
        IOObjectRelease(entry);
    }
}

inline bool ReadInteger(CFTypeRef value, SInt32* integer) {
    return value != nullptr && CFGetTypeID(value) == CFNumberGetTypeID() &&
           CFNumberGetValue(static_cast<CFNumberRef>(value), kCFNumberSInt32Type, integer);
}
