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

    // The payload as a plain value of exactly this size.
    template <class T>
    [[nodiscard]] std::optional<T> as() const noexcept {
        return payload.size() == sizeof(T) ? valueFrom<T>(payload) : std::nullopt;
    }
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

// The attributes behind the fixed part of a payload.
template <class Family>
[[nodiscard]] Attributes attributesBehind(ByteView payload) {
    constexpr std::size_t size = NLMSG_ALIGN(sizeof(Family));
    return Attributes(payload.size() < size ? ByteView() : payload.subspan(size));
}

// Calls `each` with the next hops of a route that has several (RTA_MULTIPATH), each a header with a length of
// its own and the attributes behind it, until one gives false; what it changes in the header is written back.
template <class Each>
void forEachHop(Bytes& hops, const Each& each) {
    for (std::size_t at = 0; at < hops.size();) {
        const ByteView rest = ByteView(hops).subspan(at);
        std::optional<rtnexthop> hop = valueFrom<rtnexthop>(rest);
        if (!hop || hop->rtnh_len < sizeof *hop || hop->rtnh_len > rest.size()) {
            return;
        }
        const bool goesOn = each(*hop, Attributes(rest.first(hop->rtnh_len).subspan(sizeof *hop)));
        std::memcpy(hops.data() + at, &*hop, sizeof *hop);
        if (!goesOn) {
            return;
        }
        at += NLMSG_ALIGN(std::size_t{hop->rtnh_len});
    }
}

// One message, as it came or being built. The length in its header is always right; the sequence number is
// the socket's matter.
class Message {
  public:
    // Of type 0, which no message has.
    Message() : Message(0, 0, ByteView()) {}
    // With a fixed part that follows the header (ifinfomsg, ifaddrmsg, rtmsg), or with all that follows it.
    template <class Family>
    Message(std::uint16_t type, std::uint16_t flags, const Family& family)
        : Message(type, flags, bytesOf(family)) {}
    Message(std::uint16_t type, std::uint16_t flags, ByteView payload);
    // All of the bytes of one that came.
    explicit Message(ByteView bytes) : bytes_(bytes.begin(), bytes.end()) {}

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
    [[nodiscard]] const nlmsghdr& header() const noexcept;
    [[nodiscard]] std::uint16_t type() const noexcept { return header().nlmsg_type; }
    // What follows the header.
    [[nodiscard]] ByteView payload() const noexcept { return bytes().subspan(NLMSG_HDRLEN); }
    // The fixed part; nothing when the message is too short.
    template <class Family>
    [[nodiscard]] std::optional<Family> family() const noexcept {
        return valueFrom<Family>(payload());
    }
    // The attributes behind that part, borrowed.
    template <class Family>
    [[nodiscard]] Attributes attributes() const {
        return attributesBehind<Family>(payload());
    }

  private:
    // Room for so many bytes more behind the message.
    nlmsghdr* makeRoom(std::size_t size);

    Bytes bytes_;  // as long as the message, which libmnl pads
};

// The messages of a datagram, up to what is none.
[[nodiscard]] std::vector<Message> messagesIn(ByteView datagram);

}  // namespace platform::netlink
