// Entities built from plain structures.
//
// An entity is the dictionary that holds one protocol's configuration in a service. Fill the protocol's
// digest (start from zeros; a member left zero is absent or false), and the builder returns the dictionary,
// ready for MoreSCNewEntity or MoreSCSetEntity. Strings and arrays in a digest are borrowed: the entity
// retains the very objects. Flags and numbers are stored as 32-bit numbers, a flag as its byte (use 0 and 1),
// addresses as dotted quads, MAC addresses as lower-case hexadecimal bytes between colons.
//
// Every builder's output is a new mutable dictionary of the caller's, null on failure; a null output pointer
// means that the dictionary is not wanted, only the status. Statuses: -50 for a null digest (the two global
// builders read none and take null) or a null member that must not be (marked "required"), -4960 when a value
// cannot be made, -108 without memory for a password. Nothing here touches the preferences.
#pragma once

#include <netinet/in.h>

#include "platform/CoreFoundation.h"

LA_BEGIN_DECLARATIONS

// "Interface": the port that a service runs on.
typedef struct MoreSCInterfaceDigest {
    CFStringRef deviceName;       // "DeviceName", required: the device's name, as "en0"
    CFStringRef hardware;         // "Hardware", required: "Ethernet", "AirPort" or "Modem"
    CFStringRef variant;          // "HardwareVariant"
    CFStringRef type;             // "Type", required: "Ethernet" or "PPP"
    CFStringRef subType;          // "SubType"
    CFStringRef userDefinedName;  // "UserDefinedName", required: the port's name as the user sees it
} MoreSCInterfaceDigest;

// "Proxies": "ExceptionsList", "FTPPassive" and, for each of FTP, Gopher, HTTP, HTTPS, RTSP and SOCKS, a flag
// ("FTPEnable", always there), a host ("FTPProxy") and a port ("FTPPort", left out when 0).
// NOLINTNEXTLINE(clang-analyzer-optin.performance.Padding): callers rely on the order of the members.
typedef struct MoreSCProxiesDigest {
    CFArrayRef exceptionsList;  // strings: hosts that are reached without a proxy
    Boolean ftpPassive;
    Boolean ftpEnable;
    CFStringRef ftpProxy;
    UInt16 ftpPort;
    Boolean gopherEnable;
    CFStringRef gopherProxy;
    UInt16 gopherPort;
    Boolean httpEnable;
    CFStringRef httpProxy;
    UInt16 httpPort;
    Boolean httpsEnable;
    CFStringRef httpsProxy;
    UInt16 httpsPort;
    Boolean rtspEnable;
    CFStringRef rtspProxy;
    UInt16 rtspPort;
    Boolean socksEnable;
    CFStringRef socksProxy;
    UInt16 socksPort;
} MoreSCProxiesDigest;

// "AppleTalk"
typedef struct MoreSCAppleTalkDigest {
    Boolean active;            // false: "__INACTIVE__" = 1
    CFStringRef configMethod;  // "ConfigMethod", required, as "Node"
    Boolean manual;            // the next two are given by hand; else they are left out
    UInt16 networkID;          // "NetworkID"
    UInt8 nodeID;              // "NodeID"
    CFStringRef defaultZone;   // "DefaultZone"
} MoreSCAppleTalkDigest;

// "DNS"; all zeros make an empty dictionary.
typedef struct MoreSCDNSDigest {
    UInt32 serverAddressesCount;
    const struct in_addr* serverAddresses;  // "ServerAddresses", dotted quads; required with a count
    UInt32 searchDomainsCount;
    const CFStringRef* searchDomains;  // "SearchDomains"; required with a count, and each of them
} MoreSCDNSDigest;

// "IPv4"; an address of 0 is absent.
typedef struct MoreSCIPv4Digest {
    CFStringRef configMethod;   // "ConfigMethod", required: "DHCP", "Manual" or "PPP"
    struct in_addr address;     // "Addresses", an array of one
    struct in_addr subnetMask;  // "SubnetMasks", an array of one
    struct in_addr router;      // "Router", a string, not an array
    CFStringRef clientID;       // "DHCPClientID"
} MoreSCIPv4Digest;

