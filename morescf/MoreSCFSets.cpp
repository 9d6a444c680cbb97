#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCF.h"
#include "morescf/MoreSCFDigest.h"
#include "morescf/MoreSCFKeys.h"
#include "morescf/MoreSCFNode.h"
#include "morescf/MoreSCFPortScanner.h"
#include "morescf/MoreSCFSteps.h"
#include "morescf/MoreSCFTree.h"
#include "morescf/MoreSCFValues.h"
#include "platform/CoreServices.h"

namespace {

// The two empty dictionaries that a location's services and global entities are put into.
OSStatus MakeEmptySetContent(CFStringRef setID) {
    CFMutableDictionaryRef empty = nullptr;
    const OSStatus err = InTurn([&] { return CFQDictionaryCreateMutable(&empty); },
                                [&] { return StoreNode(LinksNode(setID), empty, false); },
                                [&] { return StoreNode(ServiceNode(setID, nullptr), empty, false); });
    CFQRelease(empty);
    return err;
}

OSStatus AddGlobalEntityToSet(CFStringRef setID, CFStringRef protocol, const MoreSCGlobalDigest* digest) {
    CFMutableDictionaryRef entity = nullptr;
    const OSStatus err = InTurn([&] { return MoreSCCreateGlobalEntity(protocol, digest, &entity); },
                                [&] { return MoreSCNewEntity(setID, nullptr, protocol, entity); });
    CFQRelease(entity);
    return err;
}

OSStatus AddServiceForEachPort(CFStringRef setID) {
    CFArrayRef ports = nullptr;
    OSStatus err = MoreSCCreatePortArray(&ports);
    if (err == 0) {
        err = ForEach<CFDictionaryRef>(
            ports, [setID](CFDictionaryRef port) { return MoreSCNewService(setID, port, nullptr); });
    }
    CFQRelease(ports);
    return err;
}

OSStatus SetTopLevelValue(CFStringRef key, CFPropertyListRef value) {
    return MoreSCErrorBoolean(SCPreferencesSetValue(MoreSCGetSCPreferencesRef(), key, value));
}

// A top-level value that is a dictionary.
OSStatus CopyTopLevelDictionary(CFStringRef key, CFDictionaryRef* dict) {
    CFTypeRef value = SCPreferencesGetValue(MoreSCGetSCPreferencesRef(), key);
    OSStatus err = MoreSCError(value);
    if (err == 0 && !IsDictionary(value)) {
        err = coreFoundationUnknownErr;
    }
    if (err == 0) {
        *dict = static_cast<CFDictionaryRef>(CFQRetain(value));
    }
    return err;
}

// Services are shared under their resolved IDs, so these are what is marked and compared. Adds those of the
// location's services to the keys of the dictionary.
OSStatus MarkServicesOfSet(CFStringRef setID, CFMutableDictionaryRef marks) {
    CFArrayRef serviceIDs = nullptr;
    OSStatus err = MoreSCCopyServiceIDs(setID, nullptr, &serviceIDs);
    if (err == 0) {
        err = ForEach<CFTypeRef>(serviceIDs, [marks](CFTypeRef serviceID) {
            CFDictionaryAddValue(marks, serviceID, nullptr);
            return OSStatus{0};
        });
    }
    CFQRelease(serviceIDs);
    return err;
}

OSStatus RemoveAtPath(CFStringRef path) {
    return MoreSCErrorBoolean(SCPreferencesPathRemoveValue(MoreSCGetSCPreferencesRef(), path));
}

OSStatus RemoveService(CFStringRef serviceID) {
    CFStringRef path = nullptr;
    const OSStatus err = InTurn([&] { return CreateServicePathWithServiceID(serviceID, &path); },
                                [&] { return RemoveAtPath(path); });
    CFQRelease(path);
    return err;
}

OSStatus RemoveUnmarkedServices(CFDictionaryRef marks) {
    CFDictionaryRef services = nullptr;
    CFArrayRef serviceIDs = nullptr;
    OSStatus err = InTurn([&] { return CopyTopLevelDictionary(kNetworkServicesKey, &services); },
                          [&] { return CFQArrayCreateWithDictionaryKeys(services, &serviceIDs); });
    if (err == 0) {
        err = ForEach<CFStringRef>(serviceIDs, [marks](CFStringRef serviceID) {
            return CFDictionaryContainsKey(marks, serviceID) ? OSStatus{0} : RemoveService(serviceID);
        });
    }
    CFQRelease(services);
    CFQRelease(serviceIDs);
    return err;
}

// The new location gets copies of its own of the services that the old one lists, in place of the links that
// it took over.
OSStatus DuplicateServicesReferencedBySet(CFStringRef setID, CFStringRef newSetID) {
    CFArrayRef serviceIDs = nullptr;
    CFMutableDictionaryRef services = nullptr;
    CFMutableArrayRef order = nullptr;
    const auto duplicate = [&](CFStringRef serviceID) {
        CFStringRef copyID = nullptr;
        const OSStatus err = InTurn([&] { return DuplicateService(serviceID, &copyID); },
                                    [&] { return AddServiceLinkToDict(copyID, services); });
        if (err == 0) {
            CFArrayAppendValue(order, copyID);
        }
        CFQRelease(copyID);
        return err;
    };
    const OSStatus err = InTurn([&] { return MoreSCCopyServiceIDs(setID, nullptr, &serviceIDs); },
                                [&] { return CFQDictionaryCreateMutable(&services); },
                                [&] { return CFQArrayCreateMutable(&order); },
                                [&] { return ForEach<CFStringRef>(serviceIDs, duplicate); },
                                [&] { return MoreSCSetServicesDict(newSetID, services, order); });
    CFQRelease(serviceIDs);
    CFQRelease(services);
    CFQRelease(order);
    return err;
}

}  // namespace

