#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCF.h"

namespace {

SCPreferencesRef gPrefsRef = nullptr;
SInt32 gPrefsOpenCount = 0;
Boolean gPrefsDirty = false;
Boolean gPrefsLocked = false;
CFStringRef gClientName = nullptr;

}  // namespace

OSStatus MoreSCOpen(Boolean lockThePrefs, Boolean waitForLock) {
    OSStatus err = 0;
    if (gPrefsOpenCount == 0) {
        CFStringRef name = gClientName != nullptr ? gClientName : CFSTR("MoreSCF");
        gPrefsRef = SCPreferencesCreate(kCFAllocatorDefault, name, nullptr);
        err = MoreSCError(gPrefsRef);
    }
    if (err == 0 && lockThePrefs && !gPrefsLocked) {
        err = MoreSCErrorBoolean(SCPreferencesLock(gPrefsRef, waitForLock));
        gPrefsLocked = err == 0;
    }
    // Also after a failure: the caller closes in any case.
    ++gPrefsOpenCount;
    return err;
}

void MoreSCClose(OSStatus* err, Boolean dirty) {
    if (dirty && *err == 0) {
        gPrefsDirty = true;
    }
    --gPrefsOpenCount;
    if (gPrefsOpenCount != 0) {
        return;
    }

    // Even when this caller failed: an inner operation that succeeded has asked for it, and whoever must not
    // leave half a change behind undoes it before closing.
    if (gPrefsDirty) {
        OSStatus err2 = MoreSCErrorBoolean(SCPreferencesCommitChanges(gPrefsRef));
        if (err2 == 0) {
            err2 = MoreSCErrorBoolean(SCPreferencesApplyChanges(gPrefsRef));
        }
        if (*err == 0) {
            *err = err2;
        }
        // After a failure too: the changes go with the session, and are not the next one's.
        gPrefsDirty = false;
    }
    if (gPrefsLocked) {
        SCPreferencesUnlock(gPrefsRef);
        gPrefsLocked = false;
    }
    CFQRelease(gPrefsRef);
    gPrefsRef = nullptr;
}

OSStatus MoreSCSetClient(CFStringRef clientName) {
    CFQRetain(clientName);
    CFQRelease(gClientName);
    gClientName = clientName;
    return 0;
}

CFStringRef MoreSCGetClient() {
    return gClientName;
}

SCPreferencesRef MoreSCGetSCPreferencesRef() {
    return gPrefsRef;
}

OSStatus MoreSCErrorBoolean(Boolean mustBeTrue) {
    OSStatus err = 0;
    if (!mustBeTrue) {
        const int scErr = SCError();
        err = MoreSCToOSStatus(scErr != kSCStatusOK ? scErr : kSCStatusFailed);
    }
    return err;
}

OSStatus MoreSCError(const void* value) {
    return MoreSCErrorBoolean(value != nullptr);
}

OSStatus MoreSCToOSStatus(int scErr) {
    return scErr;
}
