// Netlink messages: built and taken apart as pure functions, without a socket.
//
// Everything is in the kernel's layout: integers in host byte order unless an attribute says otherwise,
// addresses in network byte order, every attribute padded to four bytes. What comes from the kernel is read
// through copies, so that no view depends on alignment, and a length that leaves the message ends the walk.
#pragma once

#include <linux/netlink.h>
#include <linux/rtnetlink.h>

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <iterator>
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

struct Attribute {
    std::uint16_t type = 0;  // without the flag bits
    ByteView payload;

    // The payload as an integer of exactly this width.
    [[nodiscard]] std::optional<std::uint32_t> u32() const noexcept;
    [[nodiscard]] std::optional<std::uint8_t> u8() const noexcept;
    // The payload up to its first NUL.
    [[nodiscard]] std::string_view text() const noexcept;
};

// A walk over a row of attributes; it ends at the first one that does not fit.
class Attributes {
  public:
    class Iterator {
      public:
        using value_type = Attribute;
        using difference_type = std::ptrdiff_t;

        Iterator() = default;
        explicit Iterator(ByteView rest) noexcept : rest_(rest) { read(); }
        const Attribute& operator*() const noexcept { return current_; }
        const Attribute* operator->() const noexcept { return &current_; }
        Iterator& operator++() noexcept;
        void operator++(int) noexcept { ++*this; }
        bool operator==(std::default_sentinel_t) const noexcept { return !valid_; }

      private:
        void read() noexcept;

        ByteView rest_;
        Attribute current_;
        bool valid_ = false;
    };

    explicit Attributes(ByteView bytes) noexcept : bytes_(bytes) {}
    [[nodiscard]] Iterator begin() const noexcept { return Iterator(bytes_); }
    [[nodiscard]] std::default_sentinel_t end() const noexcept { return {}; }
    // The first attribute of a type.
    [[nodiscard]] std::optional<Attribute> find(std::uint16_t type) const noexcept;

  private:
    ByteView bytes_;
};

// One message as it came, borrowed from the buffer that it came in.
class MessageView {
  public:
    MessageView() = default;
    MessageView(const nlmsghdr& header, ByteView payload) noexcept : header_(header), payload_(payload) {}

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
    // Attributes that are there already, each with its header and padding, as a message carried them.
    Message& addRaw(ByteView attributes);

    void setSequence(std::uint32_t sequence) noexcept;
    [[nodiscard]] ByteView bytes() const noexcept { return bytes_; }
    // What follows the header.
    [[nodiscard]] ByteView payload() const noexcept { return ByteView(bytes_).subspan(NLMSG_HDRLEN); }

  private:
    void start(std::uint16_t type, std::uint16_t flags, ByteView family);
    void append(ByteView bytes);

    Bytes bytes_;
};

}  // namespace platform::netlink
