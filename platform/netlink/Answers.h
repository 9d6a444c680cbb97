// What the kernel says to one request, taken apart without a socket.
#pragma once

#include <cstdint>
#include <optional>
#include <vector>

#include "platform/base/Outcome.h"
#include "platform/netlink/Message.h"

namespace platform::netlink {

struct Answers {
    std::uint32_t sequence = 0;    // of the request; what answers another one is left out
    std::vector<int> tolerated{};  // the kernel's errors that count as success

    std::vector<Message> messages{};
    bool isInterrupted = false;    // a change ran into the dump
    int error = 0;                 // the errno that the kernel ended with, tolerated or not
    std::optional<Outcome> end{};  // what the request came to, once the kernel has said so

    // Takes what is in a datagram, up to the end of the answers.
    void take(ByteView datagram);

  private:
    void endWith(const Message& last);
};

}  // namespace platform::netlink
