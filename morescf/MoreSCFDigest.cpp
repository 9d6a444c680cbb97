#include "morescf/MoreSCFDigest.h"

#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCFKeys.h"
#include "morescf/MoreSCFValues.h"
#include "platform/CoreServices.h"

namespace {

// The tables differ in three values, and agree in the rest.
constexpr MoreSCPPPOptions PPPOptions(Boolean disconnectOnIdle, SInt32 disconnectOnIdleTimer,
                                      SInt32 commRedialInterval) {
    return {
        .dialOnDemand = false,
        .idleReminder = false,
        .idleReminderTimer = 1800,
        .disconnectOnIdle = disconnectOnIdle,
        .disconnectOnIdleTimer = disconnectOnIdleTimer,
        .disconnectOnLogout = true,
        .commRedialEnabled = true,
        .commRedialCount = 1,
        .commRedialInterval = commRedialInterval,
        .lcpEchoEnabled = true,
        .ipcpCompressionVJ = true,
        .commDisplayTerminalWindow = false,
        .verboseLogging = false,
    };
}

}  // namespace

const MoreSCPPPOptions kMoreSCPPPOptionsDefaultTenOne = PPPOptions(true, 900, 30);
const MoreSCPPPOptions kMoreSCPPPOptionsDefaultTenTwoAndLater = PPPOptions(true, 600, 5);
const MoreSCPPPOptions kMoreSCPPPoEOptionsDefaultTenTwoAndLater = PPPOptions(false, 1800, 5);

const MoreSCModemDigest kMoreSCModemDigestDefault = {
    .connectionScript = nullptr,
    .dataCompressionErrorCorrection = true,
    .speaker = true,
    .pulseDial = false,
    .waitForDialTone = true,
};

