// Addresses and passwords as the entities hold them.
#include <arpa/inet.h>

#include <cstdio>
#include <cstdlib>

#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCFDigest.h"
#include "morescf/MoreSCFValues.h"
#include "platform/CoreServices.h"

namespace {

OSStatus CreateStringWithASCII(const char* text, CFStringRef* result) {
    CFStringRef string = CFStringCreateWithCString(kCFAllocatorDefault, text, kCFStringEncodingASCII);
    const OSStatus err = ErrorIfMissing(string);
    HandOverOrNull(err, string, result);
    return err;
}

}  // namespace

OSStatus MoreSCFCreateStringWithMacAddress(const UInt8 macAddr[6], CFStringRef* result) {
    char text[19] = "";
    char* end = text;
    for (int i = 0; i < 6; ++i, end += 3) {
        std::snprintf(end, 4, "%2.2x:", static_cast<unsigned int>(macAddr[i]));
    }
    // The colon behind the last byte.
    text[17] = '\0';
    return CreateStringWithASCII(text, result);
}

OSStatus MoreSCFStringToMacAddress(CFStringRef str, UInt8 macAddr[6]) {
    char text[18];
    unsigned int bytes[6];
    OSStatus err = ErrorIfNotGiven(str);
    // Room for six bytes of two digits, five colons and the end: a longer text is refused here.
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
    OSStatus err = count != 0 ? ErrorIfNotGiven(addresses) : 0;
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
    UniChar* units = nullptr;
    CFDataRef encoded = nullptr;
    const CFIndex count = password != nullptr ? CFStringGetLength(password) : 0;
    OSStatus err = ErrorIfNotGiven(password);
    if (err == 0 && count > 0) {
        units = static_cast<UniChar*>(std::malloc(static_cast<std::size_t>(count) * sizeof(UniChar)));
        err = units != nullptr ? 0 : memFullErr;
    }
    if (err == 0) {
        CFStringGetCharacters(password, CFRangeMake(0, count), units);
        // The higher byte first, whatever this machine does.
        for (CFIndex i = 0; i < count; ++i) {
            units[i] = htons(units[i]);
        }
        encoded = CFDataCreate(kCFAllocatorDefault, reinterpret_cast<const UInt8*>(units),
                               count * static_cast<CFIndex>(sizeof(UniChar)));
        err = ErrorIfMissing(encoded);
    }
    std::free(units);
    HandOverOrNull(err, encoded, encodedPassword);
    return err;
}
