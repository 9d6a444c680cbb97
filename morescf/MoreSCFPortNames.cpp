// How ports are called: the rules, the hook, and the keywords in a name.
#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCFKeys.h"
#include "morescf/MoreSCFPortScanner.h"
#include "morescf/MoreSCFPorts.h"
#include "morescf/MoreSCFSteps.h"
#include "morescf/MoreSCFValues.h"
#include "platform/CoreServices.h"

namespace {

MoreSCFPortNameCallback gPortNameCallback = nullptr;

const CFStringRef kSlotNameKey = CFSTR("AAPL,slot-name");
const CFStringRef kChildIndexKey = CFSTR("IOChildIndex");
const CFStringRef kUnknownText = CFSTR("unknown");

// Literally equal; null is equal to nothing.
bool CFEqualString(CFStringRef a, CFStringRef b) {
    return a != nullptr && b != nullptr && (a == b || CFStringCompare(a, b, 0) == kCFCompareEqualTo);
}

// Registry data as text, without the zero bytes at its end. Firmware writes it, in an encoding of its own.
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

// Records the text, which is consumed, that a keyword of a name is replaced by.
void RecordKeyword(CFMutableDictionaryRef portDict, CFStringRef key, CFStringRef text) {
    CFDictionarySetValue(portDict, key, text != nullptr ? text : kUnknownText);
    CFQRelease(text);
}

// A name, and the place in the order that goes with it.
OSStatus Propose(CFMutableDictionaryRef portDict, SInt32 sortOrder, CFStringRef name,
                 CFStringRef* proposedName) {
    *proposedName = Retained(name);
    return CFQDictionarySetNumber(portDict, kSortOrderKey, sortOrder);
}

void RecordSlotName(io_object_t bus, CFMutableDictionaryRef portDict) {
    CFStringRef prefix = CFSTR("SLOT-");
    CFStringRef slot = CopyDataPropertyAsString(bus, kSlotNameKey);
    CFStringRef rest = nullptr;
    if (slot != nullptr && CFStringHasPrefix(slot, prefix)) {
        const CFIndex start = CFStringGetLength(prefix);
        rest = CFStringCreateWithSubstring(kCFAllocatorDefault, slot,
                                           CFRangeMake(start, CFStringGetLength(slot) - start));
    }
    RecordKeyword(portDict, kSlotNameKey, Retained(rest != nullptr ? rest : slot));
    CFQRelease(slot);
    CFQRelease(rest);
}

// The registry counts a card's ports from 0, its user from 1. A card that is gone by now has no number.
void RecordPortNumber(io_object_t bus, CFMutableDictionaryRef portDict) {
    SInt32 index = 0;
    CFTypeRef number = CopyProperty(bus, kChildIndexKey, CFNumberGetTypeID());
    CFStringRef text = nullptr;
    if (ReadInteger(number, &index)) {
        text = CFStringCreateWithFormat(kCFAllocatorDefault, nullptr, CFSTR("%ld"),
                                        static_cast<long>(index) + 1);
    }
    RecordKeyword(portDict, kChildIndexKey, text);
    CFQRelease(number);
}

OSStatus CopyNameForPCIPort(io_object_t bus, CFDictionaryRef busProperties, CFMutableDictionaryRef portDict,
                            CFStringRef* proposedName) {
    SInt32 index = 0;
    CFStringRef name = CFSTR("PCI Ethernet Slot %2$@");
    RecordSlotName(bus, portDict);
    if (ReadInteger(CFDictionaryGetValue(busProperties, kChildIndexKey), &index)) {
        RecordPortNumber(bus, portDict);
        name = CFSTR("PCI Ethernet Slot %2$@, Port %3$@");
    }
    return Propose(portDict, kSortPCIEthernet, name, proposedName);
}

// The name of a card that is neither built in nor an AirPort.
OSStatus CopyNameByBus(io_object_t entry, CFDictionaryRef controllerProperties, io_object_t bus,
                       CFMutableDictionaryRef portDict, CFStringRef* proposedName) {
    CFMutableDictionaryRef busProperties = nullptr;
    CFStringRef busName = nullptr;
    OSStatus err = CopyProperties(bus, &busProperties);
    if (err == 0) {
        busName = CopyDataPropertyAsString(bus, CFSTR("name"));
        err = busName != nullptr ? 0 : kCannotDescribePortErr;
    }
    if (err == 0) {
        if (CFEqualString(busName, CFSTR("radio"))) {
            err = Propose(portDict, kSortWireless, CFSTR("Wireless Network Adaptor"), proposedName);
        } else if (HasStringValue(controllerProperties, CFSTR("IOProviderClass"), CFSTR("IOPCIDevice"))) {
            err = CopyNameForPCIPort(bus, busProperties, portDict, proposedName);
        } else {
            RecordKeyword(portDict, kBSDNameKey, CopyStringProperty(entry, kBSDNameKey));
            *proposedName = Retained(CFSTR("Ethernet Adaptor (%1$@)"));
        }
    }
    CFQRelease(busProperties);
    CFQRelease(busName);
    return err;
}

OSStatus CopyUserVisibleNameForEthernetPort(io_object_t entry, CFMutableDictionaryRef portDict,
                                            CFStringRef* proposedName) {
    io_object_t controller = IO_OBJECT_NULL;
    io_object_t bus = IO_OBJECT_NULL;
    CFMutableDictionaryRef controllerProperties = nullptr;
    CFStringRef bsdName = nullptr;
    OSStatus err =
        InTurn([&] { return GetParent(entry, &controller); }, [&] { return GetParent(controller, &bus); },
               [&] { return CopyProperties(controller, &controllerProperties); },
               [&] { return CopyRequiredString(entry, kBSDNameKey, &bsdName); });
    if (err == 0) {
        CFStringRef driverClass = GetStringValue(controllerProperties, CFSTR("IOClass"));
        // The first interface is the built-in one, even if it is an AirPort.
        if (CFEqualString(bsdName, CFSTR("en0"))) {
            err = Propose(portDict, kSortBuiltInEthernet, CFSTR("Built-in Ethernet"), proposedName);
        } else if (driverClass != nullptr && CFStringHasPrefix(driverClass, kAirPortProtocol)) {
            CFDictionarySetValue(portDict, kHardwareKey, kAirPortProtocol);
            err = Propose(portDict, kSortAirPort, CFSTR("AirPort"), proposedName);
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
    CFStringRef product = nullptr;
    OSStatus err = InTurn([&] { return CFQDictionarySetNumber(portDict, kSortOrderKey, kSortUSBModem); },
                          [&] { return GetParent(entry, &device); });
    if (err == 0) {
        product = CopyStringProperty(device, CFSTR("Product Name"));
        *proposedName = Retained(product != nullptr ? product : CFSTR("USB Modem"));
    }
    CFQRelease(product);
    ReleaseEntry(device);
    return err;
}

CFStringRef CreateLowerCase(CFStringRef text) {
    CFMutableStringRef lowerCase = CFStringCreateMutableCopy(kCFAllocatorDefault, 0, text);
    if (lowerCase != nullptr) {
        CFStringLowercase(lowerCase, nullptr);
    }
    return lowerCase;
}

OSStatus CopyUserVisibleNameForModemOrSerialPort(io_object_t entry, CFMutableDictionaryRef portDict,
                                                 CFStringRef* proposedName) {
    const struct {
        CFStringRef baseName;
        CFStringRef name;
    } fixedNames[] = {{CFSTR("modem"), CFSTR("Modem Port")},
                      {CFSTR("printer"), CFSTR("Printer Port")},
                      {CFSTR("modem-printer"), CFSTR("Modem/Printer Port")},
                      {kInfraredName, CFSTR("IrDA Modem Port")}};
    CFStringRef baseName = nullptr;
    CFStringRef streamType = nullptr;
    OSStatus err = CopyRequiredString(entry, kStreamTypeKey, &streamType);
    const bool isModem = CFEqualString(streamType, kModemStreamType);
    if (err == 0 && isModem) {
        err = CFQDictionarySetNumber(portDict, kSortOrderKey, kSortModem);
    }
    if (err == 0) {
        err = CopyRequiredString(entry, kBaseNameKey, &baseName);
    }
    if (err == 0) {
        for (const auto& fixed : fixedNames) {
            if (CFEqualString(baseName, fixed.baseName)) {
                *proposedName = Retained(fixed.name);
            }
        }
        if (isModem && CFEqualString(baseName, CFSTR("modem"))) {
            CFQRelease(*proposedName);
            err = Propose(portDict, kSortInternalModem, CFSTR("Internal Modem"), proposedName);
        } else if (CFEqualString(baseName, CFSTR("usbmodem"))) {
            err = CopyNameForUSBModem(entry, portDict, proposedName);
        } else if (*proposedName == nullptr) {
            CFStringRef again = CopyStringProperty(entry, kBaseNameKey);
            RecordKeyword(portDict, kBaseNameKey, again != nullptr ? CreateLowerCase(again) : nullptr);
            CFQRelease(again);
            *proposedName = Retained(CFSTR("%4$@-port"));
        }
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
    CFMutableStringRef text = nullptr;
    if (nameTemplate != nullptr) {
        text = CFStringCreateMutableCopy(kCFAllocatorDefault, 0, nameTemplate);
    }
    const OSStatus err = text != nullptr ? 0 : kCannotDescribePortErr;
    if (err == 0) {
        // In this order, each once: what replaced one keyword may hold a later one, and never an earlier.
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
        err = CopyRequiredString(entry, kBSDNameKey, &proposedName);
    }
    if (gPortNameCallback != nullptr) {
        // Also after a failure: the hook may know a name where the rules have none.
        err = gPortNameCallback(entry, portDict, proposedName, &baseName);
    } else if (err == 0) {
        baseName = CFStringCreateCopy(kCFAllocatorDefault, proposedName);
        err = baseName != nullptr ? 0 : kCannotDescribePortErr;
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
