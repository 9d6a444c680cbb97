#include "morescf/MoreSCFHelpers.h"

#include <cstring>

#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCF.h"
#include "morescf/MoreSCFKeys.h"
#include "morescf/MoreSCFPortScanner.h"
#include "morescf/MoreSCFValues.h"
#include "platform/CoreServices.h"

namespace {

// A live record that does not tell how it was configured.
constexpr OSStatus kNoConfigMethodErr = -2;

OSStatus IsSetupConfiguredToUseDHCP(SCDynamicStoreRef store, CFStringRef key, Boolean* usesDHCP) {
    CFPropertyListRef value = SCDynamicStoreCopyValue(store, key);
    OSStatus err = MoreSCError(value);
    if (err == 0 && !IsDictionary(value)) {
        err = coreFoundationUnknownErr;
    }
    if (err == 0) {
        CFStringRef method = GetStringValue(static_cast<CFDictionaryRef>(value), kConfigMethodKey);
        if (method == nullptr) {
            err = kNoConfigMethodErr;
        } else {
            *usesDHCP = CFEqual(method, CFSTR("DHCP"));
        }
    }
    CFQRelease(value);
    return err;
}

OSStatus AppendServiceIDForEachDHCPDynamicStoreKey(SCDynamicStoreRef store, CFArrayRef keys,
                                                   CFMutableArrayRef serviceIDs) {
    OSStatus err = 0;
    const CFIndex count = CFArrayGetCount(keys);
    for (CFIndex i = 0; err == 0 && i < count; ++i) {
        CFTypeRef key = CFArrayGetValueAtIndex(keys, i);
        Boolean usesDHCP = false;
        if (!IsString(key)) {
            err = coreFoundationUnknownErr;
        }
        if (err == 0) {
            err = IsSetupConfiguredToUseDHCP(store, static_cast<CFStringRef>(key), &usesDHCP);
        }
        if (err == 0 && usesDHCP) {
            // "Setup:" / "Network" / "Service" / ID / "IPv4"
            CFArrayRef components = CFStringCreateArrayBySeparatingStrings(
                kCFAllocatorDefault, static_cast<CFStringRef>(key), CFSTR("/"));
            if (components != nullptr && CFArrayGetCount(components) > 3) {
                CFArrayAppendValue(serviceIDs, CFArrayGetValueAtIndex(components, 3));
            } else {
                err = coreFoundationUnknownErr;
            }
            CFQRelease(components);
        }
    }
    return err;
}

// The output stays as it is when there is no modem.
OSStatus CopyDefaultModemPortBSDName(CFStringRef* bsdName) {
    CFArrayRef ports = nullptr;
    OSStatus err = MoreSCCreatePortArray(&ports);
    if (err == 0) {
        const CFIndex count = CFArrayGetCount(ports);
        bool found = false;
        for (CFIndex i = 0; !found && i < count; ++i) {
            auto* port = static_cast<CFDictionaryRef>(CFArrayGetValueAtIndex(ports, i));
            if (HasStringValue(port, kHardwareKey, kModemProtocol)) {
                found = true;
                *bsdName = static_cast<CFStringRef>(CFQRetain(GetStringValue(port, kDeviceNameKey)));
            }
        }
    }
    CFQRelease(ports);
    return err;
}

// Replaces the entity by one made from the digest, or from zeros for none.
template <class Digest>
OSStatus SetupEntity(CFStringRef setID, CFStringRef serviceID, CFStringRef protocol,
                     Digest MoreSCDigest::*member, const Digest* given) {
    MoreSCDigest digest;
    CFMutableDictionaryRef entity = nullptr;
    std::memset(&digest, 0, sizeof(digest));
    if (given != nullptr) {
        digest.*member = *given;
    }
    OSStatus err = MoreSCCreateEntity(protocol, &digest, &entity);
    if (err == 0) {
        err = MoreSCSetEntity(setID, serviceID, protocol, entity);
    }
    CFQRelease(entity);
    return err;
}

OSStatus SetupModemService(CFStringRef setID, CFStringRef serviceID, const MoreSCModemDigest* modemDigest,
                           const MoreSCPPPDigest* pppDigest, const MoreSCIPv4Digest* ipv4Digest,
                           const MoreSCDNSDigest* dnsDigest) {
    OSStatus err = SetupEntity(setID, serviceID, kPPPProtocol, &MoreSCDigest::ppp, pppDigest);
    if (err == 0 && modemDigest != nullptr) {
        err = SetupEntity(setID, serviceID, kModemProtocol, &MoreSCDigest::modem, modemDigest);
    }
    if (err == 0 && ipv4Digest != nullptr) {
        err = SetupEntity(setID, serviceID, kIPv4Protocol, &MoreSCDigest::ipv4, ipv4Digest);
    }
    if (err == 0 && dnsDigest != nullptr) {
        err = SetupEntity(setID, serviceID, kDNSProtocol, &MoreSCDigest::dns, dnsDigest);
    }
    return err;
}

OSStatus SetIPv4Active(CFStringRef serviceID, Boolean active) {
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0) {
        err = MoreSCSetEntityActive(nullptr, serviceID, kIPv4Protocol, active);
    }
    MoreSCClose(&err, true);
    return err;
}

}  // namespace

