// How ports are called: the rules, the hook, and the keywords in a name.
#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCFKeys.h"
#include "morescf/MoreSCFPortScanner.h"
#include "morescf/MoreSCFPorts.h"
#include "morescf/MoreSCFValues.h"
#include "platform/CoreServices.h"

namespace {

MoreSCFPortNameCallback gPortNameCallback = nullptr;

const CFStringRef kSlotNameKey = CFSTR("AAPL,slot-name");
const CFStringRef kChildIndexKey = CFSTR("IOChildIndex");
const CFStringRef kUnknownText = CFSTR("unknown");

// Registry data as text, without the zero bytes at its end.
CFStringRef CreateStringFromData(CFDataRef data) {
    const UInt8* bytes = CFDataGetBytePtr(data);
    CFIndex length = CFDataGetLength(data);
    while (length > 0 && bytes[length - 1] == 0) {
        --length;
    }
    return CFStringCreateWithBytes(kCFAllocatorDefault, bytes, length, kCFStringEncodingMacRoman, false);
}

// A data property as text, or null.
CFStringRef CopyDataPropertyAsString(io_object_t entry, CFStringRef key) {
    auto* data = static_cast<CFDataRef>(CopyProperty(entry, key, CFDataGetTypeID()));
    CFStringRef text = data != nullptr ? CreateStringFromData(data) : nullptr;
    CFQRelease(data);
    return text;
}

// Records what a keyword of a name stands for.
void RecordKeyword(CFMutableDictionaryRef portDict, CFStringRef key, CFStringRef text) {
    CFDictionarySetValue(portDict, key, text != nullptr ? text : kUnknownText);
}

void RecordSlotName(io_object_t bus, CFMutableDictionaryRef portDict) {
    CFStringRef prefix = CFSTR("SLOT-");
    CFStringRef slot = CopyDataPropertyAsString(bus, kSlotNameKey);
    if (slot != nullptr && CFStringHasPrefix(slot, prefix)) {
        const CFIndex start = CFStringGetLength(prefix);
        CFStringRef rest = CFStringCreateWithSubstring(kCFAllocatorDefault, slot,
                                                       CFRangeMake(start, CFStringGetLength(slot) - start));
        if (rest != nullptr) {
            CFQRelease(slot);
            slot = rest;
        }
    }
    RecordKeyword(portDict, kSlotNameKey, slot);
    CFQRelease(slot);
}

// The registry counts a card's ports from 0, its user from 1.
void RecordPortNumber(io_object_t bus, CFMutableDictionaryRef portDict) {
    SInt32 index = 0;
    CFStringRef text = nullptr;
    CFTypeRef number = CopyProperty(bus, kChildIndexKey, CFNumberGetTypeID());
    if (ReadInteger(number, &index)) {
        text = CFStringCreateWithFormat(kCFAllocatorDefault, nullptr, CFSTR("%ld"),
                                        static_cast<long>(index) + 1);
    }
    RecordKeyword(portDict, kChildIndexKey, text);
    CFQRelease(text);
    CFQRelease(number);
}

OSStatus CopyNameForPCIPort(io_object_t bus, CFDictionaryRef busProperties, CFMutableDictionaryRef portDict,
                            CFStringRef* proposedName) {
    SInt32 index = 0;
    OSStatus err = CFQDictionarySetNumber(portDict, kSortOrderKey, kSortPCIEthernet);
    if (err == 0) {
        RecordSlotName(bus, portDict);
        if (ReadInteger(CFDictionaryGetValue(busProperties, kChildIndexKey), &index)) {
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
            err = CFQDictionarySetNumber(portDict, kSortOrderKey, kSortWireless);
            *proposedName = static_cast<CFStringRef>(CFQRetain(CFSTR("Wireless Network Adaptor")));
        } else if (HasStringValue(controllerProperties, CFSTR("IOProviderClass"), CFSTR("IOPCIDevice"))) {
            err = CopyNameForPCIPort(bus, busProperties, portDict, proposedName);
        } else {
            bsdName = CopyStringProperty(entry, kBSDNameKey);
            RecordKeyword(portDict, kBSDNameKey, bsdName);
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
        bsdName = CopyStringProperty(entry, kBSDNameKey);
        if (bsdName == nullptr) {
            err = kCannotDescribePortErr;
        }
    }
    if (err == 0) {
        CFStringRef driverClass = GetStringValue(controllerProperties, CFSTR("IOClass"));
        if (CFEqualString(bsdName, CFSTR("en0"))) {
            err = CFQDictionarySetNumber(portDict, kSortOrderKey, kSortBuiltInEthernet);
            *proposedName = static_cast<CFStringRef>(CFQRetain(CFSTR("Built-in Ethernet")));
        } else if (driverClass != nullptr && CFStringHasPrefix(driverClass, CFSTR("AirPort"))) {
            CFDictionarySetValue(portDict, kHardwareKey, kAirPortProtocol);
            err = CFQDictionarySetNumber(portDict, kSortOrderKey, kSortAirPort);
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
    OSStatus err = CFQDictionarySetNumber(portDict, kSortOrderKey, kSortUSBModem);
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
    CFStringRef baseName = CopyStringProperty(entry, kBaseNameKey);
    if (baseName != nullptr) {
        lowerCase = CFStringCreateMutableCopy(kCFAllocatorDefault, 0, baseName);
    }
    if (lowerCase != nullptr) {
        CFStringLowercase(lowerCase, nullptr);
    }
    RecordKeyword(portDict, kBaseNameKey, lowerCase);
    CFQRelease(baseName);
    CFQRelease(lowerCase);
}

OSStatus CopyUserVisibleNameForModemOrSerialPort(io_object_t entry, CFMutableDictionaryRef portDict,
                                                 CFStringRef* proposedName) {
    OSStatus err = 0;
    bool isModem = false;
    CFStringRef fixedName = nullptr;
    CFStringRef baseName = nullptr;
    CFStringRef streamType = CopyStringProperty(entry, kStreamTypeKey);
    if (streamType == nullptr) {
        err = kCannotDescribePortErr;
    }
    if (err == 0) {
        isModem = CFEqualString(streamType, kModemStreamType);
        if (isModem) {
            err = CFQDictionarySetNumber(portDict, kSortOrderKey, kSortModem);
        }
    }
    if (err == 0) {
        baseName = CopyStringProperty(entry, kBaseNameKey);
        if (baseName == nullptr) {
            err = kCannotDescribePortErr;
        }
    }
    if (err == 0) {
        if (CFEqualString(baseName, CFSTR("modem"))) {
            if (isModem) {
                err = CFQDictionarySetNumber(portDict, kSortOrderKey, kSortInternalModem);
            }
            fixedName = isModem ? CFSTR("Internal Modem") : CFSTR("Modem Port");
        } else if (CFEqualString(baseName, CFSTR("printer"))) {
            fixedName = CFSTR("Printer Port");
        } else if (CFEqualString(baseName, CFSTR("modem-printer"))) {
            fixedName = CFSTR("Modem/Printer Port");
        } else if (CFEqualString(baseName, CFSTR("usbmodem"))) {
            err = CopyNameForUSBModem(entry, portDict, proposedName);
        } else if (CFEqualString(baseName, kInfraredName)) {
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
    } keywords[] = {{CFSTR("%1$@"), kBSDNameKey},
                    {CFSTR("%2$@"), kSlotNameKey},
                    {CFSTR("%3$@"), kChildIndexKey},
                    {CFSTR("%4$@"), kBaseNameKey}};
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
                CFStringReplace(text, place, value != nullptr ? value : kUnknownText);
            }
        }
    }
    HandOver<CFStringRef>(err, text, name);
    return err;
}

}  // namespace

OSStatus CopyUserVisiblePortName(io_object_t entry, CFMutableDictionaryRef portDict, CFStringRef* name) {
    OSStatus err = 0;
    CFStringRef proposedName = nullptr;
    CFStringRef baseName = nullptr;
    if (IOObjectConformsTo(entry, "IOEthernetInterface")) {
        err = CopyUserVisibleNameForEthernetPort(entry, portDict, &proposedName);
    } else if (IOObjectConformsTo(entry, "IOSerialBSDClient")) {
        err = CopyUserVisibleNameForModemOrSerialPort(entry, portDict, &proposedName);
    } else {
        proposedName = CopyStringProperty(entry, kBSDNameKey);
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

void MoreSCFSetPortNameCallback(MoreSCFPortNameCallback callback) {
    gPortNameCallback = callback;
}
