// The network preferences: locations, their services, and the services' configuration records.
//
// The preferences are one tree of property-list values:
//
//     Sets
//       <set ID>                       a location, also called a set
//         UserDefinedName              its name as the user sees it
//         Network
//           Service
//             <service ID>             { __LINK__ = "/NetworkServices/<service ID>" }
//           Global
//             IPv4                     { ServiceOrder = (<service ID>, ...), PPPOverridePrimary = 0 or 1 }
//             NetInfo                  {}
//     NetworkServices
//       <service ID>                   a service, shared by the locations that link to it
//         UserDefinedName
//         __INACTIVE__                 the number 1, only when the service is off
//         <protocol>                   an entity: one protocol's record (see MoreSCFDigest.h)
//           __INACTIVE__               the number 1, only when the entity is off
//     CurrentSet                       "/Sets/<set ID>"
//
// A location's services are those that its "ServiceOrder" lists, in that order; one that is linked and not
// listed does not appear. A service that no location lists is removed whenever a location or a service is
// deleted. In a service's dictionary the entries that are dictionaries are its entities, the others its own
// properties.
//
// Every operation works on one session with the preferences store, which is opened on first use and shared by
// whatever runs inside: changes are kept in memory until the outermost user closes it, and are then committed
// and applied at once. Wrap several operations in MoreSCOpen and MoreSCClose to make them one change, and to
// read the file once. One thread only.
//
// Conventions for all operations:
// - They return a status, 0 for success.
// - Outputs come last and are written only on success, unless said otherwise. Set them to null beforehand and
//   release them with CFQRelease in any case; each is a reference of the caller's own. Outputs called
//   optional may be null pointers, the others may not.
// - A null set ID means the current location, a null service ID the location's global entities, except where
//   -50 is named for it.
// - An operation that writes gives back the status of the commit and of the apply when it is the outermost
//   one; "store's status" is any of the store's values (SystemConfiguration.h), among them 1003 without the
//   rights, 1004 for a value that is not there, 1001 for a value of the wrong type or a reason unknown.
// - -50: a null argument, or as described. -108: no memory for a list of this library's own; any other lack
//   of memory ends the process (CoreFoundation.h). -4960: a value cannot be made, or one that is expected in
//   the tree is missing or has the wrong type (a name that is no string counts as missing).
// - A location without a readable "ServiceOrder" fails whatever has to know its services: listing, adding,
//   duplicating and deleting them, and duplicating it. So does an entry of the order without a link whose
//   text is a path, wherever the resolved IDs are needed. Removing the services that no location lists needs
//   those of every location, so that one such location fails every MoreSCDeleteSet and MoreSCDeleteService,
//   after what they do besides.
// - What an operation undoes after a failure it undoes in the session's tree, before anything is committed.
//   The services that it made are removed with those that no location lists; where that fails as described
//   above, they stay in "NetworkServices", listed by nobody, until a removal succeeds. Without a usable
//   "CurrentSet" no location can be removed, and one that was made stays.
// - An operation that looks at the computer's ports or modem scripts (MoreSCNewService, MoreSCNewSet,
//   MoreSCMakeNewDialupSet) gives back their statuses too (MoreSCFPortScanner.h, MoreSCFCCLScanner.h), and
//   those of MoreSCFStringToMacAddress for a "MACAddress".
#pragma once

#include "platform/CoreFoundation.h"
#include "platform/SystemConfiguration.h"

LA_BEGIN_DECLARATIONS

// --- Session ---

// Begins one use of the session, opening it when it is the outermost one. lockThePrefs takes the store's lock
// against other processes, until the outermost close; waitForLock waits for it, at most half a minute (3002).
// Whoever waited for a process that then committed gets 3005, since the session was read before: close, and
// open again. Match every call with MoreSCClose, a failed one too. Store's status.
OSStatus MoreSCOpen(Boolean lockThePrefs, Boolean waitForLock);
// Ends one use. err is the caller's status, which must not be null. dirty says that the caller changed the
// tree: when *err is 0 the session is marked for a commit; a failed caller does not mark it, and cannot clear
// the mark that an inner operation left. The outermost close of a marked session commits and then applies;
// the status of that goes to *err when it was 0. Changes of a session that is not marked, or whose commit
// fails, are dropped with it.
void MoreSCClose(OSStatus* err, Boolean dirty);
// Names the client for the store's log, from the next session on; null for "MoreSCF". The name is retained.
// Always 0.
OSStatus MoreSCSetClient(CFStringRef clientName);
// The name as it was set, borrowed; null when none was.
CFStringRef MoreSCGetClient(void);
// The open session, borrowed; null when none is open.
SCPreferencesRef MoreSCGetSCPreferencesRef(void);

