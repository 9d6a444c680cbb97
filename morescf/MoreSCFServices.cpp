#include <cstring>

#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCF.h"
#include "morescf/MoreSCFCCLScanner.h"
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

OSStatus AddServiceToSet(CFStringRef setID, CFStringRef serviceID) {
    CFMutableDictionaryRef services = nullptr;
    CFMutableArrayRef order = nullptr;
    OSStatus err = MoreSCCopyServicesDictMutable(setID, &services, &order);
    if (err == 0) {
        err = AddServiceLinkToDict(serviceID, services);
    }
    if (err == 0) {
        CFArrayAppendValue(order, serviceID);
        err = MoreSCSetServicesDict(setID, services, order);
    }
    CFQRelease(services);
    CFQRelease(order);
    return err;
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

OSStatus AddPPPEntityToService(CFStringRef setID, CFStringRef serviceID, Boolean isPPPoE) {
    MoreSCPPPDigest digest = {};
    CFMutableDictionaryRef entity = nullptr;
    digest.active = !isPPPoE;
    digest.options = MoreSCGetDefaultPPPOptions(isPPPoE);
    OSStatus err = MoreSCCreatePPPEntity(&digest, &entity);
    if (err == 0) {
        err = MoreSCNewEntity(setID, serviceID, CFSTR("PPP"), entity);
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

OSStatus AddInterfaceEntity(CFStringRef setID, CFStringRef serviceID, CFDictionaryRef portDict,
                            bool portIsEthernetLike) {
    MoreSCDigest digest;
    std::memset(&digest, 0, sizeof(digest));
    digest.interface.deviceName = GetStringValue(portDict, CFSTR("DeviceName"));
    digest.interface.userDefinedName = GetStringValue(portDict, CFSTR("UserDefinedName"));
    digest.interface.hardware = GetStringValue(portDict, CFSTR("Hardware"));
    digest.interface.type = GetStringValue(portDict, CFSTR("Type"));
    if (!portIsEthernetLike) {
        digest.interface.subType = GetStringValue(portDict, CFSTR("SubType"));
    }
    digest.interface.variant = GetStringValue(portDict, CFSTR("HardwareVariant"));
    return AddEntityToService(setID, serviceID, CFSTR("Interface"), &digest);
}

// "AirPort", "Ethernet" or "Modem".
OSStatus AddHardwareEntity(CFStringRef setID, CFStringRef serviceID, CFDictionaryRef portDict,
                           bool portIsEthernetLike) {
    OSStatus err = 0;
    MoreSCDigest digest;
    CFStringRef protocol = nullptr;
    CFStringRef script = nullptr;
    std::memset(&digest, 0, sizeof(digest));
    if (portIsEthernetLike) {
        CFStringRef hardware = GetStringValue(portDict, CFSTR("Hardware"));
        CFStringRef address = GetStringValue(portDict, CFSTR("MACAddress"));
        if (hardware != nullptr && CFEqual(hardware, CFSTR("AirPort"))) {
            protocol = CFSTR("AirPort");
            err = MoreSCFStringToMacAddress(address, digest.airPort.macAddress);
        } else {
            protocol = CFSTR("Ethernet");
            err = MoreSCFStringToMacAddress(address, digest.ethernet.macAddress);
        }
    } else {
        protocol = CFSTR("Modem");
        err = FindDefaultModemScriptAndCopyName(&script);
        digest.modem = kMoreSCModemDigestDefault;
        digest.modem.dataCompressionErrorCorrection = true;
        digest.modem.speaker = true;
        digest.modem.waitForDialTone = true;
        digest.modem.connectionScript = script;
    }
    if (err == 0) {
        err = AddEntityToService(setID, serviceID, protocol, &digest);
    }
    CFQRelease(script);
    return err;
}

// Everything that a new service holds, in this order.
OSStatus AddEntitiesForPort(CFStringRef setID, CFStringRef serviceID, CFDictionaryRef portDict,
                            SystemVersion version) {
    MoreSCDigest digest;
    const bool portIsEthernetLike = CFDictionaryContainsKey(portDict, CFSTR("MACAddress"));
    OSStatus err = AddInterfaceEntity(setID, serviceID, portDict, portIsEthernetLike);
    if (err == 0) {
        std::memset(&digest, 0, sizeof(digest));
        digest.proxies.ftpPassive = version.tenTwoOrLater;
        err = AddEntityToService(setID, serviceID, CFSTR("Proxies"), &digest);
    }
    if (err == 0 && portIsEthernetLike) {
        std::memset(&digest, 0, sizeof(digest));
        digest.appleTalk.active = false;
        digest.appleTalk.configMethod = CFSTR("Node");
        err = AddEntityToService(setID, serviceID, CFSTR("AppleTalk"), &digest);
    }
    if (err == 0) {
        std::memset(&digest, 0, sizeof(digest));
        err = AddEntityToService(setID, serviceID, CFSTR("DNS"), &digest);
    }
    if (err == 0) {
        std::memset(&digest, 0, sizeof(digest));
        if (!portIsEthernetLike) {
            digest.ipv4.configMethod = CFSTR("PPP");
        } else if (version.tenOneThreeOrLater) {
            digest.ipv4.configMethod = CFSTR("Manual");
        } else {
            digest.ipv4.configMethod = CFSTR("DHCP");
        }
        err = AddEntityToService(setID, serviceID, CFSTR("IPv4"), &digest);
    }
    if (err == 0) {
        err = AddPPPEntityToService(setID, serviceID, portIsEthernetLike);
    }
    if (err == 0) {
        err = AddHardwareEntity(setID, serviceID, portDict, portIsEthernetLike);
    }
    return err;
}

}  // namespace

OSStatus MoreSCCopyServicesDict(CFStringRef setID, CFDictionaryRef* servicesDict, CFArrayRef* serviceOrder) {
    SCPreferencesRef session = nullptr;
    CFStringRef servicesPath = nullptr;
    CFStringRef orderPath = nullptr;
    CFDictionaryRef services = nullptr;
    CFArrayRef order = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    session = MoreSCGetSCPreferencesRef();
    if (err == 0 && servicesDict != nullptr) {
        err = CopySetServicesPath(setID, &servicesPath);
        if (err == 0) {
            services =
                static_cast<CFDictionaryRef>(CFQRetain(SCPreferencesPathGetValue(session, servicesPath)));
            err = MoreSCError(services);
        }
    }
    if (err == 0 && serviceOrder != nullptr) {
        err = CopySetServiceOrderPath(setID, &orderPath);
        if (err == 0) {
            CFDictionaryRef globalIPv4 = SCPreferencesPathGetValue(session, orderPath);
            err = MoreSCError(globalIPv4);
            if (err == 0) {
                order = static_cast<CFArrayRef>(CFQRetain(GetArrayValue(globalIPv4, CFSTR("ServiceOrder"))));
                if (order == nullptr) {
                    err = coreFoundationUnknownErr;
                }
            }
        }
    }
    CFQRelease(servicesPath);
    CFQRelease(orderPath);
    MoreSCClose(&err, false);
    HandOverOrNull(err, services, servicesDict);
    HandOverOrNull(err, order, serviceOrder);
    return err;
}

OSStatus MoreSCCopyServicesDictMutable(CFStringRef setID, CFMutableDictionaryRef* servicesDict,
                                       CFMutableArrayRef* serviceOrder) {
    CFDictionaryRef services = nullptr;
    CFArrayRef order = nullptr;
    CFMutableDictionaryRef servicesCopy = nullptr;
    CFMutableArrayRef orderCopy = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0) {
        err = MoreSCCopyServicesDict(setID, &services, &order);
    }
    if (err == 0 && servicesDict != nullptr) {
        servicesCopy = CFDictionaryCreateMutableCopy(kCFAllocatorDefault, 0, services);
        if (servicesCopy == nullptr) {
            err = coreFoundationUnknownErr;
        }
    }
    if (err == 0 && serviceOrder != nullptr) {
        orderCopy = CFArrayCreateMutableCopy(kCFAllocatorDefault, 0, order);
        if (orderCopy == nullptr) {
            err = coreFoundationUnknownErr;
        }
    }
    CFQRelease(services);
    CFQRelease(order);
    MoreSCClose(&err, false);
    HandOver(err, servicesCopy, servicesDict);
    HandOver(err, orderCopy, serviceOrder);
    return err;
}

OSStatus MoreSCSetServicesDict(CFStringRef setID, CFDictionaryRef servicesDict, CFArrayRef serviceOrder) {
    CFStringRef servicesPath = nullptr;
    CFStringRef orderPath = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0 && servicesDict != nullptr) {
        err = CopySetServicesPath(setID, &servicesPath);
        if (err == 0) {
            err = MoreSCErrorBoolean(
                SCPreferencesPathSetValue(MoreSCGetSCPreferencesRef(), servicesPath, servicesDict));
        }
    }
    if (err == 0 && serviceOrder != nullptr) {
        err = CopySetServiceOrderPath(setID, &orderPath);
        if (err == 0) {
            err = PreferencesPathSetProperty(orderPath, CFSTR("ServiceOrder"), serviceOrder);
        }
    }
    CFQRelease(servicesPath);
    CFQRelease(orderPath);
    MoreSCClose(&err, true);
    return err;
}

