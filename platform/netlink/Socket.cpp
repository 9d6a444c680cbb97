#include "platform/netlink/Socket.h"

#include <poll.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <string>

namespace platform::netlink {
namespace {

// The largest datagram that the kernel makes for a dump.
constexpr std::size_t largestDatagram = std::size_t{64} << 10U;
constexpr int dumpTries = 5;

// An NLMSG_ERROR as an outcome: the errno, and the text that the kernel puts behind it when the socket asks
// for it.
Outcome outcomeOfError(const MessageView& message, std::initializer_list<int> tolerated) {
    const auto error = message.family<nlmsgerr>();
    if (!error) {
        return {kSCStatusFailed, "the kernel sent a short netlink answer"};
    }
    const int code = -error->error;
    if (code == 0 || std::find(tolerated.begin(), tolerated.end(), code) != tolerated.end()) {
        return {};
    }
    std::string what = "the kernel refused a netlink request";
    if ((message.flags() & NLM_F_ACK_TLVS) != 0) {
        std::size_t offset = sizeof(nlmsgerr);
        if ((message.flags() & NLM_F_CAPPED) == 0 && error->msg.nlmsg_len > NLMSG_HDRLEN) {
            offset += NLMSG_ALIGN(error->msg.nlmsg_len) - NLMSG_HDRLEN;
        }
        if (offset < message.payload().size()) {
            if (const auto text = Attributes(message.payload().subspan(offset)).find(NLMSGERR_ATTR_MSG)) {
                what += " (" + std::string(text->text()) + ")";
            }
        }
    }
    return Outcome::fromErrno(what, code);
}

}  // namespace

Outcome Socket::open(std::uint32_t groups) {
    FileDescriptor descriptor(::socket(AF_NETLINK, SOCK_RAW | SOCK_CLOEXEC, NETLINK_ROUTE));
    if (!descriptor.isOpen()) {
        return Outcome::fromErrno("cannot open a netlink socket");
    }
    // Kernels that lack one of these still answer every request, only with fewer words or less strictness.
    const int on = 1;
    (void)::setsockopt(descriptor.get(), SOL_NETLINK, NETLINK_EXT_ACK, &on, sizeof on);
    (void)::setsockopt(descriptor.get(), SOL_NETLINK, NETLINK_CAP_ACK, &on, sizeof on);
    (void)::setsockopt(descriptor.get(), SOL_NETLINK, NETLINK_GET_STRICT_CHK, &on, sizeof on);
    sockaddr_nl address{};
    address.nl_family = AF_NETLINK;
    address.nl_groups = groups;
    if (::bind(descriptor.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
        return Outcome::fromErrno("cannot bind a netlink socket");
    }
    descriptor_ = std::move(descriptor);
    return {};
}

Outcome Socket::send(Message& message) {
    message.setSequence(++sequence_);
    sockaddr_nl kernel{};
    kernel.nl_family = AF_NETLINK;
    const ByteView bytes = message.bytes();
    ssize_t sent = 0;
    do {
        sent = ::sendto(descriptor_.get(), bytes.data(), bytes.size(), 0,
                        reinterpret_cast<const sockaddr*>(&kernel), sizeof kernel);
    } while (sent < 0 && errno == EINTR);
    if (sent < 0) {
        return Outcome::fromErrno("cannot send a netlink request");
    }
    return {};
}

Outcome Socket::receive(std::chrono::steady_clock::time_point deadline, Bytes& datagram) {
    datagram.resize(largestDatagram);
    for (;;) {
        const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(
            deadline - std::chrono::steady_clock::now());
        if (left.count() <= 0) {
            return {kSCStatusFailed, "the kernel did not answer a netlink request"};
        }
        pollfd wait{descriptor_.get(), POLLIN, 0};
        const int ready = ::poll(&wait, 1, static_cast<int>(left.count()));
        if (ready < 0 && errno != EINTR) {
            return Outcome::fromErrno("cannot wait for a netlink answer");
        }
        if (ready <= 0) {
            continue;
        }
        sockaddr_nl sender{};
        socklen_t senderSize = sizeof sender;
        const ssize_t size =
            ::recvfrom(descriptor_.get(), datagram.data(), datagram.size(), MSG_DONTWAIT | MSG_TRUNC,
                       reinterpret_cast<sockaddr*>(&sender), &senderSize);
        if (size < 0) {
            if (errno == EINTR || errno == EAGAIN) {
                continue;
            }
            return Outcome::fromErrno("cannot read a netlink answer");
        }
        if (static_cast<std::size_t>(size) > datagram.size()) {
            return {kSCStatusFailed, "the kernel sent a netlink answer that is too large"};
        }
        if (sender.nl_pid == 0) {
            datagram.resize(static_cast<std::size_t>(size));
            return {};
        }
    }
}

Outcome Socket::request(Message message, std::initializer_list<int> tolerated) {
    OwnedMessage nothing;
    return ask(std::move(message), nothing, tolerated);
}

Outcome Socket::ask(Message message, OwnedMessage& answer, std::initializer_list<int> tolerated) {
    answer = {};
    Outcome sent = send(message);
    if (!sent.ok()) {
        return sent;
    }
    const auto deadline = std::chrono::steady_clock::now() + answerTime;
    Bytes datagram;
    for (;;) {
        Outcome received = receive(deadline, datagram);
        if (!received.ok()) {
            return received;
        }
        ByteView rest = datagram;
        while (const auto part = takeMessage(rest)) {
            if (part->sequence() != sequence_) {
                continue;
            }
            if (part->type() == NLMSG_ERROR) {
                return outcomeOfError(*part, tolerated);
            }
            answer.header.nlmsg_type = part->type();
            answer.header.nlmsg_flags = part->flags();
            answer.header.nlmsg_seq = part->sequence();
            answer.payload.assign(part->payload().begin(), part->payload().end());
        }
    }
}

Outcome Socket::dump(const Message& message, std::vector<OwnedMessage>& answers,
                     std::initializer_list<int> tolerated) {
    bool interrupted = true;
    for (int attempt = 0; attempt < dumpTries && interrupted; ++attempt) {
        Outcome done = dumpOnce(message, answers, tolerated, interrupted);
        if (!done.ok()) {
            answers.clear();
            return done;
        }
    }
    // After that many tries the last list is as good as the kernel gives; a caller that acts on it compares
    // later.
    return {};
}

Outcome Socket::dumpOnce(Message message, std::vector<OwnedMessage>& answers,
                         std::initializer_list<int> tolerated, bool& interrupted) {
    answers.clear();
    interrupted = false;
    Outcome sent = send(message);
    if (!sent.ok()) {
        return sent;
    }
    const auto deadline = std::chrono::steady_clock::now() + answerTime;
    std::size_t total = 0;
    Bytes datagram;
    for (;;) {
        Outcome received = receive(deadline, datagram);
        if (!received.ok()) {
            return received;
        }
        total += datagram.size();
        if (total > largestDump) {
            return {kSCStatusFailed, "the kernel's netlink dump is too large"};
        }
        ByteView rest = datagram;
        while (const auto part = takeMessage(rest)) {
            if (part->sequence() != sequence_) {
                continue;
            }
            interrupted = interrupted || (part->flags() & NLM_F_DUMP_INTR) != 0;
            if (part->type() == NLMSG_ERROR) {
                return outcomeOfError(*part, tolerated);
            }
            if (part->type() == NLMSG_DONE) {
                const int error = -valueFrom<std::int32_t>(part->payload()).value_or(0);
                const bool isFine =
                    error <= 0 || std::find(tolerated.begin(), tolerated.end(), error) != tolerated.end();
                return isFine ? Outcome() : Outcome::fromErrno("the kernel ended a netlink dump", error);
            }
            OwnedMessage& owned = answers.emplace_back();
            owned.header.nlmsg_type = part->type();
            owned.header.nlmsg_flags = part->flags();
            owned.header.nlmsg_seq = part->sequence();
            owned.payload.assign(part->payload().begin(), part->payload().end());
        }
    }
}

Outcome Socket::receiveNotices(Bytes& datagram, bool& received, bool& overrun) {
    received = false;
    overrun = false;
    datagram.resize(largestDatagram);
    for (;;) {
        sockaddr_nl sender{};
        socklen_t senderSize = sizeof sender;
        const ssize_t size =
            ::recvfrom(descriptor_.get(), datagram.data(), datagram.size(), MSG_DONTWAIT | MSG_TRUNC,
                       reinterpret_cast<sockaddr*>(&sender), &senderSize);
        if (size < 0 && errno == EINTR) {
            continue;
        }
        if (size < 0 && errno == EAGAIN) {
            return {};
        }
        if (size < 0 && errno == ENOBUFS) {
            overrun = true;
            return {};
        }
        if (size < 0) {
            return Outcome::fromErrno("cannot read netlink notices");
        }
        if (sender.nl_pid != 0) {
            continue;
        }
        if (static_cast<std::size_t>(size) > datagram.size()) {
            overrun = true;
            return {};
        }
        datagram.resize(static_cast<std::size_t>(size));
        received = true;
        return {};
    }
}

}  // namespace platform::netlink
