// The addresses and routes of one network interface, as the kernel's messages tell them.
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
#include "platform/netlink/Message.h"

namespace platform::apply {

// Marks the routes that this system made; a number that no routing daemon has claimed
// (/etc/iproute2/rt_protos).
inline constexpr std::uint8_t ourRouteProtocol = 76;

inline constexpr std::uint32_t forever = 0xFFFFFFFFU;

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
    // It needs more than this interface: other ones, a next-hop object, a source address of another interface
    // or one that the network has to confirm first.
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
[[nodiscard]] std::optional<Address> decodeAddress(const netlink::Message& message, int index);
[[nodiscard]] std::optional<Route> decodeRoute(const netlink::Message& message, int index,
                                               const std::vector<Address>& addresses);

// A manual or leased address with its broadcast address, under the interface's name.
[[nodiscard]] Address makeAddress(const std::string& interface, const ManualAddress& address);
// The default route through a router, and, when no address has the router on its own network, the way to it.
[[nodiscard]] std::vector<Route> makeDefaultRoute(IPv4Address router, unsigned metric,
                                                  const std::vector<ManualAddress>& addresses);

// The request to make or remove a kept address or route on the link of that index.
[[nodiscard]] netlink::Message requestFor(std::uint16_t type, std::uint16_t flags, const Address& address,
                                          int index);
[[nodiscard]] netlink::Message requestFor(std::uint16_t type, std::uint16_t flags, const Route& route,
                                          int index);

// The place that a route leads to and how good it is: routes that agree in it are tried in the order of the
// list.
[[nodiscard]] netlink::Bytes placeOf(const netlink::Message& message);
// Whether the network has to confirm the route's source address before the kernel takes the route.
[[nodiscard]] bool needsConfirmedSource(const Route& route);

// Not in every distribution's kernel headers yet: IFA_PROTO.
inline constexpr std::uint16_t addressProtocol = 11;

// Sleep included.
[[nodiscard]] std::int64_t secondsSinceStart();

}  // namespace platform::apply
