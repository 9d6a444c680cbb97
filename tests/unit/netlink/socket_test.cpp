#include "platform/netlink/Socket.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <string>
#include <vector>

#include "tests/unit/support/PrivateNetwork.h"

namespace platform::netlink {
namespace {

using testing_support::PrivateNetwork;
using testing_support::PrivateNetworkTest;
using testing_support::shell;

std::vector<std::string> linkNames(Socket& socket) {
    std::vector<OwnedMessage> messages;
    const Outcome done = socket.dump(Message(RTM_GETLINK, NLM_F_REQUEST | NLM_F_DUMP, ifinfomsg{}), messages);
    EXPECT_TRUE(done.ok()) << done.reason();
    std::vector<std::string> names;
    for (const OwnedMessage& message : messages) {
        names.emplace_back(message.view().attributes<ifinfomsg>().find(IFLA_IFNAME)->text());
    }
    return names;
}

Message linkCalled(const std::string& name) {
    return std::move(Message(RTM_GETLINK, NLM_F_REQUEST | NLM_F_ACK, ifinfomsg{}).addText(IFLA_IFNAME, name));
}

class SocketTest : public PrivateNetworkTest {};

TEST_F(SocketTest, AsksDumpsAndExplains) {
    PrivateNetwork::run([] {
        shell("ip link add card0 type veth peer name far0");
        Socket socket;
        ASSERT_TRUE(socket.open().ok());
        EXPECT_EQ((std::vector<std::string>{"lo", "far0", "card0"}), linkNames(socket));
        OwnedMessage answer;
        EXPECT_TRUE(socket.ask(linkCalled("card0"), answer).ok());
        EXPECT_EQ(3, answer.view().family<ifinfomsg>()->ifi_index);
        EXPECT_TRUE(socket.ask(linkCalled("none"), answer, {ENODEV}).ok());
        EXPECT_EQ(0, answer.header.nlmsg_type);
        EXPECT_EQ("the kernel refused a netlink request: No such device",
                  socket.request(linkCalled("none")).reason());
    });
}

TEST_F(SocketTest, ReceivesNotices) {
    PrivateNetwork::run([] {
        Socket socket;
        ASSERT_TRUE(socket.open(RTMGRP_IPV4_IFADDR).ok());
        Bytes datagram;
        bool received = true;
        bool overrun = true;
        EXPECT_TRUE(socket.receiveNotices(datagram, received, overrun).ok());
        EXPECT_FALSE(received || overrun);
        shell("ip addr add 10.0.0.1/8 dev lo");
        EXPECT_TRUE(socket.receiveNotices(datagram, received, overrun).ok());
        ASSERT_TRUE(received);
        ByteView rest = datagram;
        EXPECT_EQ(RTM_NEWADDR, takeMessage(rest)->type());
    });
}

}  // namespace
}  // namespace platform::netlink