namespace {

constexpr OSStatus kUnknownProtocolErr = -1;

// Asked for again on every build of a PPP entity.
Boolean gTenTwoOrLater = false;

// An entity that is being built. After an error no key is written any more.
struct Record {
    CFMutableDictionaryRef dict;
    OSStatus err;
};

void SetNumber(Record* record, CFStringRef key, SInt32 value) {
    if (record->err == 0) {
        record->err = CFQDictionarySetNumber(record->dict, key, value);
    }
}

void SetValue(Record* record, CFStringRef key, CFTypeRef value) {
    if (record->err == 0) {
        CFDictionarySetValue(record->dict, key, value);
    }
}

// Null leaves the key out.
void SetOptional(Record* record, CFStringRef key, CFTypeRef value) {
    if (value != nullptr) {
        SetValue(record, key, value);
    }
}

// Null is -50.
void SetRequired(Record* record, CFStringRef key, CFTypeRef value) {
    if (record->err == 0) {
        record->err = ErrorIfNotGiven(value);
    }
    SetValue(record, key, value);
}

// A value that is made for the record; it comes with the status of making it, and is consumed.
void SetMade(Record* record, CFStringRef key, OSStatus err, CFTypeRef value) {
    if (record->err == 0) {
        record->err = err;
    }
    SetValue(record, key, value);
    CFQRelease(value);
}

void SetActive(Record* record, Boolean active) {
    if (!active) {
        SetNumber(record, kInactiveKey, 1);
    }
}

void SetMacAddress(Record* record, const UInt8 macAddr[6]) {
    CFStringRef text = nullptr;
    const OSStatus err = MoreSCFCreateStringWithMacAddress(macAddr, &text);
    SetMade(record, kMACAddressKey, err, text);
}

// Nothing for no addresses.
void SetInetAddresses(Record* record, CFStringRef key, UInt32 count, const in_addr* addresses) {
    if (count != 0) {
        CFArrayRef array = nullptr;
        const OSStatus err =
            MoreSCFCreateArrayWithInetAddresses(static_cast<CFIndex>(count), addresses, &array);
        SetMade(record, key, err, array);
    }
}

OSStatus AddProxy(CFMutableDictionaryRef dict, CFStringRef enableKey, CFStringRef proxyKey,
                  CFStringRef portKey, Boolean enableValue, CFStringRef proxyValue, UInt16 portValue) {
    Record record = {dict, 0};
    SetNumber(&record, enableKey, enableValue);
    SetOptional(&record, proxyKey, proxyValue);
    if (portValue != 0) {
        SetNumber(&record, portKey, portValue);
    }
    return record.err;
}

OSStatus CreateArrayWithStrings(UInt32 count, const CFStringRef* strings, CFMutableArrayRef* result) {
    CFMutableArrayRef array = nullptr;
    OSStatus err = strings != nullptr ? CFQArrayCreateMutable(&array) : static_cast<OSStatus>(paramErr);
    for (UInt32 i = 0; err == 0 && i < count; ++i) {
        err = ErrorIfNotGiven(strings[i]);
        if (err == 0) {
            CFArrayAppendValue(array, strings[i]);
        }
    }
    HandOverOrNull(err, array, result);
    return err;
}

// What every builder does around the keys of its own: a new dictionary, which the keys are put into, and
// which the caller gets, or null. err is that of looking at the digest.
template <class Fill>
OSStatus CreateRecord(OSStatus err, CFMutableDictionaryRef* entity, Fill fill) {
    Record record = {nullptr, err};
    if (record.err == 0) {
        record.err = CFQDictionaryCreateMutable(&record.dict);
    }
    if (record.err == 0) {
        fill(&record);
    }
    HandOverOrNull(record.err, record.dict, entity);
    return record.err;
}

// A protocol's builder, as a dispatcher calls it.
template <class Union>
struct Builder {
    CFStringRef protocol;
    OSStatus (*create)(const Union* digest, CFMutableDictionaryRef* entity);
};

// Builds from the protocol's member of a union of digests; from no digest without a union.
template <auto create, auto member, class Union>
OSStatus CreateFromMember(const Union* digests, CFMutableDictionaryRef* entity) {
    return create(digests != nullptr ? &(digests->*member) : nullptr, entity);
}

template <class Union, std::size_t count>
OSStatus Dispatch(const Builder<Union> (&builders)[count], CFStringRef protocol, const Union* digest,
                  CFMutableDictionaryRef* entity) {
    OSStatus err = kUnknownProtocolErr;
    bool isFound = protocol == nullptr;
    if (isFound) {
        err = paramErr;
        HandOverOrNull<CFMutableDictionaryRef>(err, nullptr, entity);
    }
    for (std::size_t i = 0; !isFound && i < count; ++i) {
        isFound = CFEqual(protocol, builders[i].protocol);
        if (isFound) {
            err = builders[i].create(digest, entity);
        }
    }
    return err;
}

}  // namespace

OSStatus MoreSCCreateInterfaceEntity(const MoreSCInterfaceDigest* digest, CFMutableDictionaryRef* entity) {
    return CreateRecord(ErrorIfNotGiven(digest), entity, [digest](Record* record) {
        SetRequired(record, kDeviceNameKey, digest->deviceName);
        SetRequired(record, kUserDefinedNameKey, digest->userDefinedName);
        SetRequired(record, kHardwareKey, digest->hardware);
        SetRequired(record, kTypeKey, digest->type);
        SetOptional(record, kSubTypeKey, digest->subType);
        SetOptional(record, kHardwareVariantKey, digest->variant);
    });
}

