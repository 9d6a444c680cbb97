// Building, activating and deleting the temporary location.
#include <arpa/inet.h>

#include <cstring>

#include "app/ArvAssistant.h"
#include "app/Trace.h"
#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCF.h"
#include "morescf/MoreSCFDigest.h"
#include "platform/CoreServices.h"

namespace {

// The printer's own set-up network: a fixed address for this computer, and the printer as the router.
constexpr const char* kOwnAddress = "192.0.0.199";
constexpr const char* kSubnetMask = "255.255.255.0";
constexpr const char* kPrinterAddress = "192.0.0.192";

// No mode is a mode other than every one that has a name.
bool IsMode(const char* mode, const char* wanted) {
    return mode != nullptr && std::strcmp(mode, wanted) == 0;
}

OSStatus CopyArgument(const char* argument, CFStringRef* string) {
    *string = CFStringCreateWithCString(kCFAllocatorDefault, argument, CFStringGetSystemEncoding());
    return *string != nullptr ? 0 : coreFoundationUnknownErr;
}

// Turns the card on and, with a network name, has it join that network. What is not given is not written.
OSStatus SetAirPortKeys(CFMutableDictionaryRef entity, const char* networkName, const char* password) {
    OSStatus err = 0;
    CFStringRef network = nullptr;
    CFStringRef passwordText = nullptr;
    CFDataRef encodedPassword = nullptr;

    CFDictionarySetValue(entity, CFSTR("PowerEnabled"), kCFBooleanTrue);
    if (networkName != nullptr) {
        err = CopyArgument(networkName, &network);
        if (err == 0) {
            CFDictionarySetValue(entity, CFSTR("PreferredNetwork"), network);
        }
    }
    if (err == 0) {
        CFDictionarySetValue(entity, CFSTR("JoinMode"), CFSTR("Preferred"));
    }
    if (err == 0 && password != nullptr) {
        err = CopyArgument(password, &passwordText);
        if (err == 0) {
            err = MoreSCFCopyEncodedPPPPassword(passwordText, &encodedPassword);
        }
        if (err == 0) {
            CFDictionarySetValue(entity, CFSTR("AuthPassword"), encodedPassword);
        }
    }

    CFQRelease(network);
    CFQRelease(passwordText);
    CFQRelease(encodedPassword);
    return err;
}

OSStatus CreateIPv4Settings(const char* mode, CFMutableDictionaryRef* entity) {
    OSStatus err = 0;
    MoreSCIPv4Digest digest = {};
    if (IsMode(mode, "auto") || IsMode(mode, "wirelessAuto")) {
        digest.configMethod = CFSTR("DHCP");
    } else {
        digest.configMethod = CFSTR("Manual");
        if (inet_aton(kOwnAddress, &digest.address) == 0 || inet_aton(kSubnetMask, &digest.subnetMask) == 0 ||
            inet_aton(kPrinterAddress, &digest.router) == 0) {
            err = paramErr;
        }
    }
    if (err == 0) {
        err = MoreSCCreateIPv4Entity(&digest, entity);
    }
    return err;
}

}  // namespace

