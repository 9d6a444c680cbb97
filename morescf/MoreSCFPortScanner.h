// The network ports of the computer: wired and wireless Ethernet, modems and other serial ports.
//
// A port is a dictionary:
//
//     DeviceName       string    the device, as "en0" or "ttyS0"
//     Hardware         string    "Ethernet", "AirPort" or, for every serial port, "Modem"
//     Type             string    "Ethernet"; "PPP" for every serial port
//     SubType          string    serial ports: "PPPSerial"
//     HardwareVariant  string    infrared ports: "IrDA-IrCOMM"
//     MACAddress       string    Ethernet with a hardware address: "00:0a:95:9d:68:16"
//     UserDefinedName  string    the name that the user sees
//     SortOrder        number    0 internal modem, 1 USB modem, 2 other modems, 3 infrared, 4 other serial
//                                ports, 5 "en0", 6 PCI cards, 7 AirPort, 8 other wireless, 9 other Ethernet
//
// and, where the name needed them, "BSD Name", "AAPL,slot-name", "IOChildIndex" and "IOTTYBaseName"
// (strings).
#pragma once

#include "platform/CoreFoundation.h"
#include "platform/IOKit.h"

LA_BEGIN_DECLARATIONS

// All ports as a new array, by "SortOrder" and then by name, equal ones as the registry gives them; empty
// when there is none. The first port that cannot be described fails the whole call: -1 for a property that is
// required, -4960 for a value that cannot be made, the registry's status, or the hook's. The output is then
// null.
OSStatus MoreSCCreatePortArray(CFArrayRef* portArray);

// A hook that names ports. It gets the port's registry entry, the port's dictionary so far (to which it may
// add), and the name that the built-in rules propose; that one is null when they failed. It hands over a
// reference to the name to use in *baseName (null and status 0: -1), or returns a status that fails the scan.
// Its status replaces that of the rules. In the name the first "%1$@" stands for "BSD Name" in the port's
// dictionary, "%2$@" for "AAPL,slot-name", "%3$@" for "IOChildIndex" and "%4$@" for "IOTTYBaseName"; one that
// is not there reads "unknown".
typedef OSStatus (*MoreSCFPortNameCallback)(io_object_t port, CFMutableDictionaryRef portDict,
                                            CFStringRef proposedName, CFStringRef* baseName);
// Installs a hook in place of any other, for all scans to come; null removes it.
void MoreSCFSetPortNameCallback(MoreSCFPortNameCallback callback);

LA_END_DECLARATIONS
