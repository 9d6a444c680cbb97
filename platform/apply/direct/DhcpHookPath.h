// Where the program is that the DHCP client calls.
#pragma once

#include <string>

#include "platform/base/Outcome.h"

namespace platform::apply {

bool isProgram(const std::string& path);

// The host's, when it names one; else the one beside the running program, as in a build; else the installed
// one, found from the file that this code was loaded from, so that an installation may stand anywhere. Last
// the place that it was configured for: a program that this library is linked into may lie anywhere itself.
Outcome findDhcpHook(std::string& hook);

}  // namespace platform::apply
