// The name servers' file, while locations or their leases bring servers of their own.
//
// The file as it was is kept in the runtime directory before it is first replaced, and comes back when no
// interface brings servers any more: content, mode and owner of a file, or a link with its target. A file
// that somebody else has written meanwhile is left to them. Without servers or domains from a location the
// file is never touched.
#pragma once

#include <string>
#include <vector>

#include "platform/Outcome.h"
#include "platform/apply/Plan.h"

namespace platform::apply {

struct NameService {
    std::vector<IPv4Address> servers;
    std::vector<std::string> domains;
    bool operator==(const NameService&) const = default;
    [[nodiscard]] bool empty() const noexcept { return servers.empty() && domains.empty(); }
};

// Makes these the servers that an interface brings, in place of what it brought before; an empty service
// withdraws it. Servers of a lower rank come first. The same service again touches nothing. Several processes
// may call it at once: the programs that take leases do.
Outcome bringNameServers(const std::string& interface, unsigned rank, const NameService& service);

}  // namespace platform::apply