OSStatus MoreSCIsAppleTalkActive(CFStringRef setID, Boolean* active) {
    CFArrayRef serviceIDs = nullptr;
    *active = false;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0) {
        err = MoreSCCopyServiceIDs(setID, &serviceIDs, nullptr);
    }
    if (err == 0) {
        const CFIndex count = CFArrayGetCount(serviceIDs);
        for (CFIndex i = 0; err == 0 && !*active && i < count; ++i) {
            auto* serviceID = static_cast<CFStringRef>(CFArrayGetValueAtIndex(serviceIDs, i));
            Boolean isServiceActive = false;
            Boolean isEntityActive = false;
            err = MoreSCIsServiceActive(setID, serviceID, &isServiceActive);
            if (err == 0 && isServiceActive) {
                err = MoreSCIsEntityActive(setID, serviceID, kAppleTalkProtocol, &isEntityActive);
            }
            if (err == 0 && isEntityActive) {
                *active = true;
            }
        }
    }
    CFQRelease(serviceIDs);
    MoreSCClose(&err, false);
    return err;
}

OSStatus MoreSCSetAppleTalkActive(CFStringRef setID, Boolean active) {
    CFArrayRef serviceIDs = nullptr;
    bool madeChanges = false;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0) {
        err = MoreSCCopyServiceIDs(setID, &serviceIDs, nullptr);
    }
    if (err == 0) {
        const CFIndex count = CFArrayGetCount(serviceIDs);
        for (CFIndex i = 0; err == 0 && i < count; ++i) {
            auto* serviceID = static_cast<CFStringRef>(CFArrayGetValueAtIndex(serviceIDs, i));
            Boolean isActive = false;
            // A service without AppleTalk is skipped.
            if (MoreSCIsEntityActive(setID, serviceID, kAppleTalkProtocol, &isActive) == 0 &&
                (isActive != 0) != (active != 0)) {
                err = MoreSCSetEntityActive(setID, serviceID, kAppleTalkProtocol, active);
                if (err == 0) {
                    madeChanges = true;
                }
            }
        }
    }
    CFQRelease(serviceIDs);
    MoreSCClose(&err, madeChanges);
    return err;
}

OSStatus MoreSCCreateActiveDHCPServicesArray(CFArrayRef* activeDHCP) {
    CFStringRef pattern = nullptr;
    CFArrayRef keys = nullptr;
    CFMutableArrayRef serviceIDs = nullptr;
    SCDynamicStoreRef store = SCDynamicStoreCreate(kCFAllocatorDefault, MoreSCGetClient(), nullptr, nullptr);
    OSStatus err = MoreSCError(store);
    if (err == 0) {
        pattern = SCDynamicStoreKeyCreateNetworkServiceEntity(kCFAllocatorDefault, kSCDynamicStoreDomainSetup,
                                                              CFSTR("[^/]+"), kSCEntNetIPv4);
        err = MoreSCError(pattern);
    }
    if (err == 0) {
        keys = SCDynamicStoreCopyKeyList(store, pattern);
        err = MoreSCError(keys);
    }
    if (err == 0) {
        serviceIDs = CFArrayCreateMutable(kCFAllocatorDefault, CFArrayGetCount(keys), &kCFTypeArrayCallBacks);
        if (serviceIDs == nullptr) {
            err = coreFoundationUnknownErr;
        }
    }
    if (err == 0) {
        err = AppendServiceIDForEachDHCPDynamicStoreKey(store, keys, serviceIDs);
    }
    CFQRelease(pattern);
    CFQRelease(keys);
    CFQRelease(store);
    HandOverOrNull<CFArrayRef>(err, serviceIDs, activeDHCP);
    return err;
}

