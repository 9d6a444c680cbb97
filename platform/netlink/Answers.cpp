#include "platform/netlink/Answers.h"

#include <algorithm>
#include <string>
#include <utility>

namespace platform::netlink {

void Answers::take(ByteView datagram) {
    for (Message& part : messagesIn(datagram)) {
        // The answer to a question that was given up.
        if (part.header().nlmsg_seq != sequence) {
            continue;
        }
        isInterrupted = isInterrupted || (part.header().nlmsg_flags & NLM_F_DUMP_INTR) != 0;
        if (part.type() == NLMSG_ERROR || part.type() == NLMSG_DONE) {
            endWith(part);
            return;
        }
        messages.push_back(std::move(part));
    }
}

// Both begin with the errno as a negative number; an NLMSG_ERROR goes on with the request's header and, when
// the socket asks for it, a text.
void Answers::endWith(const Message& last) {
    const bool isDump = last.type() == NLMSG_DONE;
    const auto code = last.family<std::int32_t>();
    if (!isDump && !last.family<nlmsgerr>()) {
        end = Outcome(kSCStatusFailed, "the kernel sent a short netlink answer");
        return;
    }
    error = std::max(-code.value_or(0), 0);
    std::string what = isDump ? "the kernel ended a netlink dump" : "the kernel refused a netlink request";
    // The request itself is not repeated before them: the socket asks for that too.
    if (!isDump && (last.header().nlmsg_flags & NLM_F_ACK_TLVS) != 0) {
        if (const auto text = last.attributes<nlmsgerr>().find(NLMSGERR_ATTR_MSG)) {
            what += " (" + std::string(text->text()) + ")";
        }
    }
    end =
        error == 0 || std::ranges::count(tolerated, error) != 0 ? Outcome() : Outcome::fromErrno(what, error);
}

}  // namespace platform::netlink
