// A socket to the kernel's routing tables: requests with their answers, dumps, and change notices.
#pragma once

#include <chrono>
#include <cstdint>
#include <initializer_list>
#include <vector>

#include "platform/FileDescriptor.h"
#include "platform/Outcome.h"
#include "platform/netlink/Message.h"

namespace platform::netlink {

// A message with a buffer of its own.
struct OwnedMessage {
    nlmsghdr header{};
    Bytes payload;
    [[nodiscard]] MessageView view() const noexcept { return {header, payload}; }
};

// Every wait for an answer is bounded by answerTime, and every dump by largestDump; only datagrams from the
// kernel itself are read, and answers to other requests than the one at hand are passed over. A request that
// the kernel refuses fails with its errno and, where it gives one, its own explanation.
class Socket {
  public:
    static constexpr std::chrono::milliseconds answerTime{5000};
    static constexpr std::size_t largestDump = std::size_t{64} << 20U;

    // groups are RTMGRP_ bits for the notices to receive; a socket for requests takes none.
    Outcome open(std::uint32_t groups = 0);
    [[nodiscard]] bool isOpen() const noexcept { return descriptor_.isOpen(); }
    [[nodiscard]] int descriptor() const noexcept { return descriptor_.get(); }

    // Sends a request and waits for the acknowledgement. The kernel's errors in `tolerated` count as success.
    Outcome request(Message message, std::initializer_list<int> tolerated = {});
    // The one message that answers a request (RTM_GETLINK for one link, RTM_GETROUTE for one destination). An
    // error in `tolerated` leaves the answer with type 0.
    Outcome ask(Message message, OwnedMessage& answer, std::initializer_list<int> tolerated = {});
    // Everything that a dump request lists; nothing after an error in `tolerated`. A dump that a change ran
    // into is taken again, a few times.
    Outcome dump(const Message& message, std::vector<OwnedMessage>& answers,
                 std::initializer_list<int> tolerated = {});

    // For a socket with groups: reads what is there without waiting, one datagram a call. received tells
    // whether there was one. overrun: the kernel dropped notices, so what is known has to be looked up anew.
    Outcome receiveNotices(Bytes& datagram, bool& received, bool& overrun);

  private:
    Outcome send(Message& message);
    Outcome receive(std::chrono::steady_clock::time_point deadline, Bytes& datagram);
    Outcome dumpOnce(Message message, std::vector<OwnedMessage>& answers,
                     std::initializer_list<int> tolerated, bool& interrupted);

    FileDescriptor descriptor_;
    std::uint32_t sequence_ = 0;
};

}  // namespace platform::netlink