OSStatus MoreSCDHCPRelease(CFStringRef serviceID) {
    OSStatus err = 0;
    if (serviceID == nullptr) {
        err = paramErr;
    }
    // Two sessions, since the system gives the lease up only when it sees the entity off.
    if (err == 0) {
        err = SetIPv4Active(serviceID, false);
    }
    if (err == 0) {
        err = SetIPv4Active(serviceID, true);
    }
    return err;
}

OSStatus MoreSCFindSetByUserVisibleNameAndCopyID(CFStringRef userVisibleName, CFStringRef* setID) {
    CFArrayRef setIDs = nullptr;
    CFStringRef foundID = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0 && userVisibleName == nullptr) {
        err = paramErr;
    }
    if (err == 0) {
        err = MoreSCCopySetIDs(&setIDs, nullptr);
    }
    if (err == 0) {
        const CFIndex count = CFArrayGetCount(setIDs);
        for (CFIndex i = 0; err == 0 && foundID == nullptr && i < count; ++i) {
            auto* thisID = static_cast<CFStringRef>(CFArrayGetValueAtIndex(setIDs, i));
            CFStringRef thisName = nullptr;
            err = MoreSCCopyUserVisibleNameOfSet(thisID, &thisName);
            if (err == 0 && CFEqual(thisName, userVisibleName)) {
                foundID = static_cast<CFStringRef>(CFQRetain(thisID));
            }
            CFQRelease(thisName);
        }
    }
    CFQRelease(setIDs);
    MoreSCClose(&err, false);
    if (foundID != nullptr) {
        HandOver(err, foundID, setID);
    }
    return err;
}

OSStatus MoreSCMakeNewDialupSet(CFStringRef modemBSDName, CFStringRef userVisibleName,
                                const MoreSCModemDigest* modemDigest, const MoreSCPPPDigest* pppDigest,
                                const MoreSCIPv4Digest* ipv4Digest, const MoreSCDNSDigest* dnsDigest,
                                CFStringRef* newSetID) {
    CFStringRef portName = nullptr;
    CFStringRef setID = nullptr;
    CFArrayRef serviceIDs = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0) {
        if (modemBSDName != nullptr) {
            portName = static_cast<CFStringRef>(CFQRetain(modemBSDName));
        } else {
            err = CopyDefaultModemPortBSDName(&portName);
        }
    }
    if (err == 0) {
        err = MoreSCNewSet(userVisibleName, &setID);
    }
    if (err == 0) {
        err = MoreSCCopyServiceIDs(setID, &serviceIDs, nullptr);
    }
    if (err == 0) {
        const CFIndex count = CFArrayGetCount(serviceIDs);
        for (CFIndex i = 0; err == 0 && i < count; ++i) {
            auto* serviceID = static_cast<CFStringRef>(CFArrayGetValueAtIndex(serviceIDs, i));
            CFStringRef bsdName = nullptr;
            err = MoreSCCopyBSDNameOfService(setID, serviceID, &bsdName);
            if (err == 0) {
                if (portName != nullptr && CFEqual(bsdName, portName)) {
                    err = SetupModemService(setID, serviceID, modemDigest, pppDigest, ipv4Digest, dnsDigest);
                } else {
                    err = MoreSCSetServiceActive(setID, serviceID, false);
                }
            }
            CFQRelease(bsdName);
        }
    }
    if (err != 0 && setID != nullptr) {
        MoreSCDeleteSet(setID);
        CFQRelease(setID);
        setID = nullptr;
    }
    CFQRelease(portName);
    CFQRelease(serviceIDs);
    MoreSCClose(&err, true);
    HandOverOrNull(err, setID, newSetID);
    return err;
}
