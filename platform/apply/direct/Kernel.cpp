#include "platform/apply/direct/Kernel.h"

#include <linux/if_addr.h>
#include <linux/neighbour.h>
#include <net/if.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <iterator>
#include <thread>
#include <utility>

namespace platform::apply {
namespace {

using netlink::Bytes;
using netlink::Message;
using netlink::OwnedMessage;

constexpr std::chrono::milliseconds confirmationTime{3000};
constexpr std::chrono::milliseconds lookAgain{50};

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

}  // namespace

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
