// The reachability operations of SystemConfiguration.h.
#include <netdb.h>
#include <netinet/in.h>
#include <sys/socket.h>

#include <cstring>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/SystemConfiguration.h"
#include "platform/live/NetworkState.h"
#include "platform/preferences/Status.h"

namespace {

using platform::Outcome;
using platform::live::Destination;
using platform::live::Reach;
using platform::preferences::setStatus;

constexpr const char* who = "reachability";

std::optional<Destination> destinationOf(const sockaddr* address, std::size_t length) {
    Destination destination;
    sa_family_t family = AF_UNSPEC;
    if (address == nullptr || length < sizeof family) {
        return std::nullopt;
    }
    std::memcpy(&family, &address->sa_family, sizeof family);
    destination.family = family;
    if (family == AF_INET && length >= sizeof(sockaddr_in)) {
        sockaddr_in in{};
        std::memcpy(&in, address, sizeof in);
        std::memcpy(destination.address.data(), &in.sin_addr, sizeof in.sin_addr);
        return destination;
    }
    if (family == AF_INET6 && length >= sizeof(sockaddr_in6)) {
        sockaddr_in6 in{};
        std::memcpy(&in, address, sizeof in);
        std::memcpy(destination.address.data(), &in.sin6_addr, sizeof in.sin6_addr);
        destination.interfaceIndex = in.sin6_scope_id;
        return destination;
    }
    return std::nullopt;
}

// getaddrinfo's own status.
int resolve(const char* name, int flags, std::vector<Destination>& destinations) {
    addrinfo hints{};
    hints.ai_flags = flags;
    hints.ai_socktype = SOCK_STREAM;
    addrinfo* found = nullptr;
    const int status = ::getaddrinfo(name, nullptr, &hints, &found);
    if (status == 0) {
        const std::unique_ptr<addrinfo, decltype(&::freeaddrinfo)> list(found, &::freeaddrinfo);
        for (const addrinfo* entry = found; entry != nullptr; entry = entry->ai_next) {
            if (const auto destination = destinationOf(entry->ai_addr, entry->ai_addrlen)) {
                destinations.push_back(*destination);
            }
        }
    }
    return status;
}

// The first address of the list that can be reached tells the answer; the flags are untouched on failure.
Boolean answer(const std::vector<Destination>& destinations, SCNetworkConnectionFlags* flags) {
    Reach reach;
    Outcome done;
    for (const Destination& destination : destinations) {
        if (done.ok() && !reach.isReachable) {
            done = platform::live::currentNetworkState()->reach(destination, reach);
        }
    }
    if (setStatus(done, who)) {
        *flags = (reach.isReachable ? kSCNetworkFlagsReachable : 0) |
                 (reach.isLocal ? kSCNetworkFlagsIsLocalAddress : 0) |
                 (reach.isDirect ? kSCNetworkFlagsIsDirect : 0);
    }
    return static_cast<Boolean>(done.ok());
}

}  // namespace

Boolean SCNetworkCheckReachabilityByAddress(const sockaddr* address, int addressLength,
                                            SCNetworkConnectionFlags* flags) noexcept {
    const auto length = static_cast<std::size_t>(addressLength < 0 ? 0 : addressLength);
    const std::optional<Destination> destination = destinationOf(address, length);
    if (!destination || flags == nullptr) {
        return static_cast<Boolean>(setStatus(kSCStatusInvalidArgument));
    }
    return answer({*destination}, flags);
}

Boolean SCNetworkCheckReachabilityByName(const char* nodename, SCNetworkConnectionFlags* flags) noexcept {
    if (nodename == nullptr || *nodename == '\0' || flags == nullptr) {
        return static_cast<Boolean>(setStatus(kSCStatusInvalidArgument));
    }
    std::vector<Destination> destinations;
    int status = resolve(nodename, AI_NUMERICHOST, destinations);
    if (status == EAI_NONAME) {
        status = resolve(nodename, 0, destinations);
    }
    if (status != 0 && status != EAI_NONAME && status != EAI_NODATA) {
        const Outcome failed(kSCStatusFailed,
                             std::string("cannot look up ") + nodename + ": " + ::gai_strerror(status));
        return static_cast<Boolean>(setStatus(failed, who));
    }
    return answer(destinations, flags);
}
