#include "morescf/MoreSCFHelpers.h"

#include <cstring>

#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCF.h"
#include "morescf/MoreSCFKeys.h"
#include "morescf/MoreSCFPortScanner.h"
#include "morescf/MoreSCFSteps.h"
#include "morescf/MoreSCFValues.h"
#include "platform/CoreServices.h"

namespace {

// A live record that does not tell how it was configured.
constexpr OSStatus kNoConfigMethodErr = -2;

// Takes the step for each service that the location lists, until one fails: the status of that one.
template <class Step>
OSStatus ForEachService(CFStringRef setID, Step step) {
    CFArrayRef serviceIDs = nullptr;
    const OSStatus err = InTurn([&] { return MoreSCCopyServiceIDs(setID, &serviceIDs, nullptr); },
                                [&] { return ForEach<CFStringRef>(serviceIDs, step); });
    CFQRelease(serviceIDs);
    return err;
}

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

// The ID in "Setup:/Network/Service/<service ID>/IPv4".
OSStatus AppendServiceIDOfKey(CFStringRef key, CFMutableArrayRef serviceIDs) {
    CFArrayRef components = CFStringCreateArrayBySeparatingStrings(kCFAllocatorDefault, key, CFSTR("/"));
    const bool hasID = components != nullptr && CFArrayGetCount(components) > 3;
    if (hasID) {
        CFArrayAppendValue(serviceIDs, CFArrayGetValueAtIndex(components, 3));
    }
    CFQRelease(components);
    return hasID ? 0 : coreFoundationUnknownErr;
}

OSStatus AppendServiceIDForEachDHCPDynamicStoreKey(SCDynamicStoreRef store, CFArrayRef keys,
                                                   CFMutableArrayRef serviceIDs) {
    return ForEach<CFTypeRef>(keys, [store, serviceIDs](CFTypeRef entry) {
        auto* key = IsString(entry) ? static_cast<CFStringRef>(entry) : nullptr;
        Boolean usesDHCP = false;
        OSStatus err = ErrorIfMissing(key);
        if (err == 0) {
            err = IsSetupConfiguredToUseDHCP(store, key, &usesDHCP);
        }
        if (err == 0 && usesDHCP) {
            err = AppendServiceIDOfKey(key, serviceIDs);
        }
        return err;
    });
}

// The output stays as it is when there is no modem. The ports are sorted, so the first one is the default.
OSStatus CopyDefaultModemPortBSDName(CFStringRef* bsdName) {
    CFArrayRef ports = nullptr;
    CFStringRef found = nullptr;
    bool isFound = false;
    OSStatus err = MoreSCCreatePortArray(&ports);
    if (err == 0) {
        err = ForEach<CFDictionaryRef>(ports, [&](CFDictionaryRef port) {
            if (!isFound && HasStringValue(port, kHardwareKey, kModemProtocol)) {
                isFound = true;
                found = Retained(GetStringValue(port, kDeviceNameKey));
            }
            return OSStatus{0};
        });
    }
    if (found != nullptr) {
        HandOver(err, found, bsdName);
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
    const OSStatus err = InTurn([&] { return MoreSCCreateEntity(protocol, &digest, &entity); },
                                [&] { return MoreSCSetEntity(setID, serviceID, protocol, entity); });
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
    OSStatus err =
        InTurn(OpenSession, [&] { return MoreSCSetEntityActive(nullptr, serviceID, kIPv4Protocol, active); });
    MoreSCClose(&err, true);
    return err;
}

}  // namespace

OSStatus MoreSCIsAppleTalkActive(CFStringRef setID, Boolean* active) {
    *active = false;
    OSStatus err = OpenSession();
    if (err == 0) {
        err = ForEachService(setID, [setID, active](CFStringRef serviceID) {
            Boolean isServiceActive = false;
            Boolean isEntityActive = false;
            // The first service that answers the question decides: those behind it are not asked.
            OSStatus stepErr = *active ? 0 : MoreSCIsServiceActive(setID, serviceID, &isServiceActive);
            if (stepErr == 0 && isServiceActive) {
                stepErr = MoreSCIsEntityActive(setID, serviceID, kAppleTalkProtocol, &isEntityActive);
            }
            *active = *active || isEntityActive;
            return stepErr;
        });
    }
    MoreSCClose(&err, false);
    return err;
}

OSStatus MoreSCSetAppleTalkActive(CFStringRef setID, Boolean active) {
    bool madeChanges = false;
    OSStatus err = OpenSession();
    if (err == 0) {
        err = ForEachService(setID, [setID, active, &madeChanges](CFStringRef serviceID) {
            OSStatus stepErr = 0;
            Boolean isActive = false;
            // Services that are off are switched as well, so that they come back as wanted; one without
            // AppleTalk is skipped.
            if (MoreSCIsEntityActive(setID, serviceID, kAppleTalkProtocol, &isActive) == 0 &&
                (isActive != 0) != (active != 0)) {
                stepErr = MoreSCSetEntityActive(setID, serviceID, kAppleTalkProtocol, active);
                madeChanges = madeChanges || stepErr == 0;
            }
            return stepErr;
        });
    }
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
        err = ErrorIfMissing(serviceIDs);
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
    // Two sessions, since the system gives the lease up only when it sees the entity off.
    return InTurn([&] { return ErrorIfNotGiven(serviceID); }, [&] { return SetIPv4Active(serviceID, false); },
                  [&] { return SetIPv4Active(serviceID, true); });
}

OSStatus MoreSCFindSetByUserVisibleNameAndCopyID(CFStringRef userVisibleName, CFStringRef* setID) {
    CFArrayRef setIDs = nullptr;
    CFStringRef foundID = nullptr;
    OSStatus err = InTurn(
        OpenSession, [&] { return ErrorIfNotGiven(userVisibleName); },
        [&] { return MoreSCCopySetIDs(&setIDs, nullptr); });
    if (err == 0) {
        err = ForEach<CFStringRef>(setIDs, [userVisibleName, &foundID](CFStringRef thisID) {
            CFStringRef thisName = nullptr;
            // A nameless location fails the search, but not behind the one that was found.
            const OSStatus stepErr =
                foundID == nullptr ? MoreSCCopyUserVisibleNameOfSet(thisID, &thisName) : OSStatus{0};
            if (thisName != nullptr && CFEqual(thisName, userVisibleName)) {
                foundID = Retained(thisID);
            }
            CFQRelease(thisName);
            return stepErr;
        });
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
    CFStringRef portName = Retained(modemBSDName);
    CFStringRef setID = nullptr;
    OSStatus err = OpenSession();
    if (err == 0 && portName == nullptr) {
        err = CopyDefaultModemPortBSDName(&portName);
    }
    if (err == 0) {
        err = MoreSCNewSet(userVisibleName, &setID);
    }
    if (err == 0) {
        err = ForEachService(setID, [&](CFStringRef serviceID) {
            CFStringRef bsdName = nullptr;
            OSStatus stepErr = MoreSCCopyBSDNameOfService(setID, serviceID, &bsdName);
            if (stepErr == 0 && portName != nullptr && CFEqual(bsdName, portName)) {
                stepErr = SetupModemService(setID, serviceID, modemDigest, pppDigest, ipv4Digest, dnsDigest);
            } else if (stepErr == 0) {
                stepErr = MoreSCSetServiceActive(setID, serviceID, false);
            }
            CFQRelease(bsdName);
            return stepErr;
        });
    }
    if (err != 0 && setID != nullptr) {
        MoreSCDeleteSet(setID);
    }
    CFQRelease(portName);
    MoreSCClose(&err, true);
    HandOverOrNull(err, setID, newSetID);
    return err;
}