OSStatus MoreSCCopyServiceIDs(CFStringRef setID, CFArrayRef* localServiceIDs,
                              CFArrayRef* resolvedServiceIDs) {
    CFArrayRef order = nullptr;
    CFMutableArrayRef localIDs = nullptr;
    CFMutableArrayRef resolvedIDs = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0) {
        err = MoreSCCopyServicesDict(setID, nullptr, &order);
    }
    if (err == 0 && localServiceIDs != nullptr) {
        err = CFQArrayCreateMutable(&localIDs);
    }
    if (err == 0 && resolvedServiceIDs != nullptr) {
        err = CFQArrayCreateMutable(&resolvedIDs);
    }
    if (err == 0) {
        const CFIndex count = CFArrayGetCount(order);
        for (CFIndex i = 0; err == 0 && i < count; ++i) {
            CFTypeRef entry = CFArrayGetValueAtIndex(order, i);
            if (!IsString(entry)) {
                err = coreFoundationUnknownErr;
            }
            if (err == 0 && localIDs != nullptr) {
                CFArrayAppendValue(localIDs, entry);
            }
            if (err == 0 && resolvedIDs != nullptr) {
                CFStringRef path = nullptr;
                CFStringRef resolvedID = nullptr;
                err = CopyResolvedServicePath(setID, static_cast<CFStringRef>(entry), &path);
                if (err == 0) {
                    err = CopySeIDFromSePath(path, &resolvedID);
                }
                if (err == 0) {
                    CFArrayAppendValue(resolvedIDs, resolvedID);
                }
                CFQRelease(path);
                CFQRelease(resolvedID);
            }
        }
    }
    CFQRelease(order);
    MoreSCClose(&err, false);
    HandOver<CFArrayRef>(err, localIDs, localServiceIDs);
    HandOver<CFArrayRef>(err, resolvedIDs, resolvedServiceIDs);
    return err;
}

