// A socket to the kernel's routing tables, or to its generic netlink: requests with their answers, dumps, and
// notices.
#pragma once

#include <chrono>
#include <cstdint>
#include <initializer_list>
#include <utility>
#include <vector>

#include "platform/base/FileDescriptor.h"
#include "platform/base/Outcome.h"
#include "platform/netlink/Answers.h"
#include "platform/netlink/Message.h"

namespace platform::netlink {

// Every wait for an answer is bounded by answerTime, and every dump by largestDump; only datagrams from the
// kernel itself are read, and answers to other requests than the one at hand are ignored. A request that
// the kernel refuses fails with its errno and, where it gives one, its own explanation.
class Socket {
  public:
    static constexpr std::chrono::milliseconds answerTime{5000};
    static constexpr std::size_t largestDump = std::size_t{64} << 20U;

    Outcome open() { return open(NETLINK_ROUTE); }
    // To generic netlink, whose families and groups of notices have numbers of their own.
    Outcome openGeneric() { return open(NETLINK_GENERIC); }
    // For the notices of a group (RTNLGRP_ for the routing tables). A socket for requests takes none.
    Outcome joinGroup(std::uint32_t group);
    // Of a socket for notices: readable while there are some.
    [[nodiscard]] FileDescriptor release() noexcept { return std::move(socket_); }

    // Sends a request and waits for the acknowledgement. The kernel's errors in `tolerated` count as success.
    Outcome request(Message message, std::initializer_list<int> tolerated = {});
    // The errno that the kernel answered the last request with, tolerated or not; 0 when it took the request,
    // or did not answer.
    [[nodiscard]] int error() const noexcept { return error_; }
    // The one message that answers a request (RTM_GETLINK for one link, RTM_GETROUTE for one destination). An
    // error in `tolerated` leaves the answer with type 0.
    Outcome ask(Message message, Message& answer, std::initializer_list<int> tolerated = {});
    // Everything that a dump request lists; nothing after an error in `tolerated`, something or nothing on
    // failure. A dump that a change ran into is taken again, a few times.
    Outcome dump(Message message, std::vector<Message>& list, std::initializer_list<int> tolerated = {});

    // For a socket with groups: takes the notices that are there, without waiting. overrun: the kernel
    // dropped some, so what is known has to be looked up anew.
    [[nodiscard]] std::vector<Message> takeNotices(bool& overrun);

  private:
    using Deadline = std::chrono::steady_clock::time_point;

    Outcome open(int protocol);
    Outcome send(const Message& message);
    // One datagram of the kernel's; empty when none has come by the deadline.
    Outcome receive(Deadline deadline, Bytes& datagram);
    // Sends a request and takes the answers to it, up to the one that ends them.
    Outcome exchange(Message& message, Answers& answers);

    FileDescriptor socket_;
    std::uint32_t sequence_ = 0;
    int error_ = 0;
};

}  // namespace platform::netlink
