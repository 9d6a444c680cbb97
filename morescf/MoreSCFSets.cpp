#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCF.h"
#include "morescf/MoreSCFKeys.h"
#include "morescf/MoreSCFPortScanner.h"
#include "morescf/MoreSCFTree.h"
#include "morescf/MoreSCFValues.h"
#include "platform/CoreServices.h"

namespace {

// The two dictionaries that a location's services and global entities are put into.
OSStatus MakeEmptySetContent(CFStringRef setID) {
    SCPreferencesRef session = MoreSCGetSCPreferencesRef();
    CFStringRef servicesPath = nullptr;
    CFStringRef globalsPath = nullptr;
    OSStatus err = 0;
    CFDictionaryRef empty =
        CFDictionaryCreate(kCFAllocatorDefault, nullptr, nullptr, 0, &kCFTypeDictionaryKeyCallBacks,
                           &kCFTypeDictionaryValueCallBacks);
    if (empty == nullptr) {
        err = coreFoundationUnknownErr;
    }
    if (err == 0) {
        err = CopySetServicesPath(setID, &servicesPath);
    }
    if (err == 0) {
        err = MoreSCErrorBoolean(SCPreferencesPathSetValue(session, servicesPath, empty));
    }
    if (err == 0) {
        err = CopySetGlobalsPath(setID, &globalsPath);
    }
    if (err == 0) {
        err = MoreSCErrorBoolean(SCPreferencesPathSetValue(session, globalsPath, empty));
    }
    CFQRelease(empty);
    CFQRelease(servicesPath);
    CFQRelease(globalsPath);
    return err;
}

OSStatus AddServiceForEachPort(CFStringRef setID) {
    CFArrayRef ports = nullptr;
    OSStatus err = MoreSCCreatePortArray(&ports);
    if (err == 0) {
        const CFIndex count = CFArrayGetCount(ports);
        for (CFIndex i = 0; err == 0 && i < count; ++i) {
            err = MoreSCNewService(setID, static_cast<CFDictionaryRef>(CFArrayGetValueAtIndex(ports, i)),
                                   nullptr);
        }
    }
    CFQRelease(ports);
    return err;
}

// Adds the resolved IDs of the location's services to the keys of the dictionary.
OSStatus MarkServicesOfSet(CFStringRef setID, CFMutableDictionaryRef marks) {
    CFArrayRef serviceIDs = nullptr;
    const OSStatus err = MoreSCCopyServiceIDs(setID, nullptr, &serviceIDs);
    if (err == 0) {
        const CFIndex count = CFArrayGetCount(serviceIDs);
        for (CFIndex i = 0; i < count; ++i) {
            CFDictionaryAddValue(marks, CFArrayGetValueAtIndex(serviceIDs, i), nullptr);
        }
    }
    CFQRelease(serviceIDs);
    return err;
}

OSStatus RemoveUnmarkedServices(CFDictionaryRef marks) {
    SCPreferencesRef session = MoreSCGetSCPreferencesRef();
    CFArrayRef serviceIDs = nullptr;
    CFTypeRef services = SCPreferencesGetValue(session, kNetworkServicesKey);
    OSStatus err = MoreSCError(services);
    if (err == 0 && !IsDictionary(services)) {
        err = coreFoundationUnknownErr;
    }
    if (err == 0) {
        err = CFQArrayCreateWithDictionaryKeys(static_cast<CFDictionaryRef>(services), &serviceIDs);
    }
    if (err == 0) {
        const CFIndex count = CFArrayGetCount(serviceIDs);
        for (CFIndex i = 0; err == 0 && i < count; ++i) {
            CFTypeRef serviceID = CFArrayGetValueAtIndex(serviceIDs, i);
            if (!CFDictionaryContainsKey(marks, serviceID)) {
                CFStringRef path = nullptr;
                err = CreateServicePathWithServiceID(static_cast<CFStringRef>(serviceID), &path);
                if (err == 0) {
                    err = MoreSCErrorBoolean(SCPreferencesPathRemoveValue(session, path));
                }
                CFQRelease(path);
            }
        }
    }
    CFQRelease(serviceIDs);
    return err;
}

}  // namespace

OSStatus MoreSCCopySetsDict(CFDictionaryRef* setsDict) {
    CFTypeRef dict = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0) {
        dict = CFQRetain(SCPreferencesGetValue(MoreSCGetSCPreferencesRef(), kSetsKey));
        err = MoreSCError(dict);
    }
    if (err == 0 && !IsDictionary(dict)) {
        err = coreFoundationUnknownErr;
    }
    MoreSCClose(&err, false);
    HandOver(err, static_cast<CFDictionaryRef>(dict), setsDict);
    return err;
}