OSStatus MoreSCCopyUserVisibleNameOfService(CFStringRef setID, CFStringRef serviceID,
                                            CFStringRef* userVisibleName) {
    CFDictionaryRef service = nullptr;
    CFStringRef name = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0) {
        err = MoreSCCopyEntitiesDict(setID, serviceID, &service);
    }
    if (err == 0) {
        name = static_cast<CFStringRef>(CFQRetain(GetStringValue(service, CFSTR("UserDefinedName"))));
        if (name == nullptr) {
            err = coreFoundationUnknownErr;
        }
    }
    CFQRelease(service);
    MoreSCClose(&err, false);
    HandOver(err, name, userVisibleName);
    return err;
}

OSStatus MoreSCIsServiceActive(CFStringRef setID, CFStringRef serviceID, Boolean* active) {
    CFDictionaryRef service = nullptr;
    Boolean isActive = false;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0) {
        err = MoreSCCopyEntitiesDict(setID, serviceID, &service);
    }
    if (err == 0) {
        isActive = IsDictionaryActive(service);
    }
    CFQRelease(service);
    MoreSCClose(&err, false);
    if (err == 0) {
        *active = isActive;
    }
    return err;
}

OSStatus MoreSCSetServiceActive(CFStringRef setID, CFStringRef serviceID, Boolean active) {
    CFMutableDictionaryRef service = nullptr;
    Boolean changed = false;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0) {
        err = MoreSCCopyEntitiesDictMutable(setID, serviceID, &service);
    }
    if (err == 0) {
        err = SetDictionaryActive(service, active, &changed);
    }
    if (err == 0 && changed) {
        err = MoreSCSetEntitiesDict(setID, serviceID, service);
    }
    CFQRelease(service);
    MoreSCClose(&err, changed);
    return err;
}

OSStatus MoreSCCopyBSDNameOfService(CFStringRef setID, CFStringRef serviceID, CFStringRef* bsdName) {
    CFDictionaryRef interface = nullptr;
    CFStringRef name = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0) {
        err = MoreSCCopyEntity(setID, serviceID, CFSTR("Interface"), &interface);
    }
    if (err == 0) {
        name = static_cast<CFStringRef>(CFQRetain(GetStringValue(interface, CFSTR("DeviceName"))));
        if (name == nullptr) {
            err = coreFoundationUnknownErr;
        }
    }
    CFQRelease(interface);
    MoreSCClose(&err, false);
    HandOver(err, name, bsdName);
    return err;
}

