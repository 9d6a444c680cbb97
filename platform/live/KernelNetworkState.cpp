#include "platform/live/KernelNetworkState.h"

#include <sys/socket.h>

#include <cerrno>
#include <cstdint>
#include <utility>
#include <vector>

#include "platform/base/Host.h"
#include "platform/live/Routes.h"
#include "platform/netlink/Link.h"
#include "platform/netlink/Socket.h"

namespace platform::live {
namespace {

using netlink::OwnedMessage;
using netlink::Socket;

class KernelNotices final : public Notices {
  public:
    explicit KernelNotices(Socket socket) : socket_(std::move(socket)) {}

    [[nodiscard]] int descriptor() const noexcept override { return socket_.descriptor(); }

    // What a notice says does not matter: the kernel drops some when they come too fast, and takes routes
    // away without one when a link goes down. So every notice is thrown away unread, and so is the report of
    // an overrun.
    bool drain() override {
        bool any = false;
        for (int i = 0; i < mostNotices; ++i) {
            char nothing = 0;
            const ssize_t size =
                ::recv(socket_.descriptor(), &nothing, sizeof nothing, MSG_DONTWAIT | MSG_TRUNC);
            if (size < 0 && errno != ENOBUFS && errno != EINTR) {
                break;
            }
            any = true;
        }
        return any;
    }

  private:
    static constexpr int mostNotices = 10000;

    Socket socket_;
};

}  // namespace

Outcome KernelNetworkState::primaryRoute(std::optional<PrimaryRoute>& route) {
    route.reset();
    Socket socket;
    std::vector<OwnedMessage> answers;
    RETURN_IF_FAILED(socket.open());
    // A machine that never had a route has no table for them.
    RETURN_IF_FAILED(socket.dump(askForRoutes(), answers, {ENOENT}));
    for (const DefaultRoute& candidate : defaultRoutesIn(answers)) {
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

Outcome KernelNetworkState::reach(const Destination& destination, Reach& reach) {
    reach = {};
    Socket socket;
    OwnedMessage answer;
    RETURN_IF_FAILED(socket.open());
    // What the kernel answers without a route, and for routes that are there to refuse: unreachable,
    // prohibit, blackhole; ENODEV for the scope of a link that is gone.
    RETURN_IF_FAILED(socket.ask(askForRouteTo(destination), answer,
                                {ENETUNREACH, EHOSTUNREACH, EACCES, EINVAL, ESRCH, ENODEV, ENETDOWN}));
    reach = reachIn(answer.view());
    return {};
}

Outcome KernelNetworkState::subscribe(std::unique_ptr<Notices>& notices) {
    Socket socket;
    // A route that goes with its next-hop object goes without a notice of its own.
    constexpr std::uint32_t nextHops = std::uint32_t{1} << (RTNLGRP_NEXTHOP - 1U);
    RETURN_IF_FAILED(socket.open(RTMGRP_LINK | RTMGRP_IPV4_IFADDR | RTMGRP_IPV4_ROUTE | nextHops));
    notices = std::make_unique<KernelNotices>(std::move(socket));
    return {};
}

std::shared_ptr<NetworkState> currentNetworkState() {
    if (currentHost().networkState) {
        return currentHost().networkState;
    }
    static const std::shared_ptr<NetworkState> kernel = std::make_shared<KernelNetworkState>();
    return kernel;
}

}  // namespace platform::live
