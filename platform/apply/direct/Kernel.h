// One network interface as the kernel has it: link state, addresses and routes, read, compared and made.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "platform/apply/direct/Addressing.h"
#include "platform/base/Outcome.h"
#include "platform/netlink/Link.h"
#include "platform/netlink/Socket.h"

namespace platform::apply {

using netlink::Link;

class Kernel {
  public:
    Outcome open() { return socket_.open(); }

    // Nothing, and success, when there is no interface of that name.
    Outcome findLink(const std::string& name, std::optional<Link>& link) {
        return netlink::findLink(socket_, name, link);
    }
    Outcome setUp(const Link& link, bool up);
    Outcome read(const Link& link, InterfaceState& state);

    // Already there, or already gone, is success. A lifetime other than forever lets the kernel drop the
    // address.
    Outcome addAddress(const Link& link, const Address& address);
    Outcome removeAddress(const Link& link, const Address& address);
    Outcome addRoute(const Link& link, const Route& route);
    Outcome removeRoute(const Link& link, const Route& route);

    // Makes the interface's addresses these and no others, touching nothing when they are; IPv4 ones in this
    // order. What comes by itself is neither wanted nor removed.
    Outcome makeAddresses(const Link& link, const std::vector<Address>& wanted);
    // Makes its routes these and no others. With keepConnected the kernel's own routes to the networks of the
    // interface's addresses stay too.
    Outcome makeRoutes(const Link& link, const std::vector<Route>& wanted, bool keepConnected);

    // Forgets the neighbours that have not answered so far. Whoever asks for one in vain keeps the kernel
    // from asking anew for seconds, also when the interface has got onto its network in between.
    Outcome forgetSilentNeighbours(const Link& link);

  private:
    Outcome dump(std::uint16_t type, int family, std::vector<netlink::OwnedMessage>& messages);

    netlink::Socket socket_;
};

}  // namespace platform::apply
