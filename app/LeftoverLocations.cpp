// What the assistant knows of the locations that exist: the listings in the trace, and the clearing away of
// those that earlier runs left.
#include "app/ArvAssistant.h"
#include "app/Trace.h"
#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCF.h"

namespace {

// Whether a location that has no name stands in the trace; it is never deleted.
enum class Nameless { skipped, traced };

// Deletes every location of that name but the current one, which the library refuses to delete. The walk
// runs backwards, so that the status that comes back is that of the one with the lowest index.
OSStatus DeleteSetsNamed(CFStringRef doomedName, const char* heading, Nameless nameless) {
    CFArrayRef ids = nullptr;
    CFIndex currentIndex = kCFNotFound;
    MoreSCCopySetIDs(&ids, &currentIndex);
    if (ids == nullptr) {
        return 0;
    }

    OSStatus status = 0;
    TRACE("%s", heading);
    const CFIndex count = CFArrayGetCount(ids);
    if (count <= 0) {
        TRACE("No locations!");
    }
    for (CFIndex i = count - 1; i >= 0; --i) {
        const auto id = static_cast<CFStringRef>(CFArrayGetValueAtIndex(ids, i));
        if (id == nullptr) {
            TRACE("i = %d, currentSetID = NULL!!\n", static_cast<int>(i));
            continue;
        }
        CFStringRef name = nullptr;
        MoreSCCopyUserVisibleNameOfSet(id, &name);
        if (name != nullptr || nameless == Nameless::traced) {
            TRACE("i=%d, currentSetID=%s, currentSetName=\"%s\"\n", static_cast<int>(i),
                  SystemText(id).c_str(), SystemText(name).c_str());
            if (name != nullptr && CFEqual(name, doomedName) != 0) {
                TRACE("DELETING THIS SET:\"%s\"\n", SystemText(name).c_str());
                status = MoreSCDeleteSet(id);
            }
        }
        CFQRelease(name);
    }
    TRACE("Done.\n");
    CFQRelease(ids);
    return status;
}

}  // namespace

OSStatus ArvAssistant::CleanupOldTemporarySets() {
    return DeleteSetsNamed(TemporarySetName(), "In ArvAssistant::CleanupOldTemporarySets(),\n",
                           Nameless::skipped);
}

OSStatus ArvAssistant::CleanupOldUserSets() {
    return DeleteSetsNamed(KeptSetName(), "In ArvAssistant::CleanupOldUserSets(),\n", Nameless::traced);
}

SetName NameOfSet(CFStringRef setID) {
    SetName found = SetName::none;
    CFStringRef name = nullptr;
    MoreSCCopyUserVisibleNameOfSet(setID, &name);
    if (name != nullptr) {
        found = CFEqual(name, TemporarySetName()) != 0 ? SetName::temporary
                : CFEqual(name, KeptSetName()) != 0    ? SetName::kept
                                                       : SetName::other;
    }
    CFQRelease(name);
    return found;
}

OSStatus ListLocations() {
    CFArrayRef ids = nullptr;
    CFIndex currentIndex = kCFNotFound;
    const OSStatus err = MoreSCCopySetIDs(&ids, &currentIndex);
    if (ids == nullptr) {
        return 0;
    }

    TRACE("\n");
    const CFIndex count = CFArrayGetCount(ids);
    if (count > 0) {
        TRACE("LOCATIONS:\n");
        TRACE("-------------------\n");
        for (CFIndex i = 0; i < count; ++i) {
            const auto id = static_cast<CFStringRef>(CFArrayGetValueAtIndex(ids, i));
            TRACE("%s", i == currentIndex ? "* " : "  ");
            TRACE("Location %d: ", static_cast<int>(i));
            if (id != nullptr) {
                CFStringRef name = nullptr;
                MoreSCCopyUserVisibleNameOfSet(id, &name);
                TRACE("%s", SystemText(name).c_str());
                CFQRelease(name);
            } else {
                TRACE("NULL!!");
            }
            TRACE("\n");
        }
    } else {
        TRACE("No locations!");
    }
    TRACE("\n");
    CFQRelease(ids);
    return err;
}

OSStatus traceCurrentSet() {
    CFStringRef id = nullptr;
    const OSStatus err = MoreSCCopyCurrentSet(&id);
    if (id != nullptr) {
        TRACE("CURRENT SET--> %s\n", SystemText(id).c_str());
    }
    CFQRelease(id);
    return err;
}

int TempLocationExists() {
    CFArrayRef ids = nullptr;
    CFIndex currentIndex = kCFNotFound;
    int exists = MoreSCCopySetIDs(&ids, &currentIndex) != 0 ? 1 : 0;
    const CFIndex count = ids != nullptr ? CFArrayGetCount(ids) : 0;
    for (CFIndex i = 0; i < count && exists == 0; ++i) {
        const auto id = static_cast<CFStringRef>(CFArrayGetValueAtIndex(ids, i));
        if (id == nullptr) {
            TRACE("TempLocationExists(): NULL == currentSetID!!\n");
            continue;
        }
        exists = NameOfSet(id) == SetName::temporary ? 1 : 0;
    }
    CFQRelease(ids);
    return exists;
}
