// Netlink messages: built and taken apart as pure functions, without a socket.
//
// Everything is in the kernel's layout: integers in host byte order unless an attribute says otherwise,
// addresses in network byte order, every attribute padded to four bytes. A length that leaves the message
// ends the walk.
#pragma once

#include <linux/netlink.h>
#include <linux/rtnetlink.h>

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <optional>
#include <span>
#include <string_view>
#include <type_traits>
#include <vector>

namespace platform::netlink {

using Bytes = std::vector<std::byte>;
using ByteView = std::span<const std::byte>;

// The bytes of a plain value, borrowed.
template <class T>
[[nodiscard]] ByteView bytesOf(const T& value) noexcept {
    static_assert(std::is_trivially_copyable_v<T>);
    return std::as_bytes(std::span<const T, 1>(&value, 1));
}

// A plain value from the start of the bytes; nothing when they are too few.
template <class T>
[[nodiscard]] std::optional<T> valueFrom(ByteView bytes) noexcept {
    static_assert(std::is_trivially_copyable_v<T>);
    if (bytes.size() < sizeof(T)) {
        return std::nullopt;
    }
    T value;
    std::memcpy(&value, bytes.data(), sizeof(T));
    return value;
}

class Attributes;

struct Attribute {
    std::uint16_t type = 0;  // without the flag bits
    ByteView payload;

    // The payload as an integer of exactly this width.
    [[nodiscard]] std::optional<std::uint32_t> u32() const noexcept;
    [[nodiscard]] std::optional<std::uint16_t> u16() const noexcept;
    [[nodiscard]] std::optional<std::uint8_t> u8() const noexcept;
    // The payload up to its first NUL.
    [[nodiscard]] std::string_view text() const noexcept;
    // The payload as attributes of its own.
    [[nodiscard]] Attributes nested() const;
};

// A row of attributes up to the first one that does not fit; their payloads are borrowed from the bytes,
// which begin at a multiple of four as everything in a message does.
class Attributes {
  public:
    explicit Attributes(ByteView bytes);
    [[nodiscard]] auto begin() const noexcept { return list_.begin(); }
    [[nodiscard]] auto end() const noexcept { return list_.end(); }
    // The first attribute of a type, and its payload as an integer of this width.
    [[nodiscard]] std::optional<Attribute> find(std::uint16_t type) const noexcept;
    [[nodiscard]] std::optional<std::uint32_t> u32(std::uint16_t type) const noexcept;

  private:
    std::vector<Attribute> list_;
};

// One message as it came, borrowed from the buffer that it came in.
class MessageView {
  public:
    MessageView() = default;
    MessageView(const nlmsghdr& header, ByteView payload) noexcept : header_(header), payload_(payload) {}

    [[nodiscard]] const nlmsghdr& header() const noexcept { return header_; }
    [[nodiscard]] std::uint16_t type() const noexcept { return header_.nlmsg_type; }
    [[nodiscard]] std::uint16_t flags() const noexcept { return header_.nlmsg_flags; }
    [[nodiscard]] std::uint32_t sequence() const noexcept { return header_.nlmsg_seq; }
    [[nodiscard]] ByteView payload() const noexcept { return payload_; }

    // The fixed part that follows the header (ifinfomsg, ifaddrmsg, rtmsg); nothing when the message is too
    // short.
    template <class Family>
    [[nodiscard]] std::optional<Family> family() const noexcept {
        return valueFrom<Family>(payload_);
    }
    // The attributes behind that part.
    template <class Family>
    [[nodiscard]] Attributes attributes() const noexcept {
        constexpr std::size_t size = NLMSG_ALIGN(sizeof(Family));
        return Attributes(payload_.size() < size ? ByteView() : payload_.subspan(size));
    }

  private:
    nlmsghdr header_{};
    ByteView payload_;
};

// Takes the first message off the bytes of a datagram; nothing at the end, or when what is left is no
// message.
[[nodiscard]] std::optional<MessageView> takeMessage(ByteView& datagram) noexcept;

// A message being built. The length in its header is always right; the sequence number is the socket's
// matter.
class Message {
  public:
    template <class Family>
    Message(std::uint16_t type, std::uint16_t flags, const Family& family) {
        start(type, flags, bytesOf(family));
    }

    Message& add(std::uint16_t type, ByteView payload);
    template <class T>
    Message& addValue(std::uint16_t type, const T& value) {
        return add(type, bytesOf(value));
    }
    // With its final NUL.
    Message& addText(std::uint16_t type, std::string_view text);
    // An attribute that holds those which `fill` adds to the message.
    template <class Fill>
    Message& addNested(std::uint16_t type, const Fill& fill) {
        const std::size_t start = bytes_.size();
        add(type | NLA_F_NESTED, {});
        fill(*this);
        const auto length = static_cast<std::uint16_t>(bytes_.size() - start);
        std::memcpy(bytes_.data() + start + offsetof(nlattr, nla_len), &length, sizeof length);
        return *this;
    }

    void setSequence(std::uint32_t sequence) noexcept;
    [[nodiscard]] ByteView bytes() const noexcept { return bytes_; }
    // What follows the header.
    [[nodiscard]] ByteView payload() const noexcept { return ByteView(bytes_).subspan(NLMSG_HDRLEN); }

  private:
    void start(std::uint16_t type, std::uint16_t flags, ByteView family);
    // Room for so many bytes more behind the message.
    nlmsghdr* makeRoom(std::size_t size);

    Bytes bytes_;  // as long as the message, which libmnl pads
};

}  // namespace platform::netlink
