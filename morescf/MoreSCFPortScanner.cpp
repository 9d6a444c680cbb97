#include "morescf/MoreSCFPortScanner.h"

#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCFKeys.h"
#include "morescf/MoreSCFPorts.h"
#include "morescf/MoreSCFValues.h"
#include "platform/CoreServices.h"

namespace {

// Fills the port's dictionary from its registry entry; one that stays empty is no port.
using DeviceToDictProc = OSStatus (*)(void* context, io_object_t entry, CFMutableDictionaryRef portDict);

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
    OSStatus err = CFQDictionarySetNumber(portDict, kSortOrderKey, kSortEthernet);
    if (err == 0) {
        bsdName = CopyStringProperty(entry, kBSDNameKey);
        if (bsdName != nullptr) {
            CFDictionarySetValue(portDict, kDeviceNameKey, bsdName);
        } else {
            err = kCannotDescribePortErr;
        }
    }
    CFDictionarySetValue(portDict, kHardwareKey, kEthernetProtocol);
    CFDictionarySetValue(portDict, kTypeKey, kEthernetProtocol);
    if (err == 0) {
        err = GetParent(entry, &controller);
    }
    if (err == 0) {
        address = CopyProperty(controller, CFSTR("IOMACAddress"), CFDataGetTypeID());
        if (address != nullptr) {
            addressText = CreateMACFromData(static_cast<CFDataRef>(address));
        }
        if (addressText != nullptr) {
            CFDictionarySetValue(portDict, kMACAddressKey, addressText);
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
        baseName = GetStringValue(properties, kBaseNameKey);
    }
    if (err == 0 && baseName != nullptr && !CFEqualString(baseName, CFSTR("irda"))) {
        CFStringRef deviceName = GetStringValue(properties, CFSTR("IOTTYDevice"));
        if (deviceName == nullptr) {
            err = kCannotDescribePortErr;
        }
        if (err == 0) {
            err = CFQDictionarySetNumber(portDict, kSortOrderKey, kSortSerial);
        }
        if (err == 0) {
            CFDictionarySetValue(portDict, kDeviceNameKey, deviceName);
            CFDictionarySetValue(portDict, kHardwareKey, kModemProtocol);
            CFDictionarySetValue(portDict, kTypeKey, kPPPProtocol);
            CFDictionarySetValue(portDict, kSubTypeKey, CFSTR("PPPSerial"));
        }
        if (err == 0 && CFStringHasPrefix(baseName, kInfraredName)) {
            err = CFQDictionarySetNumber(portDict, kSortOrderKey, kSortInfrared);
            CFDictionarySetValue(portDict, kHardwareVariantKey, kInfraredName);
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
            CFDictionarySetValue(portDict, kUserDefinedNameKey, name);
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
        CFDictionarySetValue(matchingDict, kStreamTypeKey, streamType);
        err = AddMatchingDevicesToArray(masterPort, matchingDict, ModemOrSerialDeviceToDictProc, nullptr,
                                        array);
    }
    return err;
}

SInt32 SortOrder(CFDictionaryRef portDict) {
    SInt32 order = kSortUnknown;
    return ReadInteger(CFDictionaryGetValue(portDict, kSortOrderKey), &order)
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
    return CFStringCompare(GetStringValue(lhsDict, kUserDefinedNameKey),
                           GetStringValue(rhsDict, kUserDefinedNameKey), kCFCompareLocalized);
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
        err = AddSerialDevicesToArray(masterPort, kModemStreamType, ports);
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
