#include "platform/netlink/Generic.h"

#include <cerrno>

namespace platform::netlink {

Message GenericFamily::request(std::uint8_t command, std::uint16_t flags) const {
    return {type, static_cast<std::uint16_t>(NLM_F_REQUEST | flags), genlmsghdr{command, 0, 0}};
}

Outcome findFamily(Socket& socket, const std::string& name, std::optional<GenericFamily>& family) {
    family.reset();
    Message message = GenericFamily{GENL_ID_CTRL, {}}.request(CTRL_CMD_GETFAMILY, NLM_F_ACK);
    message.addText(CTRL_ATTR_FAMILY_NAME, name);
    Message answer;
    RETURN_IF_FAILED(socket.ask(std::move(message), answer, {ENOENT}));
    const Attributes attributes = answer.attributes<genlmsghdr>();
    const auto id = attributes.find(CTRL_ATTR_FAMILY_ID);
    const auto type = id ? id->as<std::uint16_t>() : std::nullopt;
    if (answer.type() != GENL_ID_CTRL || !type) {
        return {};
    }
    family = GenericFamily{*type, {}};
    if (const auto groups = attributes.find(CTRL_ATTR_MCAST_GROUPS)) {
        for (const Attribute& group : groups->nested()) {
            const Attributes parts = group.nested();
            const auto groupName = parts.find(CTRL_ATTR_MCAST_GRP_NAME);
            const auto number = parts.u32(CTRL_ATTR_MCAST_GRP_ID);
            if (groupName && number) {
                family->groups.emplace(groupName->text(), *number);
            }
        }
    }
    return {};
}

}  // namespace platform::netlink
