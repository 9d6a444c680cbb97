#include "morescf/MoreSCFDigest.h"

#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCFKeys.h"
#include "morescf/MoreSCFValues.h"
#include "platform/CoreServices.h"

const MoreSCPPPOptions kMoreSCPPPOptionsDefaultTenOne = {
    .dialOnDemand = false,
    .idleReminder = false,
    .idleReminderTimer = 1800,
    .disconnectOnIdle = true,
    .disconnectOnIdleTimer = 900,
    .disconnectOnLogout = true,
    .commRedialEnabled = true,
    .commRedialCount = 1,
    .commRedialInterval = 30,
    .lcpEchoEnabled = true,
    .ipcpCompressionVJ = true,
    .commDisplayTerminalWindow = false,
    .verboseLogging = false,
};

const MoreSCPPPOptions kMoreSCPPPOptionsDefaultTenTwoAndLater = {
    .dialOnDemand = false,
    .idleReminder = false,
    .idleReminderTimer = 1800,
    .disconnectOnIdle = true,
    .disconnectOnIdleTimer = 600,
    .disconnectOnLogout = true,
    .commRedialEnabled = true,
    .commRedialCount = 1,
    .commRedialInterval = 5,
    .lcpEchoEnabled = true,
    .ipcpCompressionVJ = true,
    .commDisplayTerminalWindow = false,
    .verboseLogging = false,
};

const MoreSCPPPOptions kMoreSCPPPoEOptionsDefaultTenTwoAndLater = {
    .dialOnDemand = false,
    .idleReminder = false,
    .idleReminderTimer = 1800,
    .disconnectOnIdle = false,
    .disconnectOnIdleTimer = 1800,
    .disconnectOnLogout = true,
    .commRedialEnabled = true,
    .commRedialCount = 1,
    .commRedialInterval = 5,
    .lcpEchoEnabled = true,
    .ipcpCompressionVJ = true,
    .commDisplayTerminalWindow = false,
    .verboseLogging = false,
};

const MoreSCModemDigest kMoreSCModemDigestDefault = {
    .connectionScript = nullptr,
    .dataCompressionErrorCorrection = true,
    .speaker = true,
    .pulseDial = false,
    .waitForDialTone = true,
};

namespace {

constexpr OSStatus kUnknownProtocolErr = -1;

Boolean gTenTwoOrLater = false;

// One key of a record each. After an error none is written any more.

void SetNumber(OSStatus* err, CFMutableDictionaryRef dict, CFStringRef key, SInt32 value) {
    if (*err == 0) {
        *err = CFQDictionarySetNumber(dict, key, value);
    }
}

void SetValue(const OSStatus* err, CFMutableDictionaryRef dict, CFStringRef key, CFTypeRef value) {
    if (*err == 0) {
        CFDictionarySetValue(dict, key, value);
    }
}

// Null leaves the key out.
void SetOptional(const OSStatus* err, CFMutableDictionaryRef dict, CFStringRef key, CFTypeRef value) {
    if (value != nullptr) {
        SetValue(err, dict, key, value);
    }
}

// Null is -50.
void SetRequired(OSStatus* err, CFMutableDictionaryRef dict, CFStringRef key, CFTypeRef value) {
    if (*err == 0 && value == nullptr) {
        *err = paramErr;
    }
    SetValue(err, dict, key, value);
}

void SetInactive(OSStatus* err, CFMutableDictionaryRef dict) {
    SetNumber(err, dict, kInactiveKey, 1);
}

void SetMacAddress(OSStatus* err, CFMutableDictionaryRef dict, const UInt8 macAddr[6]) {
    CFStringRef text = nullptr;
    if (*err == 0) {
        *err = MoreSCFCreateStringWithMacAddress(macAddr, &text);
    }
    SetValue(err, dict, kMACAddressKey, text);
    CFQRelease(text);
}

// An address as an array of one; 0 is absent.
void SetInetAddressArray(OSStatus* err, CFMutableDictionaryRef dict, CFStringRef key, in_addr address) {
    CFArrayRef addresses = nullptr;
    if (*err == 0 && address.s_addr != 0) {
        *err = MoreSCFCreateArrayWithInetAddresses(1, &address, &addresses);
        SetValue(err, dict, key, addresses);
    }
    CFQRelease(addresses);
}

OSStatus AddProxy(CFMutableDictionaryRef dict, CFStringRef enableKey, CFStringRef proxyKey,
                  CFStringRef portKey, Boolean enableValue, CFStringRef proxyValue, UInt16 portValue) {
    OSStatus err = CFQDictionarySetNumber(dict, enableKey, enableValue);
    SetOptional(&err, dict, proxyKey, proxyValue);
    if (portValue != 0) {
        SetNumber(&err, dict, portKey, portValue);
    }
    return err;
}

OSStatus CreateArrayWithStrings(UInt32 count, const CFStringRef* strings, CFMutableArrayRef* result) {
    CFMutableArrayRef array = nullptr;
    OSStatus err = strings != nullptr ? CFQArrayCreateMutable(&array) : static_cast<OSStatus>(paramErr);
    for (UInt32 i = 0; err == 0 && i < count; ++i) {
        if (strings[i] == nullptr) {
            err = paramErr;
        } else {
            CFArrayAppendValue(array, strings[i]);
        }
    }
    HandOverOrNull(err, array, result);
    return err;
}

// The member of a union of digests; none of no union.
template <class Union, class Digest>
const Digest* Member(const Union* digests, Digest Union::*member) {
    return digests != nullptr ? &(digests->*member) : nullptr;
}

// An empty record for a builder to fill; -50 without a digest.
OSStatus BeginRecord(const void* digest, CFMutableDictionaryRef* record) {
    return digest != nullptr ? CFQDictionaryCreateMutable(record) : static_cast<OSStatus>(paramErr);
}

}  // namespace

