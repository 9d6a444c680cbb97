// The assistant: remembers the location in force, builds and activates a temporary one for the printer's own
// set-up network, leads back, and clears away what earlier runs left.
//
// One process runs one command; what a later process needs passes through two small files, each holding a
// location ID as plain text. The temporary location is known by its name alone, and so is the one that "save"
// keeps.
#pragma once

#include "platform/CoreFoundation.h"

// The names of the temporary location and of the kept one; constant.
inline CFStringRef TemporarySetName() {
    return CFSTR("kv zat temp set");
}
inline CFStringRef KeptSetName() {
    return CFSTR("Current Configured Location");
}

// What the assistant makes of a location's name.
enum class SetName { none, temporary, kept, other };
// Of the location of that ID; of the current one for null. none: it has no name, or cannot be read.
SetName NameOfSet(CFStringRef setID);

inline constexpr const char* kOriginalSetFile = "/tmp/set.orig";
inline constexpr const char* kZATSetFile = "/tmp/zat.orig";

// There is no remembered location to go back to.
inline constexpr OSStatus kNoOriginalSetErr = -1234;

struct TemporaryMode;

// Every operation returns 0 or a status of the network-configuration library, unless it says otherwise, and
// traces its steps.
class ArvAssistant {
  public:
    ArvAssistant() = default;
    // The set IDs stay held: the only assistant lives as long as the process.
    ~ArvAssistant() = default;
    ArvAssistant(const ArvAssistant&) = delete;
    ArvAssistant& operator=(const ArvAssistant&) = delete;

    // The whole cycle in one process: build and activate the temporary location, look for the printer, open
    // its configuration page and wait for the user, clean up. Returns the status of building and activating.
    // The temporary location stays the current one: "remove" leads back from it.
    OSStatus Run();

    // Bracket a command; they do nothing and return 0.
    OSStatus Initialize();
    OSStatus CleanUp();

    // Remembers the current location in the object and in kOriginalSetFile; the temporary location is
    // remembered in the object only. Returns the status of reading the current location, 0 when it has no
    // name.
    OSStatus SaveOriginalSet();
    // Makes the remembered location current again, when the one that the object remembers (none: the current
    // one) is the temporary location; otherwise it does nothing and returns 0. An object that remembers none
    // reads kOriginalSetFile. kNoOriginalSetErr when there is no ID to be had.
    OSStatus RestoreOriginalSet();
    // The same from kZATSetFile, and also away from the kept location. Its trace names kOriginalSetFile.
    OSStatus RestoreOriginalSet2();
    // Gives the temporary location, when it is current, the kept location's name and remembers it in
    // kOriginalSetFile. Returns the status of reading the current location.
    OSStatus SaveTemporarySet();

    // Builds the temporary location, committed as one change or not at all, and keeps its ID in the object
    // (null when none was made, but that of what was not kept after a failed commit). mode is "auto",
    // "wirelessAuto" or "from_intro"; anything else counts as null. networkName and password may be null.
    // Status 0 with no location: no service fits the mode. What a service's settings come to is told of the
    // last service only: 0 does not mean that each one before has its settings.
    OSStatus CreateTemporarySet(char* mode, char* networkName, char* password);
    // Makes the temporary location current: -50 when there is none.
    OSStatus ActivateTemporarySet();
    // Deletes the temporary location; -50 when it is the current one. 0 when there is none.
    OSStatus DestroyTemporarySet();

    // Delete every location of the temporary, or of the kept name but the current one, which the library
    // refuses with -50. The status of the last deletion, the one with the lowest index; 0 when there was
    // none.
    OSStatus CleanupOldTemporarySets();
    OSStatus CleanupOldUserSets();

    // Opens the printer's configuration page and waits until the user is done; always 0.
    OSStatus ConfigureWirelessPrinter();
    // 1 when the kernel has a route to the printer and its web server answers the probe with HTTP status 404,
    // else 0.
    int IsWirelessPrinterReachable();

    // Remembers the current location, whatever its name, in the object and in kZATSetFile.
    OSStatus SaveZATSet();

  private:
    OSStatus ActivateSet(CFStringRef setID);
    // Consumes the entity.
    OSStatus ConfigureTemporarySetProperties(CFStringRef setID, CFStringRef serviceID,
                                             CFMutableDictionaryRef entity, const TemporaryMode& mode,
                                             const char* networkName, const char* password);
    // The current location's ID replaces the one remembered, null on failure.
    OSStatus RememberCurrentSet();
    void WriteOriginalSetID(const char* path);
    OSStatus RestoreSetFromFile(const char* path);

    SInt32 initialized = 0;
    CFStringRef originalSetID = nullptr;
    CFStringRef temporarySetID = nullptr;
};

// Traces every location, the current one marked. The status of listing them; 0 and no trace when there is no
// list.
OSStatus ListLocations();
// Traces the current location's ID. The status of reading it.
OSStatus traceCurrentSet();
// 1 when a location of the temporary name exists, or when the locations cannot be listed; else 0.
int TempLocationExists();
