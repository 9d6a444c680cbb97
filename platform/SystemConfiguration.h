// The network preferences store, the live network state and reachability.
//
// Every call of the store and of the dynamic store sets the status that SCError returns: 0 on success, else
// one of the values below.
#pragma once

#include "platform/CoreFoundation.h"

LA_BEGIN_DECLARATIONS

struct sockaddr;

LA_CONSTANT(int, kSCStatusOK, 0);
// A value on the way has the wrong type, or the reason is in the system log.
LA_CONSTANT(int, kSCStatusFailed, 1001);
LA_CONSTANT(int, kSCStatusInvalidArgument, 1002);  // a null key or value, or a malformed path
LA_CONSTANT(int, kSCStatusAccessError, 1003);      // no rights to read or to write
LA_CONSTANT(int, kSCStatusNoKey, 1004);            // nothing at the key or path
LA_CONSTANT(int, kSCStatusKeyExists, 1005);
LA_CONSTANT(int, kSCStatusLocked, 1006);
LA_CONSTANT(int, kSCStatusNeedLock, 1007);
LA_CONSTANT(int, kSCStatusNoStoreSession, 2001);  // the session on the live state is null
LA_CONSTANT(int, kSCStatusNoStoreServer, 2002);
LA_CONSTANT(int, kSCStatusNotifierActive, 2003);
LA_CONSTANT(int, kSCStatusNoPrefsSession, 3001);  // the session is null
LA_CONSTANT(int, kSCStatusPrefsBusy, 3002);       // another process holds the lock
LA_CONSTANT(int, kSCStatusNoConfigFile, 3003);
LA_CONSTANT(int, kSCStatusNoLink, 3004);
LA_CONSTANT(int, kSCStatusStale, 3005);  // the file is no longer the one that this session read
LA_CONSTANT(int, kSCStatusMaxLink, 3006);

// The status of this thread's last call of the preferences store, the dynamic store or reachability.
int SCError(void) LA_NOEXCEPT;
// English text for a status, never null; borrowed, constant.
const char* SCErrorString(int status) LA_NOEXCEPT;

// --- Preferences store ---

typedef struct OpaqueSCPreferences* SCPreferencesRef;

// A session on the network preferences as they are on disk now, released with CFRelease. name is for the log;
// prefsID must be null. Null on failure: 1001 when the file cannot be used (not a property list, too deep,
// too large, a symbolic link or anything else that is not a regular file, in a directory that somebody other
// than this user or root owns or may write to), 1003 without the rights, 1002 without a name. Without a file
// the session holds the first-run tree, in memory until something commits it, and whoever could not make the
// file is refused with 1003. A file of this user's that others could read or write gets mode 0600.
SCPreferencesRef SCPreferencesCreate(CFAllocatorRef allocator, CFStringRef name,
                                     CFStringRef prefsID) LA_NOEXCEPT;
// Takes the store's cross-process lock. False: 3002 when another process holds it (with wait: still holds it
// after half a minute), 3005 when the file changed since the session read it, 1003, 3001, 1001 (also for a
// directory or a lock file that somebody else could change). Whoever waited for a process that committed gets
// 3005, since the session read the file before: open another one. Locking twice succeeds.
Boolean SCPreferencesLock(SCPreferencesRef session, Boolean wait) LA_NOEXCEPT;
// False with 1007 when the session does not hold the lock, which also ends with the session.
Boolean SCPreferencesUnlock(SCPreferencesRef session) LA_NOEXCEPT;
// A top-level value, borrowed until the session next changes the tree below this key; null when absent
// (1004).
CFPropertyListRef SCPreferencesGetValue(SCPreferencesRef session, CFStringRef key) LA_NOEXCEPT;
// Stores the value, as it is now. 1002 for a value that is no property list, or that would make the tree
// deeper than the 512 containers that a preferences file may have; the same holds for the next ones.
Boolean SCPreferencesSetValue(SCPreferencesRef session, CFStringRef key, CFPropertyListRef value) LA_NOEXCEPT;
// The dictionary at a path of slash-separated keys ("/Sets/0/Network"); borrowed as above. Links are not
// followed; "/" is the whole tree. Null: 1004 when nothing is there, 1001 when what is there, or on the way,
// is not a dictionary, 1002 for a malformed path (no leading slash, an empty key).
CFDictionaryRef SCPreferencesPathGetValue(SCPreferencesRef session, CFStringRef path) LA_NOEXCEPT;
// Stores the dictionary, as it is now, at the path, making missing dictionaries on the way. 1001 when
// something on the way is not a dictionary.
Boolean SCPreferencesPathSetValue(SCPreferencesRef session, CFStringRef path,
                                  CFDictionaryRef value) LA_NOEXCEPT;
// The path that the dictionary's "__LINK__" names, borrowed; null: 1004 when the dictionary is absent or is
// no link, 1001 when something on the way or the link itself has the wrong type, 1002 for a malformed path.
CFStringRef SCPreferencesPathGetLink(SCPreferencesRef session, CFStringRef path) LA_NOEXCEPT;
// Removes whatever is at the path. False: 1004 when nothing is there, 1001, 1002.
Boolean SCPreferencesPathRemoveValue(SCPreferencesRef session, CFStringRef path) LA_NOEXCEPT;
// Writes the changed tree, all of it or nothing; an unchanged tree is not written again. False: 3005 when
// the file is no longer the one that was read, 3002 when another process holds the lock for ten seconds,
// 1003, 1001 (among other reasons when the tree holds a string that XML cannot carry). The session keeps its
// changes then.
Boolean SCPreferencesCommitChanges(SCPreferencesRef session) LA_NOEXCEPT;
// Makes the current location, as it is committed now, the active configuration, and returns when nothing more
// can be expected of its interfaces or after a bounded wait. A commit of this session that left the
// location's settings as they were changes nothing; one that changed nothing at all asks for just that: every
// interface is looked at. Without a commit in this session only what an earlier apply left undone is
// finished. False: 1001 when this machine refused, with the reason in the system log; 1003. What a network, a
// cable or a key does is a line in the log, and a success.
Boolean SCPreferencesApplyChanges(SCPreferencesRef session) LA_NOEXCEPT;

