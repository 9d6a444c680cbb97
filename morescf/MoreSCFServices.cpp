#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCF.h"
#include "morescf/MoreSCFKeys.h"
#include "morescf/MoreSCFNode.h"
#include "morescf/MoreSCFSteps.h"
#include "morescf/MoreSCFTree.h"
#include "morescf/MoreSCFValues.h"
#include "platform/CoreServices.h"

namespace {

// The entity of a location's globals that holds the service order.
Node OrderNode(CFStringRef setID) {
    return EntityNode(setID, nullptr, kIPv4Protocol);
}

OSStatus CopyServiceOrder(CFStringRef setID, CFArrayRef* order) {
    CFDictionaryRef globalIPv4 = nullptr;
    OSStatus err = CopyNode(OrderNode(setID), &globalIPv4);
    if (err == 0) {
        *order = Retained(GetArrayValue(globalIPv4, kServiceOrderKey));
        err = ErrorIfMissing(*order);
    }
    CFQRelease(globalIPv4);
    return err;
}

// The ID under which the service that the location links is kept for all of them.
OSStatus CopyResolvedServiceID(CFStringRef setID, CFStringRef serviceID, CFStringRef* resolvedID) {
    CFStringRef path = nullptr;
    const OSStatus err = InTurn([&] { return CopyResolvedServicePath(setID, serviceID, &path); },
                                [&] { return CopySeIDFromSePath(path, resolvedID); });
    CFQRelease(path);
    return err;
}

}  // namespace

OSStatus MoreSCCopyServicesDict(CFStringRef setID, CFDictionaryRef* servicesDict, CFArrayRef* serviceOrder) {
    CFDictionaryRef services = nullptr;
    CFArrayRef order = nullptr;
    OSStatus err = OpenSession();
    if (err == 0 && servicesDict != nullptr) {
        err = CopyNode(LinksNode(setID), &services);
    }
    if (err == 0 && serviceOrder != nullptr) {
        err = CopyServiceOrder(setID, &order);
    }
    MoreSCClose(&err, false);
    HandOverOrNull(err, services, servicesDict);
    HandOverOrNull(err, order, serviceOrder);
    return err;
}

// Both are read even when one is wanted: without an order there is nothing that may be done to the links.
OSStatus MoreSCCopyServicesDictMutable(CFStringRef setID, CFMutableDictionaryRef* servicesDict,
                                       CFMutableArrayRef* serviceOrder) {
    CFDictionaryRef services = nullptr;
    CFArrayRef order = nullptr;
    CFMutableDictionaryRef servicesCopy = nullptr;
    CFMutableArrayRef orderCopy = nullptr;
    OSStatus err = MoreSCCopyServicesDict(setID, &services, &order);
    if (err == 0) {
        servicesCopy = CFDictionaryCreateMutableCopy(kCFAllocatorDefault, 0, services);
        err = ErrorIfMissing(servicesCopy);
    }
    if (err == 0) {
        orderCopy = CFArrayCreateMutableCopy(kCFAllocatorDefault, 0, order);
        err = ErrorIfMissing(orderCopy);
    }
    CFQRelease(services);
    CFQRelease(order);
    HandOver(err, servicesCopy, servicesDict);
    HandOver(err, orderCopy, serviceOrder);
    return err;
}

OSStatus MoreSCSetServicesDict(CFStringRef setID, CFDictionaryRef servicesDict, CFArrayRef serviceOrder) {
    OSStatus err = OpenSession();
    if (err == 0 && servicesDict != nullptr) {
        err = StoreNode(LinksNode(setID), servicesDict, false);
    }
    if (err == 0 && serviceOrder != nullptr) {
        err = SetNodeProperty(OrderNode(setID), kServiceOrderKey, serviceOrder);
    }
    MoreSCClose(&err, true);
    return err;
}

