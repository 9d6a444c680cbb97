#include "morescf/MoreSCFTree.h"

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <limits>

#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCF.h"
#include "morescf/MoreSCFKeys.h"
#include "morescf/MoreSCFSteps.h"
#include "morescf/MoreSCFValues.h"
#include "platform/CoreServices.h"

namespace {

// "%@" would turn a null key into text, and a path to nowhere into one to "(null)".
OSStatus CreatePath(CFStringRef format, CFStringRef first, CFStringRef second, CFStringRef* path) {
    OSStatus err = first != nullptr ? ErrorIfNotGiven(second) : static_cast<OSStatus>(paramErr);
    if (err == 0) {
        CFStringRef created = CFStringCreateWithFormat(kCFAllocatorDefault, nullptr, format, first, second);
        err = ErrorIfMissing(created);
        HandOver(err, created, path);
    }
    return err;
}

OSStatus CopyPathInSet(CFStringRef setID, CFStringRef format, CFStringRef last, CFStringRef* path) {
    CFStringRef setPath = nullptr;
    const OSStatus err = InTurn([&] { return CopySetPath(setID, &setPath); },
                                [&] { return CreatePath(format, setPath, last, path); });
    CFQRelease(setPath);
    return err;
}

// Stores at one path the copy that is made of the dictionary at the other: what the store lends is not ours
// to change.
template <class Copy>
OSStatus StoreCopy(CFStringRef path, CFStringRef newPath, Copy makeCopy) {
    SCPreferencesRef session = MoreSCGetSCPreferencesRef();
    CFTypeRef copy = nullptr;
    CFDictionaryRef dict = SCPreferencesPathGetValue(session, path);
    OSStatus err = MoreSCError(dict);
    if (err == 0) {
        copy = makeCopy(dict);
        err = ErrorIfMissing(copy);
    }
    if (err == 0) {
        err = MoreSCErrorBoolean(
            SCPreferencesPathSetValue(session, newPath, static_cast<CFDictionaryRef>(copy)));
    }
    CFQRelease(copy);
    return err;
}

// The number that a key is, when it counts (MoreSCFTree.h).
bool ReadDecimalKey(CFTypeRef key, SInt32* number) {
    char text[16];
    if (!IsString(key) ||
        !CFStringGetCString(static_cast<CFStringRef>(key), text, sizeof(text), kCFStringEncodingASCII) ||
        text[0] < '0' || text[0] > '9') {
        return false;
    }
    char* end = nullptr;
    errno = 0;
    const long value = std::strtol(text, &end, 10);
    // What a 32-bit long cannot hold is an overflow, whatever this machine's long is.
    if (errno != 0 || *end != '\0' || value > std::numeric_limits<SInt32>::max()) {
        return false;
    }
    *number = static_cast<SInt32>(value);
    return true;
}

SInt32 LargestNumericKey(CFArrayRef keys) {
    SInt32 largest = std::numeric_limits<SInt32>::min();
    static_cast<void>(ForEach<CFTypeRef>(keys, [&largest](CFTypeRef key) {
        SInt32 number = 0;
        if (ReadDecimalKey(key, &number)) {
            largest = std::max(largest, number);
        }
        return OSStatus{0};
    }));
    return largest;
}

}  // namespace

OSStatus CreateSetPathWithSetID(CFStringRef setID, CFStringRef* setPath) {
    return CreatePath(CFSTR("/%@/%@"), kSetsKey, setID, setPath);
}

OSStatus CreateServicePathWithServiceID(CFStringRef serviceID, CFStringRef* servicePath) {
    return CreatePath(CFSTR("/%@/%@"), kNetworkServicesKey, serviceID, servicePath);
}

OSStatus CopySeIDFromSePath(CFStringRef sePath, CFStringRef* seID) {
    OSStatus err = 0;
    CFArrayRef components = CFStringCreateArrayBySeparatingStrings(kCFAllocatorDefault, sePath, CFSTR("/"));
    // The first component is what stands before the leading slash, so the ID is the third.
    if (components == nullptr || CFArrayGetCount(components) < 3) {
        err = coreFoundationUnknownErr;
    }
    if (err == 0) {
        *seID = static_cast<CFStringRef>(Retained(CFArrayGetValueAtIndex(components, 2)));
    }
    CFQRelease(components);
    return err;
}

OSStatus CopySetPath(CFStringRef setID, CFStringRef* setPath) {
    OSStatus err = 0;
    if (setID == nullptr) {
        CFTypeRef current = SCPreferencesGetValue(MoreSCGetSCPreferencesRef(), kCurrentSetKey);
        err = MoreSCError(current);
        if (err == 0 && !IsString(current)) {
            err = coreFoundationUnknownErr;
        }
        if (err == 0) {
            *setPath = static_cast<CFStringRef>(Retained(current));
        }
    } else {
        err = CreateSetPathWithSetID(setID, setPath);
    }
    return err;
}

OSStatus CopySetServicesPath(CFStringRef setID, CFStringRef* path) {
    return CopyPathInSet(setID, CFSTR("%@/Network/%@"), CFSTR("Service"), path);
}

OSStatus CopySetGlobalsPath(CFStringRef setID, CFStringRef* path) {
    return CopyPathInSet(setID, CFSTR("%@/Network/%@"), CFSTR("Global"), path);
}

