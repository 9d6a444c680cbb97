#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCF.h"
#include "morescf/MoreSCFTree.h"
#include "morescf/MoreSCFValues.h"
#include "platform/CoreServices.h"

namespace {

OSStatus CopyDictionaryAtPath(CFStringRef path, CFDictionaryRef* dict) {
    CFDictionaryRef found = SCPreferencesPathGetValue(MoreSCGetSCPreferencesRef(), path);
    const OSStatus err = MoreSCError(found);
    if (err == 0) {
        *dict = static_cast<CFDictionaryRef>(CFQRetain(found));
    }
    return err;
}

OSStatus CreateMutableCopy(CFDictionaryRef dict, CFMutableDictionaryRef* copy) {
    *copy = CFDictionaryCreateMutableCopy(kCFAllocatorDefault, 0, dict);
    return *copy != nullptr ? 0 : coreFoundationUnknownErr;
}

}  // namespace

OSStatus MoreSCCopyEntitiesDict(CFStringRef setID, CFStringRef serviceID, CFDictionaryRef* entitiesDict) {
    CFStringRef path = nullptr;
    CFDictionaryRef dict = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0) {
        err = CopyResolvedServicePath(setID, serviceID, &path);
    }
    if (err == 0) {
        err = CopyDictionaryAtPath(path, &dict);
    }
    CFQRelease(path);
    MoreSCClose(&err, false);
    HandOverOrNull(err, dict, entitiesDict);
    return err;
}

OSStatus MoreSCCopyEntitiesDictMutable(CFStringRef setID, CFStringRef serviceID,
                                       CFMutableDictionaryRef* entitiesDict) {
    CFDictionaryRef dict = nullptr;
    CFMutableDictionaryRef copy = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0) {
        err = MoreSCCopyEntitiesDict(setID, serviceID, &dict);
    }
    if (err == 0) {
        err = CreateMutableCopy(dict, &copy);
    }
    CFQRelease(dict);
    MoreSCClose(&err, false);
    HandOver(err, copy, entitiesDict);
    return err;
}

OSStatus MoreSCSetEntitiesDict(CFStringRef setID, CFStringRef serviceID, CFDictionaryRef entitiesDict) {
    CFStringRef path = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0 && entitiesDict == nullptr) {
        err = paramErr;
    }
    if (err == 0) {
        err = CopyResolvedServicePath(setID, serviceID, &path);
    }
    if (err == 0) {
        err = MoreSCErrorBoolean(SCPreferencesPathSetValue(MoreSCGetSCPreferencesRef(), path, entitiesDict));
    }
    CFQRelease(path);
    MoreSCClose(&err, true);
    return err;
}

OSStatus MoreSCCopyEntity(CFStringRef setID, CFStringRef serviceID, CFStringRef protocol,
                          CFDictionaryRef* entity) {
    CFStringRef path = nullptr;
    CFDictionaryRef dict = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0) {
        err = CopyEntityPath(setID, serviceID, protocol, &path);
    }
    if (err == 0) {
        err = CopyDictionaryAtPath(path, &dict);
    }
    CFQRelease(path);
    MoreSCClose(&err, false);
    HandOverOrNull(err, dict, entity);
    return err;
}

OSStatus MoreSCCopyEntityMutable(CFStringRef setID, CFStringRef serviceID, CFStringRef protocol,
                                 CFMutableDictionaryRef* entity) {
    CFDictionaryRef dict = nullptr;
    CFMutableDictionaryRef copy = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0) {
        err = MoreSCCopyEntity(setID, serviceID, protocol, &dict);
    }
    if (err == 0) {
        err = CreateMutableCopy(dict, &copy);
    }
    CFQRelease(dict);
    MoreSCClose(&err, false);
    HandOver(err, copy, entity);
    return err;
}

OSStatus MoreSCSetEntity(CFStringRef setID, CFStringRef serviceID, CFStringRef protocol,
                         CFDictionaryRef entity) {
    CFStringRef path = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0 && entity == nullptr) {
        err = paramErr;
    }
    if (err == 0) {
        err = CopyEntityPath(setID, serviceID, protocol, &path);
    }
    if (err == 0) {
        err = MoreSCErrorBoolean(SCPreferencesPathSetValue(MoreSCGetSCPreferencesRef(), path, entity));
    }
    CFQRelease(path);
    MoreSCClose(&err, true);
    return err;
}

