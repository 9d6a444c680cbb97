#include "morescf/MoreSCFNode.h"

#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCFSteps.h"
#include "morescf/MoreSCFTree.h"

namespace {

OSStatus CopyPath(const Node& node, CFStringRef* path) {
    switch (node.kind) {
        case Node::kSet:
            return CopySetPath(node.setID, path);
        case Node::kLinks:
            return CopySetServicesPath(node.setID, path);
        case Node::kService:
            return CopyResolvedServicePath(node.setID, node.serviceID, path);
        case Node::kEntity:
            return CopyEntityPath(node.setID, node.serviceID, node.protocol, path);
    }
    return paramErr;
}

// Writes one way or the other, to the path of a node.
template <class Write>
OSStatus WriteNode(const Node& node, const void* value, Write write, Boolean dirty = true) {
    CFStringRef path = nullptr;
    OSStatus err = InTurn(
        OpenSession, [&] { return ErrorIfNotGiven(value); }, [&] { return CopyPath(node, &path); },
        [&] { return write(path); });
    CFQRelease(path);
    MoreSCClose(&err, dirty);
    return err;
}

}  // namespace

OSStatus CopyNode(const Node& node, CFDictionaryRef* dict) {
    CFStringRef path = nullptr;
    CFDictionaryRef found = nullptr;
    OSStatus err = InTurn(OpenSession, [&] { return CopyPath(node, &path); });
    if (err == 0) {
        // Held on to, since what the store lends goes with the session.
        found = Retained(SCPreferencesPathGetValue(MoreSCGetSCPreferencesRef(), path));
        err = MoreSCError(found);
    }
    CFQRelease(path);
    MoreSCClose(&err, false);
    HandOverOrNull(err, found, dict);
    return err;
}

OSStatus CopyNodeMutable(const Node& node, CFMutableDictionaryRef* dict) {
    CFDictionaryRef found = nullptr;
    CFMutableDictionaryRef copy = nullptr;
    OSStatus err = CopyNode(node, &found);
    if (err == 0) {
        copy = CFDictionaryCreateMutableCopy(kCFAllocatorDefault, 0, found);
        err = ErrorIfMissing(copy);
    }
    CFQRelease(found);
    HandOver(err, copy, dict);
    return err;
}

OSStatus CopyNodeString(const Node& node, CFStringRef key, CFStringRef* value) {
    CFDictionaryRef dict = nullptr;
    CFStringRef string = nullptr;
    OSStatus err =
        InTurn([&] { return CopyNode(node, &dict); }, [&] { return CopyStringValue(dict, key, &string); });
    CFQRelease(dict);
    HandOver(err, string, value);
    return err;
}

OSStatus StoreNode(const Node& node, CFDictionaryRef dict, Boolean dirty) {
    const auto write = [dict](CFStringRef path) {
        return MoreSCErrorBoolean(SCPreferencesPathSetValue(MoreSCGetSCPreferencesRef(), path, dict));
    };
    return WriteNode(node, dict, write, dirty);
}

OSStatus SetNodeProperty(const Node& node, CFStringRef key, CFPropertyListRef value) {
    return WriteNode(node, value,
                     [=](CFStringRef path) { return PreferencesPathSetProperty(path, key, value); });
}

OSStatus IsNodeActive(const Node& node, Boolean* active) {
    CFDictionaryRef dict = nullptr;
    const OSStatus err = CopyNode(node, &dict);
    if (err == 0) {
        *active = IsDictionaryActive(dict);
    }
    CFQRelease(dict);
    return err;
}

OSStatus SetNodeActive(const Node& node, Boolean active) {
    // One session around both halves: nobody else's commit comes between reading and storing.
    CFMutableDictionaryRef dict = nullptr;
    Boolean changed = false;
    OSStatus err = InTurn(
        OpenSession, [&] { return CopyNodeMutable(node, &dict); },
        [&] { return SetDictionaryActive(dict, active, &changed); });
    if (err == 0 && changed) {
        err = StoreNode(node, dict);
    }
    CFQRelease(dict);
    MoreSCClose(&err, changed);
    return err;
}
