// A network interface as the kernel tells of it.
#pragma once

#include <optional>
#include <string>

#include "platform/base/Outcome.h"
#include "platform/netlink/Message.h"
#include "platform/netlink/Socket.h"

namespace platform::netlink {

struct Link {
    int index = 0;
    bool up = false;       // switched on
    bool running = false;  // and with a carrier
    std::string name;
};

// By its index or by its name; nothing, and success, when there is none.
Outcome findLink(Socket& socket, int index, std::optional<Link>& link);
Outcome findLink(Socket& socket, const std::string& name, std::optional<Link>& link);

}  // namespace platform::netlink
