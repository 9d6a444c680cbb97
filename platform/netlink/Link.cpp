#include "platform/netlink/Link.h"

#include <net/if.h>

#include <cerrno>
#include <utility>

namespace platform::netlink {
namespace {

Outcome ask(Socket& socket, Message message, std::optional<Link>& link) {
    link.reset();
    Message answer;
    RETURN_IF_FAILED(socket.ask(std::move(message), answer, {ENODEV}));
    const auto found = answer.family<ifinfomsg>();
    const auto name = answer.attributes<ifinfomsg>().find(IFLA_IFNAME);
    if (answer.type() == RTM_NEWLINK && found && name) {
        link = Link{found->ifi_index, (found->ifi_flags & IFF_UP) != 0, (found->ifi_flags & IFF_RUNNING) != 0,
                    std::string(name->text())};
    }
    return {};
}

}  // namespace

Outcome findLink(Socket& socket, int index, std::optional<Link>& link) {
    ifinfomsg header{};
    header.ifi_index = index;
    return ask(socket, Message(RTM_GETLINK, NLM_F_REQUEST | NLM_F_ACK, header), link);
}

Outcome findLink(Socket& socket, const std::string& name, std::optional<Link>& link) {
    Message message(RTM_GETLINK, NLM_F_REQUEST | NLM_F_ACK, ifinfomsg{});
    message.addText(IFLA_IFNAME, name);
    return ask(socket, std::move(message), link);
}

}  // namespace platform::netlink
