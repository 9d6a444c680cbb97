#include "platform/apply/direct/Addressing.h"

#include <arpa/inet.h>
#include <linux/if_addr.h>
#include <net/if.h>
#include <sys/socket.h>

#include <algorithm>
#include <ctime>
#include <map>
#include <utility>

namespace platform::apply {
namespace {

using netlink::Attribute;
using netlink::Attributes;
using netlink::Bytes;
using netlink::ByteView;
using netlink::Message;

constexpr std::uint8_t lastKernelProtocol = 3;

constexpr int ticksPerSecond = 100;  // USER_HZ, of RTA_CACHEINFO
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
Message makeMessage(std::uint16_t type, std::uint16_t flags, const Family& family,
                    const AttributeMap& attributes) {
    Message message(type, flags, family);
    for (const auto& [kind, payload] : attributes) {
        message.add(kind, payload);
    }
    return message;
}

template <class Family>
Bytes encodeKey(const Family& family, const AttributeMap& attributes) {
    const Message message = makeMessage(0, 0, family, attributes);
    return {message.payload().begin(), message.payload().end()};
}

// Calls `each` with every index of an interface that a route goes through; what `each` changes is written
// back.
template <class Each>
void forEachInterface(AttributeMap& attributes, const Each& each) {
    if (const auto out = attributes.find(RTA_OIF); out != attributes.end()) {
        int index = netlink::valueFrom<int>(out->second).value_or(0);
        each(index);
        out->second = ownBytes(index);
    }
    if (const auto hops = attributes.find(RTA_MULTIPATH); hops != attributes.end()) {
        netlink::forEachHop(hops->second, [&each](rtnexthop& hop, const Attributes&) {
            // Whether a hop is dead or offloaded now is not the route's own.
            hop.rtnh_flags = static_cast<unsigned char>(hop.rtnh_flags & RTNH_F_ONLINK);
            each(hop.rtnh_ifindex);
            return true;
        });
    }
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
    const Attributes attributes = netlink::attributesBehind<rtmsg>(key);
    return attributes.find(RTA_GATEWAY) || attributes.find(RTA_VIA) || attributes.find(RTA_MULTIPATH);
}

std::optional<Address> decodeAddress(const Message& message, int index) {
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
        address.protocol = protocol->as<std::uint8_t>().value_or(0);
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

std::optional<Route> decodeRoute(const Message& message, int index, const std::vector<Address>& addresses) {
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
    bool isOurs = false;
    forEachInterface(attributes, [&isOurs, &route, index](int& each) {
        (each == index ? isOurs : route.isShared) = true;
        each = each == index ? 0 : each;
    });
    if (const auto source = attributes.find(RTA_PREFSRC); source != attributes.end()) {
        // The kernel drops a route together with the address that it leaves from.
        const bool isSourceOurs = std::ranges::any_of(addresses, [&source](const Address& address) {
            const auto local = netlink::attributesBehind<ifaddrmsg>(address.key).find(IFA_LOCAL);
            return local && std::ranges::equal(local->payload, source->second);
        });
        route.isElsewhere = isSourceOurs && !isOurs;
        route.isShared = route.isShared || isSourceOurs != isOurs || header->rtm_family == AF_INET6;
        isOurs = isOurs || isSourceOurs;
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
    const bool isNear = std::ranges::any_of(addresses, [router](const ManualAddress& address) {
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

std::int64_t secondsSinceStart() {
    timespec now{};
    ::clock_gettime(CLOCK_BOOTTIME, &now);
    return now.tv_sec;
}

Bytes placeOf(const Message& message) {
    auto header = message.family<rtmsg>().value_or(rtmsg{});
    header.rtm_protocol = header.rtm_scope = header.rtm_type = 0;
    header.rtm_flags = 0;
    AttributeMap attributes = mapOf(message.attributes<rtmsg>());
    std::erase_if(attributes, [](const auto& each) {
        return each.first != RTA_TABLE && each.first != RTA_DST && each.first != RTA_PRIORITY;
    });
    return encodeKey(header, attributes);
}

Message requestFor(std::uint16_t type, std::uint16_t flags, const Address& address, int index) {
    auto header = netlink::valueFrom<ifaddrmsg>(address.key).value_or(ifaddrmsg{});
    header.ifa_index = static_cast<unsigned>(index);
    return makeMessage(type, NLM_F_REQUEST | NLM_F_ACK | flags, header,
                       mapOf(netlink::attributesBehind<ifaddrmsg>(address.key)));
}

Message requestFor(std::uint16_t type, std::uint16_t flags, const Route& route, int index) {
    AttributeMap attributes = mapOf(netlink::attributesBehind<rtmsg>(route.key));
    forEachInterface(attributes, [index](int& each) { each = each == 0 ? index : each; });
    return makeMessage(type, NLM_F_REQUEST | NLM_F_ACK | flags,
                       netlink::valueFrom<rtmsg>(route.key).value_or(rtmsg{}), attributes);
}

// The kernel takes no IPv6 address for a route's source before the network has confirmed that nobody else has
// it, which takes a second or two with a carrier.
bool needsConfirmedSource(const Route& route) {
    return route.family() == AF_INET6 && netlink::attributesBehind<rtmsg>(route.key).find(RTA_PREFSRC);
}

}  // namespace platform::apply
