#include "platform/netlink/Message.h"

#include <algorithm>

namespace platform::netlink {
namespace {

constexpr std::size_t attributeHeader = sizeof(nlattr);

constexpr std::size_t aligned(std::size_t length) {
    return (length + 3U) & ~std::size_t{3U};
}

}  // namespace

std::optional<std::uint32_t> Attribute::u32() const noexcept {
    return payload.size() == sizeof(std::uint32_t) ? valueFrom<std::uint32_t>(payload) : std::nullopt;
}

std::optional<std::uint8_t> Attribute::u8() const noexcept {
    return payload.size() == sizeof(std::uint8_t) ? valueFrom<std::uint8_t>(payload) : std::nullopt;
}

std::string_view Attribute::text() const noexcept {
    const std::string_view all(reinterpret_cast<const char*>(payload.data()), payload.size());
    return all.substr(0, all.find('\0'));
}

void Attributes::Iterator::read() noexcept {
    const std::optional<nlattr> header = valueFrom<nlattr>(rest_);
    valid_ = header && header->nla_len >= attributeHeader && header->nla_len <= rest_.size();
    if (valid_) {
        current_.type = static_cast<std::uint16_t>(header->nla_type & NLA_TYPE_MASK);
        current_.payload = rest_.subspan(attributeHeader, header->nla_len - attributeHeader);
    }
}

Attributes::Iterator& Attributes::Iterator::operator++() noexcept {
    const std::size_t length = aligned(current_.payload.size() + attributeHeader);
    rest_ = rest_.subspan(std::min(length, rest_.size()));
    read();
    return *this;
}

std::optional<Attribute> Attributes::find(std::uint16_t type) const noexcept {
    for (const Attribute& attribute : *this) {
        if (attribute.type == type) {
            return attribute;
        }
    }
    return std::nullopt;
}

std::optional<MessageView> takeMessage(ByteView& datagram) noexcept {
    const std::optional<nlmsghdr> header = valueFrom<nlmsghdr>(datagram);
    if (!header || header->nlmsg_len < NLMSG_HDRLEN || header->nlmsg_len > datagram.size()) {
        datagram = {};
        return std::nullopt;
    }
    const MessageView message(*header, datagram.subspan(NLMSG_HDRLEN, header->nlmsg_len - NLMSG_HDRLEN));
    datagram = datagram.subspan(std::min<std::size_t>(aligned(header->nlmsg_len), datagram.size()));
    return message;
}

void Message::start(std::uint16_t type, std::uint16_t flags, ByteView family) {
    nlmsghdr header{};
    header.nlmsg_type = type;
    header.nlmsg_flags = flags;
    append(bytesOf(header));
    append(family);
}

void Message::append(ByteView bytes) {
    bytes_.insert(bytes_.end(), bytes.begin(), bytes.end());
    bytes_.resize(aligned(bytes_.size()));
    const auto length = static_cast<std::uint32_t>(bytes_.size());
    std::memcpy(bytes_.data() + offsetof(nlmsghdr, nlmsg_len), &length, sizeof length);
}

Message& Message::add(std::uint16_t type, ByteView payload) {
    nlattr header{};
    header.nla_type = type;
    header.nla_len = static_cast<std::uint16_t>(attributeHeader + payload.size());
    append(bytesOf(header));
    append(payload);
    return *this;
}

Message& Message::addText(std::uint16_t type, std::string_view text) {
    Bytes payload(text.size() + 1);
    std::memcpy(payload.data(), text.data(), text.size());
    return add(type, payload);
}

Message& Message::addRaw(ByteView attributes) {
    append(attributes);
    return *this;
}

void Message::setSequence(std::uint32_t sequence) noexcept {
    std::memcpy(bytes_.data() + offsetof(nlmsghdr, nlmsg_seq), &sequence, sizeof sequence);
}

}  // namespace platform::netlink
