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
    Outcome open(const std::string& interface);
    // Nothing when there is no interface of that name, and then nothing below may be called; brought up to
    // date by refresh().
    [[nodiscard]] const std::optional<Link>& link() const noexcept { return link_; }
    Outcome refresh() { return netlink::findLink(socket_, interface_, link_); }

    Outcome setUp(bool up);
    Outcome read(InterfaceState& state);
    // The switch of IPv6; nothing when the kernel has none, or none is wanted.
    [[nodiscard]] std::optional<bool> isIPv6Disabled() const;
    Outcome setIPv6Disabled(std::optional<bool> disabled);

    // Already there, or already gone, is success. A lifetime other than forever lets the kernel drop the
    // address.
    Outcome addAddress(const Address& address);
    Outcome removeAddress(const Address& address);
    Outcome addRoute(const Route& route);
    Outcome removeRoute(const Route& route);

    // Makes the interface's addresses these and no others, touching nothing when they are; IPv4 ones in this
    // order. What comes by itself is neither wanted nor removed.
    Outcome makeAddresses(const std::vector<Address>& wanted);
    // Makes its routes these and no others. With keepConnected the kernel's own routes to the networks of the
    // interface's addresses stay too.
    Outcome makeRoutes(const std::vector<Route>& wanted, bool keepConnected);

    // Forgets the neighbours that have not answered so far. Whoever asks for one in vain keeps the kernel
    // from asking anew for seconds, also when the interface has got onto its network in between.
    Outcome forgetSilentNeighbours();

  private:
    netlink::Socket socket_;
    std::string interface_;
    std::optional<Link> link_;
};

}  // namespace platform::apply
