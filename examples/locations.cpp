// What a first program with the network-configuration library looks like.
//
//     locations list               every location with its services, and the live state of the current one's
//     locations make-dialup NAME   a new location in which only the first modem is on
//     locations delete NAME        deletes the first location of that name, unless it is the current one
//     locations renew              gives the leases of the current location back and takes new ones
//
// Changing something takes root. The exit status is 0, or 1 with a line on standard error.
#include <cstdio>
#include <cstring>

#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCF.h"
#include "morescf/MoreSCFHelpers.h"
#include "platform/CoreFoundation.h"
#include "platform/CoreServices.h"
#include "platform/SystemConfiguration.h"

namespace {

// A value as one line of text; "-" for none.
void Print(const char* label, CFTypeRef value) {
    CFStringRef text = value != nullptr ? CFCopyDescription(value) : nullptr;
    const char* bytes = text != nullptr ? CFStringGetCStringPtr(text, kCFStringEncodingUTF8) : "-";
    std::printf("%s%s\n", label, bytes != nullptr ? bytes : "-");
    CFQRelease(text);
}

// What the dynamic store holds at a key, unless it is nothing. It consumes the key.
void PrintLive(SCDynamicStoreRef store, const char* label, CFStringRef key) {
    CFPropertyListRef value = key != nullptr ? SCDynamicStoreCopyValue(store, key) : nullptr;
    if (value != nullptr) {
        Print(label, value);
    }
    CFQRelease(value);
    CFQRelease(key);
}

OSStatus PrintService(CFStringRef setID, CFStringRef serviceID, SCDynamicStoreRef store) {
    CFStringRef name = nullptr;
    CFStringRef device = nullptr;
    Boolean active = false;
    OSStatus err = MoreSCCopyUserVisibleNameOfService(setID, serviceID, &name);
    if (err == 0) {
        err = MoreSCCopyBSDNameOfService(setID, serviceID, &device);
    }
    if (err == 0) {
        err = MoreSCIsServiceActive(setID, serviceID, &active);
    }
    if (err == 0) {
        Print(active ? "    on   " : "    off  ", name);
        Print("           device  ", device);
        // "Setup:" tells of the current location alone.
        if (store != nullptr) {
            PrintLive(store, "           IPv4    ",
                      SCDynamicStoreKeyCreateNetworkServiceEntity(
                          kCFAllocatorDefault, kSCDynamicStoreDomainSetup, serviceID, kSCEntNetIPv4));
        }
    }
    CFQRelease(name);
    CFQRelease(device);
    return err;
}

OSStatus PrintLocation(CFStringRef setID, bool isCurrent, SCDynamicStoreRef store) {
    CFStringRef name = nullptr;
    CFArrayRef serviceIDs = nullptr;
    OSStatus err = MoreSCCopyUserVisibleNameOfSet(setID, &name);
    if (err == 0) {
        err = MoreSCCopyServiceIDs(setID, &serviceIDs, nullptr);
    }
    if (err == 0) {
        Print(isCurrent ? "* " : "  ", name);
        const CFIndex count = CFArrayGetCount(serviceIDs);
        for (CFIndex i = 0; err == 0 && i < count; ++i) {
            auto* serviceID = static_cast<CFStringRef>(CFArrayGetValueAtIndex(serviceIDs, i));
            err = PrintService(setID, serviceID, isCurrent ? store : nullptr);
        }
    }
    CFQRelease(name);
    CFQRelease(serviceIDs);
    return err;
}

OSStatus List() {
    CFArrayRef setIDs = nullptr;
    CFIndex currentIndex = kCFNotFound;
    SCDynamicStoreRef store = SCDynamicStoreCreate(kCFAllocatorDefault, CFSTR("locations"), nullptr, nullptr);
    OSStatus err = MoreSCError(store);
    // One open around all the questions: the preferences are read once, and all answers are of one moment.
    const OSStatus openErr = MoreSCOpen(false, false);
    if (err == 0) {
        err = openErr;
    }
    if (err == 0) {
        err = MoreSCCopySetIDs(&setIDs, &currentIndex);
    }
    if (err == 0) {
        const CFIndex count = CFArrayGetCount(setIDs);
        for (CFIndex i = 0; err == 0 && i < count; ++i) {
            auto* setID = static_cast<CFStringRef>(CFArrayGetValueAtIndex(setIDs, i));
            err = PrintLocation(setID, i == currentIndex, store);
        }
    }
    MoreSCClose(&err, false);
    if (err == 0) {
        PrintLive(store, "default route: ",
                  SCDynamicStoreKeyCreateNetworkGlobalEntity(kCFAllocatorDefault, kSCDynamicStoreDomainState,
                                                             kSCEntNetIPv4));
    }
    CFQRelease(setIDs);
    CFQRelease(store);
    return err;
}

OSStatus MakeDialup(CFStringRef name) {
    MoreSCPPPDigest ppp = {};
    ppp.active = true;
    ppp.authName = CFSTR("guest");
    ppp.authPassword = CFSTR("guest");
    ppp.commRemoteAddress = CFSTR("555-0100");
    CFStringRef setID = nullptr;
    const OSStatus err = MoreSCMakeNewDialupSet(nullptr, name, nullptr, &ppp, nullptr, nullptr, &setID);
    if (err == 0) {
        Print("made location ", setID);
    }
    CFQRelease(setID);
    return err;
}

OSStatus Delete(CFStringRef name) {
    CFStringRef setID = nullptr;
    OSStatus err = MoreSCOpen(false, false);
    if (err == 0) {
        err = MoreSCFindSetByUserVisibleNameAndCopyID(name, &setID);
    }
    if (err == 0 && setID == nullptr) {
        std::fprintf(stderr, "no location has that name\n");
        err = kSCStatusNoKey;
    }
    if (err == 0) {
        err = MoreSCDeleteSet(setID);
    }
    // The deletion has marked the session; this close commits and applies it.
    MoreSCClose(&err, false);
    if (err == 0) {
        Print("deleted location ", setID);
    }
    CFQRelease(setID);
    return err;
}

OSStatus Renew() {
    CFArrayRef services = nullptr;
    OSStatus err = MoreSCCreateActiveDHCPServicesArray(&services);
    const CFIndex count = err == 0 ? CFArrayGetCount(services) : 0;
    for (CFIndex i = 0; err == 0 && i < count; ++i) {
        const auto serviceID = static_cast<CFStringRef>(CFArrayGetValueAtIndex(services, i));
        Print("renewing the lease of service ", serviceID);
        // Outside of any session: the two halves have to be applied one after the other.
        err = MoreSCDHCPRelease(serviceID);
    }
    CFQRelease(services);
    return err;
}

}  // namespace

int main(int argc, char** argv) {
    const char* command = argc > 1 ? argv[1] : "";
    CFStringRef name = nullptr;
    OSStatus err = paramErr;
    if (argc == 3) {
        name = CFStringCreateWithCString(kCFAllocatorDefault, argv[2], CFStringGetSystemEncoding());
    }
    if (argc == 2 && std::strcmp(command, "list") == 0) {
        err = List();
    } else if (argc == 2 && std::strcmp(command, "renew") == 0) {
        err = Renew();
    } else if (name != nullptr && std::strcmp(command, "make-dialup") == 0) {
        err = MakeDialup(name);
    } else if (name != nullptr && std::strcmp(command, "delete") == 0) {
        err = Delete(name);
    } else {
        std::fprintf(stderr, "Usage: %s list | make-dialup NAME | delete NAME | renew\n", argv[0]);
    }
    if (err != 0) {
        std::fprintf(stderr, "status %d\n", static_cast<int>(err));
    }
    CFQRelease(name);
    return err == 0 ? 0 : 1;
}
