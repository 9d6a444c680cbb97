#include "platform/netlink/Socket.h"

#include <gtest/gtest.h>
#include <sys/socket.h>

#include <cerrno>
#include <string>
#include <vector>

#include "platform/netlink/Generic.h"
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
        EXPECT_EQ(ENODEV, socket.error());
        ifinfomsg odd{};
        odd.ifi_type = 1;
        EXPECT_EQ(
            "the kernel refused a netlink request (Invalid values in header for get link request): "
            "Invalid argument",
            socket.request(Message(RTM_GETLINK, NLM_F_REQUEST | NLM_F_ACK, odd)).reason());
    });
}

TEST_F(SocketTest, TakesNoticesAndFindsFamilies) {
    PrivateNetwork::run([] {
        Socket socket;
        bool overrun = true;
        ASSERT_TRUE(socket.open().ok());
        ASSERT_TRUE(socket.joinGroup(RTNLGRP_IPV4_IFADDR).ok());
        EXPECT_TRUE(socket.takeNotices(overrun).empty());
        shell("ip addr add 10.0.0.1/8 dev lo");
        const std::vector<OwnedMessage> notices = socket.takeNotices(overrun);
        ASSERT_EQ(1U, notices.size());
        EXPECT_EQ(RTM_NEWADDR, notices[0].view().type());
        EXPECT_FALSE(overrun);
        // A notice that is there is no answer.
        OwnedMessage answer;
        shell("ip addr add 10.0.0.2/8 dev lo");
        EXPECT_TRUE(socket.ask(linkCalled("none"), answer, {ENODEV}).ok());
        EXPECT_EQ(0, answer.header.nlmsg_type);
        const int smallest = 1;
        setsockopt(socket.descriptor(), SOL_SOCKET, SO_RCVBUF, &smallest, sizeof smallest);
        shell("for n in 3 4 5 6 7 8 9; do ip addr add 10.0.0.$n/8 dev lo; done");
        EXPECT_GT(7U, socket.takeNotices(overrun).size());
        EXPECT_TRUE(overrun);

        std::optional<GenericFamily> family;
        ASSERT_TRUE(socket.openGeneric().ok());
        EXPECT_TRUE(findFamily(socket, "nlctrl", family).ok());
        ASSERT_TRUE(family);
        EXPECT_EQ(GENL_ID_CTRL, family->type);
        ASSERT_EQ(1U, family->groups.count("notify"));
        EXPECT_TRUE(socket.joinGroup(family->groups["notify"]).ok());
        EXPECT_TRUE(findFamily(socket, "nobody", family).ok());
        EXPECT_FALSE(family);
    });
}

}  // namespace
}  // namespace platform::netlink
