// The kernel's messages about routes and links, apart from the socket.
#pragma once

#include <netinet/in.h>

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "platform/live/NetworkState.h"
#include "platform/netlink/Message.h"
#include "platform/netlink/Socket.h"

namespace platform::live {

// A dump of the IPv4 routes of the main table, and the way to one destination.
[[nodiscard]] netlink::Message askForRoutes();
[[nodiscard]] netlink::Message askForRouteTo(const Destination& destination);

struct DefaultRoute {
    int interfaceIndex = 0;
    std::optional<in_addr> gateway;
    std::uint32_t metric = 0;
};

// The default routes among the answers to askForRoutes that carry traffic, in the order in which the kernel
// prefers them, up to one that is there to refuse (unreachable, prohibit, blackhole). Of a route with several
// next hops the first one that works counts. A gateway that is not of IPv4 is left out.
[[nodiscard]] std::vector<DefaultRoute> defaultRoutesIn(std::span<const netlink::OwnedMessage> answers);

// Only a local route reaches anything, or a unicast one over a link that has its carrier.
[[nodiscard]] Reach reachIn(const netlink::MessageView& answer);

}  // namespace platform::live
