// Ready-made tasks on locations, services and the live network state. The conventions of MoreSCF.h hold: each
// opens the session by itself, alone or inside the caller's, but MoreSCCreateActiveDHCPServicesArray, which
// needs none.
#pragma once

#include "morescf/MoreSCFDigest.h"
#include "platform/CoreFoundation.h"

LA_BEGIN_DECLARATIONS

// Whether a service of the location that is on has an "AppleTalk" entity that is on. *active is false on
// failure. A service that is on and has no such entity fails the question with 1004, unless one before it
// answered it.
OSStatus MoreSCIsAppleTalkActive(CFStringRef setID, Boolean* active);
// Switches every "AppleTalk" entity of the location, those of services that are off too. Commits only when
// something changed.
OSStatus MoreSCSetAppleTalkActive(CFStringRef setID, Boolean active);

// The local IDs, sorted by their text, of the services of the committed current location that are on and
// whose "IPv4" is on and configured by DHCP, as the dynamic store tells
// ("Setup:/Network/Service/<service ID>/IPv4", for every service that the location links to); empty when
// there is none, null on failure. -2 for a record without "ConfigMethod", -4960 for one that is no
// dictionary.
OSStatus MoreSCCreateActiveDHCPServicesArray(CFArrayRef* activeDHCP);
// Gives up a service's DHCP lease and asks for a new one: its "IPv4" entity in the current location is
// switched off, committed and applied, and then on again just so. Inside a caller's session nothing is
// committed between the two, so call it outside of any. When the first half fails the entity is not switched
// on again. -50 for a null ID.
OSStatus MoreSCDHCPRelease(CFStringRef serviceID);

// The first location, in store order, with exactly that name. No such location is success, with the output as
// it was: set it to null beforehand. A location without a name before it fails the search (-4960).
OSStatus MoreSCFindSetByUserVisibleNameAndCopyID(CFStringRef userVisibleName, CFStringRef* setID);

// A new location in which only the modem's service is on, with entities made from the digests: "PPP" always
// (a null digest gives one that is off, with the default options), "Modem", "IPv4" and "DNS" where a digest
// is given, else as MoreSCNewService made them. A null modem name means the first modem of the computer;
// without one every service is off. On failure the location is removed again, as by MoreSCNewSet. newSetID is
// optional, and null on failure.
OSStatus MoreSCMakeNewDialupSet(CFStringRef modemBSDName, CFStringRef userVisibleName,
                                const MoreSCModemDigest* modemDigest, const MoreSCPPPDigest* pppDigest,
                                const MoreSCIPv4Digest* ipv4Digest, const MoreSCDNSDigest* dnsDigest,
                                CFStringRef* newSetID);

LA_END_DECLARATIONS