// The status of the store's last call, for a call that reports failure by false (null): 0 when mustBeTrue
// (the value is not null), else what SCError gives, or 1001 when that is 0.
OSStatus MoreSCErrorBoolean(Boolean mustBeTrue);
OSStatus MoreSCError(const void* value);
// The one place where the store's statuses become the library's: they are the same.
OSStatus MoreSCToOSStatus(int scErr);

// --- Locations ---

// The whole "Sets" dictionary: set ID -> location. 1004 without one, -4960 when it is no dictionary.
OSStatus MoreSCCopySetsDict(CFDictionaryRef* setsDict);
// Replaces it.
OSStatus MoreSCSetSetsDict(CFDictionaryRef setsDict);

// The IDs of all locations, in the store's order. indexOfCurrentSet (optional) receives the position of the
// current one and stays as it is when "CurrentSet" names none of them; without a usable "CurrentSet" the call
// then fails. *setIDs is null on failure.
OSStatus MoreSCCopySetIDs(CFArrayRef* setIDs, CFIndex* indexOfCurrentSet);

OSStatus MoreSCCopyUserVisibleNameOfSet(CFStringRef setID, CFStringRef* userVisibleName);

// 1004 without "CurrentSet", -4960 when it is not a path of at least two slashes.
OSStatus MoreSCCopyCurrentSet(CFStringRef* setID);
// Makes a location the current one; whether it exists is not checked. -50 for a null ID, with nothing
// changed.
OSStatus MoreSCSetCurrentSet(CFStringRef setID);

// A new location with one service for each network port of the computer (MoreSCFPortScanner.h), in the ports'
// order. On failure it is removed again. newSetID is optional.
OSStatus MoreSCNewSet(CFStringRef userVisibleName, CFStringRef* newSetID);
// A copy of a location with copies of the services that it lists. A null name keeps the old one's. On failure
// it is removed again. newSetID is optional.
OSStatus MoreSCDuplicateSet(CFStringRef setID, CFStringRef newSetUserVisibleName, CFStringRef* newSetID);
// Removes a location, and every service that no location lists any more. -50 for the current location, which
// stays (services that no location lists are still removed from the session, but do not mark it), and for a
// null ID, with nothing changed. 1004 or -4960 without a usable "CurrentSet", and the location stays. When
// the removal of services fails, the location is gone from the session all the same; a call that is the
// outermost one then commits nothing.
OSStatus MoreSCDeleteSet(CFStringRef setID);
OSStatus MoreSCRenameSet(CFStringRef setID, CFStringRef userVisibleName);

// --- Services ---
//
// The local ID of a service is its key in the location, the resolved ID the key in "NetworkServices" that the
// link names; the two are the same unless somebody else wrote the tree. Operations that take a service ID
// mean the local one.

// The location's links (service ID -> link) and its service order, either optional; the order is -4960 when
// it is missing. Both outputs are null on failure.
OSStatus MoreSCCopyServicesDict(CFStringRef setID, CFDictionaryRef* servicesDict, CFArrayRef* serviceOrder);
// The same as mutable copies; both must be there, even when one is wanted. The outputs are written only on
// success.
OSStatus MoreSCCopyServicesDictMutable(CFStringRef setID, CFMutableDictionaryRef* servicesDict,
                                       CFMutableArrayRef* serviceOrder);
// Replaces the links, then the service order; null leaves what is there. When the order fails, the links are
// replaced in the session all the same; a call that is the outermost one then commits nothing.
OSStatus MoreSCSetServicesDict(CFStringRef setID, CFDictionaryRef servicesDict, CFArrayRef serviceOrder);

// The IDs of the location's services in service order, either optional. For the resolved ones every entry
// needs a link (else the store's status) whose text is a path of at least two slashes (else -4960); whether
// the service is there is not asked. An entry of the order that is no string is -4960.
OSStatus MoreSCCopyServiceIDs(CFStringRef setID, CFArrayRef* localServiceIDs, CFArrayRef* resolvedServiceIDs);

OSStatus MoreSCCopyUserVisibleNameOfService(CFStringRef setID, CFStringRef serviceID,
                                            CFStringRef* userVisibleName);
