// The printer on its own set-up network: its address, whether it answers there, its configuration page, and
// the prompt that waits for the user.
#pragma once

#include "platform/CoreFoundation.h"

// A macro, so that the URLs below can be made of it.
#define LA_PRINTER_ADDRESS "192.0.0.192"
inline constexpr const char* kPrinterAddress = LA_PRINTER_ADDRESS;

// The printer's configuration start page.
extern char gQF_config_URL1[];

// 1 when the kernel has a route to the printer, else 0. Asks at most maxtries times (once when it is below
// 1), 30 microseconds apart; sends nothing.
int IsWirelessPrinterReachableViaSCF(int maxtries);

// 1 when the printer's web server answers a probe for a page that it does not have with HTTP status 404, else
// 0. Probes at most maxtries times (once when it is below 1), one second apart.
int IsWirelessPrinterReachableViaHTTP(int maxtries);

// Opens gQF_config_URL1 in the user's browser without waiting for it. A page that cannot be opened is no
// failure.
void OpenConfigurationPage();

// Asks on standard output until standard input answers "y"; always 0. Line breaks in front of an answer
// are ignored, and one character behind each answer is taken away unread. Without a "y" it asks for ever,
// at the end of the input too; while it asks, SIGPIPE ends the process when nobody reads the questions. Once
// something could not be written to standard output, the end of the input ends the asking as "y" does.
OSStatus WaitForUserToBeDone();
