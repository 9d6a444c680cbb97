#include "morescf/MoreSCFTree.h"

#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <limits>

#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCF.h"
#include "morescf/MoreSCFKeys.h"
#include "morescf/MoreSCFValues.h"
#include "platform/CoreServices.h"

namespace {

// "%@" would turn a null key into text, and a path to nowhere into one to "(null)".
OSStatus CreatePath(CFStringRef format, CFStringRef first, CFStringRef second, CFStringRef* path) {
    OSStatus err = 0;
    if (first == nullptr || second == nullptr) {
        err = paramErr;
    }
    if (err == 0) {
        CFStringRef created = CFStringCreateWithFormat(kCFAllocatorDefault, nullptr, format, first, second);
        if (created != nullptr) {
            *path = created;
        } else {
            err = coreFoundationUnknownErr;
        }
    }
    return err;
}

OSStatus CopyPathInSet(CFStringRef setID, CFStringRef format, CFStringRef last, CFStringRef* path) {
    CFStringRef setPath = nullptr;
    OSStatus err = CopySetPath(setID, &setPath);
    if (err == 0) {
        err = CreatePath(format, setPath, last, path);
    }
    CFQRelease(setPath);
    return err;
}

SInt32 LargestNumericKey(CFArrayRef keys) {
    SInt32 largest = std::numeric_limits<SInt32>::min();
    const CFIndex count = CFArrayGetCount(keys);
    for (CFIndex i = 0; i < count; ++i) {
        CFTypeRef key = CFArrayGetValueAtIndex(keys, i);
        char text[16];
        if (!IsString(key) ||
            !CFStringGetCString(static_cast<CFStringRef>(key), text, sizeof(text), kCFStringEncodingASCII)) {
            continue;
        }
        if (text[0] < '0' || text[0] > '9') {
            continue;
        }
        char* end = nullptr;
        errno = 0;
        const long value = std::strtol(text, &end, 10);
        // What a 32-bit long cannot hold is an overflow, whatever this machine's long is.
        if (errno != 0 || *end != '\0' || value > std::numeric_limits<SInt32>::max()) {
            continue;
        }
        if (value > largest) {
            largest = static_cast<SInt32>(value);
        }
    }
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
    // The first component is what stands before the leading slash.
    if (components == nullptr || CFArrayGetCount(components) < 3) {
        err = coreFoundationUnknownErr;
    }
    if (err == 0) {
        *seID = static_cast<CFStringRef>(CFQRetain(CFArrayGetValueAtIndex(components, 2)));
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
            *setPath = static_cast<CFStringRef>(CFQRetain(current));
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

OSStatus CopySetServiceOrderPath(CFStringRef setID, CFStringRef* path) {
    return CopyPathInSet(setID, CFSTR("%@/Network/Global/%@"), kIPv4Protocol, path);
}

OSStatus CopyResolvedServicePath(CFStringRef setID, CFStringRef serviceID, CFStringRef* servicePath) {
    OSStatus err = 0;
    CFStringRef linkPath = nullptr;
    if (serviceID == nullptr) {
        err = CopySetGlobalsPath(setID, servicePath);
    } else {
        err = CopyPathInSet(setID, CFSTR("%@/Network/Service/%@"), serviceID, &linkPath);
        if (err == 0) {
            CFStringRef target = SCPreferencesPathGetLink(MoreSCGetSCPreferencesRef(), linkPath);
            err = MoreSCError(target);
            if (err == 0) {
                *servicePath = static_cast<CFStringRef>(CFQRetain(target));
            }
        }
    }
    CFQRelease(linkPath);
    return err;
}

OSStatus CopyEntityPath(CFStringRef setID, CFStringRef serviceID, CFStringRef protocol,
                        CFStringRef* entityPath) {
    CFStringRef servicePath = nullptr;
    OSStatus err = CopyResolvedServicePath(setID, serviceID, &servicePath);
    if (err == 0) {
        err = CreatePath(CFSTR("%@/%@"), servicePath, protocol, entityPath);
    }
    CFQRelease(servicePath);
    return err;
}

OSStatus PreferencesPathSetProperty(CFStringRef path, CFStringRef key, CFPropertyListRef value) {
    SCPreferencesRef session = MoreSCGetSCPreferencesRef();
    CFMutableDictionaryRef copy = nullptr;
    CFDictionaryRef dict = SCPreferencesPathGetValue(session, path);
    OSStatus err = MoreSCError(dict);
    if (err == 0) {
        copy = CFDictionaryCreateMutableCopy(kCFAllocatorDefault, 0, dict);
        if (copy == nullptr) {
            err = coreFoundationUnknownErr;
        }
    }
    if (err == 0) {
        CFDictionarySetValue(copy, key, value);
        err = MoreSCErrorBoolean(SCPreferencesPathSetValue(session, path, copy));
    }
    CFQRelease(copy);
    return err;
}

OSStatus PreferencesPathDuplicate(CFStringRef path, CFStringRef newPath) {
    SCPreferencesRef session = MoreSCGetSCPreferencesRef();
    CFPropertyListRef copy = nullptr;
    CFDictionaryRef dict = SCPreferencesPathGetValue(session, path);
    OSStatus err = MoreSCError(dict);
    if (err == 0) {
        copy = CFPropertyListCreateDeepCopy(kCFAllocatorDefault, dict,
                                            kCFPropertyListMutableContainersAndLeaves);
        if (copy == nullptr) {
            err = coreFoundationUnknownErr;
        }
    }
    if (err == 0) {
        err = MoreSCErrorBoolean(
            SCPreferencesPathSetValue(session, newPath, static_cast<CFDictionaryRef>(copy)));
    }
    CFQRelease(copy);
    return err;
}

CFStringRef MySCPreferencesPathCreateUniqueChild(SCPreferencesRef session, CFStringRef prefix) {
    CFMutableDictionaryRef none = nullptr;
    CFArrayRef keys = nullptr;
    CFMutableDictionaryRef child = nullptr;
    CFStringRef childPath = nullptr;
    SInt32 largest = 0;

    CFDictionaryRef parent = SCPreferencesPathGetValue(session, prefix);
    int scErr = SCError();
    if (scErr == kSCStatusNoKey) {
        scErr = CFQDictionaryCreateMutable(&none) == 0 ? kSCStatusOK : kSCStatusFailed;
        parent = none;
    }
    if (scErr == kSCStatusOK && !IsDictionary(parent)) {
        scErr = kSCStatusNoKey;
    }
    if (scErr == kSCStatusOK && CFDictionaryContainsKey(parent, kLinkKey)) {
        scErr = kSCStatusFailed;
    }
    if (scErr == kSCStatusOK && CFQArrayCreateWithDictionaryKeys(parent, &keys) != 0) {
        scErr = kSCStatusFailed;
    }
    if (scErr == kSCStatusOK) {
        largest = LargestNumericKey(keys);
        if (largest == std::numeric_limits<SInt32>::max()) {
            scErr = kSCStatusFailed;
        }
    }
    if (scErr == kSCStatusOK) {
        childPath =
            CFStringCreateWithFormat(kCFAllocatorDefault, nullptr, CFSTR("%@/%i"), prefix, largest + 1);
        if (childPath == nullptr || CFQDictionaryCreateMutable(&child) != 0 ||
            !SCPreferencesPathSetValue(session, childPath, child)) {
            CFQRelease(childPath);
            childPath = nullptr;
        }
    }

    CFQRelease(none);
    CFQRelease(keys);
    CFQRelease(child);
    return childPath;
}

OSStatus MakeNewSeAndCopyIDAndPath(CFStringRef prefix, CFStringRef* newSeID, CFStringRef* newSePath) {
    OSStatus err = 0;
    CFStringRef parentPath = CFStringCreateWithFormat(kCFAllocatorDefault, nullptr, CFSTR("/%@"), prefix);
    if (parentPath == nullptr) {
        err = coreFoundationUnknownErr;
    }
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
    OSStatus err = CreateServicePathWithServiceID(serviceID, &servicePath);
    if (err == 0) {
        err = CFQDictionaryCreateMutable(&link);
    }
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
