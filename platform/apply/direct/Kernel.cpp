#include "platform/apply/direct/Kernel.h"

#include <arpa/inet.h>
#include <linux/if_addr.h>
#include <linux/neighbour.h>
#include <net/if.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <ctime>
#include <map>
#include <thread>
#include <utility>

namespace platform::apply {
namespace {

using netlink::Attribute;
using netlink::Attributes;
using netlink::Bytes;
using netlink::ByteView;
using netlink::Message;
using netlink::MessageView;
using netlink::OwnedMessage;

// Not in every distribution's kernel headers yet.
constexpr std::uint16_t addressProtocol = 11;  // IFA_PROTO
constexpr std::uint8_t lastKernelProtocol = 3;

constexpr int ticksPerSecond = 100;  // USER_HZ, of RTA_CACHEINFO
constexpr std::chrono::milliseconds confirmationTime{3000};
constexpr std::chrono::milliseconds lookAgain{50};

constexpr std::uint32_t lastingAddressFlags =
    IFA_F_NODAD | IFA_F_HOMEADDRESS | IFA_F_MANAGETEMPADDR | IFA_F_NOPREFIXROUTE | IFA_F_MCAUTOJOIN;

// Attributes by type, so that the order in which the kernel lists them does not count.
using AttributeMap = std::map<std::uint16_t, Bytes>;

AttributeMap mapOf(const Attributes& attributes) {
    AttributeMap map;
    for (const Attribute& attribute : attributes) {
        map[attribute.type] = Bytes(attribute.payload.begin(), attribute.payload.end());
    }
    return map;
}

template <class T>
Bytes ownBytes(const T& value) {
    const ByteView view = netlink::bytesOf(value);
    return {view.begin(), view.end()};
}

template <class Family>
Bytes encodeKey(const Family& family, const AttributeMap& attributes) {
    Message message(0, 0, family);
    for (const auto& [type, payload] : attributes) {
        message.add(type, payload);
    }
    return {message.payload().begin(), message.payload().end()};
}

template <class Family>
Attributes attributesOf(const Bytes& key) {
    return MessageView({}, key).attributes<Family>();
}

// Calls `each` with the hops of a multipath route; what `each` changes is written back.
template <class Each>
void forEachHop(Bytes& hops, const Each& each) {
    std::size_t offset = 0;
    while (offset + sizeof(rtnexthop) <= hops.size()) {
        rtnexthop hop{};
        std::memcpy(&hop, hops.data() + offset, sizeof hop);
        if (hop.rtnh_len < sizeof hop || hop.rtnh_len > hops.size() - offset) {
            return;
        }
        each(hop);
        std::memcpy(hops.data() + offset, &hop, sizeof hop);
        offset += RTNH_ALIGN(hop.rtnh_len);
    }
}

// The place that a route leads to and how good it is: routes that agree in it are tried in the order of the
// list.
Bytes placeOf(const MessageView& message) {
    auto header = message.family<rtmsg>().value_or(rtmsg{});
    const Attributes attributes = message.attributes<rtmsg>();
    header.rtm_protocol = header.rtm_scope = header.rtm_type = 0;
    header.rtm_flags = 0;
    AttributeMap kept;
    for (const Attribute& attribute : attributes) {
        if (attribute.type == RTA_TABLE || attribute.type == RTA_DST || attribute.type == RTA_PRIORITY) {
            kept[attribute.type] = Bytes(attribute.payload.begin(), attribute.payload.end());
        }
    }
    return encodeKey(header, kept);
}

bool isConnected(const Route& route) {
    return route.family() == AF_INET && route.protocol() == RTPROT_KERNEL;
}

bool contains(const std::vector<Address>& list, const Address& address) {
    return std::find(list.begin(), list.end(), address) != list.end();
}
bool contains(const std::vector<Route>& list, const Route& route) {
    return std::find(list.begin(), list.end(), route) != list.end();
}

std::vector<Address> ofFamily(const std::vector<Address>& list, int family) {
    std::vector<Address> result;
    std::copy_if(list.begin(), list.end(), std::back_inserter(result),
                 [family](const Address& a) { return a.family() == family && !a.isKernelManaged; });
    return result;
}

// The message for a kept address or route, with the interface's index of now in place of 0.
Message requestFor(std::uint16_t type, std::uint16_t flags, const Address& address, const Link& link) {
    auto header = netlink::valueFrom<ifaddrmsg>(address.key).value_or(ifaddrmsg{});
    header.ifa_index = static_cast<unsigned>(link.index);
    Message message(type, static_cast<std::uint16_t>(NLM_F_REQUEST | NLM_F_ACK | flags), header);
    for (const Attribute& attribute : attributesOf<ifaddrmsg>(address.key)) {
        message.add(attribute.type, attribute.payload);
    }
    return message;
}

Message requestFor(std::uint16_t type, std::uint16_t flags, const Route& route, const Link& link) {
    const auto header = netlink::valueFrom<rtmsg>(route.key).value_or(rtmsg{});
    Message message(type, static_cast<std::uint16_t>(NLM_F_REQUEST | NLM_F_ACK | flags), header);
    const auto index = static_cast<std::uint32_t>(link.index);
    for (const Attribute& attribute : attributesOf<rtmsg>(route.key)) {
        if (attribute.type == RTA_OIF && attribute.u32() == 0U) {
            message.addValue(RTA_OIF, index);
        } else if (attribute.type == RTA_MULTIPATH) {
            Bytes hops(attribute.payload.begin(), attribute.payload.end());
            forEachHop(hops, [&link](rtnexthop& hop) {
                hop.rtnh_ifindex = hop.rtnh_ifindex == 0 ? link.index : hop.rtnh_ifindex;
            });
            message.add(RTA_MULTIPATH, hops);
        } else {
            message.add(attribute.type, attribute.payload);
        }
    }
    return message;
}

// The kernel takes no IPv6 address for a route's source before the network has confirmed that nobody else has
// it, which takes a second or two with a carrier.
bool needsConfirmedSource(const Route& route) {
    return route.family() == AF_INET6 && attributesOf<rtmsg>(route.key).find(RTA_PREFSRC);
}

std::int64_t secondsSinceStart() {
    timespec now{};
    ::clock_gettime(CLOCK_BOOTTIME, &now);
    return now.tv_sec;
}

std::uint32_t maskOf(unsigned prefixLength) {
    return prefixLength == 0 ? 0 : htonl(0xFFFFFFFFU << (32U - std::min(prefixLength, 32U)));
}

}  // namespace

int Address::family() const noexcept {
    return netlink::valueFrom<ifaddrmsg>(key).value_or(ifaddrmsg{}).ifa_family;
}

std::uint8_t Address::scope() const noexcept {
    return netlink::valueFrom<ifaddrmsg>(key).value_or(ifaddrmsg{}).ifa_scope;
}

int Route::family() const noexcept {
    return netlink::valueFrom<rtmsg>(key).value_or(rtmsg{}).rtm_family;
}

std::uint8_t Route::protocol() const noexcept {
    return netlink::valueFrom<rtmsg>(key).value_or(rtmsg{}).rtm_protocol;
}

bool Route::hasGateway() const noexcept {
    const Attributes attributes = attributesOf<rtmsg>(key);
    return attributes.find(RTA_GATEWAY) || attributes.find(RTA_VIA) || attributes.find(RTA_MULTIPATH);
}

std::optional<Address> decodeAddress(const MessageView& message, int index) {
    auto header = message.family<ifaddrmsg>();
    if (message.type() != RTM_NEWADDR || !header || static_cast<int>(header->ifa_index) != index ||
        (header->ifa_family != AF_INET && header->ifa_family != AF_INET6)) {
        return std::nullopt;
    }
    AttributeMap attributes = mapOf(message.attributes<ifaddrmsg>());
    const Attributes all = message.attributes<ifaddrmsg>();
    const std::uint32_t flags = all.u32(IFA_FLAGS).value_or(header->ifa_flags);
    Address address;
    if (const auto protocol = all.find(addressProtocol)) {
        address.protocol = protocol->u8().value_or(0);
    }
    if (const auto times = all.find(IFA_CACHEINFO)) {
        const auto cache = netlink::valueFrom<ifa_cacheinfo>(times->payload).value_or(ifa_cacheinfo{});
        address.valid = cache.ifa_valid;
        // Of a lasting IPv4 address only the flag says that no new connection is to use it.
        address.preferred = (flags & IFA_F_DEPRECATED) != 0 ? 0 : cache.ifa_prefered;
    }
    const bool fromKernel = address.protocol != 0 && address.protocol <= lastKernelProtocol;
    const bool advertised = (flags & IFA_F_PERMANENT) == 0 &&
                            (flags & (IFA_F_TEMPORARY | IFA_F_MANAGETEMPADDR | IFA_F_STABLE_PRIVACY)) != 0;
    address.isKernelManaged = header->ifa_family == AF_INET6 && (fromKernel || advertised);

    attributes.erase(IFA_CACHEINFO);
    attributes.erase(addressProtocol);
    attributes[IFA_FLAGS] = ownBytes(flags & lastingAddressFlags);
    header->ifa_index = 0;
    header->ifa_flags = 0;
    address.key = encodeKey(*header, attributes);
    return address;
}

std::optional<Route> decodeRoute(const MessageView& message, int index,
                                 const std::vector<Address>& addresses) {
    auto header = message.family<rtmsg>();
    if (message.type() != RTM_NEWROUTE || !header || (header->rtm_flags & RTM_F_CLONED) != 0 ||
        (header->rtm_family != AF_INET && header->rtm_family != AF_INET6)) {
        return std::nullopt;
    }
    const Attributes all = message.attributes<rtmsg>();
    if (all.u32(RTA_TABLE).value_or(header->rtm_table) == RT_TABLE_LOCAL) {
        return std::nullopt;
    }
    AttributeMap attributes = mapOf(all);
    Route route;
    bool isOurs = all.u32(RTA_OIF).value_or(0) == static_cast<std::uint32_t>(index);
    if (isOurs) {
        attributes[RTA_OIF] = ownBytes(std::uint32_t{0});
    }
    if (const auto hops = attributes.find(RTA_MULTIPATH); hops != attributes.end()) {
        forEachHop(hops->second, [&isOurs, &route, index](rtnexthop& hop) {
            // Whether a hop is dead or offloaded now is not the route's own.
            hop.rtnh_flags = static_cast<unsigned char>(hop.rtnh_flags & RTNH_F_ONLINK);
            (hop.rtnh_ifindex == index ? isOurs : route.isShared) = true;
            hop.rtnh_ifindex = hop.rtnh_ifindex == index ? 0 : hop.rtnh_ifindex;
        });
    }
    if (const auto source = attributes.find(RTA_PREFSRC); source != attributes.end() && !isOurs) {
        // The kernel drops such a route together with the address.
        isOurs = std::any_of(addresses.begin(), addresses.end(), [&source](const Address& address) {
            const auto local = attributesOf<ifaddrmsg>(address.key).find(IFA_LOCAL);
            return local && std::equal(local->payload.begin(), local->payload.end(), source->second.begin(),
                                       source->second.end());
        });
        route.isShared = route.isElsewhere = isOurs;
    } else if (source != attributes.end() && header->rtm_family == AF_INET6) {
        route.isShared = true;
    }
    if (!isOurs) {
        return std::nullopt;
    }
    if (attributes.count(RTA_NH_ID) != 0) {
        route.isShared = true;
        // A route by next-hop object may not repeat what the object says.
        for (const std::uint16_t type : {RTA_OIF, RTA_GATEWAY, RTA_VIA, RTA_MULTIPATH}) {
            attributes.erase(type);
        }
    }
    if (const auto times = all.find(RTA_CACHEINFO); times && header->rtm_family == AF_INET6) {
        const auto cache = netlink::valueFrom<rta_cacheinfo>(times->payload).value_or(rta_cacheinfo{});
        route.endsAt = cache.rta_expires == 0
                           ? 0
                           : secondsSinceStart() + std::max(cache.rta_expires, 0) / ticksPerSecond;
    }
    attributes.erase(RTA_CACHEINFO);
    header->rtm_flags &= RTNH_F_ONLINK;
    route.isKernelManaged = header->rtm_family == AF_INET6 &&
                            (header->rtm_protocol == RTPROT_KERNEL || header->rtm_protocol == RTPROT_RA);
    route.key = encodeKey(*header, attributes);
    return route;
}

Address makeAddress(const std::string& interface, const ManualAddress& address) {
    ifaddrmsg header{};
    header.ifa_family = AF_INET;
    header.ifa_prefixlen = static_cast<std::uint8_t>(address.prefixLength);
    header.ifa_scope = RT_SCOPE_UNIVERSE;
    AttributeMap attributes;
    attributes[IFA_ADDRESS] = ownBytes(address.address);
    attributes[IFA_LOCAL] = ownBytes(address.address);
    attributes[IFA_FLAGS] = ownBytes(std::uint32_t{0});
    if (address.prefixLength < 31) {
        attributes[IFA_BROADCAST] = ownBytes(IPv4Address{address.address | ~maskOf(address.prefixLength)});
    }
    Bytes label(interface.size() + 1);
    std::memcpy(label.data(), interface.data(), interface.size());
    attributes[IFA_LABEL] = label;
    return {encodeKey(header, attributes)};
}

std::vector<Route> makeDefaultRoute(IPv4Address router, unsigned metric,
                                    const std::vector<ManualAddress>& addresses) {
    std::vector<Route> routes;
    if (router == 0 || addresses.empty()) {
        return routes;
    }
    rtmsg header{};
    header.rtm_family = AF_INET;
    header.rtm_table = RT_TABLE_MAIN;
    header.rtm_protocol = ourRouteProtocol;
    header.rtm_type = RTN_UNICAST;
    AttributeMap attributes;
    attributes[RTA_TABLE] = ownBytes(std::uint32_t{RT_TABLE_MAIN});
    attributes[RTA_OIF] = ownBytes(std::uint32_t{0});
    if (metric != 0) {
        attributes[RTA_PRIORITY] = ownBytes(std::uint32_t{metric});
    }
    const bool isNear =
        std::any_of(addresses.begin(), addresses.end(), [router](const ManualAddress& address) {
            return ((address.address ^ router) & maskOf(address.prefixLength)) == 0;
        });
    if (!isNear) {
        rtmsg toRouter = header;
        toRouter.rtm_dst_len = 32;
        toRouter.rtm_scope = RT_SCOPE_LINK;
        AttributeMap way = attributes;
        way[RTA_DST] = ownBytes(router);
        routes.push_back({encodeKey(toRouter, way)});
    }
    header.rtm_scope = RT_SCOPE_UNIVERSE;
    attributes[RTA_GATEWAY] = ownBytes(router);
    routes.push_back({encodeKey(header, attributes)});
    return routes;
}

Outcome Kernel::setUp(const Link& link, bool up) {
    ifinfomsg header{};
    header.ifi_index = link.index;
    header.ifi_change = IFF_UP;
    header.ifi_flags = up ? unsigned{IFF_UP} : 0U;
    return socket_.request(Message(RTM_NEWLINK, NLM_F_REQUEST | NLM_F_ACK, header));
}

Outcome Kernel::dump(std::uint16_t type, int family, std::vector<OwnedMessage>& messages) {
    constexpr std::uint16_t flags = NLM_F_REQUEST | NLM_F_DUMP;
    if (type == RTM_GETADDR) {
        ifaddrmsg header{};
        header.ifa_family = static_cast<std::uint8_t>(family);
        return socket_.dump(Message(type, flags, header), messages);
    }
    rtmsg header{};
    header.rtm_family = static_cast<std::uint8_t>(family);
    return socket_.dump(Message(type, flags, header), messages);
}

Outcome Kernel::read(const Link& link, InterfaceState& state) {
    state = {};
    std::vector<OwnedMessage> messages;
    for (const int family : {AF_INET, AF_INET6}) {
        RETURN_IF_FAILED(dump(RTM_GETADDR, family, messages));
        for (const OwnedMessage& message : messages) {
            auto address = decodeAddress(message.view(), link.index);
            // A kernel without IPv6 answers for every family it has.
            if (address && address->family() == family) {
                state.addresses.push_back(std::move(*address));
            }
        }
    }
    for (const int family : {AF_INET, AF_INET6}) {
        RETURN_IF_FAILED(dump(RTM_GETROUTE, family, messages));
        Bytes lastPlace;
        for (const OwnedMessage& message : messages) {
            Bytes place = placeOf(message.view());
            auto route = decodeRoute(message.view(), link.index, state.addresses);
            if (route && route->family() == family) {
                // The kernel lists the routes to one place one after the other.
                route->preceded = place == lastPlace;
                state.routes.push_back(std::move(*route));
            }
            lastPlace = std::move(place);
        }
    }
    return {};
}

Outcome Kernel::addAddress(const Link& link, const Address& address) {
    Message message = requestFor(RTM_NEWADDR, NLM_F_CREATE | NLM_F_REPLACE, address, link);
    if (address.protocol != 0) {
        message.addValue(addressProtocol, address.protocol);
    }
    if (address.valid != forever || address.preferred != forever) {
        ifa_cacheinfo times{};
        times.ifa_valid = address.valid;
        times.ifa_prefered = std::min(address.preferred, address.valid);
        message.addValue(IFA_CACHEINFO, times);
    }
    return socket_.request(std::move(message), {EEXIST});
}

Outcome Kernel::removeAddress(const Link& link, const Address& address) {
    return socket_.request(requestFor(RTM_DELADDR, 0, address, link), {EADDRNOTAVAIL, ENODEV});
}

Outcome Kernel::addRoute(const Link& link, const Route& route) {
    const auto flags = static_cast<std::uint16_t>(NLM_F_CREATE | (route.preceded ? NLM_F_APPEND : 0));
    Message message = requestFor(RTM_NEWROUTE, flags, route, link);
    if (route.endsAt != 0) {
        const std::int64_t left = std::max<std::int64_t>(route.endsAt - secondsSinceStart(), 1);
        message.addValue(RTA_EXPIRES, static_cast<std::uint32_t>(left));
    }
    return socket_.request(std::move(message), {EEXIST});
}

Outcome Kernel::removeRoute(const Link& link, const Route& route) {
    return socket_.request(requestFor(RTM_DELROUTE, 0, route, link), {ESRCH, ENODEV});
}

Outcome Kernel::makeAddresses(const Link& link, const std::vector<Address>& wanted) {
    InterfaceState state;
    RETURN_IF_FAILED(read(link, state));
    // The first address of a network decides which ones are secondary, so IPv4 addresses that are not exactly
    // these, in this order, are made anew.
    const std::vector<Address> now = ofFamily(state.addresses, AF_INET);
    const std::vector<Address> then = ofFamily(wanted, AF_INET);
    if (now != then) {
        for (const Address& address : now) {
            RETURN_IF_FAILED(removeAddress(link, address));
        }
        for (const Address& address : then) {
            RETURN_IF_FAILED(addAddress(link, address));
        }
    }
    const std::vector<Address> now6 = ofFamily(state.addresses, AF_INET6);
    const std::vector<Address> then6 = ofFamily(wanted, AF_INET6);
    for (const Address& address : now6) {
        if (!contains(then6, address)) {
            RETURN_IF_FAILED(removeAddress(link, address));
        }
    }
    for (const Address& address : then6) {
        if (!contains(now6, address)) {
            RETURN_IF_FAILED(addAddress(link, address));
        }
    }
    return {};
}

Outcome Kernel::makeRoutes(const Link& link, const std::vector<Route>& wanted, bool keepConnected) {
    InterfaceState state;
    RETURN_IF_FAILED(read(link, state));
    for (const Route& route : state.routes) {
        const bool stays = route.isKernelManaged || route.isElsewhere || contains(wanted, route) ||
                           (keepConnected && isConnected(route));
        if (!stays) {
            RETURN_IF_FAILED(removeRoute(link, route));
        }
    }
    const auto deadline = std::chrono::steady_clock::now() + confirmationTime;
    // The ways to the neighbours first: a route through one of them is refused until then.
    for (const bool throughGateway : {false, true}) {
        for (const Route& route : wanted) {
            if (route.isKernelManaged || route.hasGateway() != throughGateway ||
                contains(state.routes, route)) {
                continue;
            }
            Outcome added = addRoute(link, route);
            while (!added.ok() && needsConfirmedSource(route) &&
                   std::chrono::steady_clock::now() < deadline) {
                std::this_thread::sleep_for(lookAgain);
                added = addRoute(link, route);
            }
            // A route that other interfaces share is complete only when the last of them is up again, which
            // then adds it.
            if (!route.isShared) {
                RETURN_IF_FAILED(added);
            }
        }
    }
    return {};
}

Outcome Kernel::forgetSilentNeighbours(const Link& link) {
    ndmsg header{};
    header.ndm_family = AF_INET;
    Message message(RTM_GETNEIGH, NLM_F_REQUEST | NLM_F_DUMP, header);
    message.addValue(NDA_IFINDEX, link.index);
    std::vector<OwnedMessage> neighbours;
    RETURN_IF_FAILED(socket_.dump(message, neighbours));
    for (const OwnedMessage& neighbour : neighbours) {
        const auto found = neighbour.view().family<ndmsg>();
        const auto address = neighbour.view().attributes<ndmsg>().find(NDA_DST);
        if (found && address && found->ndm_ifindex == link.index &&
            (found->ndm_state & (NUD_INCOMPLETE | NUD_FAILED)) != 0) {
            header.ndm_ifindex = link.index;
            Message removal(RTM_DELNEIGH, NLM_F_REQUEST | NLM_F_ACK, header);
            removal.add(NDA_DST, address->payload);
            RETURN_IF_FAILED(socket_.request(std::move(removal), {ENOENT}));
        }
    }
    return {};
}

}  // namespace platform::apply