OSStatus MoreSCCreateInterfaceEntity(const MoreSCInterfaceDigest* digest, CFMutableDictionaryRef* entity) {
    CFMutableDictionaryRef record = nullptr;
    OSStatus err = BeginRecord(digest, &record);
    if (err == 0) {
        SetRequired(&err, record, kDeviceNameKey, digest->deviceName);
        SetRequired(&err, record, kUserDefinedNameKey, digest->userDefinedName);
        SetRequired(&err, record, kHardwareKey, digest->hardware);
        SetRequired(&err, record, kTypeKey, digest->type);
        SetOptional(&err, record, kSubTypeKey, digest->subType);
        SetOptional(&err, record, kHardwareVariantKey, digest->variant);
    }
    HandOverOrNull(err, record, entity);
    return err;
}

OSStatus MoreSCCreateProxiesEntity(const MoreSCProxiesDigest* digest, CFMutableDictionaryRef* entity) {
    CFMutableDictionaryRef record = nullptr;
    OSStatus err = BeginRecord(digest, &record);
    if (err == 0) {
        SetOptional(&err, record, CFSTR("ExceptionsList"), digest->exceptionsList);
        SetNumber(&err, record, CFSTR("FTPPassive"), digest->ftpPassive);
    }
    if (err == 0) {
        err = AddProxy(record, CFSTR("FTPEnable"), CFSTR("FTPProxy"), CFSTR("FTPPort"), digest->ftpEnable,
                       digest->ftpProxy, digest->ftpPort);
    }
    if (err == 0) {
        err = AddProxy(record, CFSTR("GopherEnable"), CFSTR("GopherProxy"), CFSTR("GopherPort"),
                       digest->gopherEnable, digest->gopherProxy, digest->gopherPort);
    }
    if (err == 0) {
        err = AddProxy(record, CFSTR("HTTPEnable"), CFSTR("HTTPProxy"), CFSTR("HTTPPort"), digest->httpEnable,
                       digest->httpProxy, digest->httpPort);
    }
    if (err == 0) {
        err = AddProxy(record, CFSTR("HTTPSEnable"), CFSTR("HTTPSProxy"), CFSTR("HTTPSPort"),
                       digest->httpsEnable, digest->httpsProxy, digest->httpsPort);
    }
    if (err == 0) {
        err = AddProxy(record, CFSTR("RTSPEnable"), CFSTR("RTSPProxy"), CFSTR("RTSPPort"), digest->rtspEnable,
                       digest->rtspProxy, digest->rtspPort);
    }
    if (err == 0) {
        err = AddProxy(record, CFSTR("SOCKSEnable"), CFSTR("SOCKSProxy"), CFSTR("SOCKSPort"),
                       digest->socksEnable, digest->socksProxy, digest->socksPort);
    }
    HandOverOrNull(err, record, entity);
    return err;
}

