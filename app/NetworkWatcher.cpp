#include "app/NetworkWatcher.h"

#include <cstdio>

#include "app/Trace.h"
#include "morecfq/MoreCFQ.h"
#include "platform/CoreServices.h"

bool gIsNetworkReady = false;

namespace {

SCDynamicStoreRef store = nullptr;
CFRunLoopSourceRef rls = nullptr;

void ReportFailure(const char* what) {
    std::fprintf(stderr, "%s\n", what);
    std::fprintf(stderr, "error = %s\n", SCErrorString(SCError()));
}

// The session's value at the key, when it is a dictionary, or null.
CFDictionaryRef CopyDictionary(SCDynamicStoreRef session, CFStringRef key) {
    const CFPropertyListRef value = SCDynamicStoreCopyValue(session, key);
    if (value != nullptr && CFGetTypeID(value) != CFDictionaryGetTypeID()) {
        CFQRelease(value);
        return nullptr;
    }
    return static_cast<CFDictionaryRef>(value);
}

// A string as it is, of any other value a textual form in one line.
CFStringRef CopyText(CFTypeRef value) {
    return CFGetTypeID(value) == CFStringGetTypeID() ? static_cast<CFStringRef>(CFQRetain(value))
                                                     : CFCopyDescription(value);
}

void TracePair(CFTypeRef key, CFTypeRef value) {
    const CFStringRef keyText = CopyText(key);
    const CFStringRef valueText = CopyText(value);
    TRACE("key=\"%s\", value=\"%s\"\n", SystemText(keyText).c_str(), SystemText(valueText).c_str());
    CFQRelease(keyText);
    CFQRelease(valueText);
}

OSStatus TraceDictionary(CFDictionaryRef dictionary) {
    CFArrayRef keys = nullptr;
    CFArrayRef values = nullptr;
    OSStatus err = CFQArrayCreateWithDictionaryKeys(dictionary, &keys);
    if (err == 0) {
        err = CFQArrayCreateWithDictionaryValues(dictionary, &values);
    }
    if (err == 0) {
        TRACE("Main Key Dict:\n");
        const CFIndex count = CFArrayGetCount(keys);
        for (CFIndex i = 0; i < count; ++i) {
            TracePair(CFArrayGetValueAtIndex(keys, i), CFArrayGetValueAtIndex(values, i));
        }
    }
    CFQRelease(keys);
    CFQRelease(values);
    return err;
}

}  // namespace

void setNetworkReady(bool ready) {
    gIsNetworkReady = ready;
    TRACE("setting gIsNetworkReady to ");
    TRACE("%s", ready ? "TRUE" : "FALSE");
    TRACE("\n");
}

void networkChanged(SCDynamicStoreRef session, CFArrayRef changedKeys, void* /*info*/) {
    OSStatus err = 0;
    TRACE("the network configuration changed!\n");
    const CFIndex count = CFArrayGetCount(changedKeys);
    for (CFIndex i = 0; i < count; ++i) {
        const auto key = static_cast<CFStringRef>(CFArrayGetValueAtIndex(changedKeys, i));
        TRACE("Main Key %d=\"%s\"\n", static_cast<int>(i), SystemText(key).c_str());
        const CFDictionaryRef dictionary = CopyDictionary(session, key);
        if (dictionary == nullptr) {
            TRACE("Main Key Dict is nil\n");
            err = coreFoundationUnknownErr;
        }
        setNetworkReady(err == 0);
        if (err == 0) {
            err = TraceDictionary(dictionary);
        }
        CFQRelease(dictionary);
    }
    TRACE("\n");
    std::fflush(stdout);
}

void watchForNetworkChanges() {
    SCDynamicStoreContext context = {0, store, nullptr, nullptr, nullptr};
    store =
        SCDynamicStoreCreate(kCFAllocatorDefault, CFSTR("watchForNetworkChanges"), networkChanged, &context);
    if (store == nullptr) {
        ReportFailure("could not open session with configd");
        return;
    }

    CFMutableArrayRef keys = nullptr;
    CFMutableArrayRef patterns = nullptr;
    CFQArrayCreateMutable(&keys);
    CFQArrayCreateMutable(&patterns);
    const CFStringRef key = SCDynamicStoreKeyCreateNetworkGlobalEntity(
        kCFAllocatorDefault, kSCDynamicStoreDomainState, kSCEntNetIPv4);
    if (keys != nullptr && key != nullptr) {
        CFArrayAppendValue(keys, key);
    }
    CFQRelease(key);
    const Boolean registered = SCDynamicStoreSetNotificationKeys(store, keys, patterns);
    if (registered == 0) {
        ReportFailure("could not register notification keys");
        CFQRelease(store);
        store = nullptr;
    }
    CFQRelease(keys);
    CFQRelease(patterns);
    if (registered == 0) {
        return;
    }

    rls = SCDynamicStoreCreateRunLoopSource(kCFAllocatorDefault, store, 0);
    if (rls != nullptr) {
        CFRunLoopAddSource(CFRunLoopGetCurrent(), rls, kCFRunLoopDefaultMode);
    } else {
        ReportFailure("could not create runloop source");
        CFQRelease(store);
        store = nullptr;
    }
}

void stopWatchingForNetworkChanges() {
    if (rls != nullptr) {
        CFRunLoopRemoveSource(CFRunLoopGetCurrent(), rls, kCFRunLoopDefaultMode);
    }
    CFRunLoopStop(CFRunLoopGetCurrent());
}
