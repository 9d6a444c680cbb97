// Bytes captured from a kernel of the 6.18 series in a network namespace; v0 is link 3 and v2 is link 5.
#include "platform/live/Routes.h"

#include <arpa/inet.h>
#include <gtest/gtest.h>

#include <string>
#include <string_view>

#include "tests/unit/support/Hexadecimal.h"

namespace live_test {
namespace {

using platform::live::DefaultRoute;
using platform::live::defaultRoutesIn;
using platform::live::linkIn;
using platform::live::routeIn;
using platform::netlink::Bytes;
using platform::netlink::ByteView;
using platform::netlink::MessageView;
using platform::netlink::OwnedMessage;
using testing_support::fromHex;

std::vector<OwnedMessage> messagesIn(ByteView datagram) {
    std::vector<OwnedMessage> messages;
    while (const auto view = platform::netlink::takeMessage(datagram)) {
        OwnedMessage& message = messages.emplace_back();
        message.header.nlmsg_type = view->type();
        message.payload.assign(view->payload().begin(), view->payload().end());
    }
    return messages;
}

std::string describe(const std::vector<DefaultRoute>& routes) {
    std::string text;
    for (const DefaultRoute& route : routes) {
        text += "link " + std::to_string(route.interfaceIndex) + " metric " + std::to_string(route.metric);
        if (route.gateway) {
            char address[INET_ADDRSTRLEN];
            text += std::string(" via ") + inet_ntop(AF_INET, &*route.gateway, address, sizeof address);
        }
        text += "; ";
    }
    return text;
}

// default via 10.0.0.9 dev v2 table 77
constexpr std::string_view otherTable =
    "340000001800220001000000c65e0000020000004d0300010000000008000f004d000000080005000a000009080004000500000"
    "0";
// unreachable default metric 10
constexpr std::string_view refusing =
    "2c0000001800220001000000c65e000002000000fe0300070000000008000f00fe000000080006000a000000";
// default metric 20 nexthop via 10.0.0.1 dev v2 nexthop via 192.0.0.1 dev v0
constexpr std::string_view twoHops =
    "500000001800220001000000c65e000002000000fe0300010000000008000f00fe000000080006001400000024000900"
    "1000000005000000080005000a000001100000000300000008000500c0000001";
// default dev v2 scope link metric 50
constexpr std::string_view direct =
    "340000001800220001000000c65e000002000000fe03fd010000000008000f00fe0000000800060032000000080004000500000"
    "0";
// default via 192.0.0.192 dev v0 metric 100
constexpr std::string_view viaRouter =
    "3c0000001800220001000000c65e000002000000fe0300010000000008000f00fe000000080006006400000008000500c00000c0"
    "0800040003000000";
// 10.0.0.0/24 dev v2 proto kernel scope link src 10.0.0.2
constexpr std::string_view connected =
    "3c0000001800220001000000c65e000002180000fe02fd010000000008000f00fe000000080001000a000000080007000a000002"
    "0800040005000000";

std::string joined(std::initializer_list<std::string_view> parts) {
    std::string all;
    for (const std::string_view part : parts) {
        all += part;
    }
    return all;
}

// With the next hop's (or the route's) flags set in the captured bytes.
std::string with(std::string_view message, std::size_t byte, std::string_view hex) {
    std::string changed(message);
    return changed.replace(byte * 2, hex.size(), hex);
}

TEST(RoutesTest, DefaultRoutesComeInTheKernelsOrder) {
    const struct {
        const char* what;
        std::string dump;
        std::string_view routes;
    } rows[] = {
        {"the lowest metric first, whatever the order of the dump",
         joined({viaRouter, otherTable, connected, direct, twoHops}),
         "link 5 metric 20 via 10.0.0.1; link 5 metric 50; link 3 metric 100 via 192.0.0.192; "},
        {"of equal metrics the first one", joined({direct, with(viaRouter, 40, "32000000")}),
         "link 5 metric 50; link 3 metric 50 via 192.0.0.192; "},
        {"behind one that refuses there is none", joined({viaRouter, refusing}), ""},
        {"before it there are", joined({with(direct, 40, "09000000"), viaRouter, refusing}),
         "link 5 metric 9; "},
        {"a first hop without carrier", with(twoHops, 50, "10"), "link 3 metric 20 via 192.0.0.1; "},
        {"two dead hops", with(with(twoHops, 50, "01"), 66, "01"), ""},
        {"a dead route", with(direct, 24, "01000000"), ""},
        {"a route without carrier", with(direct, 24, "10000000"), ""},
        {"for one kind of traffic only", with(direct, 19, "10"), ""},
        {"a hop with a length of its own making", with(twoHops, 48, "0000"), ""},
        {"a hop that is longer than the row", with(twoHops, 48, "ff00"), ""},
        {"nothing", "", ""},
    };
    for (const auto& row : rows) {
        EXPECT_EQ(describe(defaultRoutesIn(messagesIn(fromHex(row.dump)))), row.routes) << row.what;
    }
}

TEST(RoutesTest, WhatIsCutShortIsNotReadBeyondItsEnd) {
    const Bytes dump = fromHex(joined({twoHops, viaRouter}));
    const std::string whole = describe(defaultRoutesIn(messagesIn(dump)));
    for (std::size_t length = 0; length < dump.size(); ++length) {
        const Bytes cut(dump.begin(), dump.begin() + static_cast<std::ptrdiff_t>(length));
        EXPECT_TRUE(whole.starts_with(describe(defaultRoutesIn(messagesIn(cut))))) << length;
    }
    for (std::size_t size = 0; size < dump.size() - NLMSG_HDRLEN; ++size) {
        nlmsghdr header{};
        header.nlmsg_type = RTM_NEWROUTE;
        const Bytes payload(dump.begin() + NLMSG_HDRLEN,
                            dump.begin() + static_cast<std::ptrdiff_t>(NLMSG_HDRLEN + size));
        (void)routeIn(MessageView(header, payload));
        header.nlmsg_type = RTM_NEWLINK;
        (void)linkIn(MessageView(header, payload));
    }
}

}  // namespace
}  // namespace live_test