OSStatus MoreSCCopyEntities(CFStringRef setID, CFStringRef serviceID, CFArrayRef* entityProtocols,
                            CFArrayRef* entityValues) {
    CFDictionaryRef dict = nullptr;
    CFArrayRef keys = nullptr;
    CFArrayRef values = nullptr;
    CFMutableArrayRef protocols = nullptr;
    CFMutableArrayRef entities = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0 && entityProtocols == nullptr && entityValues != nullptr) {
        err = paramErr;
    }
    if (err == 0) {
        err = MoreSCCopyEntitiesDict(setID, serviceID, &dict);
    }
    if (entityProtocols != nullptr) {
        if (err == 0) {
            err = CFQArrayCreateMutable(&protocols);
        }
        if (err == 0) {
            err = CFQArrayCreateMutable(&entities);
        }
        if (err == 0) {
            err = CFQArrayCreateWithDictionaryKeys(dict, &keys);
        }
        if (err == 0) {
            err = CFQArrayCreateWithDictionaryValues(dict, &values);
        }
        if (err == 0) {
            const CFIndex count = CFArrayGetCount(keys);
            for (CFIndex i = 0; i < count; ++i) {
                CFTypeRef value = CFArrayGetValueAtIndex(values, i);
                if (IsDictionary(value)) {
                    CFArrayAppendValue(protocols, CFArrayGetValueAtIndex(keys, i));
                    CFArrayAppendValue(entities, value);
                }
            }
        }
    }
    CFQRelease(dict);
    CFQRelease(keys);
    CFQRelease(values);
    MoreSCClose(&err, false);
    HandOver<CFArrayRef>(err, protocols, entityProtocols);
    HandOver<CFArrayRef>(err, entities, entityValues);
    return err;
}

OSStatus MoreSCSetEntities(CFStringRef setID, CFStringRef serviceID, CFArrayRef entityProtocols,
                           CFArrayRef entityValues) {
    CFMutableDictionaryRef dict = nullptr;
    CFArrayRef keys = nullptr;
    CFArrayRef values = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0 && (entityProtocols == nullptr || entityValues == nullptr ||
                     CFArrayGetCount(entityProtocols) != CFArrayGetCount(entityValues))) {
        err = paramErr;
    }
    if (err == 0) {
        err = MoreSCCopyEntitiesDictMutable(setID, serviceID, &dict);
    }
    if (err == 0) {
        err = CFQArrayCreateWithDictionaryKeys(dict, &keys);
    }
    if (err == 0) {
        err = CFQArrayCreateWithDictionaryValues(dict, &values);
    }
    if (err == 0) {
        const CFIndex oldCount = CFArrayGetCount(keys);
        for (CFIndex i = 0; i < oldCount; ++i) {
            if (IsDictionary(CFArrayGetValueAtIndex(values, i))) {
                CFDictionaryRemoveValue(dict, CFArrayGetValueAtIndex(keys, i));
            }
        }
        const CFIndex newCount = CFArrayGetCount(entityProtocols);
        for (CFIndex i = 0; i < newCount; ++i) {
            CFDictionaryAddValue(dict, CFArrayGetValueAtIndex(entityProtocols, i),
                                 CFArrayGetValueAtIndex(entityValues, i));
        }
        err = MoreSCSetEntitiesDict(setID, serviceID, dict);
    }
    CFQRelease(dict);
    CFQRelease(keys);
    CFQRelease(values);
    MoreSCClose(&err, true);
    return err;
}

OSStatus MoreSCNewEntity(CFStringRef setID, CFStringRef serviceID, CFStringRef protocol,
                         CFDictionaryRef entity) {
    CFMutableDictionaryRef dict = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0 && (protocol == nullptr || entity == nullptr)) {
        err = paramErr;
    }
    if (err == 0) {
        err = MoreSCCopyEntitiesDictMutable(setID, serviceID, &dict);
    }
    if (err == 0 && CFDictionaryContainsKey(dict, protocol)) {
        err = paramErr;
    }
    if (err == 0) {
        CFDictionaryAddValue(dict, protocol, entity);
        err = MoreSCSetEntitiesDict(setID, serviceID, dict);
    }
    CFQRelease(dict);
    MoreSCClose(&err, true);
    return err;
}

OSStatus MoreSCDeleteEntity(CFStringRef setID, CFStringRef serviceID, CFStringRef protocol) {
    CFMutableDictionaryRef dict = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0 && protocol == nullptr) {
        err = paramErr;
    }
    if (err == 0) {
        err = MoreSCCopyEntitiesDictMutable(setID, serviceID, &dict);
    }
    if (err == 0) {
        CFDictionaryRemoveValue(dict, protocol);
        err = MoreSCSetEntitiesDict(setID, serviceID, dict);
    }
    CFQRelease(dict);
    MoreSCClose(&err, true);
    return err;
}

OSStatus MoreSCIsEntityActive(CFStringRef setID, CFStringRef serviceID, CFStringRef protocol,
                              Boolean* active) {
    CFDictionaryRef entity = nullptr;
    Boolean isActive = false;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0) {
        err = MoreSCCopyEntity(setID, serviceID, protocol, &entity);
    }
    if (err == 0) {
        isActive = IsDictionaryActive(entity);
    }
    CFQRelease(entity);
    MoreSCClose(&err, false);
    if (err == 0) {
        *active = isActive;
    }
    return err;
}

OSStatus MoreSCSetEntityActive(CFStringRef setID, CFStringRef serviceID, CFStringRef protocol,
                               Boolean active) {
    CFMutableDictionaryRef entity = nullptr;
    Boolean changed = false;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0) {
        err = MoreSCCopyEntityMutable(setID, serviceID, protocol, &entity);
    }
    if (err == 0) {
        err = SetDictionaryActive(entity, active, &changed);
    }
    if (err == 0 && changed) {
        err = MoreSCSetEntity(setID, serviceID, protocol, entity);
    }
    CFQRelease(entity);
    MoreSCClose(&err, changed);
    return err;
}
