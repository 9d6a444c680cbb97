#include "platform/netlink/Message.h"

#include <libmnl/libmnl.h>

#include <algorithm>
#include <string>

namespace platform::netlink {
namespace {

// libmnl's own macro is one of signed numbers.
constexpr std::size_t aligned(std::size_t length) {
    return (length + 3U) & ~std::size_t{3U};
}

}  // namespace

std::string_view Attribute::text() const noexcept {
    const std::string_view all(reinterpret_cast<const char*>(payload.data()), payload.size());
    return all.substr(0, all.find('\0'));
}

Attributes Attribute::nested() const {
    return Attributes(payload);
}

Attributes::Attributes(ByteView bytes) {
    const auto* attribute = reinterpret_cast<const nlattr*>(bytes.data());
    const std::byte* const end = bytes.data() + bytes.size();
    const auto left = [&attribute, end] {
        return static_cast<int>(end - reinterpret_cast<const std::byte*>(attribute));
    };
    for (; mnl_attr_ok(attribute, left()); attribute = mnl_attr_next(attribute)) {
        const auto* const payload = static_cast<const std::byte*>(mnl_attr_get_payload(attribute));
        list_.push_back({mnl_attr_get_type(attribute), {payload, mnl_attr_get_payload_len(attribute)}});
    }
}

std::optional<Attribute> Attributes::find(std::uint16_t type) const noexcept {
    const auto found = std::ranges::find(list_, type, &Attribute::type);
    return found == list_.end() ? std::nullopt : std::optional(*found);
}

std::optional<std::uint32_t> Attributes::u32(std::uint16_t type) const noexcept {
    const std::optional<Attribute> found = find(type);
    return found ? found->as<std::uint32_t>() : std::nullopt;
}

nlmsghdr* Message::makeRoom(std::size_t size) {
    bytes_.resize(bytes_.size() + aligned(size));
    return reinterpret_cast<nlmsghdr*>(bytes_.data());
}

Message::Message(std::uint16_t type, std::uint16_t flags, ByteView payload) {
    nlmsghdr* const header = mnl_nlmsg_put_header(makeRoom(NLMSG_HDRLEN + payload.size()));
    header->nlmsg_type = type;
    header->nlmsg_flags = flags;
    std::ranges::copy(payload, static_cast<std::byte*>(mnl_nlmsg_put_extra_header(header, payload.size())));
}

const nlmsghdr& Message::header() const noexcept {
    return *reinterpret_cast<const nlmsghdr*>(bytes_.data());
}

Message& Message::add(std::uint16_t type, ByteView payload) {
    mnl_attr_put(makeRoom(sizeof(nlattr) + payload.size()), type, payload.size(), payload.data());
    return *this;
}

Message& Message::addText(std::uint16_t type, std::string_view text) {
    mnl_attr_put_strz(makeRoom(sizeof(nlattr) + text.size() + 1), type, std::string(text).c_str());
    return *this;
}

void Message::setSequence(std::uint32_t sequence) noexcept {
    reinterpret_cast<nlmsghdr*>(bytes_.data())->nlmsg_seq = sequence;
}

std::vector<Message> messagesIn(ByteView datagram) {
    std::vector<Message> messages;
    int left = static_cast<int>(datagram.size());
    for (const auto* header = reinterpret_cast<const nlmsghdr*>(datagram.data()); mnl_nlmsg_ok(header, left);
         header = mnl_nlmsg_next(header, &left)) {
        messages.emplace_back(ByteView(reinterpret_cast<const std::byte*>(header), header->nlmsg_len));
    }
    return messages;
}

}  // namespace platform::netlink