OSStatus MoreSCCreateAppleTalkEntity(const MoreSCAppleTalkDigest* digest, CFMutableDictionaryRef* entity) {
    CFMutableDictionaryRef record = nullptr;
    OSStatus err = BeginRecord(digest, &record);
    if (err == 0) {
        SetRequired(&err, record, kConfigMethodKey, digest->configMethod);
        SetOptional(&err, record, CFSTR("DefaultZone"), digest->defaultZone);
        if (digest->manual) {
            SetNumber(&err, record, CFSTR("NetworkID"), digest->networkID);
            SetNumber(&err, record, CFSTR("NodeID"), digest->nodeID);
        }
        if (!digest->active) {
            SetInactive(&err, record);
        }
    }
    HandOverOrNull(err, record, entity);
    return err;
}

OSStatus MoreSCCreateDNSEntity(const MoreSCDNSDigest* digest, CFMutableDictionaryRef* entity) {
    CFMutableDictionaryRef record = nullptr;
    CFArrayRef servers = nullptr;
    CFMutableArrayRef domains = nullptr;
    OSStatus err = BeginRecord(digest, &record);
    if (err == 0 && digest->serverAddressesCount != 0) {
        err = MoreSCFCreateArrayWithInetAddresses(static_cast<CFIndex>(digest->serverAddressesCount),
                                                  digest->serverAddresses, &servers);
        SetValue(&err, record, CFSTR("ServerAddresses"), servers);
    }
    if (err == 0 && digest->searchDomainsCount != 0) {
        err = CreateArrayWithStrings(digest->searchDomainsCount, digest->searchDomains, &domains);
        SetValue(&err, record, CFSTR("SearchDomains"), domains);
    }
    CFQRelease(servers);
    CFQRelease(domains);
    HandOverOrNull(err, record, entity);
    return err;
}

OSStatus MoreSCCreateIPv4Entity(const MoreSCIPv4Digest* digest, CFMutableDictionaryRef* entity) {
    CFMutableDictionaryRef record = nullptr;
    CFStringRef router = nullptr;
    OSStatus err = BeginRecord(digest, &record);
    if (err == 0) {
        SetRequired(&err, record, kConfigMethodKey, digest->configMethod);
        SetOptional(&err, record, CFSTR("DHCPClientID"), digest->clientID);
        SetInetAddressArray(&err, record, CFSTR("Addresses"), digest->address);
        SetInetAddressArray(&err, record, CFSTR("SubnetMasks"), digest->subnetMask);
    }
    // Unlike the other two, the router stands alone, not in an array.
    if (err == 0 && digest->router.s_addr != 0) {
        err = MoreSCFCreateStringWithInetAddress(digest->router, &router);
        SetValue(&err, record, CFSTR("Router"), router);
    }
    CFQRelease(router);
    HandOverOrNull(err, record, entity);
    return err;
}