OSStatus MoreSCNewService(CFStringRef setID, CFDictionaryRef portDict, CFStringRef* newServiceID) {
    CFStringRef serviceID = nullptr;
    CFStringRef servicePath = nullptr;
    const SystemVersion version = GetSystemVersion();
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0 && portDict == nullptr) {
        err = paramErr;
    }
    if (err == 0) {
        err = MakeNewSeAndCopyIDAndPath(CFSTR("NetworkServices"), &serviceID, &servicePath);
    }
    if (err == 0) {
        err = AddServiceToSet(setID, serviceID);
    }
    if (err == 0) {
        err = MoreSCRenameService(setID, serviceID, GetStringValue(portDict, CFSTR("UserDefinedName")));
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

OSStatus MoreSCDuplicateService(CFStringRef setID, CFStringRef serviceID, CFStringRef userVisibleName,
                                CFStringRef* newServiceID) {
    CFStringRef copyID = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0 && serviceID == nullptr) {
        err = paramErr;
    }
    if (err == 0) {
        err = DuplicateService(serviceID, &copyID);
    }
    if (err == 0) {
        err = AddServiceToSet(setID, copyID);
    }
    if (err == 0 && userVisibleName != nullptr) {
        err = MoreSCRenameService(setID, copyID, userVisibleName);
    }
    if (err != 0 && serviceID != nullptr) {
        DeleteUnreferencedServices();
    }
    MoreSCClose(&err, true);
    HandOver(err, copyID, newServiceID);
    return err;
}

OSStatus MoreSCDeleteService(CFStringRef setID, CFStringRef serviceID) {
    CFMutableDictionaryRef services = nullptr;
    CFMutableArrayRef order = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0 && serviceID == nullptr) {
        err = paramErr;
    }
    if (err == 0) {
        err = MoreSCCopyServicesDictMutable(setID, &services, &order);
    }
    if (err == 0) {
        CFDictionaryRemoveValue(services, serviceID);
        const CFIndex index =
            CFArrayGetFirstIndexOfValue(order, CFRangeMake(0, CFArrayGetCount(order)), serviceID);
        // A service that somebody linked without listing it is only unlinked.
        if (index != kCFNotFound) {
            CFArrayRemoveValueAtIndex(order, index);
        }
        err = MoreSCSetServicesDict(setID, services, order);
    }
    if (serviceID != nullptr) {
        const OSStatus err2 = DeleteUnreferencedServices();
        if (err == 0) {
            err = err2;
        }
    }
    CFQRelease(services);
    CFQRelease(order);
    MoreSCClose(&err, true);
    return err;
}

OSStatus MoreSCRenameService(CFStringRef setID, CFStringRef serviceID, CFStringRef userVisibleName) {
    CFMutableDictionaryRef service = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0 && userVisibleName == nullptr) {
        err = paramErr;
    }
    if (err == 0) {
        err = MoreSCCopyEntitiesDictMutable(setID, serviceID, &service);
    }
    if (err == 0) {
        CFDictionarySetValue(service, CFSTR("UserDefinedName"), userVisibleName);
        err = MoreSCSetEntitiesDict(setID, serviceID, service);
    }
    CFQRelease(service);
    MoreSCClose(&err, true);
    return err;
}

OSStatus DuplicateService(CFStringRef serviceID, CFStringRef* newServiceID) {
    SCPreferencesRef session = MoreSCGetSCPreferencesRef();
    CFStringRef servicePath = nullptr;
    CFStringRef newPath = nullptr;
    CFPropertyListRef copy = nullptr;
    OSStatus err = CreateServicePathWithServiceID(serviceID, &servicePath);
    if (err == 0) {
        err = MakeNewSeAndCopyIDAndPath(CFSTR("NetworkServices"), newServiceID, &newPath);
    }
    if (err == 0) {
        CFDictionaryRef service = SCPreferencesPathGetValue(session, servicePath);
        err = MoreSCError(service);
        if (err == 0) {
            copy = CFPropertyListCreateDeepCopy(kCFAllocatorDefault, service,
                                                kCFPropertyListMutableContainersAndLeaves);
            if (copy == nullptr) {
                err = coreFoundationUnknownErr;
            }
        }
    }
    if (err == 0) {
        err = MoreSCErrorBoolean(
            SCPreferencesPathSetValue(session, newPath, static_cast<CFDictionaryRef>(copy)));
    }
    if (err != 0) {
        CFQRelease(*newServiceID);
        *newServiceID = nullptr;
    }
    CFQRelease(servicePath);
    CFQRelease(newPath);
    CFQRelease(copy);
    return err;
}

OSStatus AddGlobalEntityToSet(CFStringRef setID, CFStringRef protocol, const MoreSCGlobalDigest* digest) {
    CFMutableDictionaryRef entity = nullptr;
    OSStatus err = MoreSCCreateGlobalEntity(protocol, digest, &entity);
    if (err == 0) {
        err = MoreSCNewEntity(setID, nullptr, protocol, entity);
    }
    CFQRelease(entity);
    return err;
}
