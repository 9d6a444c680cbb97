#include "app/ArvAssistant.h"

#include "app/Printer.h"
#include "app/SetIDFile.h"
#include "app/Trace.h"
#include "app/Turn.h"
#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCF.h"

OSStatus ArvAssistant::Initialize() {
    return 0;
}

OSStatus ArvAssistant::CleanUp() {
    return 0;
}

OSStatus ArvAssistant::RememberCurrentSet() {
    CFQRelease(originalSetID);
    originalSetID = nullptr;
    return MoreSCCopyCurrentSet(&originalSetID);
}

void ArvAssistant::WriteOriginalSetID(const char* path) {
    const SystemText text(originalSetID);
    TRACE("Remembering original set: this->originalSetID = %s\n", text.c_str());
    WriteSetIDFile(path, text.c_str());
}

OSStatus ArvAssistant::SaveOriginalSet() {
    traceCurrentSet();
    const OSStatus err = RememberCurrentSet();
    const SetName name = NameOfSet(originalSetID);
    if (name == SetName::other || name == SetName::kept) {
        WriteOriginalSetID(kOriginalSetFile);
    }
    return name == SetName::none ? 0 : err;
}

OSStatus ArvAssistant::SaveTemporarySet() {
    traceCurrentSet();
    const OSStatus err = RememberCurrentSet();
    if (NameOfSet(originalSetID) == SetName::temporary) {
        MoreSCRenameSet(originalSetID, KeptSetName());
        WriteOriginalSetID(kOriginalSetFile);
    }
    return err;
}

OSStatus ArvAssistant::SaveZATSet() {
    traceCurrentSet();
    const OSStatus err = RememberCurrentSet();
    if (originalSetID == nullptr) {
        return 0;
    }
    WriteOriginalSetID(kZATSetFile);
    return err;
}

// An object that remembers no location asks for the current one's name, and so whether this computer is on
// the temporary location that an earlier process made.
OSStatus ArvAssistant::RestoreOriginalSet() {
    return NameOfSet(originalSetID) == SetName::temporary ? RestoreSetFromFile(kOriginalSetFile) : 0;
}

OSStatus ArvAssistant::RestoreOriginalSet2() {
    const SetName name = NameOfSet(originalSetID);
    const bool leadsBack = name == SetName::temporary || name == SetName::kept;
    return leadsBack ? RestoreSetFromFile(kZATSetFile) : 0;
}

// Both ways back name kOriginalSetFile in their trace, whichever file they read: printer-setup applications
// match these lines.
OSStatus ArvAssistant::RestoreSetFromFile(const char* path) {
    if (originalSetID == nullptr) {
        TRACE("this->originalSet is not defined, so loading it from file: \"%s\"\n", kOriginalSetFile);
        if (!CopySetIDFromFile(path, &originalSetID)) {
            TRACE("File \"%s\" doesn't exist, so this->originalSet could not be loaded.\n", kOriginalSetFile);
        }
    }
    TRACE("Activating the original set: \"%s\"\n", SystemText(originalSetID).c_str());
    return originalSetID == nullptr ? kNoOriginalSetErr : ActivateSet(originalSetID);
}

OSStatus ArvAssistant::ActivateSet(CFStringRef setID) {
    traceCurrentSet();
    const OSStatus err = MoreSCSetCurrentSet(setID);
    traceCurrentSet();
    return err;
}

OSStatus ArvAssistant::Run() {
    Initialize();
    ListLocations();
    CleanupOldTemporarySets();
    ListLocations();
    SaveOriginalSet();

    OSStatus status = CreateTemporarySet(nullptr, nullptr, nullptr);
    if (status == 0) {
        status = ActivateTemporarySet();
    }
    if (status == 0 && IsWirelessPrinterReachable() != 0) {
        ConfigureWirelessPrinter();
    }

    // The object still remembers the location from before, so nothing is switched back, and the temporary one
    // cannot be deleted while it is current: that is left to the "remove" of a later process. One that could
    // not be made current is deleted here.
    RestoreOriginalSet();
    DestroyTemporarySet();
    CleanUp();
    return status;
}

OSStatus ArvAssistant::ConfigureWirelessPrinter() {
    TRACE("Configuring the device\n");
    OpenConfigurationPage();
    const TurnPause pause;
    return WaitForUserToBeDone();
}

int ArvAssistant::IsWirelessPrinterReachable() {
    int reachable = IsWirelessPrinterReachableViaSCF(5);
    if (reachable == 1) {
        reachable = IsWirelessPrinterReachableViaHTTP(3);
    }
    TRACE("Printer is reachable: %s\n", reachable != 0 ? "TRUE" : "FALSE");
    return reachable;
}
