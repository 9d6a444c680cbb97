// The network state as the kernel of this machine, or of this process's namespace, tells it over rtnetlink.
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <utility>
#include <vector>

#include "platform/base/Host.h"
#include "platform/live/NetworkState.h"
#include "platform/netlink/Link.h"
#include "platform/netlink/Socket.h"

namespace platform::live {
namespace {

using netlink::Attributes;
using netlink::ByteView;
using netlink::Message;
using netlink::Socket;

constexpr unsigned brokenHop = RTNH_F_DEAD | RTNH_F_LINKDOWN;

struct NextHop {
    int interfaceIndex = 0;
    std::optional<in_addr> gateway;  // of IPv4
    bool isDirect = true;
};

NextHop hopOver(int interfaceIndex, const Attributes& attributes) {
    const auto gateway = attributes.find(RTA_GATEWAY);
    return {interfaceIndex, gateway ? netlink::valueFrom<in_addr>(gateway->payload) : std::nullopt,
            !gateway && !attributes.find(RTA_VIA)};
}

// Of several next hops the first one that works; nothing when none of them does.
std::optional<NextHop> hopIn(const rtmsg& route, const Attributes& attributes) {
    std::optional<NextHop> found;
    if (const auto several = attributes.find(RTA_MULTIPATH)) {
        netlink::Bytes hops(several->payload.begin(), several->payload.end());
        netlink::forEachHop(hops, [&found](const rtnexthop& hop, const Attributes& parts) {
            if ((hop.rtnh_flags & brokenHop) == 0) {
                found = hopOver(hop.rtnh_ifindex, parts);
            }
            return !found;
        });
    } else if (const auto index = attributes.u32(RTA_OIF); index && (route.rtm_flags & brokenHop) == 0) {
        found = hopOver(static_cast<int>(*index), attributes);
    }
    return found;
}

struct DefaultRoute {
    int interfaceIndex = 0;  // 0 for one that is there to refuse: unreachable, prohibit, blackhole
    std::optional<in_addr> gateway;
    std::uint32_t metric = 0;
};

std::optional<DefaultRoute> defaultRouteIn(const Message& message) {
    const auto route = message.family<rtmsg>();
    if (message.type() != RTM_NEWROUTE || !route || route->rtm_family != AF_INET || route->rtm_dst_len != 0 ||
        route->rtm_tos != 0) {
        return std::nullopt;
    }
    const Attributes attributes = message.attributes<rtmsg>();
    std::optional<NextHop> hop = NextHop{};
    if (route->rtm_type == RTN_UNICAST) {
        hop = hopIn(*route, attributes);
    } else if (route->rtm_type != RTN_UNREACHABLE && route->rtm_type != RTN_BLACKHOLE &&
               route->rtm_type != RTN_PROHIBIT) {
        return std::nullopt;
    }
    if (!hop || attributes.u32(RTA_TABLE).value_or(route->rtm_table) != RT_TABLE_MAIN) {
        return std::nullopt;
    }
    return DefaultRoute{hop->interfaceIndex, hop->gateway, attributes.u32(RTA_PRIORITY).value_or(0)};
}

Message askForRouteTo(const Destination& destination) {
    const ByteView address = ByteView(destination.address)
                                 .first(destination.family == AF_INET6 ? sizeof(in6_addr) : sizeof(in_addr));
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

// Holds no socket between two questions.
class KernelNetworkState final : public NetworkState {
  public:
    Outcome primaryRoute(std::optional<PrimaryRoute>& route) override {
        route.reset();
        rtmsg question{};
        question.rtm_family = AF_INET;
        question.rtm_table = RT_TABLE_MAIN;
        Socket socket;
        std::vector<Message> answers;
        RETURN_IF_FAILED(socket.open());
        // A machine that never had a route has no table for them.
        RETURN_IF_FAILED(
            socket.dump({RTM_GETROUTE, NLM_F_REQUEST | NLM_F_DUMP, question}, answers, {ENOENT}));
        std::vector<DefaultRoute> candidates;
        for (const Message& answer : answers) {
            if (const auto candidate = defaultRouteIn(answer)) {
                candidates.push_back(*candidate);
            }
        }
        std::ranges::stable_sort(candidates, {}, &DefaultRoute::metric);
        for (const DefaultRoute& candidate : candidates) {
            if (candidate.interfaceIndex == 0) {
                break;
            }
            // The link may have gone or gone down meanwhile, with the route still to follow it.
            std::optional<netlink::Link> link;
            RETURN_IF_FAILED(netlink::findLink(socket, candidate.interfaceIndex, link));
            if (link && link->up) {
                route = PrimaryRoute{link->name, candidate.gateway};
                break;
            }
        }
        return {};
    }

    // Only a local route reaches anything, or a unicast one over a link that has its carrier.
    Outcome reach(const Destination& destination, Reach& reach) override {
        reach = {};
        Socket socket;
        Message answer;
        RETURN_IF_FAILED(socket.open());
        // What the kernel answers without a route, and for routes that are there to refuse: unreachable,
        // prohibit, blackhole; ENODEV for the scope of a link that is gone.
        RETURN_IF_FAILED(socket.ask(askForRouteTo(destination), answer,
                                    {ENETUNREACH, EHOSTUNREACH, EACCES, EINVAL, ESRCH, ENODEV, ENETDOWN}));
        const auto route = answer.family<rtmsg>();
        if (answer.type() != RTM_NEWROUTE || !route) {
            return {};
        }
        if (route->rtm_type == RTN_LOCAL) {
            reach = {.isReachable = true, .isLocal = true, .isDirect = true};
        } else if (route->rtm_type == RTN_UNICAST) {
            const std::optional<NextHop> hop = hopIn(*route, answer.attributes<rtmsg>());
            reach = {.isReachable = hop.has_value(), .isLocal = false, .isDirect = hop && hop->isDirect};
        }
        return {};
    }

    Outcome subscribe(FileDescriptor& news) override {
        Socket socket;
        RETURN_IF_FAILED(socket.open());
        // A route that goes with its next-hop object goes without a notice of its own. A kernel without such
        // objects has no notices of them either.
        for (const std::uint32_t group :
             {RTNLGRP_LINK, RTNLGRP_IPV4_IFADDR, RTNLGRP_IPV4_ROUTE, RTNLGRP_NEXTHOP}) {
            if (const Outcome joined = socket.joinGroup(group); !joined.ok() && group != RTNLGRP_NEXTHOP) {
                return joined;
            }
        }
        news = socket.release();
        return {};
    }
};

}  // namespace

std::shared_ptr<NetworkState> currentNetworkState() {
    if (currentHost().networkState) {
        return currentHost().networkState;
    }
    static const std::shared_ptr<NetworkState> kernel = std::make_shared<KernelNetworkState>();
    return kernel;
}

}  // namespace platform::live
