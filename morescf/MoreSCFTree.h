// Paths into the preferences tree, new keys in it, and the steps that locations, services and entities share.
//
// Everything here works inside a session that is open, and neither opens nor closes one. Outputs are new
// references, written only on success unless said otherwise. Null IDs are -50 where null has no meaning.
#pragma once

#include "platform/CoreFoundation.h"
#include "platform/SystemConfiguration.h"

// "/Sets/<set ID>"
OSStatus CreateSetPathWithSetID(CFStringRef setID, CFStringRef* setPath);
// "/NetworkServices/<service ID>"
OSStatus CreateServicePathWithServiceID(CFStringRef serviceID, CFStringRef* servicePath);
// The ID in a path of one of the two forms: what stands behind its second slash. -4960 with less than two.
OSStatus CopySeIDFromSePath(CFStringRef sePath, CFStringRef* seID);

// The location's path; for a null ID "CurrentSet" as it stands, whatever it names.
OSStatus CopySetPath(CFStringRef setID, CFStringRef* setPath);
// "<set path>/Network/Service"
OSStatus CopySetServicesPath(CFStringRef setID, CFStringRef* path);
// "<set path>/Network/Global"
OSStatus CopySetGlobalsPath(CFStringRef setID, CFStringRef* path);
// Where the service's link in the location leads; for a null service ID the location's globals.
OSStatus CopyResolvedServicePath(CFStringRef setID, CFStringRef serviceID, CFStringRef* servicePath);
// "<resolved service path>/<protocol>"
OSStatus CopyEntityPath(CFStringRef setID, CFStringRef serviceID, CFStringRef protocol,
                        CFStringRef* entityPath);

// Sets one key of the dictionary at the path, which must be there.
OSStatus PreferencesPathSetProperty(CFStringRef path, CFStringRef key, CFPropertyListRef value);

// Stores a deep, mutable copy of the dictionary at the path under the other one.
OSStatus PreferencesPathDuplicate(CFStringRef path, CFStringRef newPath);

// An empty dictionary under a new key below the path: the largest key that is a decimal number, and one. Null
// on failure: a store's status that SCError still has, or, when that is 0, a parent that is a link or has no
// number left.
//
// Keys count when they are at most 15 ASCII characters, all of them digits, and at most 2147483647: a parent
// without any gets -2147483647, and since a sign is no digit it gets the same key again the next time, in
// place of the child that is there. Whoever makes children needs one with a decimal key there before.
CFStringRef MySCPreferencesPathCreateUniqueChild(SCPreferencesRef session, CFStringRef prefix);
// The same below a top-level key ("Sets", "NetworkServices"). Both outputs must come in as null, and are null
// on failure.
OSStatus MakeNewSeAndCopyIDAndPath(CFStringRef prefix, CFStringRef* newSeID, CFStringRef* newSePath);

// Adds a link to the shared service of that ID, unless the dictionary has an entry for it.
OSStatus AddServiceLinkToDict(CFStringRef serviceID, CFMutableDictionaryRef servicesDict);

// Whether the dictionary of a service or of an entity has no inactive marker.
Boolean IsDictionaryActive(CFDictionaryRef dict);
// Sets or removes the marker. changed (optional) becomes true when that was necessary, and else stays as it
// is.
OSStatus SetDictionaryActive(CFMutableDictionaryRef dict, Boolean active, Boolean* changed);

// Removes every service that no location's order names.
OSStatus DeleteUnreferencedServices();

// Links the shared service in the location, last in its order.
OSStatus AddServiceToSet(CFStringRef setID, CFStringRef serviceID);
// A copy of the shared service under a new ID; no location knows it yet. The output must come in as null, and
// is null on failure.
OSStatus DuplicateService(CFStringRef serviceID, CFStringRef* newServiceID);
