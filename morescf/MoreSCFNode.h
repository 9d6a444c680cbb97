// The dictionaries of the tree that operations read and write whole: a location, its links, a service, an
// entity. Most operations are one of these on one of those.
//
// Everything here is an operation of its own: it opens the session and closes it, alone or inside another
// one's, as MoreSCF.h promises of all. What it returns when the node is not there, or its path cannot be
// made, is the status of the path (MoreSCFTree.h) or the store's.
#pragma once

#include "morescf/MoreSCF.h"
#include "morescf/MoreSCFSteps.h"
#include "morescf/MoreSCFValues.h"
#include "platform/CoreFoundation.h"

struct Node {
    enum Kind { kSet, kLinks, kService, kEntity };

    Kind kind;
    CFStringRef setID;      // null: the current location
    CFStringRef serviceID;  // null: the location's globals
    CFStringRef protocol;
};

inline Node SetNode(CFStringRef setID) {
    return {Node::kSet, setID, nullptr, nullptr};
}
// The links to the location's services.
inline Node LinksNode(CFStringRef setID) {
    return {Node::kLinks, setID, nullptr, nullptr};
}
inline Node ServiceNode(CFStringRef setID, CFStringRef serviceID) {
    return {Node::kService, setID, serviceID, nullptr};
}
inline Node EntityNode(CFStringRef setID, CFStringRef serviceID, CFStringRef protocol) {
    return {Node::kEntity, setID, serviceID, protocol};
}

// The node's dictionary; null on failure.
OSStatus CopyNode(const Node& node, CFDictionaryRef* dict);
// A mutable copy of it, written only on success.
OSStatus CopyNodeMutable(const Node& node, CFMutableDictionaryRef* dict);
// A string of it; -4960 when there is none under the key.
OSStatus CopyNodeString(const Node& node, CFStringRef key, CFStringRef* value);
// Puts the dictionary in the node's place; -50 for null. Not dirty: a step of an operation that marks the
// session itself, when all of its steps have succeeded.
OSStatus StoreNode(const Node& node, CFDictionaryRef dict, Boolean dirty = true);
// Sets one key of a dictionary that is there; -50 for a null value.
OSStatus SetNodeProperty(const Node& node, CFStringRef key, CFPropertyListRef value);

OSStatus IsNodeActive(const Node& node, Boolean* active);
// Stores, and marks the session, only when that changes something.
OSStatus SetNodeActive(const Node& node, Boolean active);

// Has a mutable copy of the dictionary changed, and stores it, unless the change returns a status. -50,
// before anything is read, when the caller's arguments are not valid.
template <class Change>
OSStatus ChangeNode(const Node& node, bool isValid, Change change) {
    CFMutableDictionaryRef dict = nullptr;
    OSStatus err = OpenSession();
    if (err == 0 && !isValid) {
        err = paramErr;
    }
    if (err == 0) {
        err = CopyNodeMutable(node, &dict);
    }
    if (err == 0) {
        err = change(dict);
    }
    if (err == 0) {
        err = StoreNode(node, dict);
    }
    CFQRelease(dict);
    MoreSCClose(&err, true);
    return err;
}
