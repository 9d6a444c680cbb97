#include "platform/netlink/Socket.h"

#include <poll.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <iterator>
#include <string>
#include <utility>

namespace platform::netlink {
namespace {

// The largest datagram that the kernel makes for a dump.
constexpr std::size_t largestDatagram = std::size_t{64} << 10U;
// The kernel says of a list that something changed while it was made.
constexpr int dumpTries = 5;
// Notices that come faster than they are read do not keep the reader for ever.
constexpr int mostNotices = 1000;

}  // namespace

Outcome Socket::open(int protocol) {
    FileDescriptor socket(::socket(AF_NETLINK, SOCK_RAW | SOCK_CLOEXEC, protocol));
    if (!socket.isOpen()) {
        return Outcome::fromErrno("cannot open a netlink socket");
    }
    // Kernels that lack one of these still answer every request, only with fewer words or less strictness.
    const int on = 1;
    for (const int option : {NETLINK_EXT_ACK, NETLINK_CAP_ACK, NETLINK_GET_STRICT_CHK}) {
        (void)::setsockopt(socket.get(), SOL_NETLINK, option, &on, sizeof on);
    }
    sockaddr_nl own{};
    own.nl_family = AF_NETLINK;
    if (::bind(socket.get(), reinterpret_cast<const sockaddr*>(&own), sizeof own) != 0) {
        return Outcome::fromErrno("cannot bind a netlink socket");
    }
    socket_ = std::move(socket);
    return {};
}

Outcome Socket::joinGroup(std::uint32_t group) {
    if (::setsockopt(socket_.get(), SOL_NETLINK, NETLINK_ADD_MEMBERSHIP, &group, sizeof group) != 0) {
        return Outcome::fromErrno("cannot ask for netlink notices");
    }
    return {};
}

Outcome Socket::send(const Message& message) {
    sockaddr_nl kernel{};
    kernel.nl_family = AF_NETLINK;
    ssize_t sent = 0;
    do {
        sent = ::sendto(socket_.get(), message.bytes().data(), message.bytes().size(), 0,
                        reinterpret_cast<const sockaddr*>(&kernel), sizeof kernel);
    } while (sent < 0 && errno == EINTR);
    return sent < 0 ? Outcome::fromErrno("cannot send a netlink request") : Outcome();
}

Outcome Socket::receive(Deadline deadline, Bytes& datagram) {
    for (;;) {
        const auto left =
            std::chrono::ceil<std::chrono::milliseconds>(deadline - std::chrono::steady_clock::now());
        datagram.clear();
        pollfd wait{socket_.get(), POLLIN, 0};
        const int ready = ::poll(&wait, 1, static_cast<int>(std::max(left.count(), std::int64_t{0})));
        if (ready < 0 && errno != EINTR) {
            return Outcome::fromErrno("cannot wait for a netlink answer");
        }
        if (ready == 0) {
            return {};
        }
        // With MSG_TRUNC the size is that of the whole, also of what does not fit.
        datagram.resize(largestDatagram);
        sockaddr_nl sender{};
        socklen_t senderSize = sizeof sender;
        const ssize_t size =
            ::recvfrom(socket_.get(), datagram.data(), datagram.size(), MSG_DONTWAIT | MSG_TRUNC,
                       reinterpret_cast<sockaddr*>(&sender), &senderSize);
        if (size < 0 && errno != EINTR && errno != EAGAIN) {
            return Outcome::fromErrno("cannot read a netlink answer");
        }
        if (size > static_cast<ssize_t>(largestDatagram)) {
            return {kSCStatusFailed, "the kernel sent a netlink answer that is too large"};
        }
        // From the kernel: other processes can send to this socket too.
        if (size > 0 && sender.nl_pid == 0) {
            datagram.resize(static_cast<std::size_t>(size));
            return {};
        }
    }
}

Outcome Socket::exchange(Message& message, Answers& answers) {
    answers.sequence = ++sequence_;
    message.setSequence(sequence_);
    error_ = 0;
    RETURN_IF_FAILED(send(message));
    const auto deadline = std::chrono::steady_clock::now() + answerTime;
    std::size_t total = 0;
    for (Bytes datagram; !answers.end;) {
        RETURN_IF_FAILED(receive(deadline, datagram));
        if (datagram.empty()) {
            return {kSCStatusFailed, "the kernel did not answer a netlink request"};
        }
        total += datagram.size();
        if (total > largestDump) {
            return {kSCStatusFailed, "the kernel's netlink dump is too large"};
        }
        answers.take(datagram);
    }
    error_ = answers.error;
    return *answers.end;
}

Outcome Socket::request(Message message, std::initializer_list<int> tolerated) {
    Message nothing;
    return ask(std::move(message), nothing, tolerated);
}

Outcome Socket::ask(Message message, Message& answer, std::initializer_list<int> tolerated) {
    answer = {};
    Answers answers{.tolerated = tolerated};
    RETURN_IF_FAILED(exchange(message, answers));
    if (!answers.messages.empty()) {
        answer = std::move(answers.messages.back());
    }
    return {};
}

Outcome Socket::dump(Message message, std::vector<Message>& list, std::initializer_list<int> tolerated) {
    bool isInterrupted = true;
    for (int attempt = 0; attempt < dumpTries && isInterrupted; ++attempt) {
        Answers answers{.tolerated = tolerated};
        const Outcome done = exchange(message, answers);
        list = std::move(answers.messages);
        RETURN_IF_FAILED(done);
        isInterrupted = answers.isInterrupted;
    }
    // After that many tries the last list is as good as the kernel gives; a caller that acts on it compares
    // later.
    return {};
}

std::vector<Message> Socket::takeNotices(bool& overrun) {
    std::vector<Message> notices;
    overrun = false;
    Bytes datagram;
    for (int i = 0; i < mostNotices; ++i) {
        // The one error that a socket for notices knows is that there were too many of them.
        const bool received = receive(Deadline{}, datagram).ok();
        overrun = overrun || !received;
        if (received && datagram.empty()) {
            break;
        }
        std::ranges::move(messagesIn(datagram), std::back_inserter(notices));
    }
    return notices;
}

}  // namespace platform::netlink
