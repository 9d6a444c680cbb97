// The name servers' file, while locations or their leases bring servers of their own.
//
// The file as it was is kept in the runtime directory before it is first replaced, and comes back when no
// interface brings servers any more: content, mode and owner of a file, or a link with its target. A file
// that somebody else has written meanwhile is left to them. Without servers or domains from a location the
// file is never touched.
#pragma once

#include <cstddef>
#include <string>
#include <vector>

#include "platform/apply/Plan.h"
#include "platform/base/Outcome.h"

namespace platform::apply {

// What the C library's resolver reads.
inline constexpr std::size_t mostServers = 3;
inline constexpr std::size_t mostDomains = 6;

struct NameService {
    std::vector<IPv4Address> servers;
    std::vector<std::string> domains;
    bool operator==(const NameService&) const = default;
    [[nodiscard]] bool empty() const noexcept { return servers.empty() && domains.empty(); }
    template <class Self, class Fields>
    static void listFields(Self& self, Fields& fields) {
        fields("Servers", self.servers);
        fields("Domains", self.domains);
    }
};

// Makes these the servers that an interface brings, in place of what it brought before; an empty service
// withdraws it. Servers of a lower rank come first. The same service again touches nothing. Several processes
// may call it at once: the programs that take leases do.
//
// A file that cannot be read or replaced, as with a read-only /etc, is a success with the reason in
// `trouble`, unless that tells of another one before: the addresses stand without it. What cannot be kept in
// the runtime directory is a failure.
Outcome setInterfaceNameServers(const std::string& interface, unsigned rank, const NameService& service,
                                std::string& trouble);

}  // namespace platform::apply