// How a dial-up or PPPoE connection behaves; each is stored under its own name with a capital letter
// ("DialOnDemand", "LCPEchoEnabled", "IPCPCompressionVJ"). Times are in seconds.
typedef struct MoreSCPPPOptions {
    Boolean dialOnDemand;
    Boolean idleReminder;
    SInt32 idleReminderTimer;
    Boolean disconnectOnIdle;
    SInt32 disconnectOnIdleTimer;
    Boolean disconnectOnLogout;
    Boolean commRedialEnabled;
    SInt32 commRedialCount;
    SInt32 commRedialInterval;
    Boolean lcpEchoEnabled;
    Boolean ipcpCompressionVJ;  // Van Jacobson's header compression
    Boolean commDisplayTerminalWindow;
    Boolean verboseLogging;
} MoreSCPPPOptions;

// "PPP"; besides what stands here the entity holds "Logfile" = "/tmp/ppp.log", "LCPEchoInterval" = 10,
// "LCPEchoFailure" = 4 (3 on systems before 10.2) and, from 10.2 on, "CommUseTerminalScript" = 0.
typedef struct MoreSCPPPDigest {
    Boolean active;                          // false: "__INACTIVE__" = 1
    CFStringRef userDefinedName;             // "UserDefinedName"
    CFStringRef authName;                    // "AuthName": the account
    CFStringRef authPassword;                // "AuthPassword", as MoreSCFCopyEncodedPPPPassword makes it
    CFStringRef commRemoteAddress;           // "CommRemoteAddress": telephone number or server
    CFStringRef commAlternateRemoteAddress;  // "CommAlternateRemoteAddress"
    const MoreSCPPPOptions* options;         // null: MoreSCGetDefaultPPPOptions(false)
} MoreSCPPPDigest;

// "AirPort"
typedef struct MoreSCAirPortDigest {
    UInt8 macAddress[6];           // "MACAddress"
    CFStringRef preferredNetwork;  // "PreferredNetwork": the network to join
} MoreSCAirPortDigest;

// "Ethernet"
typedef struct MoreSCEthernetDigest {
    UInt8 macAddress[6];  // "MACAddress"
} MoreSCEthernetDigest;

// "Modem"
typedef struct MoreSCModemDigest {
    CFStringRef connectionScript;            // "ConnectionScript", required: a name of MoreSCFCCLScanner.h
    Boolean dataCompressionErrorCorrection;  // both "DataCompression" and "ErrorCorrection"
    Boolean speaker;                         // "Speaker"
    Boolean pulseDial;                       // "PulseDial"
    Boolean waitForDialTone;                 // "DialMode": "WaitForDialTone", else "IgnoreDialTone"
} MoreSCModemDigest;

// For callers that learn the protocol at run time. Zero it whole (memset: an initializer of {} reaches only
// the first member), then fill the member of the protocol.
typedef union MoreSCDigest {
    MoreSCInterfaceDigest interface;
    MoreSCProxiesDigest proxies;
    MoreSCAppleTalkDigest appleTalk;
    MoreSCDNSDigest dns;
    MoreSCIPv4Digest ipv4;
    MoreSCPPPDigest ppp;
    MoreSCAirPortDigest airPort;
    MoreSCEthernetDigest ethernet;
    MoreSCModemDigest modem;
} MoreSCDigest;

// The digests of a location's global entities; nothing in them is read yet.
typedef struct MoreSCIPv4GlobalDigest {
    UInt32 dummy;
} MoreSCIPv4GlobalDigest;
typedef struct MoreSCNetInfoGlobalDigest {
    UInt32 dummy;
} MoreSCNetInfoGlobalDigest;
typedef union MoreSCGlobalDigest {
    MoreSCIPv4GlobalDigest ipv4;
    MoreSCNetInfoGlobalDigest netInfo;
} MoreSCGlobalDigest;

// --- Builders ---

