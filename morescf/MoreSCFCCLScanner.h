// The modem scripts that are installed.
#pragma once

#include "platform/CoreFoundation.h"

LA_BEGIN_DECLARATIONS

// The names of the scripts in the modem-script folders of the user, the network, the computer and the system,
// as a new array of strings: sorted without regard to case and with numbers by value ("Modem 9" before
// "Modem 10"), each name once; names that differ in case are different. A folder that is not there, or
// cannot be looked up, is skipped; in a folder, files that are visible count, and of those the ones whose
// name is printable UTF-8 of at most 64 bytes.
//
// indexOfDefaultCCL is optional and receives the position of "Apple Internal 56K Modem (v.90)", compared
// without regard to case (the first of several), or 0 when that one is not installed: take the entry there,
// unless the array is empty.
//
// -108 without memory, -4960 when a value cannot be made, or the status of the folder that cannot be read.
// The array is then null and the index untouched.
OSStatus MoreSCCreateCCLArray(CFArrayRef* result, CFIndex* indexOfDefaultCCL);

LA_END_DECLARATIONS
