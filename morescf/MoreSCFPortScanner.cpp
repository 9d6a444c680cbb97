#include "morescf/MoreSCFPortScanner.h"

#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCFValues.h"
#include "platform/CoreServices.h"

namespace {

MoreSCFPortNameCallback gPortNameCallback = nullptr;

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

CFStringRef SortOrderKey() {
    return CFSTR("SortOrder");
}
CFStringRef BSDNameKey() {
    return CFSTR("BSD Name");
}
CFStringRef BaseNameKey() {
    return CFSTR("IOTTYBaseName");
}
CFStringRef SlotNameKey() {
    return CFSTR("AAPL,slot-name");
}
CFStringRef ChildIndexKey() {
    return CFSTR("IOChildIndex");
}
CFStringRef InfraredName() {
    return CFSTR("IrDA-IrCOMM");
}
CFStringRef Unknown() {
    return CFSTR("unknown");
}

// Fills the port's dictionary from its registry entry; one that stays empty is no port.
using DeviceToDictProc = OSStatus (*)(void* context, io_object_t entry, CFMutableDictionaryRef portDict);

bool CFEqualString(CFStringRef a, CFStringRef b) {
    if (a == nullptr || b == nullptr) {
        return false;
    }
    return a == b || CFStringCompare(a, b, 0) == kCFCompareEqualTo;
}

// Registry data as text, without the zero bytes at its end.
CFStringRef CreateStringFromData(CFDataRef data) {
    const UInt8* bytes = CFDataGetBytePtr(data);
    CFIndex length = CFDataGetLength(data);
    while (length > 0 && bytes[length - 1] == 0) {
        --length;
    }
    return CFStringCreateWithBytes(kCFAllocatorDefault, bytes, length, kCFStringEncodingMacRoman, false);
}

// A property of that type, or null.
CFTypeRef CopyProperty(io_object_t entry, CFStringRef key, CFTypeID type) {
    CFTypeRef value = IORegistryEntryCreateCFProperty(entry, key, kCFAllocatorDefault, 0);
    if (value != nullptr && CFGetTypeID(value) != type) {
        CFQRelease(value);
        value = nullptr;
    }
    return value;
}

CFStringRef CopyStringProperty(io_object_t entry, CFStringRef key) {
    return static_cast<CFStringRef>(CopyProperty(entry, key, CFStringGetTypeID()));
}

// A data property as text, or null.
CFStringRef CopyDataPropertyAsString(io_object_t entry, CFStringRef key) {
    auto* data = static_cast<CFDataRef>(CopyProperty(entry, key, CFDataGetTypeID()));
    CFStringRef text = data != nullptr ? CreateStringFromData(data) : nullptr;
    CFQRelease(data);
    return text;
}

OSStatus GetParent(io_object_t entry, io_object_t* parent) {
    return IORegistryEntryGetParentEntry(entry, kIOServicePlane, parent);
}

OSStatus CopyProperties(io_object_t entry, CFMutableDictionaryRef* properties) {
    return IORegistryEntryCreateCFProperties(entry, properties, kCFAllocatorDefault, 0);
}

void ReleaseEntry(io_object_t entry) {
    if (entry != IO_OBJECT_NULL) {
        IOObjectRelease(entry);
    }
}

// Records what a keyword of a name stands for.
void RecordKeyword(CFMutableDictionaryRef portDict, CFStringRef key, CFStringRef text) {
    CFDictionarySetValue(portDict, key, text != nullptr ? text : Unknown());
}

bool ReadInteger(CFTypeRef value, SInt32* integer) {
    return value != nullptr && CFGetTypeID(value) == CFNumberGetTypeID() &&
           CFNumberGetValue(static_cast<CFNumberRef>(value), kCFNumberSInt32Type, integer);
}

void RecordSlotName(io_object_t bus, CFMutableDictionaryRef portDict) {
    CFStringRef prefix = CFSTR("SLOT-");
    CFStringRef slot = CopyDataPropertyAsString(bus, SlotNameKey());
    if (slot != nullptr && CFStringHasPrefix(slot, prefix)) {
        const CFIndex start = CFStringGetLength(prefix);
        CFStringRef rest = CFStringCreateWithSubstring(kCFAllocatorDefault, slot,
                                                       CFRangeMake(start, CFStringGetLength(slot) - start));
        if (rest != nullptr) {
            CFQRelease(slot);
            slot = rest;
        }
    }
    RecordKeyword(portDict, SlotNameKey(), slot);
    CFQRelease(slot);
}

// The registry counts a card's ports from 0, its user from 1.
void RecordPortNumber(io_object_t bus, CFMutableDictionaryRef portDict) {
    SInt32 index = 0;
    CFStringRef text = nullptr;
    CFTypeRef number = CopyProperty(bus, ChildIndexKey(), CFNumberGetTypeID());
    if (ReadInteger(number, &index)) {
        text = CFStringCreateWithFormat(kCFAllocatorDefault, nullptr, CFSTR("%ld"),
                                        static_cast<long>(index) + 1);
    }
    RecordKeyword(portDict, ChildIndexKey(), text);
    CFQRelease(text);
    CFQRelease(number);
}

OSStatus CopyNameForPCIPort(io_object_t bus, CFDictionaryRef busProperties, CFMutableDictionaryRef portDict,
                            CFStringRef* proposedName) {
    SInt32 index = 0;
    OSStatus err = CFQDictionarySetNumber(portDict, SortOrderKey(), kSortPCIEthernet);
    if (err == 0) {
        RecordSlotName(bus, portDict);
        if (ReadInteger(CFDictionaryGetValue(busProperties, ChildIndexKey()), &index)) {
            RecordPortNumber(bus, portDict);
            *proposedName = CFSTR("PCI Ethernet Slot %2$@, Port %3$@");
        } else {
            *proposedName = CFSTR("PCI Ethernet Slot %2$@");
        }
        CFQRetain(*proposedName);
    }
    return err;
}

// The name of a card that is neither built in nor an AirPort.
OSStatus CopyNameByBus(io_object_t entry, CFDictionaryRef controllerProperties, io_object_t bus,
                       CFMutableDictionaryRef portDict, CFStringRef* proposedName) {
    CFMutableDictionaryRef busProperties = nullptr;
    CFStringRef busName = nullptr;
    CFStringRef bsdName = nullptr;
    OSStatus err = CopyProperties(bus, &busProperties);
    if (err == 0) {
        CFTypeRef nameData = CFDictionaryGetValue(busProperties, CFSTR("name"));
        if (nameData != nullptr && CFGetTypeID(nameData) == CFDataGetTypeID()) {
            busName = CreateStringFromData(static_cast<CFDataRef>(nameData));
        }
        if (busName == nullptr) {
            err = kCannotDescribePortErr;
        }
    }
    if (err == 0) {
        if (CFEqualString(busName, CFSTR("radio"))) {
            err = CFQDictionarySetNumber(portDict, SortOrderKey(), kSortWireless);
            *proposedName = static_cast<CFStringRef>(CFQRetain(CFSTR("Wireless Network Adaptor")));
        } else if (CFEqualString(GetStringValue(controllerProperties, CFSTR("IOProviderClass")),
                                 CFSTR("IOPCIDevice"))) {
            err = CopyNameForPCIPort(bus, busProperties, portDict, proposedName);
        } else {
            bsdName = CopyStringProperty(entry, BSDNameKey());
            RecordKeyword(portDict, BSDNameKey(), bsdName);
            *proposedName = static_cast<CFStringRef>(CFQRetain(CFSTR("Ethernet Adaptor (%1$@)")));
        }
    }
    CFQRelease(busProperties);
    CFQRelease(busName);
    CFQRelease(bsdName);
    return err;
}

OSStatus CopyUserVisibleNameForEthernetPort(io_object_t entry, CFMutableDictionaryRef portDict,
                                            CFStringRef* proposedName) {
    io_object_t controller = IO_OBJECT_NULL;
    io_object_t bus = IO_OBJECT_NULL;
    CFMutableDictionaryRef controllerProperties = nullptr;
    CFStringRef bsdName = nullptr;
    OSStatus err = GetParent(entry, &controller);
    if (err == 0) {
        err = GetParent(controller, &bus);
    }
    if (err == 0) {
        err = CopyProperties(controller, &controllerProperties);
    }
    if (err == 0) {
        bsdName = CopyStringProperty(entry, BSDNameKey());
        if (bsdName == nullptr) {
            err = kCannotDescribePortErr;
        }
    }
    if (err == 0) {
        CFStringRef driverClass = GetStringValue(controllerProperties, CFSTR("IOClass"));
        if (CFEqualString(bsdName, CFSTR("en0"))) {
            err = CFQDictionarySetNumber(portDict, SortOrderKey(), kSortBuiltInEthernet);
            *proposedName = static_cast<CFStringRef>(CFQRetain(CFSTR("Built-in Ethernet")));
        } else if (driverClass != nullptr && CFStringHasPrefix(driverClass, CFSTR("AirPort"))) {
            CFDictionarySetValue(portDict, CFSTR("Hardware"), CFSTR("AirPort"));
            err = CFQDictionarySetNumber(portDict, SortOrderKey(), kSortAirPort);
            *proposedName = static_cast<CFStringRef>(CFQRetain(CFSTR("AirPort")));
        } else {
            err = CopyNameByBus(entry, controllerProperties, bus, portDict, proposedName);
        }
    }
    CFQRelease(controllerProperties);
    CFQRelease(bsdName);
    ReleaseEntry(controller);
    ReleaseEntry(bus);
    return err;
}

OSStatus CopyNameForUSBModem(io_object_t entry, CFMutableDictionaryRef portDict, CFStringRef* proposedName) {
    io_object_t device = IO_OBJECT_NULL;
    OSStatus err = CFQDictionarySetNumber(portDict, SortOrderKey(), kSortUSBModem);
    if (err == 0) {
        err = GetParent(entry, &device);
    }
    if (err == 0) {
        *proposedName = CopyStringProperty(device, CFSTR("Product Name"));
        if (*proposedName == nullptr) {
            *proposedName = static_cast<CFStringRef>(CFQRetain(CFSTR("USB Modem")));
        }
    }
    ReleaseEntry(device);
    return err;
}

void RecordLowerCaseBaseName(io_object_t entry, CFMutableDictionaryRef portDict) {
    CFMutableStringRef lowerCase = nullptr;
    CFStringRef baseName = CopyStringProperty(entry, BaseNameKey());
    if (baseName != nullptr) {
        lowerCase = CFStringCreateMutableCopy(kCFAllocatorDefault, 0, baseName);
    }
    if (lowerCase != nullptr) {
        CFStringLowercase(lowerCase, nullptr);
    }
    RecordKeyword(portDict, BaseNameKey(), lowerCase);
    CFQRelease(baseName);
    CFQRelease(lowerCase);
}

OSStatus CopyUserVisibleNameForModemOrSerialPort(io_object_t entry, CFMutableDictionaryRef portDict,
                                                 CFStringRef* proposedName) {
    OSStatus err = 0;
    bool isModem = false;
    CFStringRef fixedName = nullptr;
    CFStringRef baseName = nullptr;
    CFStringRef streamType = CopyStringProperty(entry, CFSTR("IOSerialBSDClientType"));
    if (streamType == nullptr) {
        err = kCannotDescribePortErr;
    }
    if (err == 0) {
        isModem = CFEqualString(streamType, CFSTR("IOModemSerialStream"));
        if (isModem) {
            err = CFQDictionarySetNumber(portDict, SortOrderKey(), kSortModem);
        }
    }
    if (err == 0) {
        baseName = CopyStringProperty(entry, BaseNameKey());
        if (baseName == nullptr) {
            err = kCannotDescribePortErr;
        }
    }
    if (err == 0) {
        if (CFEqualString(baseName, CFSTR("modem"))) {
            if (isModem) {
                err = CFQDictionarySetNumber(portDict, SortOrderKey(), kSortInternalModem);
            }
            fixedName = isModem ? CFSTR("Internal Modem") : CFSTR("Modem Port");
        } else if (CFEqualString(baseName, CFSTR("printer"))) {
            fixedName = CFSTR("Printer Port");
        } else if (CFEqualString(baseName, CFSTR("modem-printer"))) {
            fixedName = CFSTR("Modem/Printer Port");
        } else if (CFEqualString(baseName, CFSTR("usbmodem"))) {
            err = CopyNameForUSBModem(entry, portDict, proposedName);
        } else if (CFEqualString(baseName, InfraredName())) {
            fixedName = CFSTR("IrDA Modem Port");
        } else {
            RecordLowerCaseBaseName(entry, portDict);
            fixedName = CFSTR("%4$@-port");
        }
    }
    if (err == 0 && fixedName != nullptr) {
        *proposedName = static_cast<CFStringRef>(CFQRetain(fixedName));
    }
    CFQRelease(streamType);
    CFQRelease(baseName);
    return err;
}

OSStatus SubstituteKeywordsInUserVisibleName(io_object_t /*entry*/, CFDictionaryRef portDict,
                                             CFStringRef nameTemplate, CFStringRef* name) {
    const struct {
        CFStringRef keyword;
        CFStringRef key;
    } keywords[] = {{CFSTR("%1$@"), BSDNameKey()},
                    {CFSTR("%2$@"), SlotNameKey()},
                    {CFSTR("%3$@"), ChildIndexKey()},
                    {CFSTR("%4$@"), BaseNameKey()}};
    OSStatus err = 0;
    CFMutableStringRef text = nullptr;
    if (nameTemplate != nullptr) {
        text = CFStringCreateMutableCopy(kCFAllocatorDefault, 0, nameTemplate);
    }
    if (text == nullptr) {
        err = kCannotDescribePortErr;
    }
    if (err == 0) {
        for (const auto& each : keywords) {
            const CFRange place = CFStringFind(text, each.keyword, 0);
            if (place.location != kCFNotFound) {
                // A hook's name, or a product's, can ask for what the rules did not record.
                CFStringRef value = GetStringValue(portDict, each.key);
                CFStringReplace(text, place, value != nullptr ? value : Unknown());
            }
        }
    }
    HandOver<CFStringRef>(err, text, name);
    return err;
}

OSStatus CopyUserVisiblePortName(io_object_t entry, CFMutableDictionaryRef portDict, CFStringRef* name) {
    OSStatus err = 0;
    CFStringRef proposedName = nullptr;
    CFStringRef baseName = nullptr;
    if (IOObjectConformsTo(entry, "IOEthernetInterface")) {
        err = CopyUserVisibleNameForEthernetPort(entry, portDict, &proposedName);
    } else if (IOObjectConformsTo(entry, "IOSerialBSDClient")) {
        err = CopyUserVisibleNameForModemOrSerialPort(entry, portDict, &proposedName);
    } else {
        proposedName = CopyStringProperty(entry, BSDNameKey());
        if (proposedName == nullptr) {
            err = kCannotDescribePortErr;
        }
    }
    if (gPortNameCallback != nullptr) {
        // Also after a failure: the hook may know a name where the rules have none.
        err = gPortNameCallback(entry, portDict, proposedName, &baseName);
    } else if (err == 0) {
        baseName = CFStringCreateCopy(kCFAllocatorDefault, proposedName);
        if (baseName == nullptr) {
            err = kCannotDescribePortErr;
        }
    }
    if (err == 0) {
        err = SubstituteKeywordsInUserVisibleName(entry, portDict, baseName, name);
    }
    CFQRelease(proposedName);
    CFQRelease(baseName);
    return err;
}

// Only the 6 bytes of a hardware address make one.
CFStringRef CreateMACFromData(CFDataRef data) {
    CFStringRef text = nullptr;
    if (CFDataGetLength(data) == 6) {
        const UInt8* bytes = CFDataGetBytePtr(data);
        text = CFStringCreateWithFormat(kCFAllocatorDefault, nullptr, CFSTR("%02x:%02x:%02x:%02x:%02x:%02x"),
                                        bytes[0], bytes[1], bytes[2], bytes[3], bytes[4], bytes[5]);
    }
    return text;
}

OSStatus EthernetDeviceToDictProc(void* /*context*/, io_object_t entry, CFMutableDictionaryRef portDict) {
    io_object_t controller = IO_OBJECT_NULL;
    CFTypeRef address = nullptr;
    CFStringRef addressText = nullptr;
    CFStringRef bsdName = nullptr;
    OSStatus err = CFQDictionarySetNumber(portDict, SortOrderKey(), kSortEthernet);
    if (err == 0) {
        bsdName = CopyStringProperty(entry, BSDNameKey());
        if (bsdName != nullptr) {
            CFDictionarySetValue(portDict, CFSTR("DeviceName"), bsdName);
        } else {
            err = kCannotDescribePortErr;
        }
    }
    CFDictionarySetValue(portDict, CFSTR("Hardware"), CFSTR("Ethernet"));
    CFDictionarySetValue(portDict, CFSTR("Type"), CFSTR("Ethernet"));
    if (err == 0) {
        err = GetParent(entry, &controller);
    }
    if (err == 0) {
        address = CopyProperty(controller, CFSTR("IOMACAddress"), CFDataGetTypeID());
        if (address != nullptr) {
            addressText = CreateMACFromData(static_cast<CFDataRef>(address));
        }
        if (addressText != nullptr) {
            CFDictionarySetValue(portDict, CFSTR("MACAddress"), addressText);
        }
    }
    CFQRelease(bsdName);
    CFQRelease(address);
    CFQRelease(addressText);
    ReleaseEntry(controller);
    return err;
}

OSStatus ModemOrSerialDeviceToDictProc(void* /*context*/, io_object_t entry,
                                       CFMutableDictionaryRef portDict) {
    CFMutableDictionaryRef properties = nullptr;
    CFStringRef baseName = nullptr;
    OSStatus err = CopyProperties(entry, &properties);
    if (err == 0) {
        baseName = GetStringValue(properties, BaseNameKey());
    }
    if (err == 0 && baseName != nullptr && !CFEqualString(baseName, CFSTR("irda"))) {
        CFStringRef deviceName = GetStringValue(properties, CFSTR("IOTTYDevice"));
        if (deviceName == nullptr) {
            err = kCannotDescribePortErr;
        }
        if (err == 0) {
            err = CFQDictionarySetNumber(portDict, SortOrderKey(), kSortSerial);
        }
        if (err == 0) {
            CFDictionarySetValue(portDict, CFSTR("DeviceName"), deviceName);
            CFDictionarySetValue(portDict, CFSTR("Hardware"), CFSTR("Modem"));
            CFDictionarySetValue(portDict, CFSTR("Type"), CFSTR("PPP"));
            CFDictionarySetValue(portDict, CFSTR("SubType"), CFSTR("PPPSerial"));
        }
        if (err == 0 && CFStringHasPrefix(baseName, InfraredName())) {
            err = CFQDictionarySetNumber(portDict, SortOrderKey(), kSortInfrared);
            CFDictionarySetValue(portDict, CFSTR("HardwareVariant"), InfraredName());
        }
    }
    CFQRelease(properties);
    return err;
}

OSStatus AddDeviceToArray(io_object_t entry, DeviceToDictProc fillProc, void* context,
                          CFMutableArrayRef array) {
    CFMutableDictionaryRef portDict = nullptr;
    CFStringRef name = nullptr;
    OSStatus err = CFQDictionaryCreateMutable(&portDict);
    if (err == 0) {
        err = fillProc(context, entry, portDict);
    }
    if (err == 0 && CFDictionaryGetCount(portDict) != 0) {
        err = CopyUserVisiblePortName(entry, portDict, &name);
        if (err == 0) {
            CFDictionarySetValue(portDict, CFSTR("UserDefinedName"), name);
            CFArrayAppendValue(array, portDict);
        }
    }
    CFQRelease(portDict);
    CFQRelease(name);
    return err;
}

// Consumes a reference of matchingDict, which is null when it could not be made.
OSStatus AddMatchingDevicesToArray(mach_port_t masterPort, CFDictionaryRef matchingDict,
                                   DeviceToDictProc fillProc, void* context, CFMutableArrayRef array) {
    OSStatus err = 0;
    io_iterator_t iterator = IO_OBJECT_NULL;
    if (matchingDict == nullptr) {
        err = coreFoundationUnknownErr;
    }
    if (err == 0) {
        err = IOServiceGetMatchingServices(masterPort, matchingDict, &iterator);
    }
    while (err == 0) {
        io_object_t entry = IOIteratorNext(iterator);
        if (entry == IO_OBJECT_NULL) {
            break;
        }
        err = AddDeviceToArray(entry, fillProc, context, array);
        IOObjectRelease(entry);
    }
    ReleaseEntry(iterator);
    return err;
}

OSStatus AddSerialDevicesToArray(mach_port_t masterPort, CFStringRef streamType, CFMutableArrayRef array) {
    CFMutableDictionaryRef matchingDict = nullptr;
    OSStatus err = CFQDictionaryCreateMutable(&matchingDict);
    if (err == 0) {
        CFDictionarySetValue(matchingDict, CFSTR("IOProviderClass"), CFSTR("IOSerialBSDClient"));
        CFDictionarySetValue(matchingDict, CFSTR("IOSerialBSDClientType"), streamType);
        err = AddMatchingDevicesToArray(masterPort, matchingDict, ModemOrSerialDeviceToDictProc, nullptr,
                                        array);
    }
    return err;
}

SInt32 SortOrder(CFDictionaryRef portDict) {
    SInt32 order = kSortUnknown;
    return ReadInteger(CFDictionaryGetValue(portDict, SortOrderKey()), &order)
               ? order
               : static_cast<SInt32>(kSortUnknown);
}

CFComparisonResult PortSorter(const void* lhs, const void* rhs, void* /*context*/) {
    auto* lhsDict = static_cast<CFDictionaryRef>(lhs);
    auto* rhsDict = static_cast<CFDictionaryRef>(rhs);
    const SInt32 lhsOrder = SortOrder(lhsDict);
    const SInt32 rhsOrder = SortOrder(rhsDict);
    if (lhsOrder != rhsOrder) {
        return lhsOrder < rhsOrder ? kCFCompareLessThan : kCFCompareGreaterThan;
    }
    return CFStringCompare(GetStringValue(lhsDict, CFSTR("UserDefinedName")),
                           GetStringValue(rhsDict, CFSTR("UserDefinedName")), kCFCompareLocalized);
}

}  // namespace

OSStatus MoreSCCreatePortArray(CFArrayRef* portArray) {
    mach_port_t masterPort = MACH_PORT_NULL;
    CFMutableArrayRef ports = nullptr;
    OSStatus err = CFQArrayCreateMutable(&ports);
    if (err == 0) {
        err = IOMasterPort(MACH_PORT_NULL, &masterPort);
    }
    if (err == 0) {
        err = AddMatchingDevicesToArray(masterPort, IOServiceMatching("IOEthernetInterface"),
                                        EthernetDeviceToDictProc, nullptr, ports);
    }
    if (err == 0) {
        err = AddSerialDevicesToArray(masterPort, CFSTR("IOModemSerialStream"), ports);
    }
    if (err == 0) {
        err = AddSerialDevicesToArray(masterPort, CFSTR("IORS232SerialStream"), ports);
    }
    if (err == 0) {
        CFArraySortValues(ports, CFRangeMake(0, CFArrayGetCount(ports)), PortSorter, nullptr);
    }
    ReleaseEntry(masterPort);
    HandOverOrNull<CFArrayRef>(err, ports, portArray);
    return err;
}

void MoreSCFSetPortNameCallback(MoreSCFPortNameCallback callback) {
    gPortNameCallback = callback;
}