OSStatus MoreSCCreateProxiesEntity(const MoreSCProxiesDigest* digest, CFMutableDictionaryRef* entity) {
    return CreateRecord(ErrorIfNotGiven(digest), entity, [digest](Record* record) {
        const struct {
            CFStringRef enableKey, proxyKey, portKey;
            Boolean enable;
            CFStringRef proxy;
            UInt16 port;
        } proxies[] = {
            {CFSTR("FTPEnable"), CFSTR("FTPProxy"), CFSTR("FTPPort"), digest->ftpEnable, digest->ftpProxy,
             digest->ftpPort},
            {CFSTR("GopherEnable"), CFSTR("GopherProxy"), CFSTR("GopherPort"), digest->gopherEnable,
             digest->gopherProxy, digest->gopherPort},
            {CFSTR("HTTPEnable"), CFSTR("HTTPProxy"), CFSTR("HTTPPort"), digest->httpEnable,
             digest->httpProxy, digest->httpPort},
            {CFSTR("HTTPSEnable"), CFSTR("HTTPSProxy"), CFSTR("HTTPSPort"), digest->httpsEnable,
             digest->httpsProxy, digest->httpsPort},
            {CFSTR("RTSPEnable"), CFSTR("RTSPProxy"), CFSTR("RTSPPort"), digest->rtspEnable,
             digest->rtspProxy, digest->rtspPort},
            {CFSTR("SOCKSEnable"), CFSTR("SOCKSProxy"), CFSTR("SOCKSPort"), digest->socksEnable,
             digest->socksProxy, digest->socksPort},
        };
        SetOptional(record, CFSTR("ExceptionsList"), digest->exceptionsList);
        SetNumber(record, CFSTR("FTPPassive"), digest->ftpPassive);
        for (const auto& each : proxies) {
            if (record->err == 0) {
                record->err = AddProxy(record->dict, each.enableKey, each.proxyKey, each.portKey, each.enable,
                                       each.proxy, each.port);
            }
        }
    });
}

OSStatus MoreSCCreateAppleTalkEntity(const MoreSCAppleTalkDigest* digest, CFMutableDictionaryRef* entity) {
    return CreateRecord(ErrorIfNotGiven(digest), entity, [digest](Record* record) {
        SetRequired(record, kConfigMethodKey, digest->configMethod);
        SetOptional(record, CFSTR("DefaultZone"), digest->defaultZone);
        if (digest->manual) {
            SetNumber(record, CFSTR("NetworkID"), digest->networkID);
            SetNumber(record, CFSTR("NodeID"), digest->nodeID);
        }
        SetActive(record, digest->active);
    });
}

OSStatus MoreSCCreateDNSEntity(const MoreSCDNSDigest* digest, CFMutableDictionaryRef* entity) {
    return CreateRecord(ErrorIfNotGiven(digest), entity, [digest](Record* record) {
        SetInetAddresses(record, CFSTR("ServerAddresses"), digest->serverAddressesCount,
                         digest->serverAddresses);
        if (digest->searchDomainsCount != 0) {
            CFMutableArrayRef domains = nullptr;
            const OSStatus err =
                CreateArrayWithStrings(digest->searchDomainsCount, digest->searchDomains, &domains);
            SetMade(record, CFSTR("SearchDomains"), err, domains);
        }
    });
}

OSStatus MoreSCCreateIPv4Entity(const MoreSCIPv4Digest* digest, CFMutableDictionaryRef* entity) {
    return CreateRecord(ErrorIfNotGiven(digest), entity, [digest](Record* record) {
        SetRequired(record, kConfigMethodKey, digest->configMethod);
        SetOptional(record, CFSTR("DHCPClientID"), digest->clientID);
        // One address each, or none.
        SetInetAddresses(record, CFSTR("Addresses"), digest->address.s_addr != 0, &digest->address);
        SetInetAddresses(record, CFSTR("SubnetMasks"), digest->subnetMask.s_addr != 0, &digest->subnetMask);
        // Unlike the other two, the router stands alone, not in an array.
        if (digest->router.s_addr != 0) {
            CFStringRef router = nullptr;
            const OSStatus err = MoreSCFCreateStringWithInetAddress(digest->router, &router);
            SetMade(record, CFSTR("Router"), err, router);
        }
    });
}