OSStatus MoreSCCreatePPPEntity(const MoreSCPPPDigest* digest, CFMutableDictionaryRef* entity) {
    CFMutableDictionaryRef record = nullptr;
    CFDataRef password = nullptr;
    // Asked for in any case: this also tells the version of the system, which decides on some keys below.
    const MoreSCPPPOptions* options = MoreSCGetDefaultPPPOptions(false);
    OSStatus err = BeginRecord(digest, &record);
    if (err == 0 && digest->options != nullptr) {
        options = digest->options;
    }
    if (err == 0) {
        SetOptional(&err, record, kUserDefinedNameKey, digest->userDefinedName);
        if (!digest->active) {
            SetInactive(&err, record);
        }
        SetNumber(&err, record, CFSTR("DialOnDemand"), options->dialOnDemand);
        SetNumber(&err, record, CFSTR("DisconnectOnIdle"), options->disconnectOnIdle);
        SetNumber(&err, record, CFSTR("DisconnectOnIdleTimer"), options->disconnectOnIdleTimer);
        SetNumber(&err, record, CFSTR("DisconnectOnLogout"), options->disconnectOnLogout);
        SetNumber(&err, record, CFSTR("IdleReminder"), options->idleReminder);
        SetNumber(&err, record, CFSTR("IdleReminderTimer"), options->idleReminderTimer);
        SetValue(&err, record, CFSTR("Logfile"), CFSTR("/tmp/ppp.log"));
        SetNumber(&err, record, CFSTR("VerboseLogging"), options->verboseLogging);
        SetOptional(&err, record, CFSTR("AuthName"), digest->authName);
    }
    if (err == 0 && digest->authPassword != nullptr) {
        err = MoreSCFCopyEncodedPPPPassword(digest->authPassword, &password);
        SetValue(&err, record, CFSTR("AuthPassword"), password);
    }
    if (err == 0) {
        SetOptional(&err, record, CFSTR("CommAlternateRemoteAddress"), digest->commAlternateRemoteAddress);
        SetNumber(&err, record, CFSTR("CommDisplayTerminalWindow"), options->commDisplayTerminalWindow);
        SetNumber(&err, record, CFSTR("CommRedialCount"), options->commRedialCount);
        SetNumber(&err, record, CFSTR("CommRedialEnabled"), options->commRedialEnabled);
        SetNumber(&err, record, CFSTR("CommRedialInterval"), options->commRedialInterval);
        SetOptional(&err, record, CFSTR("CommRemoteAddress"), digest->commRemoteAddress);
        if (gTenTwoOrLater) {
            SetNumber(&err, record, CFSTR("CommUseTerminalScript"), 0);
        }
        SetNumber(&err, record, CFSTR("IPCPCompressionVJ"), options->ipcpCompressionVJ);
        SetNumber(&err, record, CFSTR("LCPEchoEnabled"), options->lcpEchoEnabled);
        SetNumber(&err, record, CFSTR("LCPEchoFailure"), gTenTwoOrLater ? 4 : 3);
        SetNumber(&err, record, CFSTR("LCPEchoInterval"), 10);
    }
    CFQRelease(password);
    HandOverOrNull(err, record, entity);
    return err;
}

OSStatus MoreSCCreateAirPortEntity(const MoreSCAirPortDigest* digest, CFMutableDictionaryRef* entity) {
    CFMutableDictionaryRef record = nullptr;
    OSStatus err = BeginRecord(digest, &record);
    if (err == 0) {
        SetMacAddress(&err, record, digest->macAddress);
        SetOptional(&err, record, CFSTR("PreferredNetwork"), digest->preferredNetwork);
    }
    HandOverOrNull(err, record, entity);
    return err;
}

OSStatus MoreSCCreateEthernetEntity(const MoreSCEthernetDigest* digest, CFMutableDictionaryRef* entity) {
    CFMutableDictionaryRef record = nullptr;
    OSStatus err = BeginRecord(digest, &record);
    if (err == 0) {
        SetMacAddress(&err, record, digest->macAddress);
    }
    HandOverOrNull(err, record, entity);
    return err;
}

OSStatus MoreSCCreateModemEntity(const MoreSCModemDigest* digest, CFMutableDictionaryRef* entity) {
    CFMutableDictionaryRef record = nullptr;
    OSStatus err = BeginRecord(digest, &record);
    if (err == 0) {
        SetRequired(&err, record, CFSTR("ConnectionScript"), digest->connectionScript);
        SetNumber(&err, record, CFSTR("DataCompression"), digest->dataCompressionErrorCorrection);
        SetValue(&err, record, CFSTR("DialMode"),
                 digest->waitForDialTone ? CFSTR("WaitForDialTone") : CFSTR("IgnoreDialTone"));
        SetNumber(&err, record, CFSTR("ErrorCorrection"), digest->dataCompressionErrorCorrection);
        SetNumber(&err, record, CFSTR("PulseDial"), digest->pulseDial);
        SetNumber(&err, record, CFSTR("Speaker"), digest->speaker);
    }
    HandOverOrNull(err, record, entity);
    return err;
}

