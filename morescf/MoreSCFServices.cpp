#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCF.h"
#include "morescf/MoreSCFKeys.h"
#include "morescf/MoreSCFTree.h"
#include "morescf/MoreSCFValues.h"
#include "platform/CoreServices.h"

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
                order = static_cast<CFArrayRef>(CFQRetain(GetArrayValue(globalIPv4, kServiceOrderKey)));
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
            err = PreferencesPathSetProperty(orderPath, kServiceOrderKey, serviceOrder);
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
        err = CopyStringValue(service, kUserDefinedNameKey, &name);
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
        err = MoreSCCopyEntity(setID, serviceID, kInterfaceProtocol, &interface);
    }
    if (err == 0) {
        err = CopyStringValue(interface, kDeviceNameKey, &name);
    }
    CFQRelease(interface);
    MoreSCClose(&err, false);
    HandOver(err, name, bsdName);
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
        CFDictionarySetValue(service, kUserDefinedNameKey, userVisibleName);
        err = MoreSCSetEntitiesDict(setID, serviceID, service);
    }
    CFQRelease(service);
    MoreSCClose(&err, true);
    return err;
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

OSStatus DuplicateService(CFStringRef serviceID, CFStringRef* newServiceID) {
    CFStringRef servicePath = nullptr;
    CFStringRef newPath = nullptr;
    OSStatus err = CreateServicePathWithServiceID(serviceID, &servicePath);
    if (err == 0) {
        err = MakeNewSeAndCopyIDAndPath(kNetworkServicesKey, newServiceID, &newPath);
    }
    if (err == 0) {
        err = PreferencesPathDuplicate(servicePath, newPath);
    }
    if (err != 0) {
        CFQRelease(*newServiceID);
        *newServiceID = nullptr;
    }
    CFQRelease(servicePath);
    CFQRelease(newPath);
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
