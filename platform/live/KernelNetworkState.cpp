#include "platform/live/KernelNetworkState.h"

#include <sys/socket.h>

#include <cerrno>
#include <cstdint>
#include <utility>
#include <vector>

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
    Outcome done = socket.open();
    if (done.ok()) {
        // A machine that never had a route has no table for them.
        done = socket.dump(askForRoutes(), answers, {ENOENT});
    }
    if (!done.ok()) {
        return done;
    }
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

Outcome KernelNetworkState::routeTo(const Destination& destination, Route& route) {
    route = {};
    Socket socket;
    OwnedMessage answer;
    Outcome done = socket.open();
    if (done.ok()) {
        // What the kernel answers without a route, and for routes that are there to refuse: unreachable,
        // prohibit, blackhole; ENODEV for the scope of a link that is gone.
        done = socket.ask(askForRouteTo(destination), answer,
                          {ENETUNREACH, EHOSTUNREACH, EACCES, EINVAL, ESRCH, ENODEV, ENETDOWN});
    }
    if (done.ok()) {
        route = routeIn(answer.view());
    }
    return done;
}

Outcome KernelNetworkState::subscribe(std::unique_ptr<Notices>& notices) {
    Socket socket;
    // A route that goes with its next-hop object goes without a notice of its own.
    constexpr std::uint32_t nextHops = std::uint32_t{1} << (RTNLGRP_NEXTHOP - 1U);
    Outcome done = socket.open(RTMGRP_LINK | RTMGRP_IPV4_IFADDR | RTMGRP_IPV4_ROUTE | nextHops);
    if (done.ok()) {
        notices = std::make_unique<KernelNotices>(std::move(socket));
    }
    return done;
}

}  // namespace platform::live
