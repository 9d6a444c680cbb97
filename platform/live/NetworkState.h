// What the kernel knows of the network now: the seam between the live state and the machine.
#pragma once

#include <netinet/in.h>

#include <array>
#include <cstddef>
#include <memory>
#include <optional>
#include <string>

#include "platform/base/FileDescriptor.h"
#include "platform/base/Outcome.h"

namespace platform::live {

// The interface that the computer's traffic leaves by.
struct PrimaryRoute {
    std::string interface;
    std::optional<in_addr> router;  // nothing when the route has none
};

// An address to ask for. The first 4 or all 16 bytes, in network byte order, by the family.
struct Destination {
    int family = AF_INET;  // or AF_INET6
    std::array<std::byte, 16> address{};
    unsigned interfaceIndex = 0;  // the scope of a link-local address; 0 for none
};

// How packets for an address travel.
struct Reach {
    bool isReachable = false;  // the rest is false without it
    bool isLocal = false;      // the address is one of this computer's own
    bool isDirect = false;     // no gateway on the way
};

class NetworkState {
  public:
    NetworkState() = default;
    NetworkState(const NetworkState&) = delete;
    NetworkState& operator=(const NetworkState&) = delete;
    virtual ~NetworkState() = default;

    // The default route of IPv4 with the lowest metric, over an interface that is up; nothing without one.
    virtual Outcome primaryRoute(std::optional<PrimaryRoute>& route) = 0;
    // Fails only when the question could not be asked; having no route is an answer, and a route over a link
    // that is down or without a carrier reaches nothing.
    virtual Outcome reach(const Destination& destination, Reach& reach) = 0;
    // A socket that is readable while there is news. From then on no change of the primary route goes without
    // any; what the datagrams say does not matter.
    virtual Outcome subscribe(FileDescriptor& news) = 0;
};

// The one of the host in force, or the kernel's own.
[[nodiscard]] std::shared_ptr<NetworkState> currentNetworkState();

}  // namespace platform::live
