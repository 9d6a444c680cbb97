// Generic netlink: a family of requests (nl80211 is one) has a number that the kernel gives it when it
// starts, and so has each of its groups of notices.
#pragma once

#include <linux/genetlink.h>

#include <cstdint>
#include <map>
#include <optional>
#include <string>

#include "platform/base/Outcome.h"
#include "platform/netlink/Message.h"
#include "platform/netlink/Socket.h"

namespace platform::netlink {

struct GenericFamily {
    std::uint16_t type = 0;                                    // of its messages
    std::map<std::string, std::uint32_t, std::less<>> groups;  // for Socket::joinGroup, by their names

    [[nodiscard]] Message request(std::uint8_t command, std::uint16_t flags) const;
};

// Nothing, and success, when this kernel has no family of that name. The socket is one to generic netlink.
Outcome findFamily(Socket& socket, const std::string& name, std::optional<GenericFamily>& family);

}  // namespace platform::netlink