OSStatus MoreSCSetSetsDict(CFDictionaryRef setsDict) {
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0 && setsDict == nullptr) {
        err = paramErr;
    }
    if (err == 0) {
        err = MoreSCErrorBoolean(SCPreferencesSetValue(MoreSCGetSCPreferencesRef(), kSetsKey, setsDict));
    }
    MoreSCClose(&err, true);
    return err;
}

OSStatus MoreSCCopySetIDs(CFArrayRef* setIDs, CFIndex* indexOfCurrentSet) {
    CFDictionaryRef setsDict = nullptr;
    CFArrayRef ids = nullptr;
    CFStringRef currentID = nullptr;
    CFIndex currentIndex = kCFNotFound;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0) {
        err = MoreSCCopySetsDict(&setsDict);
    }
    if (err == 0) {
        err = CFQArrayCreateWithDictionaryKeys(setsDict, &ids);
    }
    if (err == 0 && indexOfCurrentSet != nullptr) {
        err = MoreSCCopyCurrentSet(&currentID);
        if (err == 0) {
            const CFIndex count = CFArrayGetCount(ids);
            for (CFIndex i = 0; i < count; ++i) {
                if (CFEqual(CFArrayGetValueAtIndex(ids, i), currentID)) {
                    currentIndex = i;
                }
            }
        }
    }
    CFQRelease(setsDict);
    CFQRelease(currentID);
    MoreSCClose(&err, false);
    if (err == 0 && currentIndex != kCFNotFound) {
        *indexOfCurrentSet = currentIndex;
    }
    HandOverOrNull(err, ids, setIDs);
    return err;
}

OSStatus MoreSCCopyUserVisibleNameOfSet(CFStringRef setID, CFStringRef* userVisibleName) {
    CFStringRef setPath = nullptr;
    CFStringRef name = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0) {
        err = CopySetPath(setID, &setPath);
    }
    if (err == 0) {
        CFDictionaryRef dict = SCPreferencesPathGetValue(MoreSCGetSCPreferencesRef(), setPath);
        err = MoreSCError(dict);
        if (err == 0) {
            err = CopyStringValue(dict, kUserDefinedNameKey, &name);
        }
    }
    CFQRelease(setPath);
    MoreSCClose(&err, false);
    HandOver(err, name, userVisibleName);
    return err;
}

OSStatus MoreSCCopyCurrentSet(CFStringRef* setID) {
    CFStringRef currentPath = nullptr;
    CFStringRef currentID = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0) {
        err = CopySetPath(nullptr, &currentPath);
    }
    if (err == 0) {
        err = CopySeIDFromSePath(currentPath, &currentID);
    }
    CFQRelease(currentPath);
    MoreSCClose(&err, false);
    HandOver(err, currentID, setID);
    return err;
}

OSStatus MoreSCSetCurrentSet(CFStringRef setID) {
    CFStringRef setPath = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0) {
        err = CreateSetPathWithSetID(setID, &setPath);
    }
    if (err == 0) {
        err = MoreSCErrorBoolean(SCPreferencesSetValue(MoreSCGetSCPreferencesRef(), kCurrentSetKey, setPath));
    }
    CFQRelease(setPath);
    MoreSCClose(&err, true);
    return err;
}

OSStatus MoreSCNewSet(CFStringRef userVisibleName, CFStringRef* newSetID) {
    CFStringRef setID = nullptr;
    CFStringRef setPath = nullptr;
    MoreSCGlobalDigest digest = {};
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0 && userVisibleName == nullptr) {
        err = paramErr;
    }
    if (err == 0) {
        err = MakeNewSeAndCopyIDAndPath(kSetsKey, &setID, &setPath);
    }
    if (err == 0) {
        err = MakeEmptySetContent(setID);
    }
    if (err == 0) {
        err = AddGlobalEntityToSet(setID, kIPv4Protocol, &digest);
    }
    if (err == 0) {
        err = AddGlobalEntityToSet(setID, kNetInfoProtocol, &digest);
    }
    if (err == 0) {
        err = AddServiceForEachPort(setID);
    }
    if (err == 0) {
        err = MoreSCRenameSet(setID, userVisibleName);
    }
    if (err != 0 && setID != nullptr) {
        MoreSCDeleteSet(setID);
    }
    CFQRelease(setPath);
    MoreSCClose(&err, true);
    HandOver(err, setID, newSetID);
    return err;
}

