#include "platform/apply/direct/Kernel.h"

#include <fcntl.h>
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

#include "platform/base/DurableFile.h"

namespace platform::apply {
namespace {

using netlink::Bytes;
using netlink::Message;

constexpr std::chrono::milliseconds confirmationTime{3000};
constexpr std::chrono::milliseconds lookAgain{50};

bool isConnected(const Route& route) {
    return route.family() == AF_INET && route.protocol() == RTPROT_KERNEL;
}

std::vector<Address> ofFamily(const std::vector<Address>& list, int family) {
    std::vector<Address> result;
    std::ranges::copy_if(list, std::back_inserter(result), [family](const Address& address) {
        return address.family() == family && !address.isKernelManaged;
    });
    return result;
}

std::string switchPath(const std::string& interface) {
    return "/proc/sys/net/ipv6/conf/" + interface + "/disable_ipv6";
}

}  // namespace

Outcome Kernel::open(const std::string& interface) {
    interface_ = interface;
    RETURN_IF_FAILED(socket_.open());
    return refresh();
}

Outcome Kernel::setUp(bool up) {
    if (link_->up == up) {
        return {};
    }
    ifinfomsg header{};
    header.ifi_index = link_->index;
    header.ifi_change = IFF_UP;
    header.ifi_flags = up ? unsigned{IFF_UP} : 0U;
    RETURN_IF_FAILED(socket_.request(Message(RTM_NEWLINK, NLM_F_REQUEST | NLM_F_ACK, header)));
    link_->up = up;
    return {};
}

Outcome Kernel::read(InterfaceState& state) {
    state = {};
    // Of every family, which the kernel lists in the order of their numbers: IPv4 first.
    constexpr std::uint16_t flags = NLM_F_REQUEST | NLM_F_DUMP;
    std::vector<Message> messages;
    RETURN_IF_FAILED(socket_.dump(Message(RTM_GETADDR, flags, ifaddrmsg{}), messages));
    for (const Message& message : messages) {
        if (auto address = decodeAddress(message, link_->index)) {
            state.addresses.push_back(std::move(*address));
        }
    }
    RETURN_IF_FAILED(socket_.dump(Message(RTM_GETROUTE, flags, rtmsg{}), messages));
    Bytes lastPlace;
    for (const Message& message : messages) {
        Bytes place = placeOf(message);
        if (auto route = decodeRoute(message, link_->index, state.addresses)) {
            // The kernel lists the routes to one place one after the other.
            route->preceded = place == lastPlace;
            state.routes.push_back(std::move(*route));
        }
        lastPlace = std::move(place);
    }
    return {};
}

std::optional<bool> Kernel::isIPv6Disabled() const {
    std::string text;
    if (!readWholeFile(switchPath(interface_), text).ok() || text.empty()) {
        return std::nullopt;
    }
    return text[0] != '0';
}

Outcome Kernel::setIPv6Disabled(std::optional<bool> disabled) {
    const std::optional<bool> now = isIPv6Disabled();
    if (!disabled || !now || now == disabled) {
        return {};
    }
    const std::string path = switchPath(interface_);
    const FileDescriptor file(::open(path.c_str(), O_WRONLY | O_CLOEXEC));
    if (!file.isOpen() || ::write(file.get(), *disabled ? "1" : "0", 1) != 1) {
        return Outcome::fromErrno("cannot write " + path);
    }
    return {};
}

Outcome Kernel::addAddress(const Address& address) {
    Message message = requestFor(RTM_NEWADDR, NLM_F_CREATE | NLM_F_REPLACE, address, link_->index);
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

Outcome Kernel::removeAddress(const Address& address) {
    return socket_.request(requestFor(RTM_DELADDR, 0, address, link_->index), {EADDRNOTAVAIL, ENODEV});
}

Outcome Kernel::addRoute(const Route& route) {
    const auto flags = static_cast<std::uint16_t>(NLM_F_CREATE | (route.preceded ? NLM_F_APPEND : 0));
    Message message = requestFor(RTM_NEWROUTE, flags, route, link_->index);
    if (route.endsAt != 0) {
        const std::int64_t left = std::max<std::int64_t>(route.endsAt - secondsSinceStart(), 1);
        message.addValue(RTA_EXPIRES, static_cast<std::uint32_t>(left));
    }
    return socket_.request(std::move(message), {EEXIST});
}

Outcome Kernel::removeRoute(const Route& route) {
    return socket_.request(requestFor(RTM_DELROUTE, 0, route, link_->index), {ESRCH, ENODEV});
}

Outcome Kernel::makeAddresses(const std::vector<Address>& wanted) {
    InterfaceState state;
    RETURN_IF_FAILED(read(state));
    // The first address of a network decides which ones are secondary, so IPv4 addresses that are not exactly
    // these, in this order, are made anew.
    for (const int family : {AF_INET, AF_INET6}) {
        const std::vector<Address> now = ofFamily(state.addresses, family);
        const std::vector<Address> then = ofFamily(wanted, family);
        const bool isAnew = family == AF_INET && now != then;
        for (const Address& address : now) {
            if (isAnew || std::ranges::count(then, address) == 0) {
                RETURN_IF_FAILED(removeAddress(address));
            }
        }
        for (const Address& address : then) {
            if (isAnew || std::ranges::count(now, address) == 0) {
                RETURN_IF_FAILED(addAddress(address));
            }
        }
    }
    return {};
}

Outcome Kernel::makeRoutes(const std::vector<Route>& wanted, bool keepConnected) {
    InterfaceState state;
    RETURN_IF_FAILED(read(state));
    for (const Route& route : state.routes) {
        const bool stays = route.isKernelManaged || route.isElsewhere ||
                           std::ranges::count(wanted, route) != 0 || (keepConnected && isConnected(route));
        if (!stays) {
            RETURN_IF_FAILED(removeRoute(route));
        }
    }
    const auto deadline = std::chrono::steady_clock::now() + confirmationTime;
    // The ways to the neighbours first: a route through one of them is refused until then.
    for (const bool throughGateway : {false, true}) {
        for (const Route& route : wanted) {
            if (route.isKernelManaged || route.hasGateway() != throughGateway ||
                std::ranges::count(state.routes, route) != 0) {
                continue;
            }
            Outcome added = addRoute(route);
            while (!added.ok() && needsConfirmedSource(route) &&
                   std::chrono::steady_clock::now() < deadline) {
                std::this_thread::sleep_for(lookAgain);
                added = addRoute(route);
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

Outcome Kernel::forgetSilentNeighbours() {
    ndmsg header{};
    header.ndm_family = AF_INET;
    Message message(RTM_GETNEIGH, NLM_F_REQUEST | NLM_F_DUMP, header);
    message.addValue(NDA_IFINDEX, link_->index);
    std::vector<Message> neighbours;
    RETURN_IF_FAILED(socket_.dump(message, neighbours));
    for (const Message& neighbour : neighbours) {
        const auto found = neighbour.family<ndmsg>();
        const auto address = neighbour.attributes<ndmsg>().find(NDA_DST);
        if (found && address && found->ndm_ifindex == link_->index &&
            (found->ndm_state & (NUD_INCOMPLETE | NUD_FAILED)) != 0) {
            header.ndm_ifindex = link_->index;
            Message removal(RTM_DELNEIGH, NLM_F_REQUEST | NLM_F_ACK, header);
            removal.add(NDA_DST, address->payload);
            RETURN_IF_FAILED(socket_.request(std::move(removal), {ENOENT}));
        }
    }
    return {};
}

}  // namespace platform::apply