OSStatus ArvAssistant::CreateTemporarySet(char* mode, char* networkName, char* password) {
    TRACE("Creating the temporary set\n");
    CFStringRef setID = nullptr;
    CFArrayRef serviceIDs = nullptr;
    bool foundAirPortCard = false;

    OSStatus err = MoreSCOpen(false, false);
    if (err == 0) {
        err = MoreSCNewSet(TemporarySetName(), &setID);
    }
    TRACE("AT START OF CreateTemporarySet():");
    ListLocations();

    if (err == 0) {
        err = MoreSCCopyServiceIDs(setID, &serviceIDs, nullptr);
    }
    if (err == 0 && serviceIDs == nullptr) {
        // The session stays open, and nothing of it is committed.
        CFQRelease(setID);
        return 0;
    }

    if (err == 0) {
        const CFStringRef type = IsMode(mode, "auto") ? CFSTR("Ethernet") : CFSTR("AirPort");
        const CFIndex count = CFArrayGetCount(serviceIDs);
        for (CFIndex i = 0; i < count; ++i) {
            const auto serviceID = static_cast<CFStringRef>(CFArrayGetValueAtIndex(serviceIDs, i));
            CFStringRef serviceName = nullptr;
            CFMutableDictionaryRef entity = nullptr;
            MoreSCCopyUserVisibleNameOfService(setID, serviceID, &serviceName);
            err = MoreSCCopyEntityMutable(setID, serviceID, type, &entity);
            if (err != 0) {
                err = MoreSCSetServiceActive(setID, serviceID, false);
                TRACE("Disabling interface %s\n", SystemText(serviceName).c_str());
            } else {
                TRACE("Enabling interface %s\n", SystemText(serviceName).c_str());
                err = MoreSCSetServiceActive(setID, serviceID, true);
                foundAirPortCard = true;
                err = ConfigureTemporarySetProperties(setID, serviceID, entity, mode, networkName, password);
            }
            CFQRelease(serviceName);
        }
    }

    TRACE("err == %d, foundAirPortCard == %d\n", static_cast<int>(err), foundAirPortCard ? 1 : 0);
    if ((err != 0 || !foundAirPortCard) && setID != nullptr) {
        TRACE("Removing a partially created set\n");
        MoreSCDeleteSet(setID);
        CFQRelease(setID);
        setID = nullptr;
    }

    MoreSCClose(&err, err == 0);
    if (err == kSCStatusAccessError) {
        TRACE("Authorization failure - you must authorize or run as root!\n");
    } else if (err != 0) {
        TRACE("MoreSCClose() failed -> err == %d\n", static_cast<int>(err));
    } else {
        TRACE("MoreSCClose() succeeded\n");
    }

    temporarySetID = setID;
    TRACE("AT END OF CreateTemporarySet():");
    ListLocations();
    CFQRelease(serviceIDs);
    return err;
}

OSStatus ArvAssistant::ConfigureTemporarySetProperties(CFStringRef setID, CFStringRef serviceID,
                                                       CFMutableDictionaryRef entity, const char* mode,
                                                       const char* networkName, const char* password) {
    OSStatus err = 0;
    if (IsMode(mode, "auto")) {
        err = MoreSCSetEntity(setID, serviceID, CFSTR("Ethernet"), entity);
    } else {
        err = SetAirPortKeys(entity, networkName, password);
        if (err == 0) {
            err = MoreSCSetEntity(setID, serviceID, CFSTR("AirPort"), entity);
        }
    }
    CFQRelease(entity);

    if (err == 0) {
        CFMutableDictionaryRef ipv4 = nullptr;
        err = CreateIPv4Settings(mode, &ipv4);
        if (err == 0) {
            TRACE("Setting the IPv4 settings\n");
            err = MoreSCSetEntity(setID, serviceID, CFSTR("IPv4"), ipv4);
            CFQRelease(ipv4);
        }
    }
    if (err == 0) {
        CFMutableDictionaryRef dns = nullptr;
        const MoreSCDNSDigest digest = {};
        err = MoreSCCreateDNSEntity(&digest, &dns);
        if (err == 0) {
            TRACE("Setting the DNS settings\n");
            err = MoreSCSetEntity(setID, serviceID, CFSTR("DNS"), dns);
            CFQRelease(dns);
        }
    }

    TRACE("Returning err == %d\n", static_cast<int>(err));
    return err;
}

OSStatus ArvAssistant::ActivateTemporarySet() {
    TRACE("Activating the temporary set\n");
    return ActivateSet(temporarySetID);
}

OSStatus ArvAssistant::DestroyTemporarySet() {
    TRACE("Deleting the temporary set\n");
    OSStatus status = 0;
    if (temporarySetID == nullptr) {
        TRACE("No temporary set to delete.\n");
    } else {
        status = MoreSCDeleteSet(temporarySetID);
        if (status == 0) {
            TRACE("Temporary set deleted.\n");
        } else {
            TRACE("*** Temporary set NOT deleted! (result = %d) ***\n", static_cast<int>(status));
        }
    }
    ListLocations();
    return status;
}
