#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCF.h"
#include "morescf/MoreSCFNode.h"
#include "morescf/MoreSCFSteps.h"
#include "morescf/MoreSCFValues.h"
#include "platform/CoreServices.h"

namespace {

// Takes the step for the protocol and the dictionary of each entity. What is no dictionary is a property of
// the service itself. The step may change the service.
template <class Step>
OSStatus ForEachEntity(CFDictionaryRef service, Step step) {
    CFArrayRef keys = nullptr;
    CFArrayRef values = nullptr;
    const OSStatus err = InTurn([&] { return CFQArrayCreateWithDictionaryKeys(service, &keys); },
                                [&] { return CFQArrayCreateWithDictionaryValues(service, &values); });
    const CFIndex count = err == 0 ? CFArrayGetCount(keys) : 0;
    for (CFIndex i = 0; i < count; ++i) {
        if (IsDictionary(CFArrayGetValueAtIndex(values, i))) {
            step(CFArrayGetValueAtIndex(keys, i), CFArrayGetValueAtIndex(values, i));
        }
    }
    CFQRelease(keys);
    CFQRelease(values);
    return err;
}

}  // namespace

OSStatus MoreSCCopyEntitiesDict(CFStringRef setID, CFStringRef serviceID, CFDictionaryRef* entitiesDict) {
    return CopyNode(ServiceNode(setID, serviceID), entitiesDict);
}

OSStatus MoreSCCopyEntitiesDictMutable(CFStringRef setID, CFStringRef serviceID,
                                       CFMutableDictionaryRef* entitiesDict) {
    return CopyNodeMutable(ServiceNode(setID, serviceID), entitiesDict);
}

OSStatus MoreSCSetEntitiesDict(CFStringRef setID, CFStringRef serviceID, CFDictionaryRef entitiesDict) {
    return StoreNode(ServiceNode(setID, serviceID), entitiesDict);
}

OSStatus MoreSCCopyEntity(CFStringRef setID, CFStringRef serviceID, CFStringRef protocol,
                          CFDictionaryRef* entity) {
    return CopyNode(EntityNode(setID, serviceID, protocol), entity);
}

OSStatus MoreSCCopyEntityMutable(CFStringRef setID, CFStringRef serviceID, CFStringRef protocol,
                                 CFMutableDictionaryRef* entity) {
    return CopyNodeMutable(EntityNode(setID, serviceID, protocol), entity);
}

OSStatus MoreSCSetEntity(CFStringRef setID, CFStringRef serviceID, CFStringRef protocol,
                         CFDictionaryRef entity) {
    return StoreNode(EntityNode(setID, serviceID, protocol), entity);
}

OSStatus MoreSCCopyEntities(CFStringRef setID, CFStringRef serviceID, CFArrayRef* entityProtocols,
                            CFArrayRef* entityValues) {
    CFDictionaryRef service = nullptr;
    CFMutableArrayRef protocols = nullptr;
    CFMutableArrayRef entities = nullptr;
    OSStatus err = InTurn(
        OpenSession, [&] { return entityValues != nullptr ? ErrorIfNotGiven(entityProtocols) : 0; },
        [&] { return CopyNode(ServiceNode(setID, serviceID), &service); },
        [&] { return CFQArrayCreateMutable(&protocols); }, [&] { return CFQArrayCreateMutable(&entities); });
    if (err == 0) {
        err = ForEachEntity(service, [&](CFTypeRef protocol, CFTypeRef entity) {
            CFArrayAppendValue(protocols, protocol);
            CFArrayAppendValue(entities, entity);
        });
    }
    CFQRelease(service);
    MoreSCClose(&err, false);
    HandOver<CFArrayRef>(err, protocols, entityProtocols);
    HandOver<CFArrayRef>(err, entities, entityValues);
    return err;
}

OSStatus MoreSCSetEntities(CFStringRef setID, CFStringRef serviceID, CFArrayRef entityProtocols,
                           CFArrayRef entityValues) {
    const bool isValid = entityProtocols != nullptr && entityValues != nullptr &&
                         CFArrayGetCount(entityProtocols) == CFArrayGetCount(entityValues);
    return ChangeNode(ServiceNode(setID, serviceID), isValid, [=](CFMutableDictionaryRef service) {
        const OSStatus err = ForEachEntity(
            service, [=](CFTypeRef protocol, CFTypeRef) { CFDictionaryRemoveValue(service, protocol); });
        const CFIndex count = err == 0 ? CFArrayGetCount(entityProtocols) : 0;
        for (CFIndex i = 0; i < count; ++i) {
            // Against a property of the service, and against an earlier entity of its protocol, it does not
            // count.
            CFDictionaryAddValue(service, CFArrayGetValueAtIndex(entityProtocols, i),
                                 CFArrayGetValueAtIndex(entityValues, i));
        }
        return err;
    });
}

OSStatus MoreSCNewEntity(CFStringRef setID, CFStringRef serviceID, CFStringRef protocol,
                         CFDictionaryRef entity) {
    return ChangeNode(ServiceNode(setID, serviceID), protocol != nullptr && entity != nullptr,
                      [=](CFMutableDictionaryRef service) {
                          OSStatus err = 0;
                          if (CFDictionaryContainsKey(service, protocol)) {
                              err = paramErr;
                          } else {
                              CFDictionaryAddValue(service, protocol, entity);
                          }
                          return err;
                      });
}

OSStatus MoreSCDeleteEntity(CFStringRef setID, CFStringRef serviceID, CFStringRef protocol) {
    return ChangeNode(ServiceNode(setID, serviceID), protocol != nullptr,
                      [=](CFMutableDictionaryRef service) {
                          CFDictionaryRemoveValue(service, protocol);
                          return OSStatus{0};
                      });
}

OSStatus MoreSCIsEntityActive(CFStringRef setID, CFStringRef serviceID, CFStringRef protocol,
                              Boolean* active) {
    return IsNodeActive(EntityNode(setID, serviceID, protocol), active);
}

OSStatus MoreSCSetEntityActive(CFStringRef setID, CFStringRef serviceID, CFStringRef protocol,
                               Boolean active) {
    return SetNodeActive(EntityNode(setID, serviceID, protocol), active);
}