OSStatus MoreSCCopySetsDict(CFDictionaryRef* setsDict) {
    CFDictionaryRef dict = nullptr;
    OSStatus err = InTurn(OpenSession, [&] { return CopyTopLevelDictionary(kSetsKey, &dict); });
    MoreSCClose(&err, false);
    HandOver(err, dict, setsDict);
    return err;
}

OSStatus MoreSCSetSetsDict(CFDictionaryRef setsDict) {
    OSStatus err = InTurn(
        OpenSession, [&] { return ErrorIfNotGiven(setsDict); },
        [&] { return SetTopLevelValue(kSetsKey, setsDict); });
    MoreSCClose(&err, true);
    return err;
}

OSStatus MoreSCCopySetIDs(CFArrayRef* setIDs, CFIndex* indexOfCurrentSet) {
    CFDictionaryRef setsDict = nullptr;
    CFArrayRef ids = nullptr;
    CFStringRef currentID = nullptr;
    CFIndex currentIndex = kCFNotFound;
    OSStatus err = InTurn(
        OpenSession, [&] { return MoreSCCopySetsDict(&setsDict); },
        [&] { return CFQArrayCreateWithDictionaryKeys(setsDict, &ids); });
    if (err == 0 && indexOfCurrentSet != nullptr) {
        err = MoreSCCopyCurrentSet(&currentID);
    }
    if (err == 0 && currentID != nullptr) {
        // The keys of a dictionary: there is one of them at most.
        currentIndex = CFArrayGetFirstIndexOfValue(ids, CFRangeMake(0, CFArrayGetCount(ids)), currentID);
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
    return CopyNodeString(SetNode(setID), kUserDefinedNameKey, userVisibleName);
}

OSStatus MoreSCCopyCurrentSet(CFStringRef* setID) {
    CFStringRef currentPath = nullptr;
    CFStringRef currentID = nullptr;
    OSStatus err = InTurn(
        OpenSession, [&] { return CopySetPath(nullptr, &currentPath); },
        [&] { return CopySeIDFromSePath(currentPath, &currentID); });
    CFQRelease(currentPath);
    MoreSCClose(&err, false);
    HandOver(err, currentID, setID);
    return err;
}

OSStatus MoreSCSetCurrentSet(CFStringRef setID) {
    CFStringRef setPath = nullptr;
    OSStatus err = InTurn(
        OpenSession, [&] { return CreateSetPathWithSetID(setID, &setPath); },
        [&] { return SetTopLevelValue(kCurrentSetKey, setPath); });
    CFQRelease(setPath);
    MoreSCClose(&err, true);
    return err;
}

OSStatus MoreSCNewSet(CFStringRef userVisibleName, CFStringRef* newSetID) {
    CFStringRef setID = nullptr;
    CFStringRef setPath = nullptr;
    const MoreSCGlobalDigest digest = {};
    OSStatus err = InTurn(
        OpenSession, [&] { return ErrorIfNotGiven(userVisibleName); },
        [&] { return MakeNewSeAndCopyIDAndPath(kSetsKey, &setID, &setPath); },
        [&] { return MakeEmptySetContent(setID); },
        [&] { return AddGlobalEntityToSet(setID, kIPv4Protocol, &digest); },
        [&] { return AddGlobalEntityToSet(setID, kNetInfoProtocol, &digest); },
        [&] { return AddServiceForEachPort(setID); },
        [&] { return MoreSCRenameSet(setID, userVisibleName); });
    // With the services that it got so far, which nobody lists any more.
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
    OSStatus err = InTurn(
        OpenSession, [&] { return CopySetPath(setID, &oldPath); },
        [&] { return MakeNewSeAndCopyIDAndPath(kSetsKey, &newID, &newPath); },
        [&] { return PreferencesPathDuplicate(oldPath, newPath); },
        [&] { return DuplicateServicesReferencedBySet(setID, newID); });
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
    OSStatus err = InTurn(
        OpenSession, [&] { return ErrorIfNotGiven(setID); }, [&] { return MoreSCCopyCurrentSet(&currentID); },
        [&] { return CFEqual(setID, currentID) ? OSStatus{paramErr} : OSStatus{0}; },
        [&] { return CreateSetPathWithSetID(setID, &setPath); }, [&] { return RemoveAtPath(setPath); });
    // Also after the current location was refused, but then the sweep is not committed.
    if (setID != nullptr) {
        const OSStatus sweepErr = DeleteUnreferencedServices();
        err = err != 0 ? err : sweepErr;
    }
    CFQRelease(currentID);
    CFQRelease(setPath);
    MoreSCClose(&err, true);
    return err;
}

OSStatus MoreSCRenameSet(CFStringRef setID, CFStringRef userVisibleName) {
    return SetNodeProperty(SetNode(setID), kUserDefinedNameKey, userVisibleName);
}

OSStatus DeleteUnreferencedServices() {
    CFArrayRef setIDs = nullptr;
    // Only the keys count.
    CFMutableDictionaryRef marks =
        CFDictionaryCreateMutable(kCFAllocatorDefault, 0, &kCFTypeDictionaryKeyCallBacks, nullptr);
    const auto mark = [marks](CFStringRef setID) { return MarkServicesOfSet(setID, marks); };
    const OSStatus err = InTurn(
        [&] { return ErrorIfMissing(marks); }, [&] { return MoreSCCopySetIDs(&setIDs, nullptr); },
        [&] { return ForEach<CFStringRef>(setIDs, mark); }, [&] { return RemoveUnmarkedServices(marks); });
    CFQRelease(setIDs);
    CFQRelease(marks);
    return err;
}