OSStatus MoreSCCreatePPPEntity(const MoreSCPPPDigest* digest, CFMutableDictionaryRef* entity) {
    // Asked for in any case: this also tells the version of the system, which decides on some keys below.
    const MoreSCPPPOptions* defaults = MoreSCGetDefaultPPPOptions(false);
    return CreateRecord(ErrorIfNotGiven(digest), entity, [digest, defaults](Record* record) {
        const MoreSCPPPOptions* options = digest->options != nullptr ? digest->options : defaults;
        SetOptional(record, kUserDefinedNameKey, digest->userDefinedName);
        SetActive(record, digest->active);
        SetNumber(record, CFSTR("DialOnDemand"), options->dialOnDemand);
        SetNumber(record, CFSTR("DisconnectOnIdle"), options->disconnectOnIdle);
        SetNumber(record, CFSTR("DisconnectOnIdleTimer"), options->disconnectOnIdleTimer);
        SetNumber(record, CFSTR("DisconnectOnLogout"), options->disconnectOnLogout);
        SetNumber(record, CFSTR("IdleReminder"), options->idleReminder);
        SetNumber(record, CFSTR("IdleReminderTimer"), options->idleReminderTimer);
        SetValue(record, CFSTR("Logfile"), CFSTR("/tmp/ppp.log"));
        SetNumber(record, CFSTR("VerboseLogging"), options->verboseLogging);
        SetOptional(record, CFSTR("AuthName"), digest->authName);
        if (digest->authPassword != nullptr) {
            CFDataRef password = nullptr;
            const OSStatus err = MoreSCFCopyEncodedPPPPassword(digest->authPassword, &password);
            SetMade(record, CFSTR("AuthPassword"), err, password);
        }
        SetOptional(record, CFSTR("CommAlternateRemoteAddress"), digest->commAlternateRemoteAddress);
        SetNumber(record, CFSTR("CommDisplayTerminalWindow"), options->commDisplayTerminalWindow);
        SetNumber(record, CFSTR("CommRedialCount"), options->commRedialCount);
        SetNumber(record, CFSTR("CommRedialEnabled"), options->commRedialEnabled);
        SetNumber(record, CFSTR("CommRedialInterval"), options->commRedialInterval);
        SetOptional(record, CFSTR("CommRemoteAddress"), digest->commRemoteAddress);
        // Systems before 10.2 do not know the key, and give a dead line up one echo earlier.
        if (gTenTwoOrLater) {
            SetNumber(record, CFSTR("CommUseTerminalScript"), 0);
        }
        SetNumber(record, CFSTR("IPCPCompressionVJ"), options->ipcpCompressionVJ);
        SetNumber(record, CFSTR("LCPEchoEnabled"), options->lcpEchoEnabled);
        SetNumber(record, CFSTR("LCPEchoFailure"), gTenTwoOrLater ? 4 : 3);
        SetNumber(record, CFSTR("LCPEchoInterval"), 10);
    });
}

OSStatus MoreSCCreateAirPortEntity(const MoreSCAirPortDigest* digest, CFMutableDictionaryRef* entity) {
    return CreateRecord(ErrorIfNotGiven(digest), entity, [digest](Record* record) {
        SetMacAddress(record, digest->macAddress);
        SetOptional(record, CFSTR("PreferredNetwork"), digest->preferredNetwork);
    });
}

OSStatus MoreSCCreateEthernetEntity(const MoreSCEthernetDigest* digest, CFMutableDictionaryRef* entity) {
    return CreateRecord(ErrorIfNotGiven(digest), entity,
                        [digest](Record* record) { SetMacAddress(record, digest->macAddress); });
}

