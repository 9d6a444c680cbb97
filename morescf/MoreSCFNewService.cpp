// A service for a port: what it holds at first.
#include <cstring>
#include <initializer_list>

#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCF.h"
#include "morescf/MoreSCFCCLScanner.h"
#include "morescf/MoreSCFDigest.h"
#include "morescf/MoreSCFKeys.h"
#include "morescf/MoreSCFSteps.h"
#include "morescf/MoreSCFTree.h"
#include "morescf/MoreSCFValues.h"
#include "platform/CoreServices.h"

namespace {

struct NewService {
    CFStringRef setID;
    CFStringRef serviceID;
    CFDictionaryRef port;
    bool isEthernetLike;  // the port has a hardware address
    UInt32 systemVersion;
};

OSStatus AddEntityToService(CFStringRef setID, CFStringRef serviceID, CFStringRef protocol,
                            const MoreSCDigest* digest) {
    CFMutableDictionaryRef entity = nullptr;
    const OSStatus err = InTurn([&] { return MoreSCCreateEntity(protocol, digest, &entity); },
                                [&] { return MoreSCNewEntity(setID, serviceID, protocol, entity); });
    CFQRelease(entity);
    return err;
}

// The same with what fill puts into a digest of zeros.
template <class Fill>
OSStatus AddEntity(const NewService& service, CFStringRef protocol, Fill fill) {
    MoreSCDigest digest;
    // An initializer would zero the first member of the union alone.
    std::memset(&digest, 0, sizeof(digest));
    fill(&digest);
    return AddEntityToService(service.setID, service.serviceID, protocol, &digest);
}

// The entities, a function each.

OSStatus AddInterfaceEntity(const NewService& service) {
    return AddEntity(service, kInterfaceProtocol, [&service](MoreSCDigest* digest) {
        digest->interface.deviceName = GetStringValue(service.port, kDeviceNameKey);
        digest->interface.userDefinedName = GetStringValue(service.port, kUserDefinedNameKey);
        digest->interface.hardware = GetStringValue(service.port, kHardwareKey);
        digest->interface.type = GetStringValue(service.port, kTypeKey);
        if (!service.isEthernetLike) {
            digest->interface.subType = GetStringValue(service.port, kSubTypeKey);
        }
        digest->interface.variant = GetStringValue(service.port, kHardwareVariantKey);
    });
}

OSStatus AddProxiesEntity(const NewService& service) {
    return AddEntity(service, kProxiesProtocol, [&service](MoreSCDigest* digest) {
        digest->proxies.ftpPassive = service.systemVersion >= kVersionTenTwo;
    });
}

OSStatus AddAppleTalkEntity(const NewService& service) {
    OSStatus err = 0;
    // Runs over Ethernet and not over a line, and is there to be switched on.
    if (service.isEthernetLike) {
        err = AddEntity(service, kAppleTalkProtocol,
                        [](MoreSCDigest* digest) { digest->appleTalk.configMethod = CFSTR("Node"); });
    }
    return err;
}

OSStatus AddDNSEntity(const NewService& service) {
    return AddEntity(service, kDNSProtocol, [](MoreSCDigest*) {});
}

// "Manual" without an address: a card does nothing with IPv4 before somebody configures it.
OSStatus AddIPv4Entity(const NewService& service) {
    return AddEntity(service, kIPv4Protocol, [&service](MoreSCDigest* digest) {
        CFStringRef ofCard = service.systemVersion >= kVersionTenOneThree ? CFSTR("Manual") : CFSTR("DHCP");
        digest->ipv4.configMethod = service.isEthernetLike ? ofCard : CFSTR("PPP");
    });
}

OSStatus AddPPPEntityToService(CFStringRef setID, CFStringRef serviceID, Boolean isPPPoE) {
    MoreSCPPPDigest digest = {};
    CFMutableDictionaryRef entity = nullptr;
    digest.active = !isPPPoE;
    digest.options = MoreSCGetDefaultPPPOptions(isPPPoE);
    const OSStatus err = InTurn([&] { return MoreSCCreatePPPEntity(&digest, &entity); },
                                [&] { return MoreSCNewEntity(setID, serviceID, kPPPProtocol, entity); });
    CFQRelease(entity);
    return err;
}

OSStatus AddPPPEntity(const NewService& service) {
    return AddPPPEntityToService(service.setID, service.serviceID, service.isEthernetLike);
}

OSStatus FindDefaultModemScriptAndCopyName(CFStringRef* name) {
    CFArrayRef scripts = nullptr;
    CFIndex index = 0;
    OSStatus err = MoreSCCreateCCLArray(&scripts, &index);
    if (err == 0) {
        *name = CFArrayGetCount(scripts) > 0
                    ? static_cast<CFStringRef>(Retained(CFArrayGetValueAtIndex(scripts, index)))
                    : CFStringCreateWithCString(kCFAllocatorDefault, "", kCFStringEncodingASCII);
        err = ErrorIfMissing(*name);
    }
    CFQRelease(scripts);
    return err;
}

OSStatus AddModemEntity(const NewService& service) {
    CFStringRef script = nullptr;
    OSStatus err = FindDefaultModemScriptAndCopyName(&script);
    if (err == 0) {
        err = AddEntity(service, kModemProtocol, [script](MoreSCDigest* digest) {
            digest->modem = kMoreSCModemDigestDefault;
            // On for a new service, whatever the defaults say.
            digest->modem.dataCompressionErrorCorrection = true;
            digest->modem.speaker = true;
            digest->modem.waitForDialTone = true;
            digest->modem.connectionScript = script;
        });
    }
    CFQRelease(script);
    return err;
}

// "AirPort" or "Ethernet".
OSStatus AddCardEntity(const NewService& service) {
    UInt8 macAddress[6];
    const bool isAirPort = HasStringValue(service.port, kHardwareKey, kAirPortProtocol);
    OSStatus err = MoreSCFStringToMacAddress(GetStringValue(service.port, kMACAddressKey), macAddress);
    if (err == 0) {
        err = AddEntity(service, isAirPort ? kAirPortProtocol : kEthernetProtocol, [&](MoreSCDigest* digest) {
            std::memcpy(isAirPort ? digest->airPort.macAddress : digest->ethernet.macAddress, macAddress,
                        sizeof(macAddress));
        });
    }
    return err;
}

OSStatus AddHardwareEntity(const NewService& service) {
    return service.isEthernetLike ? AddCardEntity(service) : AddModemEntity(service);
}

// Everything that a new service holds, in this order.
OSStatus AddEntities(const NewService& service) {
    OSStatus err = 0;
    for (auto* add : {AddInterfaceEntity, AddProxiesEntity, AddAppleTalkEntity, AddDNSEntity, AddIPv4Entity,
                      AddPPPEntity, AddHardwareEntity}) {
        if (err == 0) {
            err = add(service);
        }
    }
    return err;
}

}  // namespace

OSStatus MoreSCNewService(CFStringRef setID, CFDictionaryRef portDict, CFStringRef* newServiceID) {
    CFStringRef serviceID = nullptr;
    CFStringRef servicePath = nullptr;
    const UInt32 version = GetSystemVersion();
    OSStatus err = InTurn(
        OpenSession, [&] { return ErrorIfNotGiven(portDict); },
        [&] { return MakeNewSeAndCopyIDAndPath(kNetworkServicesKey, &serviceID, &servicePath); },
        [&] { return AddServiceToSet(setID, serviceID); },
        [&] { return MoreSCRenameService(setID, serviceID, GetStringValue(portDict, kUserDefinedNameKey)); });
    if (err == 0) {
        const bool isEthernetLike = CFDictionaryContainsKey(portDict, kMACAddressKey);
        err = AddEntities({setID, serviceID, portDict, isEthernetLike, version});
    }
    // Its link, its place in the order and, as nobody lists it any more, the service.
    if (err != 0 && serviceID != nullptr) {
        MoreSCDeleteService(setID, serviceID);
    }
    CFQRelease(servicePath);
    MoreSCClose(&err, true);
    HandOver(err, serviceID, newServiceID);
    return err;
}
