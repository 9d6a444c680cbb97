// What a DHCP server lent, and how it is made the interface's configuration.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "platform/apply/Plan.h"
#include "platform/apply/direct/Addressing.h"
#include "platform/apply/direct/NameServers.h"
#include "platform/base/Outcome.h"

namespace platform::apply {

struct Lease {
    ManualAddress address;
    IPv4Address router = 0;  // 0 for none
    NameService nameService;
    std::uint32_t seconds = forever;
    bool operator==(const Lease&) const = default;
    template <class Self, class Fields>
    static void listFields(Self& self, Fields& fields) {
        fields("Address", self.address);
        fields("Router", self.router);
        fields("NameService", self.nameService);
        fields("Seconds", self.seconds);
    }
};

// The lease as the DHCP client tells it in the environment of its program, this one. All of it comes from the
// network and from whoever answers there: an address or a prefix length that no machine can have fails;
// routers, servers and domains that are none are dropped, and more servers and domains than a resolver reads
// too.
Outcome leaseFromEnvironment(Lease& lease);

// How the interface's DHCP client was started, for the client's program and for the next run.
struct DhcpSettings {
    std::string interface;
    unsigned rank = 0;
    std::string clientID;
    // The location brings servers of its own, and the lease's are not used.
    bool ignoresServers = false;
    // The location's own search domains, which take the place of the lease's.
    std::vector<std::string> domains;
    bool operator==(const DhcpSettings&) const = default;
    template <class Self, class Fields>
    static void listFields(Self& self, Fields& fields) {
        fields("Interface", self.interface);
        fields("Rank", self.rank);
        fields("ClientID", self.clientID);
        fields("IgnoresServers", self.ignoresServers);
        fields("Domains", self.domains);
    }
};

// Writes the lease into the runtime directory, then makes it so: the address for the lease's time (in place
// of an earlier lease's), the default route, the name servers.
Outcome takeLease(const DhcpSettings& settings, const Lease& lease);
// Undoes that, whatever of it was done.
Outcome dropLease(const DhcpSettings& settings);
// Keeps the reason why a lease could not be taken, for the run that waits for it.
Outcome refuseLease(const std::string& interface, const std::string& reason);

// Forgets the reason why the last offer was refused.
Outcome forgetRefusal(const std::string& interface);

// What the interface's lease has come to.
struct LeaseState {
    bool isTaken = false;
    std::optional<Lease> lease;  // with isTaken, and while it is being made so
    std::string refusal;         // why the last offer was refused

    template <class Self, class Fields>
    static void listFields(Self& self, Fields& fields) {
        fields("Taken", self.isTaken);
        fields("Lease", self.lease);
        fields("Refusal", self.refusal);
    }
};
Outcome readLease(const std::string& interface, LeaseState& state);

// The kernel's part of a lease.
[[nodiscard]] Address addressOf(const std::string& interface, const Lease& lease);
[[nodiscard]] std::vector<Route> routesOf(const Lease& lease, unsigned rank);

}  // namespace platform::apply