OSStatus CopyResolvedServicePath(CFStringRef setID, CFStringRef serviceID, CFStringRef* servicePath) {
    OSStatus err = 0;
    CFStringRef linkPath = nullptr;
    if (serviceID == nullptr) {
        err = CopySetGlobalsPath(setID, servicePath);
    } else {
        err = CopyPathInSet(setID, CFSTR("%@/Network/Service/%@"), serviceID, &linkPath);
    }
    if (linkPath != nullptr) {
        CFStringRef target = Retained(SCPreferencesPathGetLink(MoreSCGetSCPreferencesRef(), linkPath));
        err = MoreSCError(target);
        HandOver(err, target, servicePath);
    }
    CFQRelease(linkPath);
    return err;
}

OSStatus CopyEntityPath(CFStringRef setID, CFStringRef serviceID, CFStringRef protocol,
                        CFStringRef* entityPath) {
    CFStringRef servicePath = nullptr;
    const OSStatus err =
        InTurn([&] { return CopyResolvedServicePath(setID, serviceID, &servicePath); },
               [&] { return CreatePath(CFSTR("%@/%@"), servicePath, protocol, entityPath); });
    CFQRelease(servicePath);
    return err;
}

OSStatus PreferencesPathSetProperty(CFStringRef path, CFStringRef key, CFPropertyListRef value) {
    return StoreCopy(path, path, [key, value](CFDictionaryRef dict) {
        CFMutableDictionaryRef copy = CFDictionaryCreateMutableCopy(kCFAllocatorDefault, 0, dict);
        if (copy != nullptr) {
            CFDictionarySetValue(copy, key, value);
        }
        return copy;
    });
}

OSStatus PreferencesPathDuplicate(CFStringRef path, CFStringRef newPath) {
    return StoreCopy(path, newPath, [](CFDictionaryRef dict) {
        return CFPropertyListCreateDeepCopy(kCFAllocatorDefault, dict,
                                            kCFPropertyListMutableContainersAndLeaves);
    });
}

CFStringRef MySCPreferencesPathCreateUniqueChild(SCPreferencesRef session, CFStringRef prefix) {
    CFMutableDictionaryRef empty = nullptr;
    CFArrayRef keys = nullptr;
    CFStringRef childPath = nullptr;
    SInt32 largest = std::numeric_limits<SInt32>::max();  // no number is left

    CFDictionaryRef parent = SCPreferencesPathGetValue(session, prefix);
    const bool isAbsent = parent == nullptr && SCError() == kSCStatusNoKey;
    if (CFQDictionaryCreateMutable(&empty) == 0 && isAbsent) {
        parent = empty;
    }
    // A link gets no children: whoever follows it would not see them.
    if (parent != nullptr && !CFDictionaryContainsKey(parent, kLinkKey) &&
        CFQArrayCreateWithDictionaryKeys(parent, &keys) == 0) {
        largest = LargestNumericKey(keys);
    }
    if (empty != nullptr && largest != std::numeric_limits<SInt32>::max()) {
        childPath =
            CFStringCreateWithFormat(kCFAllocatorDefault, nullptr, CFSTR("%@/%i"), prefix, largest + 1);
    }
    if (childPath != nullptr && !SCPreferencesPathSetValue(session, childPath, empty)) {
        CFQRelease(childPath);
        childPath = nullptr;
    }

    CFQRelease(empty);
    CFQRelease(keys);
    return childPath;
}

OSStatus MakeNewSeAndCopyIDAndPath(CFStringRef prefix, CFStringRef* newSeID, CFStringRef* newSePath) {
    CFStringRef parentPath = CFStringCreateWithFormat(kCFAllocatorDefault, nullptr, CFSTR("/%@"), prefix);
    OSStatus err = ErrorIfMissing(parentPath);
    if (err == 0) {
        *newSePath = MySCPreferencesPathCreateUniqueChild(MoreSCGetSCPreferencesRef(), parentPath);
        err = MoreSCError(*newSePath);
    }
    if (err == 0) {
        err = CopySeIDFromSePath(*newSePath, newSeID);
    }
    if (err != 0) {
        CFQRelease(*newSeID);
        *newSeID = nullptr;
        CFQRelease(*newSePath);
        *newSePath = nullptr;
    }
    CFQRelease(parentPath);
    return err;
}

OSStatus AddServiceLinkToDict(CFStringRef serviceID, CFMutableDictionaryRef servicesDict) {
    CFStringRef servicePath = nullptr;
    CFMutableDictionaryRef link = nullptr;
    const OSStatus err = InTurn([&] { return CreateServicePathWithServiceID(serviceID, &servicePath); },
                                [&] { return CFQDictionaryCreateMutable(&link); });
    if (err == 0) {
        CFDictionarySetValue(link, kLinkKey, servicePath);
        CFDictionaryAddValue(servicesDict, serviceID, link);
    }
    CFQRelease(servicePath);
    CFQRelease(link);
    return err;
}

Boolean IsDictionaryActive(CFDictionaryRef dict) {
    return !CFDictionaryContainsKey(dict, kInactiveKey);
}

OSStatus SetDictionaryActive(CFMutableDictionaryRef dict, Boolean active, Boolean* changed) {
    OSStatus err = 0;
    if ((active != 0) != (IsDictionaryActive(dict) != 0)) {
        if (active) {
            CFDictionaryRemoveValue(dict, kInactiveKey);
        } else {
            err = CFQDictionarySetNumber(dict, kInactiveKey, 1);
        }
        if (err == 0 && changed != nullptr) {
            *changed = true;
        }
    }
    return err;
}
