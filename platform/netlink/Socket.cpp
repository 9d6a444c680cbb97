#include "platform/netlink/Socket.h"

#include <libmnl/libmnl.h>
#include <poll.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <string>
#include <utility>

namespace platform::netlink {
namespace {

// The largest datagram that the kernel makes for a dump.
constexpr std::size_t largestDatagram = std::size_t{64} << 10U;
constexpr int dumpTries = 5;
constexpr int mostNotices = 1000;

// An NLMSG_ERROR as an outcome: the errno, and the text that the kernel puts behind it when the socket asks
// for it.
Outcome outcomeOfError(const MessageView& message, std::initializer_list<int> tolerated, int& code) {
    const auto error = message.family<nlmsgerr>();
    if (!error) {
        return {kSCStatusFailed, "the kernel sent a short netlink answer"};
    }
    code = -error->error;
    if (code == 0 || std::find(tolerated.begin(), tolerated.end(), code) != tolerated.end()) {
        return {};
    }
    std::string what = "the kernel refused a netlink request";
    // The request itself is not repeated before them: the socket asks for that too.
    if ((message.flags() & NLM_F_ACK_TLVS) != 0) {
        if (const auto text = message.attributes<nlmsgerr>().find(NLMSGERR_ATTR_MSG)) {
            what += " (" + std::string(text->text()) + ")";
        }
    }
    return Outcome::fromErrno(what, code);
}

}  // namespace

void Socket::Close::operator()(mnl_socket* socket) const noexcept {
    (void)mnl_socket_close(socket);
}

OwnedMessage::OwnedMessage(const MessageView& view)
    : header(view.header()), payload(view.payload().begin(), view.payload().end()) {}

int Socket::descriptor() const noexcept {
    return socket_ ? mnl_socket_get_fd(socket_.get()) : -1;
}

Outcome Socket::open(int protocol, std::uint32_t groups) {
    decltype(socket_) socket(mnl_socket_open2(protocol, SOCK_CLOEXEC));
    if (!socket) {
        return Outcome::fromErrno("cannot open a netlink socket");
    }
    // Kernels that lack one of these still answer every request, only with fewer words or less strictness.
    int on = 1;
    for (const int option : {NETLINK_EXT_ACK, NETLINK_CAP_ACK, NETLINK_GET_STRICT_CHK}) {
        (void)mnl_socket_setsockopt(socket.get(), option, &on, sizeof on);
    }
    if (mnl_socket_bind(socket.get(), groups, MNL_SOCKET_AUTOPID) != 0) {
        return Outcome::fromErrno("cannot bind a netlink socket");
    }
    socket_ = std::move(socket);
    return {};
}

Outcome Socket::joinGroup(std::uint32_t group) {
    if (mnl_socket_setsockopt(socket_.get(), NETLINK_ADD_MEMBERSHIP, &group, sizeof group) != 0) {
        return Outcome::fromErrno("cannot ask for netlink notices");
    }
    return {};
}

Outcome Socket::send(Message& message) {
    message.setSequence(++sequence_);
    error_ = 0;
    ssize_t sent = 0;
    do {
        sent = mnl_socket_sendto(socket_.get(), message.bytes().data(), message.bytes().size());
    } while (sent < 0 && errno == EINTR);
    return sent < 0 ? Outcome::fromErrno("cannot send a netlink request") : Outcome();
}

Outcome Socket::receive(Deadline deadline, Bytes& datagram) {
    for (;;) {
        const auto left =
            std::chrono::ceil<std::chrono::milliseconds>(deadline - std::chrono::steady_clock::now());
        datagram.clear();
        pollfd wait{descriptor(), POLLIN, 0};
        const int ready = ::poll(&wait, 1, static_cast<int>(std::max(left.count(), std::int64_t{0})));
        if (ready < 0 && errno != EINTR) {
            return Outcome::fromErrno("cannot wait for a netlink answer");
        }
        if (ready == 0) {
            return {};
        }
        // Not libmnl's own receiving: it does not tell who sent a datagram.
        datagram.resize(largestDatagram);
        sockaddr_nl sender{};
        socklen_t senderSize = sizeof sender;
        const ssize_t size =
            ::recvfrom(descriptor(), datagram.data(), datagram.size(), MSG_DONTWAIT | MSG_TRUNC,
                       reinterpret_cast<sockaddr*>(&sender), &senderSize);
        if (size < 0 && errno != EINTR && errno != EAGAIN) {
            return Outcome::fromErrno("cannot read a netlink answer");
        }
        if (size > static_cast<ssize_t>(largestDatagram)) {
            return {kSCStatusFailed, "the kernel sent a netlink answer that is too large"};
        }
        if (size > 0 && sender.nl_pid == 0) {
            datagram.resize(static_cast<std::size_t>(size));
            return {};
        }
    }
}

template <class Each>
Outcome Socket::receiveAnswers(const Each& each) {
    const auto deadline = std::chrono::steady_clock::now() + answerTime;
    std::size_t total = 0;
    Bytes datagram;
    for (;;) {
        RETURN_IF_FAILED(receive(deadline, datagram));
        if (datagram.empty()) {
            return {kSCStatusFailed, "the kernel did not answer a netlink request"};
        }
        total += datagram.size();
        if (total > largestDump) {
            return {kSCStatusFailed, "the kernel's netlink dump is too large"};
        }
        ByteView rest = datagram;
        while (const auto part = takeMessage(rest)) {
            if (part->sequence() == sequence_ && each(*part)) {
                return {};
            }
        }
    }
}

Outcome Socket::request(Message message, std::initializer_list<int> tolerated) {
    OwnedMessage nothing;
    return ask(std::move(message), nothing, tolerated);
}

Outcome Socket::ask(Message message, OwnedMessage& answer, std::initializer_list<int> tolerated) {
    answer = {};
    RETURN_IF_FAILED(send(message));
    Outcome end;
    RETURN_IF_FAILED(receiveAnswers([&](const MessageView& part) {
        const bool isEnd = part.type() == NLMSG_ERROR;
        if (isEnd) {
            end = outcomeOfError(part, tolerated, error_);
        } else {
            answer = OwnedMessage(part);
        }
        return isEnd;
    }));
    return end;
}

Outcome Socket::dump(const Message& message, std::vector<OwnedMessage>& answers,
                     std::initializer_list<int> tolerated) {
    bool interrupted = true;
    for (int attempt = 0; attempt < dumpTries && interrupted; ++attempt) {
        RETURN_IF_FAILED(dumpOnce(message, answers, tolerated, interrupted));
    }
    // After that many tries the last list is as good as the kernel gives; a caller that acts on it compares
    // later.
    return {};
}

Outcome Socket::dumpOnce(Message message, std::vector<OwnedMessage>& answers,
                         std::initializer_list<int> tolerated, bool& interrupted) {
    answers.clear();
    interrupted = false;
    RETURN_IF_FAILED(send(message));
    Outcome end;
    RETURN_IF_FAILED(receiveAnswers([&](const MessageView& part) {
        interrupted = interrupted || (part.flags() & NLM_F_DUMP_INTR) != 0;
        if (part.type() == NLMSG_ERROR) {
            end = outcomeOfError(part, tolerated, error_);
        } else if (part.type() == NLMSG_DONE) {
            error_ = std::max(-valueFrom<std::int32_t>(part.payload()).value_or(0), 0);
            const bool isFine =
                error_ == 0 || std::find(tolerated.begin(), tolerated.end(), error_) != tolerated.end();
            end = isFine ? Outcome() : Outcome::fromErrno("the kernel ended a netlink dump", error_);
        } else {
            answers.emplace_back(part);
            return false;
        }
        return true;
    }));
    return end;
}

std::vector<OwnedMessage> Socket::takeNotices(bool& overrun) {
    std::vector<OwnedMessage> notices;
    overrun = false;
    Bytes datagram;
    for (int i = 0; i < mostNotices; ++i) {
        // The one error that a socket for notices knows is that there were too many of them.
        const bool received = receive(Deadline{}, datagram).ok();
        overrun = overrun || !received;
        if (received && datagram.empty()) {
            break;
        }
        ByteView rest = datagram;
        while (const auto notice = takeMessage(rest)) {
            notices.emplace_back(*notice);
        }
    }
    return notices;
}

}  // namespace platform::netlink
