// A service for a port: what it holds at first.
#include <cstring>

#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCF.h"
#include "morescf/MoreSCFCCLScanner.h"
#include "morescf/MoreSCFKeys.h"
#include "morescf/MoreSCFTree.h"
#include "morescf/MoreSCFValues.h"
#include "platform/CoreServices.h"

namespace {

struct SystemVersion {
    bool tenOneThreeOrLater;
    bool tenTwoOrLater;
};

// A version that cannot be had counts as an old one.
SystemVersion GetSystemVersion() {
    SInt32 version = 0;
    const bool known = Gestalt(gestaltSystemVersion, &version) == noErr;
    return {.tenOneThreeOrLater = known && static_cast<UInt32>(version) > 0x1012,
            .tenTwoOrLater = known && static_cast<UInt32>(version) > 0x101F};
}

OSStatus AddEntityToService(CFStringRef setID, CFStringRef serviceID, CFStringRef protocol,
                            const MoreSCDigest* digest) {
    CFMutableDictionaryRef entity = nullptr;
    OSStatus err = MoreSCCreateEntity(protocol, digest, &entity);
    if (err == 0) {
        err = MoreSCNewEntity(setID, serviceID, protocol, entity);
    }
    CFQRelease(entity);
    return err;
}

// The entities, a function each. Ethernet-like ports are those with a hardware address.

bool IsEthernetLike(CFDictionaryRef portDict) {
    return CFDictionaryContainsKey(portDict, kMACAddressKey);
}

MoreSCDigest ZeroedDigest() {
    MoreSCDigest digest;
    std::memset(&digest, 0, sizeof(digest));
    return digest;
}

OSStatus AddInterfaceEntity(CFStringRef setID, CFStringRef serviceID, CFDictionaryRef portDict) {
    MoreSCDigest digest = ZeroedDigest();
    digest.interface.deviceName = GetStringValue(portDict, kDeviceNameKey);
    digest.interface.userDefinedName = GetStringValue(portDict, kUserDefinedNameKey);
    digest.interface.hardware = GetStringValue(portDict, kHardwareKey);
    digest.interface.type = GetStringValue(portDict, kTypeKey);
    if (!IsEthernetLike(portDict)) {
        digest.interface.subType = GetStringValue(portDict, kSubTypeKey);
    }
    digest.interface.variant = GetStringValue(portDict, kHardwareVariantKey);
    return AddEntityToService(setID, serviceID, kInterfaceProtocol, &digest);
}

OSStatus AddProxiesEntity(CFStringRef setID, CFStringRef serviceID, SystemVersion version) {
    MoreSCDigest digest = ZeroedDigest();
    digest.proxies.ftpPassive = version.tenTwoOrLater;
    return AddEntityToService(setID, serviceID, kProxiesProtocol, &digest);
}

OSStatus AddAppleTalkEntity(CFStringRef setID, CFStringRef serviceID) {
    MoreSCDigest digest = ZeroedDigest();
    digest.appleTalk.active = false;
    digest.appleTalk.configMethod = CFSTR("Node");
    return AddEntityToService(setID, serviceID, kAppleTalkProtocol, &digest);
}

OSStatus AddDNSEntity(CFStringRef setID, CFStringRef serviceID) {
    const MoreSCDigest digest = ZeroedDigest();
    return AddEntityToService(setID, serviceID, kDNSProtocol, &digest);
}

OSStatus AddIPv4Entity(CFStringRef setID, CFStringRef serviceID, bool isEthernetLike, SystemVersion version) {
    MoreSCDigest digest = ZeroedDigest();
    if (!isEthernetLike) {
        digest.ipv4.configMethod = CFSTR("PPP");
    } else if (version.tenOneThreeOrLater) {
        digest.ipv4.configMethod = CFSTR("Manual");
    } else {
        digest.ipv4.configMethod = CFSTR("DHCP");
    }
    return AddEntityToService(setID, serviceID, kIPv4Protocol, &digest);
}

OSStatus AddPPPEntityToService(CFStringRef setID, CFStringRef serviceID, Boolean isPPPoE) {
    MoreSCPPPDigest digest = {};
    CFMutableDictionaryRef entity = nullptr;
    digest.active = !isPPPoE;
    digest.options = MoreSCGetDefaultPPPOptions(isPPPoE);
    OSStatus err = MoreSCCreatePPPEntity(&digest, &entity);
    if (err == 0) {
        err = MoreSCNewEntity(setID, serviceID, kPPPProtocol, entity);
    }
    CFQRelease(entity);
    return err;
}

OSStatus FindDefaultModemScriptAndCopyName(CFStringRef* name) {
    CFArrayRef scripts = nullptr;
    CFIndex index = 0;
    OSStatus err = MoreSCCreateCCLArray(&scripts, &index);
    if (err == 0) {
        if (CFArrayGetCount(scripts) > 0) {
            *name = static_cast<CFStringRef>(CFQRetain(CFArrayGetValueAtIndex(scripts, index)));
        } else {
            *name = CFStringCreateWithCString(kCFAllocatorDefault, "", kCFStringEncodingASCII);
        }
        if (*name == nullptr) {
            err = coreFoundationUnknownErr;
        }
    }
    CFQRelease(scripts);
    return err;
}

OSStatus AddModemEntity(CFStringRef setID, CFStringRef serviceID) {
    CFStringRef script = nullptr;
    MoreSCDigest digest = ZeroedDigest();
    OSStatus err = FindDefaultModemScriptAndCopyName(&script);
    if (err == 0) {
        digest.modem = kMoreSCModemDigestDefault;
        digest.modem.dataCompressionErrorCorrection = true;
        digest.modem.speaker = true;
        digest.modem.waitForDialTone = true;
        digest.modem.connectionScript = script;
        err = AddEntityToService(setID, serviceID, kModemProtocol, &digest);
    }
    CFQRelease(script);
    return err;
}

// "AirPort" or "Ethernet".
OSStatus AddCardEntity(CFStringRef setID, CFStringRef serviceID, CFDictionaryRef portDict) {
    MoreSCDigest digest = ZeroedDigest();
    const bool isAirPort = HasStringValue(portDict, kHardwareKey, kAirPortProtocol);
    OSStatus err =
        MoreSCFStringToMacAddress(GetStringValue(portDict, kMACAddressKey),
                                  isAirPort ? digest.airPort.macAddress : digest.ethernet.macAddress);
    if (err == 0) {
        err = AddEntityToService(setID, serviceID, isAirPort ? kAirPortProtocol : kEthernetProtocol, &digest);
    }
    return err;
}

// Everything that a new service holds, in this order.
OSStatus AddEntitiesForPort(CFStringRef setID, CFStringRef serviceID, CFDictionaryRef portDict,
                            SystemVersion version) {
    const bool isEthernetLike = IsEthernetLike(portDict);
    OSStatus err = AddInterfaceEntity(setID, serviceID, portDict);
    if (err == 0) {
        err = AddProxiesEntity(setID, serviceID, version);
    }
    if (err == 0 && isEthernetLike) {
        err = AddAppleTalkEntity(setID, serviceID);
    }
    if (err == 0) {
        err = AddDNSEntity(setID, serviceID);
    }
    if (err == 0) {
        err = AddIPv4Entity(setID, serviceID, isEthernetLike, version);
    }
    if (err == 0) {
        err = AddPPPEntityToService(setID, serviceID, isEthernetLike);
    }
    if (err == 0) {
        err = isEthernetLike ? AddCardEntity(setID, serviceID, portDict) : AddModemEntity(setID, serviceID);
    }
    return err;
}

}  // namespace

OSStatus MoreSCNewService(CFStringRef setID, CFDictionaryRef portDict, CFStringRef* newServiceID) {
    CFStringRef serviceID = nullptr;
    CFStringRef servicePath = nullptr;
    const SystemVersion version = GetSystemVersion();
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0 && portDict == nullptr) {
        err = paramErr;
    }
    if (err == 0) {
        err = MakeNewSeAndCopyIDAndPath(kNetworkServicesKey, &serviceID, &servicePath);
    }
    if (err == 0) {
        err = AddServiceToSet(setID, serviceID);
    }
    if (err == 0) {
        err = MoreSCRenameService(setID, serviceID, GetStringValue(portDict, kUserDefinedNameKey));
    }
    if (err == 0) {
        err = AddEntitiesForPort(setID, serviceID, portDict, version);
    }
    if (err != 0 && serviceID != nullptr) {
        MoreSCDeleteService(setID, serviceID);
    }
    CFQRelease(servicePath);
    MoreSCClose(&err, true);
    HandOver(err, serviceID, newServiceID);
    return err;
}
