// The DHCP client: `busybox udhcpc` as a process of its own, which outlives the run that starts it and renews
// its lease until it is told to give it up.
//
// It changes nothing itself. It calls our program (the host's dhcpHook) whenever a lease comes or goes, and
// that one makes it so (Lease.h). The client is found again by its process number together with the time it
// was started, never by a name.
#pragma once

#include <optional>
#include <string>

#include "platform/apply/direct/Lease.h"
#include "platform/base/Outcome.h"

namespace platform::apply {

// The name of the environment variable that tells the client's program where the settings are.
inline constexpr const char* dhcpSettingsVariable = "LOCATION_ASSISTANT_DHCP";

// How the interface's client was started; nothing when this system started none, or it is to be taken for
// gone.
Outcome readDhcpSettings(const std::string& interface, std::optional<DhcpSettings>& settings);
// The same from the file that the variable names; the file's own directory is the runtime directory.
struct HookSettings {
    DhcpSettings dhcp;
    std::string resolverFile;
};
Outcome readHookSettings(const std::string& path, HookSettings& settings);

// Whether the interface's client is running.
Outcome isDhcpClientRunning(const std::string& interface, bool& running);
// Starts a client. There must be none.
Outcome startDhcpClient(const DhcpSettings& settings);
// Has a client without a lease ask for one right now: its card has just come onto a network. A client that
// has ended is let be.
void hurryDhcpClient(const std::string& interface);
// Begins what stopDhcpClient then waits for.
void askDhcpClientToEnd(const std::string& interface);
// Lets the client give its lease back to the server and end, and undoes what is left of the lease. Success
// when there is no client.
Outcome stopDhcpClient(const std::string& interface);

}  // namespace platform::apply
