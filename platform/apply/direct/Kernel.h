// One network interface as the kernel has it: link state, addresses and routes, read, compared and made.
//
// An address or a route is kept as the message that the kernel gave for it, in a form that two readings of
// the same thing have in common (the interface's own index is 0), so that every attribute, also one that this
// system does not know, is recorded, made again and compared. What is not:
//
// - IFA_CACHEINFO: lifetimes are kept beside and made again, but run, so they are not compared; when the
//   address was made and changed is the kernel's own matter.
// - IFA_FLAGS: what a lifetime or the network makes of an address (secondary, tentative, deprecated).
// - RTA_CACHEINFO: the end of an IPv6 route is kept beside and made again; the rest is statistics.
// - RTNH_F_DEAD and such: what the kernel finds out about a next hop.
// - RTA_OIF, RTA_GATEWAY, RTA_VIA, RTA_MULTIPATH of a route with RTA_NH_ID: the next-hop object says them.
//   The object itself, which goes when its interface is switched off, is its maker's to make.
// - RTA_IIF, RTA_UID, RTA_MARK, RTA_IP_PROTO, RTA_SPORT, RTA_DPORT, IFA_TARGET_NETNSID: they are of
//   questions, never of a route or an address.
// - Local tables: the kernel fills them by itself.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "platform/apply/Plan.h"
#include "platform/base/Outcome.h"
#include "platform/netlink/Link.h"
#include "platform/netlink/Message.h"
#include "platform/netlink/Socket.h"

namespace platform::apply {

// Marks the routes that this system made; a number that no routing daemon has claimed
// (/etc/iproute2/rt_protos).
inline constexpr std::uint8_t ourRouteProtocol = 76;

inline constexpr std::uint32_t forever = 0xFFFFFFFFU;

using netlink::Link;

struct Address {
    netlink::Bytes key;  // ifaddrmsg and attributes, without lifetimes
    std::uint8_t protocol = 0;
    std::uint32_t valid = forever;  // seconds from the reading on
    std::uint32_t preferred = forever;
    // Whether the kernel makes it without being asked, as link-local and router-advertised ones.
    bool isKernelManaged = false;

    [[nodiscard]] int family() const noexcept;
    [[nodiscard]] std::uint8_t scope() const noexcept;  // RT_SCOPE_
    bool operator==(const Address& other) const noexcept {
        return key == other.key && protocol == other.protocol;
    }
    template <class Self, class Fields>
    static void listFields(Self& self, Fields& fields) {
        fields("Message", self.key);
        fields("Protocol", self.protocol);
        fields("Valid", self.valid);
        fields("Preferred", self.preferred);
        fields("KernelManaged", self.isKernelManaged);
    }
};

struct Route {
    netlink::Bytes key;     // rtmsg and attributes
    bool preceded = false;  // an equally good route to the same place stood before it
    bool isKernelManaged = false;
    // It needs more than this interface: other ones, a next-hop object, a source address that the network has
    // to confirm first.
    bool isShared = false;
    std::int64_t endsAt = 0;   // in seconds since the machine's start, sleep included; 0 for never
    bool isElsewhere = false;  // it goes through another interface, but from one of this one's addresses

    [[nodiscard]] int family() const noexcept;
    [[nodiscard]] std::uint8_t protocol() const noexcept;
    [[nodiscard]] bool hasGateway() const noexcept;
    bool operator==(const Route& other) const noexcept { return key == other.key; }
    template <class Self, class Fields>
    static void listFields(Self& self, Fields& fields) {
        fields("Message", self.key);
        fields("Preceded", self.preceded);
        fields("KernelManaged", self.isKernelManaged);
        fields("Shared", self.isShared);
        fields("EndsAt", self.endsAt);
        fields("Elsewhere", self.isElsewhere);
    }
};

struct InterfaceState {
    std::vector<Address> addresses;  // IPv4, then IPv6, in the kernel's order
    std::vector<Route> routes;       // every table but the local one
};

// The message as an address of the interface, or as a route through it (or from one of its addresses);
// nothing when it belongs to another interface or is none of these.
[[nodiscard]] std::optional<Address> decodeAddress(const netlink::MessageView& message, int index);
[[nodiscard]] std::optional<Route> decodeRoute(const netlink::MessageView& message, int index,
                                               const std::vector<Address>& addresses);

// A manual or leased address with its broadcast address, under the interface's name.
[[nodiscard]] Address makeAddress(const std::string& interface, const ManualAddress& address);
// The default route through a router, and, when no address has the router on its own network, the way to it.
[[nodiscard]] std::vector<Route> makeDefaultRoute(IPv4Address router, unsigned metric,
                                                  const std::vector<ManualAddress>& addresses);

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