// --- Dynamic store: the live network state ---

typedef struct OpaqueSCDynamicStore* SCDynamicStoreRef;
typedef void (*SCDynamicStoreCallBack)(SCDynamicStoreRef store, CFArrayRef changedKeys, void* info);

typedef struct SCDynamicStoreContext {
    CFIndex version;  // 0
    void* info;
    const void* (*retain)(const void* info);
    void (*release)(const void* info);
    CFStringRef (*copyDescription)(const void* info);
} SCDynamicStoreContext;

extern const CFStringRef kSCDynamicStoreDomainState;  // "State:"
extern const CFStringRef kSCDynamicStoreDomainSetup;  // "Setup:"
extern const CFStringRef kSCEntNetIPv4;               // "IPv4"

// A session on the live state, released with CFRelease; the calls below give 2001 for a null one. name, which
// is for the log, may be null; callBack and context may be null when no notices are wanted. The state is
// computed when it is asked for, from the kernel and from the committed preferences; the keys are
// "State:/Network/Global/IPv4" and, for what is switched on in the current location and in the services that
// it links to, "Setup:/Network/Global/<entity>" and "Setup:/Network/Service/<serviceID>/<entity>".
SCDynamicStoreRef SCDynamicStoreCreate(CFAllocatorRef allocator, CFStringRef name,
                                       SCDynamicStoreCallBack callBack,
                                       SCDynamicStoreContext* context) LA_NOEXCEPT;
// "<domain>/Network/Global/<entity>".
CFStringRef SCDynamicStoreKeyCreateNetworkGlobalEntity(CFAllocatorRef allocator, CFStringRef domain,
                                                       CFStringRef entity) LA_NOEXCEPT;
// "<domain>/Network/Service/<serviceID>/<entity>"; without an entity the last piece is left out.
CFStringRef SCDynamicStoreKeyCreateNetworkServiceEntity(CFAllocatorRef allocator, CFStringRef domain,
                                                        CFStringRef serviceID,
                                                        CFStringRef entity) LA_NOEXCEPT;
// The keys that match the whole of a POSIX extended regular expression, sorted by their text; an empty array
// when none does. Null: 1002 for a null or malformed expression, 1001 or 1003 when the state cannot be read.
CFArrayRef SCDynamicStoreCopyKeyList(SCDynamicStoreRef store, CFStringRef pattern) LA_NOEXCEPT;
// The value at a key; null with 1004 when there is none, 1002 for a null key, 1001 or 1003 when it cannot be
// read.
//
// "State:/Network/Global/IPv4" is there while there is a default route: "PrimaryInterface", the interface's
// name; "Router", a dotted quad, when the route has one; "PrimaryService", the ID of the first service of the
// current location that names the interface, if one does.
CFPropertyListRef SCDynamicStoreCopyValue(SCDynamicStoreRef store, CFStringRef key) LA_NOEXCEPT;
// Replaces the keys and the key patterns whose changes are reported, from now on; either may be null. False:
// 1002 when something in them is no string or a pattern is malformed, 1001 or 1003 when the state cannot be
// read; nothing is replaced then.
Boolean SCDynamicStoreSetNotificationKeys(SCDynamicStoreRef store, CFArrayRef keys,
                                          CFArrayRef patterns) LA_NOEXCEPT;
// A source that calls the session's callback with the keys whose values changed. Changes that come within a
// few hundredths of a second are reported at once, and a value that is again what it was is not reported.
// The source retains the session. order is 0. Null on failure.
CFRunLoopSourceRef SCDynamicStoreCreateRunLoopSource(CFAllocatorRef allocator, SCDynamicStoreRef store,
                                                     CFIndex order) LA_NOEXCEPT;

// --- Reachability ---

typedef UInt32 SCNetworkConnectionFlags;
LA_CONSTANT(SCNetworkConnectionFlags, kSCNetworkFlagsReachable, 1U << 1U);
LA_CONSTANT(SCNetworkConnectionFlags, kSCNetworkFlagsIsLocalAddress, 1U << 16U);
LA_CONSTANT(SCNetworkConnectionFlags, kSCNetworkFlagsIsDirect, 1U << 17U);

// Asks the kernel for a route, and sends nothing. True when the question could be answered; the flags then
// tell the answer, 0 when there is no route that leads anywhere: reachable for a unicast route or an address
// of this computer, with "local" for the latter and "direct" when no gateway is on the way. On false (1002:
// no address of IPv4 or IPv6, or a length that is too small for it; 1001) they are left as they were.
//
// A name that is not an address in figures is looked up first, as every program does, which may well send
// something and take its time; one that has no address is not reachable.
Boolean SCNetworkCheckReachabilityByName(const char* nodename, SCNetworkConnectionFlags* flags) LA_NOEXCEPT;
Boolean SCNetworkCheckReachabilityByAddress(const struct sockaddr* address, int addressLength,
                                            SCNetworkConnectionFlags* flags) LA_NOEXCEPT;

LA_END_DECLARATIONS