OSStatus MoreSCCreateInterfaceEntity(const MoreSCInterfaceDigest* digest, CFMutableDictionaryRef* entity);
OSStatus MoreSCCreateProxiesEntity(const MoreSCProxiesDigest* digest, CFMutableDictionaryRef* entity);
OSStatus MoreSCCreateAppleTalkEntity(const MoreSCAppleTalkDigest* digest, CFMutableDictionaryRef* entity);
OSStatus MoreSCCreateDNSEntity(const MoreSCDNSDigest* digest, CFMutableDictionaryRef* entity);
OSStatus MoreSCCreateIPv4Entity(const MoreSCIPv4Digest* digest, CFMutableDictionaryRef* entity);
OSStatus MoreSCCreatePPPEntity(const MoreSCPPPDigest* digest, CFMutableDictionaryRef* entity);
OSStatus MoreSCCreateAirPortEntity(const MoreSCAirPortDigest* digest, CFMutableDictionaryRef* entity);
OSStatus MoreSCCreateEthernetEntity(const MoreSCEthernetDigest* digest, CFMutableDictionaryRef* entity);
OSStatus MoreSCCreateModemEntity(const MoreSCModemDigest* digest, CFMutableDictionaryRef* entity);

// "ServiceOrder" (an empty array) and "PPPOverridePrimary" 0.
OSStatus MoreSCCreateIPv4GlobalEntity(const MoreSCIPv4GlobalDigest* digest, CFMutableDictionaryRef* entity);
// An empty dictionary.
OSStatus MoreSCCreateNetInfoGlobalEntity(const MoreSCNetInfoGlobalDigest* digest,
                                         CFMutableDictionaryRef* entity);

// The builder of a protocol ("Interface", "Proxies", "AppleTalk", "DNS", "IPv4", "PPP", "AirPort",
// "Ethernet", "Modem") with the digest's member for it. -1 for any other protocol, whatever the digest, with
// the output untouched; -50 for a null one.
OSStatus MoreSCCreateEntity(CFStringRef protocol, const MoreSCDigest* digest, CFMutableDictionaryRef* entity);
// The same for "IPv4" and "NetInfo".
OSStatus MoreSCCreateGlobalEntity(CFStringRef protocol, const MoreSCGlobalDigest* digest,
                                  CFMutableDictionaryRef* entity);

// --- Conversions ---
//
// Created outputs belong to the caller and are null on failure; they need not be wanted either.

// 00 0A 95 9D 68 16 gives "00:0a:95:9d:68:16".
OSStatus MoreSCFCreateStringWithMacAddress(const UInt8 macAddr[6], CFStringRef* result);
// Digits of either case. -4960 when the text is not ASCII or longer than 17 characters, -1 when it does not
// hold six bytes, -50 for a null string; the output is then untouched.
OSStatus MoreSCFStringToMacAddress(CFStringRef str, UInt8 macAddr[6]);
// The address in network byte order as a dotted quad.
OSStatus MoreSCFCreateStringWithInetAddress(struct in_addr addr, CFStringRef* result);
// The same for several, as an array; none gives an empty one.
OSStatus MoreSCFCreateArrayWithInetAddresses(CFIndex count, const struct in_addr* addresses,
                                             CFArrayRef* result);
// A password as it is stored under "AuthPassword": its UTF-16 code units, each as two bytes with the higher
// one first, and nothing else. -50 for a null password, -108 without memory for the copy.
OSStatus MoreSCFCopyEncodedPPPPassword(CFStringRef password, CFDataRef* encodedPassword);

// --- Defaults ---

extern const MoreSCPPPOptions kMoreSCPPPOptionsDefaultTenOne;
extern const MoreSCPPPOptions kMoreSCPPPOptionsDefaultTenTwoAndLater;
extern const MoreSCPPPOptions kMoreSCPPPoEOptionsDefaultTenTwoAndLater;
// Without a connection script; the service creator fills it in.
extern const MoreSCModemDigest kMoreSCModemDigestDefault;

// The options that this version of the system starts with: from 10.2 on one table for dial-up and one for
// PPPoE, before it one for both; a version that cannot be had counts as an old one. Never null, never to be
// freed.
const MoreSCPPPOptions* MoreSCGetDefaultPPPOptions(Boolean isPPPoE);

LA_END_DECLARATIONS
