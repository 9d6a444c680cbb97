#include "morescf/MoreSCFPortScanner.h"

#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCFDigest.h"
#include "morescf/MoreSCFKeys.h"
#include "morescf/MoreSCFPorts.h"
#include "morescf/MoreSCFSteps.h"
#include "morescf/MoreSCFValues.h"
#include "platform/CoreServices.h"

namespace {

// Fills the port's dictionary from its registry entry; one that stays empty is no port.
using DeviceToDictProc = OSStatus (*)(void* context, io_object_t entry, CFMutableDictionaryRef portDict);

// Only the 6 bytes of a hardware address make one.
CFStringRef CreateMACFromData(CFDataRef data) {
    CFStringRef text = nullptr;
    if (CFDataGetLength(data) == 6) {
        static_cast<void>(MoreSCFCreateStringWithMacAddress(CFDataGetBytePtr(data), &text));
    }
    return text;
}

// A controller without an address leaves the port without one.
void SetMACAddress(io_object_t controller, CFMutableDictionaryRef portDict) {
    auto* address =
        static_cast<CFDataRef>(CopyProperty(controller, CFSTR("IOMACAddress"), CFDataGetTypeID()));
    CFStringRef text = address != nullptr ? CreateMACFromData(address) : nullptr;
    if (text != nullptr) {
        CFDictionarySetValue(portDict, kMACAddressKey, text);
    }
    CFQRelease(address);
    CFQRelease(text);
}

OSStatus EthernetDeviceToDictProc(void* /*context*/, io_object_t entry, CFMutableDictionaryRef portDict) {
    io_object_t controller = IO_OBJECT_NULL;
    CFStringRef bsdName = nullptr;
    OSStatus err = InTurn([&] { return CFQDictionarySetNumber(portDict, kSortOrderKey, kSortEthernet); },
                          [&] { return CopyRequiredString(entry, kBSDNameKey, &bsdName); });
    if (err == 0) {
        CFDictionarySetValue(portDict, kDeviceNameKey, bsdName);
    }
    CFDictionarySetValue(portDict, kHardwareKey, kEthernetProtocol);
    CFDictionarySetValue(portDict, kTypeKey, kEthernetProtocol);
    if (err == 0) {
        err = GetParent(entry, &controller);
    }
    if (err == 0) {
        SetMACAddress(controller, portDict);
    }
    CFQRelease(bsdName);
    ReleaseEntry(controller);
    return err;
}

// An entry without a base name, and the raw infrared device below the port of that name, are no ports.
OSStatus ModemOrSerialDeviceToDictProc(void* /*context*/, io_object_t entry,
                                       CFMutableDictionaryRef portDict) {
    CFMutableDictionaryRef properties = nullptr;
    CFStringRef deviceName = nullptr;
    OSStatus err = CopyProperties(entry, &properties);
    CFStringRef baseName = err == 0 ? GetStringValue(properties, kBaseNameKey) : nullptr;
    const bool isPort = baseName != nullptr && !CFEqual(baseName, CFSTR("irda"));
    const bool isInfrared = isPort && CFStringHasPrefix(baseName, kInfraredName);
    if (isPort) {
        err = CopyRequiredString(entry, CFSTR("IOTTYDevice"), &deviceName);
    }
    if (err == 0 && isPort) {
        err = CFQDictionarySetNumber(portDict, kSortOrderKey, isInfrared ? kSortInfrared : kSortSerial);
        CFDictionarySetValue(portDict, kDeviceNameKey, deviceName);
        CFDictionarySetValue(portDict, kHardwareKey, kModemProtocol);
        CFDictionarySetValue(portDict, kTypeKey, kPPPProtocol);
        CFDictionarySetValue(portDict, kSubTypeKey, CFSTR("PPPSerial"));
    }
    if (err == 0 && isInfrared) {
        CFDictionarySetValue(portDict, kHardwareVariantKey, kInfraredName);
    }
    CFQRelease(properties);
    CFQRelease(deviceName);
    return err;
}

OSStatus AddDeviceToArray(io_object_t entry, DeviceToDictProc fillProc, void* context,
                          CFMutableArrayRef array) {
    CFMutableDictionaryRef portDict = nullptr;
    CFStringRef name = nullptr;
    OSStatus err = InTurn([&] { return CFQDictionaryCreateMutable(&portDict); },
                          [&] { return fillProc(context, entry, portDict); });
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
    io_iterator_t iterator = IO_OBJECT_NULL;
    OSStatus err = InTurn([&] { return ErrorIfMissing(matchingDict); },
                          [&] { return IOServiceGetMatchingServices(masterPort, matchingDict, &iterator); });
    // A port that cannot be described is not skipped: a location made from the rest would look complete.
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

// The order is what a new location starts from: its services are in it, and its first modem is the default.
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
    OSStatus err =
        InTurn([&] { return CFQArrayCreateMutable(&ports); },
               [&] { return IOMasterPort(MACH_PORT_NULL, &masterPort); },
               [&] {
                   return AddMatchingDevicesToArray(masterPort, IOServiceMatching("IOEthernetInterface"),
                                                    EthernetDeviceToDictProc, nullptr, ports);
               },
               [&] { return AddSerialDevicesToArray(masterPort, kModemStreamType, ports); },
               [&] { return AddSerialDevicesToArray(masterPort, CFSTR("IORS232SerialStream"), ports); });
    if (err == 0) {
        CFArraySortValues(ports, CFRangeMake(0, CFArrayGetCount(ports)), PortSorter, nullptr);
    }
    ReleaseEntry(masterPort);
    HandOverOrNull<CFArrayRef>(err, ports, portArray);
    return err;
}