OSStatus MoreSCIsServiceActive(CFStringRef setID, CFStringRef serviceID, Boolean* active);
// Switches the service on or off, in every location that uses it. Changes and marks nothing when it already
// is so.
OSStatus MoreSCSetServiceActive(CFStringRef setID, CFStringRef serviceID, Boolean active);
// The name of the service's device ("DeviceName" of its "Interface" entity), as "en0" or "wlan0".
OSStatus MoreSCCopyBSDNameOfService(CFStringRef setID, CFStringRef serviceID, CFStringRef* bsdName);

// A new service for a port (a port dictionary of MoreSCFPortScanner.h), last in the location's order, with an
// entity each for "Interface", "Proxies", "AppleTalk" (ports with a "MACAddress" only, off), "DNS", "IPv4"
// ("Manual" with a "MACAddress", else "PPP"), "PPP" (off with a "MACAddress") and the hardware: "AirPort",
// "Ethernet" or "Modem". On failure it is removed again. -50 when the port lacks one of "UserDefinedName",
// "DeviceName", "Hardware", "Type". newServiceID is optional.
OSStatus MoreSCNewService(CFStringRef setID, CFDictionaryRef portDict, CFStringRef* newServiceID);
// A copy of the shared service of that resolved ID, last in the location's order; a null name keeps the old
// one's. After a failure to rename it the copy stays. -50 for a null service ID, with nothing changed.
// newServiceID is optional.
OSStatus MoreSCDuplicateService(CFStringRef setID, CFStringRef serviceID, CFStringRef userVisibleName,
                                CFStringRef* newServiceID);
// Takes the service out of the location's links and order (one that is not in the order is only unlinked),
// and removes every service that no location lists any more; when that removal fails, the service is out of
// the location, and committed so, all the same. -50 for a null service ID, with nothing changed.
OSStatus MoreSCDeleteService(CFStringRef setID, CFStringRef serviceID);
OSStatus MoreSCRenameService(CFStringRef setID, CFStringRef serviceID, CFStringRef userVisibleName);

// --- Entities ---

// A service's whole dictionary (null service ID: the location's global entities, among them "IPv4" with the
// service order). Null output on failure.
OSStatus MoreSCCopyEntitiesDict(CFStringRef setID, CFStringRef serviceID, CFDictionaryRef* entitiesDict);
// A mutable copy; the output is written only on success.
OSStatus MoreSCCopyEntitiesDictMutable(CFStringRef setID, CFStringRef serviceID,
                                       CFMutableDictionaryRef* entitiesDict);
// Replaces it, name and markers included.
OSStatus MoreSCSetEntitiesDict(CFStringRef setID, CFStringRef serviceID, CFDictionaryRef entitiesDict);

// One entity; 1004 when the service has none for the protocol. Null output on failure.
OSStatus MoreSCCopyEntity(CFStringRef setID, CFStringRef serviceID, CFStringRef protocol,
                          CFDictionaryRef* entity);
// A mutable copy; the output is written only on success.
OSStatus MoreSCCopyEntityMutable(CFStringRef setID, CFStringRef serviceID, CFStringRef protocol,
                                 CFMutableDictionaryRef* entity);
// Adds the entity or replaces it.
OSStatus MoreSCSetEntity(CFStringRef setID, CFStringRef serviceID, CFStringRef protocol,
                         CFDictionaryRef entity);

// The service's entities as two arrays that correspond position by position, both optional, but the entities
// are to be had only with the protocols (-50).
OSStatus MoreSCCopyEntities(CFStringRef setID, CFStringRef serviceID, CFArrayRef* entityProtocols,
                            CFArrayRef* entityValues);
// Replaces all of them; the service's own properties stay, even against a protocol of the same name. -50 for
// arrays of different length.
OSStatus MoreSCSetEntities(CFStringRef setID, CFStringRef serviceID, CFArrayRef entityProtocols,
                           CFArrayRef entityValues);

// Adds an entity; -50 when the service has one for the protocol.
OSStatus MoreSCNewEntity(CFStringRef setID, CFStringRef serviceID, CFStringRef protocol,
                         CFDictionaryRef entity);
// Removes an entity; one that is absent is no error.
OSStatus MoreSCDeleteEntity(CFStringRef setID, CFStringRef serviceID, CFStringRef protocol);

OSStatus MoreSCIsEntityActive(CFStringRef setID, CFStringRef serviceID, CFStringRef protocol,
                              Boolean* active);
// Changes and marks nothing when the entity already is so.
OSStatus MoreSCSetEntityActive(CFStringRef setID, CFStringRef serviceID, CFStringRef protocol,
                               Boolean active);

LA_END_DECLARATIONS
