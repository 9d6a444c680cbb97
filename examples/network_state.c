/* What the library looks like from C: the computer's primary IPv4 state, and each change of it.
 *
 *     network_state [SECONDS]
 *
 * Prints what is there now, and then what changes within that many seconds, none unless told otherwise. The
 * exit status is 0, or 1 with a line on standard error.
 */
#include <stdio.h>
#include <stdlib.h>

#include "morecfq/MoreCFQ.h"
#include "platform/CoreFoundation.h"
#include "platform/SystemConfiguration.h"

static void Show(SCDynamicStoreRef store, CFStringRef key) {
    CFPropertyListRef value = SCDynamicStoreCopyValue(store, key);
    CFStringRef text = value != NULL ? CFCopyDescription(value) : NULL;
    printf("%s\n", text != NULL ? CFStringGetCStringPtr(text, kCFStringEncodingUTF8) : "no default route");
    fflush(stdout);
    CFQRelease(text);
    CFQRelease(value);
}

static void Changed(SCDynamicStoreRef store, CFArrayRef changedKeys, void* info) {
    (void)info;
    for (CFIndex i = 0; i < CFArrayGetCount(changedKeys); ++i) {
        Show(store, (CFStringRef)CFArrayGetValueAtIndex(changedKeys, i));
    }
}

int main(int argc, char** argv) {
    const double seconds = argc > 1 ? strtod(argv[1], NULL) : 0;
    SCDynamicStoreRef store =
        SCDynamicStoreCreate(kCFAllocatorDefault, CFSTR("network_state"), Changed, NULL);
    CFStringRef key = SCDynamicStoreKeyCreateNetworkGlobalEntity(kCFAllocatorDefault,
                                                                 kSCDynamicStoreDomainState, kSCEntNetIPv4);
    CFMutableArrayRef keys = NULL;
    CFRunLoopSourceRef source = NULL;
    int status = store != NULL && CFQArrayCreateMutable(&keys) == 0 ? 0 : 1;

    if (status == 0) {
        CFArrayAppendValue(keys, key);
        source = SCDynamicStoreCreateRunLoopSource(kCFAllocatorDefault, store, 0);
        status = source != NULL && SCDynamicStoreSetNotificationKeys(store, keys, NULL) ? 0 : 1;
    }
    if (status == 0) {
        Show(store, key);
        CFRunLoopAddSource(CFRunLoopGetCurrent(), source, kCFRunLoopDefaultMode);
        CFRunLoopRunInMode(kCFRunLoopDefaultMode, seconds, 0);
    } else {
        fprintf(stderr, "%s\n", SCErrorString(SCError()));
    }
    CFQRelease(source);
    CFQRelease(keys);
    CFQRelease(key);
    CFQRelease(store);
    return status;
}