OSStatus MoreSCDuplicateSet(CFStringRef setID, CFStringRef newSetUserVisibleName, CFStringRef* newSetID) {
    CFStringRef oldPath = nullptr;
    CFStringRef newID = nullptr;
    CFStringRef newPath = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0) {
        err = CopySetPath(setID, &oldPath);
    }
    if (err == 0) {
        err = MakeNewSeAndCopyIDAndPath(kSetsKey, &newID, &newPath);
    }
    if (err == 0) {
        err = PreferencesPathDuplicate(oldPath, newPath);
    }
    if (err == 0) {
        err = DuplicateServicesReferencedBySet(setID, newID);
    }
    if (err == 0 && newSetUserVisibleName != nullptr) {
        err = MoreSCRenameSet(newID, newSetUserVisibleName);
    }
    if (err != 0 && newID != nullptr) {
        MoreSCDeleteSet(newID);
    }
    CFQRelease(oldPath);
    CFQRelease(newPath);
    MoreSCClose(&err, true);
    HandOver(err, newID, newSetID);
    return err;
}

OSStatus MoreSCDeleteSet(CFStringRef setID) {
    CFStringRef currentID = nullptr;
    CFStringRef setPath = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0 && setID == nullptr) {
        err = paramErr;
    }
    if (err == 0) {
        err = MoreSCCopyCurrentSet(&currentID);
    }
    if (err == 0 && CFEqual(setID, currentID)) {
        err = paramErr;
    }
    if (err == 0) {
        err = CreateSetPathWithSetID(setID, &setPath);
    }
    if (err == 0) {
        err = MoreSCErrorBoolean(SCPreferencesPathRemoveValue(MoreSCGetSCPreferencesRef(), setPath));
    }
    if (setID != nullptr) {
        const OSStatus err2 = DeleteUnreferencedServices();
        if (err == 0) {
            err = err2;
        }
    }
    CFQRelease(currentID);
    CFQRelease(setPath);
    MoreSCClose(&err, true);
    return err;
}

OSStatus MoreSCRenameSet(CFStringRef setID, CFStringRef userVisibleName) {
    CFStringRef setPath = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0 && userVisibleName == nullptr) {
        err = paramErr;
    }
    if (err == 0) {
        err = CopySetPath(setID, &setPath);
    }
    if (err == 0) {
        err = PreferencesPathSetProperty(setPath, kUserDefinedNameKey, userVisibleName);
    }
    CFQRelease(setPath);
    MoreSCClose(&err, true);
    return err;
}

OSStatus DuplicateServicesReferencedBySet(CFStringRef setID, CFStringRef newSetID) {
    CFArrayRef serviceIDs = nullptr;
    CFMutableDictionaryRef services = nullptr;
    CFMutableArrayRef order = nullptr;
    OSStatus err = MoreSCCopyServiceIDs(setID, nullptr, &serviceIDs);
    if (err == 0) {
        err = CFQDictionaryCreateMutable(&services);
    }
    if (err == 0) {
        err = CFQArrayCreateMutable(&order);
    }
    if (err == 0) {
        const CFIndex count = CFArrayGetCount(serviceIDs);
        for (CFIndex i = 0; err == 0 && i < count; ++i) {
            CFStringRef copyID = nullptr;
            err = DuplicateService(static_cast<CFStringRef>(CFArrayGetValueAtIndex(serviceIDs, i)), &copyID);
            if (err == 0) {
                err = AddServiceLinkToDict(copyID, services);
            }
            if (err == 0) {
                CFArrayAppendValue(order, copyID);
            }
            CFQRelease(copyID);
        }
    }
    if (err == 0) {
        err = MoreSCSetServicesDict(newSetID, services, order);
    }
    CFQRelease(serviceIDs);
    CFQRelease(services);
    CFQRelease(order);
    return err;
}

OSStatus DeleteUnreferencedServices() {
    CFArrayRef setIDs = nullptr;
    OSStatus err = 0;
    // Only the keys count.
    CFMutableDictionaryRef marks =
        CFDictionaryCreateMutable(kCFAllocatorDefault, 0, &kCFTypeDictionaryKeyCallBacks, nullptr);
    if (marks == nullptr) {
        err = coreFoundationUnknownErr;
    }
    if (err == 0) {
        err = MoreSCCopySetIDs(&setIDs, nullptr);
    }
    if (err == 0) {
        const CFIndex count = CFArrayGetCount(setIDs);
        for (CFIndex i = 0; err == 0 && i < count; ++i) {
            err = MarkServicesOfSet(static_cast<CFStringRef>(CFArrayGetValueAtIndex(setIDs, i)), marks);
        }
    }
    if (err == 0) {
        err = RemoveUnmarkedServices(marks);
    }
    CFQRelease(setIDs);
    CFQRelease(marks);
    return err;
}
