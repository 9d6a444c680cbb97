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
#include "platform/apply/direct/Process.h"
#include "platform/base/Outcome.h"

namespace platform::apply {

// The name of the environment variable that tells the client's program where its DhcpClient is kept; the
// file's own directory is the runtime directory.
inline constexpr const char* dhcpSettingsVariable = "LOCATION_ASSISTANT_DHCP";

// What is kept of a client, for its program and for the next run.
struct DhcpClient {
    DhcpSettings settings;
    std::string resolverFile;
    Process process;

    template <class Self, class Fields>
    static void listFields(Self& self, Fields& fields) {
        fields("Settings", self.settings);
        fields("ResolverFile", self.resolverFile);
        fields("Client", self.process);
    }
};

// The interface's client, running or not; nothing when this system started none.
Outcome readDhcpClient(const std::string& interface, std::optional<DhcpClient>& client);
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
