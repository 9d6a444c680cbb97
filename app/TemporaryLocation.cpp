// Building, activating and deleting the temporary location.
#include <arpa/inet.h>

#include <cstring>

#include "app/ArvAssistant.h"
#include "app/Printer.h"
#include "app/Trace.h"
#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCF.h"
#include "morescf/MoreSCFDigest.h"
#include "platform/CoreServices.h"

// What a mode of "create" means: the kind of card that stays on, and how it gets its address.
struct TemporaryMode {
    CFStringRef hardware;  // the entity that the services of such cards have: "AirPort" or "Ethernet"
    bool isWireless;
    bool usesDHCP;
};

namespace {

// The printer's own set-up network: a fixed address for this computer, and the printer as the router.
constexpr const char* kOwnAddress = "192.0.0.199";
constexpr const char* kSubnetMask = "255.255.255.0";
bool IsWord(const char* word, const char* wanted) {
    return word != nullptr && std::strcmp(word, wanted) == 0;
}

// Any other word, and none, is what the printer itself needs: its wireless network, at a fixed address.
TemporaryMode ModeOfWord(const char* word) {
    if (IsWord(word, "auto")) {
        return {CFSTR("Ethernet"), false, true};
    }
    return {CFSTR("AirPort"), true, IsWord(word, "wirelessAuto")};
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

OSStatus CreateIPv4Settings(const TemporaryMode& mode, CFMutableDictionaryRef* entity) {
    OSStatus err = 0;
    MoreSCIPv4Digest digest = {};
    digest.configMethod = mode.usesDHCP ? CFSTR("DHCP") : CFSTR("Manual");
    if (!mode.usesDHCP &&
        (inet_aton(kOwnAddress, &digest.address) == 0 || inet_aton(kSubnetMask, &digest.subnetMask) == 0 ||
         inet_aton(kPrinterAddress, &digest.router) == 0)) {
        err = paramErr;
    }
    if (err == 0) {
        err = MoreSCCreateIPv4Entity(&digest, entity);
    }
    return err;
}

}  // namespace

OSStatus ArvAssistant::CreateTemporarySet(char* mode, char* networkName, char* password) {
    TRACE("Creating the temporary set\n");
    const TemporaryMode settings = ModeOfWord(mode);
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
        const CFIndex count = CFArrayGetCount(serviceIDs);
        // Every service is gone through, whatever comes of one: each is left on or off.
        for (CFIndex i = 0; i < count; ++i) {
            const auto serviceID = static_cast<CFStringRef>(CFArrayGetValueAtIndex(serviceIDs, i));
            CFStringRef serviceName = nullptr;
            CFMutableDictionaryRef entity = nullptr;
            MoreSCCopyUserVisibleNameOfService(setID, serviceID, &serviceName);
            err = MoreSCCopyEntityMutable(setID, serviceID, settings.hardware, &entity);
            if (err != 0) {
                err = MoreSCSetServiceActive(setID, serviceID, false);
                TRACE("Disabling interface %s\n", SystemText(serviceName).c_str());
            } else {
                TRACE("Enabling interface %s\n", SystemText(serviceName).c_str());
                err = MoreSCSetServiceActive(setID, serviceID, true);
                foundAirPortCard = true;
                err = ConfigureTemporarySetProperties(setID, serviceID, entity, settings, networkName,
                                                      password);
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
                                                       CFMutableDictionaryRef entity,
                                                       const TemporaryMode& mode, const char* networkName,
                                                       const char* password) {
    OSStatus err = 0;
    if (mode.isWireless) {
        err = SetAirPortKeys(entity, networkName, password);
    }
    if (err == 0) {
        err = MoreSCSetEntity(setID, serviceID, mode.hardware, entity);
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
