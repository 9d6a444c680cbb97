#include "morescf/MoreSCFDigest.h"

#include <arpa/inet.h>

#include <cstdio>
#include <cstdlib>

#include "morecfq/MoreCFQ.h"
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

void SetOptional(const OSStatus* err, CFMutableDictionaryRef dict, CFStringRef key, CFTypeRef value) {
    if (*err == 0 && value != nullptr) {
        CFDictionarySetValue(dict, key, value);
    }
}

void SetRequired(OSStatus* err, CFMutableDictionaryRef dict, CFStringRef key, CFTypeRef value) {
    if (*err == 0 && value == nullptr) {
        *err = paramErr;
    }
    SetOptional(err, dict, key, value);
}

void SetInactive(OSStatus* err, CFMutableDictionaryRef dict) {
    SetNumber(err, dict, CFSTR("__INACTIVE__"), 1);
}

void SetMacAddress(OSStatus* err, CFMutableDictionaryRef dict, const UInt8 macAddr[6]) {
    CFStringRef text = nullptr;
    if (*err == 0) {
        *err = MoreSCFCreateStringWithMacAddress(macAddr, &text);
    }
    SetOptional(err, dict, CFSTR("MACAddress"), text);
    CFQRelease(text);
}

// An address as an array of one; 0 is absent.
void SetInetAddressArray(OSStatus* err, CFMutableDictionaryRef dict, CFStringRef key, in_addr address) {
    CFArrayRef addresses = nullptr;
    if (*err == 0 && address.s_addr != 0) {
        *err = MoreSCFCreateArrayWithInetAddresses(1, &address, &addresses);
    }
    SetOptional(err, dict, key, addresses);
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

OSStatus CreateStringWithASCII(const char* text, CFStringRef* result) {
    CFStringRef string = CFStringCreateWithCString(kCFAllocatorDefault, text, kCFStringEncodingASCII);
    const OSStatus err = string != nullptr ? 0 : coreFoundationUnknownErr;
    HandOverOrNull(err, string, result);
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
        SetRequired(&err, record, CFSTR("DeviceName"), digest->deviceName);
        SetRequired(&err, record, CFSTR("UserDefinedName"), digest->userDefinedName);
        SetRequired(&err, record, CFSTR("Hardware"), digest->hardware);
        SetRequired(&err, record, CFSTR("Type"), digest->type);
        SetOptional(&err, record, CFSTR("SubType"), digest->subType);
        SetOptional(&err, record, CFSTR("HardwareVariant"), digest->variant);
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
        SetRequired(&err, record, CFSTR("ConfigMethod"), digest->configMethod);
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
        SetOptional(&err, record, CFSTR("ServerAddresses"), servers);
    }
    if (err == 0 && digest->searchDomainsCount != 0) {
        err = CreateArrayWithStrings(digest->searchDomainsCount, digest->searchDomains, &domains);
        SetOptional(&err, record, CFSTR("SearchDomains"), domains);
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
        SetRequired(&err, record, CFSTR("ConfigMethod"), digest->configMethod);
        SetOptional(&err, record, CFSTR("DHCPClientID"), digest->clientID);
        SetInetAddressArray(&err, record, CFSTR("Addresses"), digest->address);
        SetInetAddressArray(&err, record, CFSTR("SubnetMasks"), digest->subnetMask);
    }
    // Unlike the other two, the router stands alone, not in an array.
    if (err == 0 && digest->router.s_addr != 0) {
        err = MoreSCFCreateStringWithInetAddress(digest->router, &router);
        SetOptional(&err, record, CFSTR("Router"), router);
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
        SetOptional(&err, record, CFSTR("UserDefinedName"), digest->userDefinedName);
        if (!digest->active) {
            SetInactive(&err, record);
        }
        SetNumber(&err, record, CFSTR("DialOnDemand"), options->dialOnDemand);
        SetNumber(&err, record, CFSTR("DisconnectOnIdle"), options->disconnectOnIdle);
        SetNumber(&err, record, CFSTR("DisconnectOnIdleTimer"), options->disconnectOnIdleTimer);
        SetNumber(&err, record, CFSTR("DisconnectOnLogout"), options->disconnectOnLogout);
        SetNumber(&err, record, CFSTR("IdleReminder"), options->idleReminder);
        SetNumber(&err, record, CFSTR("IdleReminderTimer"), options->idleReminderTimer);
        SetOptional(&err, record, CFSTR("Logfile"), CFSTR("/tmp/ppp.log"));
        SetNumber(&err, record, CFSTR("VerboseLogging"), options->verboseLogging);
        SetOptional(&err, record, CFSTR("AuthName"), digest->authName);
    }
    if (err == 0 && digest->authPassword != nullptr) {
        err = MoreSCFCopyEncodedPPPPassword(digest->authPassword, &password);
        SetOptional(&err, record, CFSTR("AuthPassword"), password);
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
        SetOptional(&err, record, CFSTR("DialMode"),
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
    SetOptional(&err, record, CFSTR("ServiceOrder"), order);
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
    } else if (CFEqual(protocol, CFSTR("Interface"))) {
        err = MoreSCCreateInterfaceEntity(Member(digest, &MoreSCDigest::interface), entity);
    } else if (CFEqual(protocol, CFSTR("Proxies"))) {
        err = MoreSCCreateProxiesEntity(Member(digest, &MoreSCDigest::proxies), entity);
    } else if (CFEqual(protocol, CFSTR("AppleTalk"))) {
        err = MoreSCCreateAppleTalkEntity(Member(digest, &MoreSCDigest::appleTalk), entity);
    } else if (CFEqual(protocol, CFSTR("DNS"))) {
        err = MoreSCCreateDNSEntity(Member(digest, &MoreSCDigest::dns), entity);
    } else if (CFEqual(protocol, CFSTR("IPv4"))) {
        err = MoreSCCreateIPv4Entity(Member(digest, &MoreSCDigest::ipv4), entity);
    } else if (CFEqual(protocol, CFSTR("PPP"))) {
        err = MoreSCCreatePPPEntity(Member(digest, &MoreSCDigest::ppp), entity);
    } else if (CFEqual(protocol, CFSTR("AirPort"))) {
        err = MoreSCCreateAirPortEntity(Member(digest, &MoreSCDigest::airPort), entity);
    } else if (CFEqual(protocol, CFSTR("Ethernet"))) {
        err = MoreSCCreateEthernetEntity(Member(digest, &MoreSCDigest::ethernet), entity);
    } else if (CFEqual(protocol, CFSTR("Modem"))) {
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
    } else if (CFEqual(protocol, CFSTR("IPv4"))) {
        err = MoreSCCreateIPv4GlobalEntity(Member(digest, &MoreSCGlobalDigest::ipv4), entity);
    } else if (CFEqual(protocol, CFSTR("NetInfo"))) {
        err = MoreSCCreateNetInfoGlobalEntity(Member(digest, &MoreSCGlobalDigest::netInfo), entity);
    } else {
        err = kUnknownProtocolErr;
    }
    return err;
}

OSStatus MoreSCFCreateStringWithMacAddress(const UInt8 macAddr[6], CFStringRef* result) {
    char text[19] = "";
    char* end = text;
    for (int i = 0; i < 6; ++i, end += 3) {
        std::snprintf(end, 4, "%2.2x:", static_cast<unsigned int>(macAddr[i]));
    }
    text[17] = '\0';
    return CreateStringWithASCII(text, result);
}

OSStatus MoreSCFStringToMacAddress(CFStringRef str, UInt8 macAddr[6]) {
    OSStatus err = 0;
    char text[18];
    unsigned int bytes[6];
    if (str == nullptr) {
        err = paramErr;
    }
    if (err == 0 && !CFStringGetCString(str, text, sizeof(text), kCFStringEncodingASCII)) {
        err = coreFoundationUnknownErr;
    }
    if (err == 0 && std::sscanf(text, "%02x:%02x:%02x:%02x:%02x:%02x", &bytes[0], &bytes[1], &bytes[2],
                                &bytes[3], &bytes[4], &bytes[5]) != 6) {
        err = -1;
    }
    if (err == 0) {
        for (int i = 0; i < 6; ++i) {
            macAddr[i] = static_cast<UInt8>(bytes[i] & 0xFF);
        }
    }
    return err;
}

OSStatus MoreSCFCreateStringWithInetAddress(in_addr addr, CFStringRef* result) {
    return CreateStringWithASCII(inet_ntoa(addr), result);
}

OSStatus MoreSCFCreateArrayWithInetAddresses(CFIndex count, const in_addr* addresses, CFArrayRef* result) {
    CFMutableArrayRef array = nullptr;
    OSStatus err = 0;
    if (count != 0 && addresses == nullptr) {
        err = paramErr;
    }
    if (err == 0) {
        err = CFQArrayCreateMutable(&array);
    }
    for (CFIndex i = 0; err == 0 && i < count; ++i) {
        CFStringRef text = nullptr;
        err = MoreSCFCreateStringWithInetAddress(addresses[i], &text);
        if (err == 0) {
            CFArrayAppendValue(array, text);
        }
        CFQRelease(text);
    }
    HandOverOrNull<CFArrayRef>(err, array, result);
    return err;
}

OSStatus MoreSCFCopyEncodedPPPPassword(CFStringRef password, CFDataRef* encodedPassword) {
    OSStatus err = 0;
    UniChar* units = nullptr;
    CFDataRef encoded = nullptr;
    CFIndex count = 0;
    if (password == nullptr) {
        err = paramErr;
    }
    if (err == 0) {
        count = CFStringGetLength(password);
        if (count > 0) {
            units = static_cast<UniChar*>(std::malloc(static_cast<std::size_t>(count) * sizeof(UniChar)));
            if (units == nullptr) {
                err = memFullErr;
            }
        }
    }
    if (err == 0) {
        CFStringGetCharacters(password, CFRangeMake(0, count), units);
        for (CFIndex i = 0; i < count; ++i) {
            units[i] = htons(units[i]);
        }
        encoded = CFDataCreate(kCFAllocatorDefault, reinterpret_cast<const UInt8*>(units),
                               count * static_cast<CFIndex>(sizeof(UniChar)));
        if (encoded == nullptr) {
            err = coreFoundationUnknownErr;
        }
    }
    std::free(units);
    HandOverOrNull(err, encoded, encodedPassword);
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