OSStatus MoreSCCreateModemEntity(const MoreSCModemDigest* digest, CFMutableDictionaryRef* entity) {
    return CreateRecord(ErrorIfNotGiven(digest), entity, [digest](Record* record) {
        SetRequired(record, CFSTR("ConnectionScript"), digest->connectionScript);
        SetNumber(record, CFSTR("DataCompression"), digest->dataCompressionErrorCorrection);
        SetValue(record, CFSTR("DialMode"),
                 digest->waitForDialTone ? CFSTR("WaitForDialTone") : CFSTR("IgnoreDialTone"));
        SetNumber(record, CFSTR("ErrorCorrection"), digest->dataCompressionErrorCorrection);
        SetNumber(record, CFSTR("PulseDial"), digest->pulseDial);
        SetNumber(record, CFSTR("Speaker"), digest->speaker);
    });
}

// The two global builders read nothing of their digests, which may be null.

OSStatus MoreSCCreateIPv4GlobalEntity(const MoreSCIPv4GlobalDigest* /*digest*/,
                                      CFMutableDictionaryRef* entity) {
    return CreateRecord(0, entity, [](Record* record) {
        CFMutableArrayRef order = nullptr;
        SetNumber(record, CFSTR("PPPOverridePrimary"), 0);
        const OSStatus err = CFQArrayCreateMutable(&order);
        SetMade(record, kServiceOrderKey, err, order);
    });
}

OSStatus MoreSCCreateNetInfoGlobalEntity(const MoreSCNetInfoGlobalDigest* /*digest*/,
                                         CFMutableDictionaryRef* entity) {
    return CreateRecord(0, entity, [](Record*) {});
}

OSStatus MoreSCCreateEntity(CFStringRef protocol, const MoreSCDigest* digest,
                            CFMutableDictionaryRef* entity) {
    static const Builder<MoreSCDigest> builders[] = {
        {kInterfaceProtocol, CreateFromMember<MoreSCCreateInterfaceEntity, &MoreSCDigest::interface>},
        {kProxiesProtocol, CreateFromMember<MoreSCCreateProxiesEntity, &MoreSCDigest::proxies>},
        {kAppleTalkProtocol, CreateFromMember<MoreSCCreateAppleTalkEntity, &MoreSCDigest::appleTalk>},
        {kDNSProtocol, CreateFromMember<MoreSCCreateDNSEntity, &MoreSCDigest::dns>},
        {kIPv4Protocol, CreateFromMember<MoreSCCreateIPv4Entity, &MoreSCDigest::ipv4>},
        {kPPPProtocol, CreateFromMember<MoreSCCreatePPPEntity, &MoreSCDigest::ppp>},
        {kAirPortProtocol, CreateFromMember<MoreSCCreateAirPortEntity, &MoreSCDigest::airPort>},
        {kEthernetProtocol, CreateFromMember<MoreSCCreateEthernetEntity, &MoreSCDigest::ethernet>},
        {kModemProtocol, CreateFromMember<MoreSCCreateModemEntity, &MoreSCDigest::modem>},
    };
    return Dispatch(builders, protocol, digest, entity);
}

OSStatus MoreSCCreateGlobalEntity(CFStringRef protocol, const MoreSCGlobalDigest* digest,
                                  CFMutableDictionaryRef* entity) {
    static const Builder<MoreSCGlobalDigest> builders[] = {
        {kIPv4Protocol, CreateFromMember<MoreSCCreateIPv4GlobalEntity, &MoreSCGlobalDigest::ipv4>},
        {kNetInfoProtocol, CreateFromMember<MoreSCCreateNetInfoGlobalEntity, &MoreSCGlobalDigest::netInfo>},
    };
    return Dispatch(builders, protocol, digest, entity);
}

const MoreSCPPPOptions* MoreSCGetDefaultPPPOptions(Boolean isPPPoE) {
    gTenTwoOrLater = GetSystemVersion() >= kVersionTenTwo;
    const MoreSCPPPOptions* options = &kMoreSCPPPOptionsDefaultTenOne;
    if (gTenTwoOrLater) {
        options =
            isPPPoE ? &kMoreSCPPPoEOptionsDefaultTenTwoAndLater : &kMoreSCPPPOptionsDefaultTenTwoAndLater;
    }
    return options;
}
