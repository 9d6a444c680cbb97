#include "platform/live/Routes.h"

#include <algorithm>

namespace platform::live {
namespace {

using netlink::Attribute;
using netlink::Attributes;
using netlink::ByteView;
using netlink::Message;
using netlink::MessageView;
using netlink::valueFrom;

constexpr unsigned brokenHop = RTNH_F_DEAD | RTNH_F_LINKDOWN;

ByteView addressOf(const Destination& destination) {
    return ByteView(destination.address)
        .first(destination.family == AF_INET6 ? sizeof(in6_addr) : sizeof(in_addr));
}

struct NextHop {
    int interfaceIndex = 0;
    std::optional<in_addr> gateway;  // of IPv4
    bool isDirect = true;
};

NextHop hopOver(int interfaceIndex, const Attributes& attributes) {
    const std::optional<Attribute> gateway = attributes.find(RTA_GATEWAY);
    return {interfaceIndex, gateway ? valueFrom<in_addr>(gateway->payload) : std::nullopt,
            !gateway && !attributes.find(RTA_VIA)};
}

// A row of next hops: each a header with a length of its own, and attributes.
std::optional<NextHop> workingHopIn(ByteView hops) {
    while (const auto header = valueFrom<rtnexthop>(hops)) {
        const std::size_t length = header->rtnh_len;
        if (length < sizeof(rtnexthop) || length > hops.size()) {
            return std::nullopt;
        }
        if ((header->rtnh_flags & brokenHop) == 0) {
            return hopOver(header->rtnh_ifindex,
                           Attributes(hops.subspan(sizeof(rtnexthop), length - sizeof(rtnexthop))));
        }
        hops = hops.subspan(std::min((length + 3U) & ~std::size_t{3U}, hops.size()));
    }
    return std::nullopt;
}

// Nothing when none of them works.
std::optional<NextHop> hopIn(const rtmsg& route, const Attributes& attributes) {
    if (const std::optional<Attribute> several = attributes.find(RTA_MULTIPATH)) {
        return workingHopIn(several->payload);
    }
    const std::optional<std::uint32_t> index = attributes.u32(RTA_OIF);
    if (!index || (route.rtm_flags & brokenHop) != 0) {
        return std::nullopt;
    }
    return hopOver(static_cast<int>(*index), attributes);
}

bool refuses(unsigned char type) {
    return type == RTN_UNREACHABLE || type == RTN_BLACKHOLE || type == RTN_PROHIBIT;
}

// A route that refuses has interface 0.
std::optional<DefaultRoute> defaultRouteIn(const MessageView& message) {
    const auto route = message.family<rtmsg>();
    if (message.type() != RTM_NEWROUTE || !route || route->rtm_family != AF_INET || route->rtm_dst_len != 0 ||
        route->rtm_tos != 0) {
        return std::nullopt;
    }
    const Attributes attributes = message.attributes<rtmsg>();
    std::optional<NextHop> hop = NextHop{};
    if (route->rtm_type == RTN_UNICAST) {
        hop = hopIn(*route, attributes);
    } else if (!refuses(route->rtm_type)) {
        return std::nullopt;
    }
    if (!hop || attributes.u32(RTA_TABLE).value_or(route->rtm_table) != RT_TABLE_MAIN) {
        return std::nullopt;
    }
    return DefaultRoute{hop->interfaceIndex, hop->gateway, attributes.u32(RTA_PRIORITY).value_or(0)};
}

}  // namespace

Message askForRoutes() {
    rtmsg route{};
    route.rtm_family = AF_INET;
    route.rtm_table = RT_TABLE_MAIN;
    return {RTM_GETROUTE, NLM_F_REQUEST | NLM_F_DUMP, route};
}

Message askForRouteTo(const Destination& destination) {
    const ByteView address = addressOf(destination);
    rtmsg route{};
    route.rtm_family = static_cast<unsigned char>(destination.family);
    route.rtm_dst_len = static_cast<unsigned char>(address.size() * 8);
    // The route itself with the state of its next hops, not what the kernel made of it for this destination.
    route.rtm_flags = RTM_F_FIB_MATCH;
    Message message(RTM_GETROUTE, NLM_F_REQUEST | NLM_F_ACK, route);
    message.add(RTA_DST, address);
    if (destination.interfaceIndex != 0) {
        message.addValue(RTA_OIF, destination.interfaceIndex);
    }
    return message;
}

std::vector<DefaultRoute> defaultRoutesIn(std::span<const netlink::OwnedMessage> answers) {
    std::vector<DefaultRoute> routes;
    for (const netlink::OwnedMessage& answer : answers) {
        if (const auto route = defaultRouteIn(answer.view())) {
            routes.push_back(*route);
        }
    }
    std::ranges::stable_sort(routes, {}, &DefaultRoute::metric);
    routes.erase(std::ranges::find(routes, 0, &DefaultRoute::interfaceIndex), routes.end());
    return routes;
}

Reach reachIn(const MessageView& answer) {
    const auto header = answer.family<rtmsg>();
    if (answer.type() != RTM_NEWROUTE || !header) {
        return {};
    }
    if (header->rtm_type == RTN_LOCAL) {
        return {.isReachable = true, .isLocal = true, .isDirect = true};
    }
    const std::optional<NextHop> hop =
        header->rtm_type == RTN_UNICAST ? hopIn(*header, answer.attributes<rtmsg>()) : std::nullopt;
    return {.isReachable = hop.has_value(), .isLocal = false, .isDirect = hop && hop->isDirect};
}

}  // namespace platform::live
