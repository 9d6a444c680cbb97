#include "platform/netlink/Generic.h"

#include <cerrno>

namespace platform::netlink {

Message GenericFamily::request(std::uint8_t command, std::uint16_t flags) const {
    return {type, static_cast<std::uint16_t>(NLM_F_REQUEST | flags), genlmsghdr{command, 0, 0}};
}

std::optional<GenericFamily> decodeFamily(const MessageView& message) {
    const Attributes attributes = message.attributes<genlmsghdr>();
    const auto type = attributes.find(CTRL_ATTR_FAMILY_ID);
    if (message.type() != GENL_ID_CTRL || !type || !type->u16()) {
        return std::nullopt;
    }
    GenericFamily family{*type->u16(), {}};
    if (const auto groups = attributes.find(CTRL_ATTR_MCAST_GROUPS)) {
        for (const Attribute& group : groups->nested()) {
            const Attributes parts = group.nested();
            const auto name = parts.find(CTRL_ATTR_MCAST_GRP_NAME);
            const auto number = parts.u32(CTRL_ATTR_MCAST_GRP_ID);
            if (name && number) {
                family.groups.emplace(name->text(), *number);
            }
        }
    }
    return family;
}

Outcome findFamily(Socket& socket, const std::string& name, std::optional<GenericFamily>& family) {
    family.reset();
    Message message = GenericFamily{GENL_ID_CTRL, {}}.request(CTRL_CMD_GETFAMILY, NLM_F_ACK);
    message.addText(CTRL_ATTR_FAMILY_NAME, name);
    OwnedMessage answer;
    RETURN_IF_FAILED(socket.ask(std::move(message), answer, {ENOENT}));
    family = decodeFamily(answer.view());
    return {};
}

}  // namespace platform::netlink