OSStatus MoreSCCreateIPv4GlobalEntity(const MoreSCIPv4GlobalDigest* /*digest*/,
                                      CFMutableDictionaryRef* entity) {
    CFMutableDictionaryRef record = nullptr;
    CFMutableArrayRef order = nullptr;
    OSStatus err = CFQDictionaryCreateMutable(&record);
    SetNumber(&err, record, CFSTR("PPPOverridePrimary"), 0);
    if (err == 0) {
        err = CFQArrayCreateMutable(&order);
    }
    SetValue(&err, record, kServiceOrderKey, order);
    CFQRelease(order);
    HandOverOrNull(err, record, entity);
    return err;
}

OSStatus MoreSCCreateNetInfoGlobalEntity(const MoreSCNetInfoGlobalDigest* /*digest*/,
                                         CFMutableDictionaryRef* entity) {
    CFMutableDictionaryRef record = nullptr;
    const OSStatus err = CFQDictionaryCreateMutable(&record);
    HandOverOrNull(err, record, entity);
    return err;
}

OSStatus MoreSCCreateEntity(CFStringRef protocol, const MoreSCDigest* digest,
                            CFMutableDictionaryRef* entity) {
    OSStatus err = 0;
    if (protocol == nullptr) {
        err = paramErr;
        HandOverOrNull<CFMutableDictionaryRef>(err, nullptr, entity);
    } else if (CFEqual(protocol, kInterfaceProtocol)) {
        err = MoreSCCreateInterfaceEntity(Member(digest, &MoreSCDigest::interface), entity);
    } else if (CFEqual(protocol, kProxiesProtocol)) {
        err = MoreSCCreateProxiesEntity(Member(digest, &MoreSCDigest::proxies), entity);
    } else if (CFEqual(protocol, kAppleTalkProtocol)) {
        err = MoreSCCreateAppleTalkEntity(Member(digest, &MoreSCDigest::appleTalk), entity);
    } else if (CFEqual(protocol, kDNSProtocol)) {
        err = MoreSCCreateDNSEntity(Member(digest, &MoreSCDigest::dns), entity);
    } else if (CFEqual(protocol, kIPv4Protocol)) {
        err = MoreSCCreateIPv4Entity(Member(digest, &MoreSCDigest::ipv4), entity);
    } else if (CFEqual(protocol, kPPPProtocol)) {
        err = MoreSCCreatePPPEntity(Member(digest, &MoreSCDigest::ppp), entity);
    } else if (CFEqual(protocol, kAirPortProtocol)) {
        err = MoreSCCreateAirPortEntity(Member(digest, &MoreSCDigest::airPort), entity);
    } else if (CFEqual(protocol, kEthernetProtocol)) {
        err = MoreSCCreateEthernetEntity(Member(digest, &MoreSCDigest::ethernet), entity);
    } else if (CFEqual(protocol, kModemProtocol)) {
        err = MoreSCCreateModemEntity(Member(digest, &MoreSCDigest::modem), entity);
    } else {
        err = kUnknownProtocolErr;
    }
    return err;
}

OSStatus MoreSCCreateGlobalEntity(CFStringRef protocol, const MoreSCGlobalDigest* digest,
                                  CFMutableDictionaryRef* entity) {
    OSStatus err = 0;
    if (protocol == nullptr) {
        err = paramErr;
        HandOverOrNull<CFMutableDictionaryRef>(err, nullptr, entity);
    } else if (CFEqual(protocol, kIPv4Protocol)) {
        err = MoreSCCreateIPv4GlobalEntity(Member(digest, &MoreSCGlobalDigest::ipv4), entity);
    } else if (CFEqual(protocol, kNetInfoProtocol)) {
        err = MoreSCCreateNetInfoGlobalEntity(Member(digest, &MoreSCGlobalDigest::netInfo), entity);
    } else {
        err = kUnknownProtocolErr;
    }
    return err;
}

const MoreSCPPPOptions* MoreSCGetDefaultPPPOptions(Boolean isPPPoE) {
    SInt32 version = 0;
    gTenTwoOrLater =
        Gestalt(gestaltSystemVersion, &version) == noErr && static_cast<UInt32>(version) > 0x101F;
    const MoreSCPPPOptions* options = &kMoreSCPPPOptionsDefaultTenOne;
    if (gTenTwoOrLater) {
        options =
            isPPPoE ? &kMoreSCPPPoEOptionsDefaultTenTwoAndLater : &kMoreSCPPPOptionsDefaultTenTwoAndLater;
    }
    return options;
}