OSStatus MoreSCCopyServiceIDs(CFStringRef setID, CFArrayRef* localServiceIDs,
                              CFArrayRef* resolvedServiceIDs) {
    CFArrayRef order = nullptr;
    CFMutableArrayRef localIDs = nullptr;
    CFMutableArrayRef resolvedIDs = nullptr;
    OSStatus err = InTurn(
        OpenSession, [&] { return MoreSCCopyServicesDict(setID, nullptr, &order); },
        [&] { return CFQArrayCreateMutable(&localIDs); },
        [&] { return CFQArrayCreateMutable(&resolvedIDs); });
    if (err == 0) {
        // The order says which services there are; what is linked beside it does not count.
        err = ForEach<CFTypeRef>(order, [&](CFTypeRef entry) {
            CFStringRef resolvedID = nullptr;
            OSStatus entryErr = IsString(entry) ? 0 : coreFoundationUnknownErr;
            if (entryErr == 0) {
                CFArrayAppendValue(localIDs, entry);
            }
            if (entryErr == 0 && resolvedServiceIDs != nullptr) {
                entryErr = CopyResolvedServiceID(setID, static_cast<CFStringRef>(entry), &resolvedID);
            }
            if (resolvedID != nullptr) {
                CFArrayAppendValue(resolvedIDs, resolvedID);
            }
            CFQRelease(resolvedID);
            return entryErr;
        });
    }
    CFQRelease(order);
    MoreSCClose(&err, false);
    HandOver<CFArrayRef>(err, localIDs, localServiceIDs);
    HandOver<CFArrayRef>(err, resolvedIDs, resolvedServiceIDs);
    return err;
}

OSStatus MoreSCCopyUserVisibleNameOfService(CFStringRef setID, CFStringRef serviceID,
                                            CFStringRef* userVisibleName) {
    return CopyNodeString(ServiceNode(setID, serviceID), kUserDefinedNameKey, userVisibleName);
}

OSStatus MoreSCIsServiceActive(CFStringRef setID, CFStringRef serviceID, Boolean* active) {
    return IsNodeActive(ServiceNode(setID, serviceID), active);
}

OSStatus MoreSCSetServiceActive(CFStringRef setID, CFStringRef serviceID, Boolean active) {
    return SetNodeActive(ServiceNode(setID, serviceID), active);
}

OSStatus MoreSCCopyBSDNameOfService(CFStringRef setID, CFStringRef serviceID, CFStringRef* bsdName) {
    return CopyNodeString(EntityNode(setID, serviceID, kInterfaceProtocol), kDeviceNameKey, bsdName);
}

OSStatus MoreSCRenameService(CFStringRef setID, CFStringRef serviceID, CFStringRef userVisibleName) {
    return SetNodeProperty(ServiceNode(setID, serviceID), kUserDefinedNameKey, userVisibleName);
}

OSStatus MoreSCDuplicateService(CFStringRef setID, CFStringRef serviceID, CFStringRef userVisibleName,
                                CFStringRef* newServiceID) {
    CFStringRef copyID = nullptr;
    OSStatus err = InTurn(
        OpenSession, [&] { return DuplicateService(serviceID, &copyID); },
        [&] { return AddServiceToSet(setID, copyID); });
    if (err == 0 && userVisibleName != nullptr) {
        err = MoreSCRenameService(setID, copyID, userVisibleName);
    }
    // A copy that is not listed yet goes; one that only failed to be renamed stays.
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
    OSStatus err = InTurn(
        OpenSession, [&] { return ErrorIfNotGiven(serviceID); },
        [&] { return MoreSCCopyServicesDictMutable(setID, &services, &order); });
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
    // After a failure too: what nobody lists is of no use to anybody. The first failure is the one to tell.
    if (serviceID != nullptr) {
        const OSStatus sweepErr = DeleteUnreferencedServices();
        err = err != 0 ? err : sweepErr;
    }
    CFQRelease(services);
    CFQRelease(order);
    MoreSCClose(&err, true);
    return err;
}

OSStatus AddServiceToSet(CFStringRef setID, CFStringRef serviceID) {
    CFMutableDictionaryRef services = nullptr;
    CFMutableArrayRef order = nullptr;
    OSStatus err = InTurn([&] { return MoreSCCopyServicesDictMutable(setID, &services, &order); },
                          [&] { return AddServiceLinkToDict(serviceID, services); });
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
    OSStatus err =
        InTurn([&] { return CreateServicePathWithServiceID(serviceID, &servicePath); },
               [&] { return MakeNewSeAndCopyIDAndPath(kNetworkServicesKey, newServiceID, &newPath); },
               [&] { return PreferencesPathDuplicate(servicePath, newPath); });
    if (err != 0) {
        CFQRelease(*newServiceID);
        *newServiceID = nullptr;
    }
    CFQRelease(servicePath);
    CFQRelease(newPath);
    return err;
}
