#include <gtest/gtest.h>

#include <bit>
#include <cerrno>
#include <string>
#include <vector>

#include "platform/netlink/Generic.h"
#include "platform/netlink/Link.h"
#include "platform/netlink/Socket.h"
#include "tests/unit/support/Hexadecimal.h"
#include "tests/unit/support/PrivateNetwork.h"

namespace platform::netlink {
namespace {

using testing_support::fromHex;
using testing_support::shell;
using testing_support::toHex;

static_assert(std::endian::native == std::endian::little,
              "the messages below were captured on such a machine");

// inet 10.1.0.5/24 brd 10.1.0.255 scope global card0, index 3
const std::string addressBody =
    "0218800003000000080001000a010005080002000a010005080004000a0100ff0a0003006361726430000000080008008000000"
    "0";

TEST(Message, LengthsThatLeaveItEndTheWalk) {
    const auto size = static_cast<std::uint32_t>(sizeof(nlmsghdr) + addressBody.size() / 2);
    const std::string whole = toHex(bytesOf(nlmsghdr{size, RTM_NEWADDR, 2, 7, 0})) + addressBody;
    for (std::size_t length = 0; length < whole.size() / 2; ++length) {
        EXPECT_TRUE(messagesIn(fromHex(whole.substr(0, length * 2))).empty()) << length;
    }
    const std::vector<Message> taken = messagesIn(fromHex(whole + whole));
    ASSERT_EQ(2U, taken.size());
    EXPECT_EQ("card0", taken[1].attributes<ifaddrmsg>().find(IFA_LABEL)->text());
    EXPECT_EQ(addressBody, toHex(taken[1].payload()));
    EXPECT_FALSE(taken[1].attributes<ifaddrmsg>().u32(IFA_LABEL)) << "six bytes";
    const struct {
        const char* attributes;
        int count;
    } rows[] = {
        {"", 0},
        {"0800", 0},
        {"00000100", 0},                  // a length of nothing would never end
        {"03000100", 0},                  // shorter than its own header
        {"0400010004000200", 2},          // two without a value
        {"05000100aa00000008000200", 1},  // the second one leaves the row
        {"05000180aa", 1},                // flag bits in the type, no padding at the end
    };
    for (const auto& row : rows) {
        const Bytes attributes = fromHex(row.attributes);
        int count = 0;
        for (const Attribute& attribute : Attributes(attributes)) {
            EXPECT_EQ(attribute.type, ++count);
            EXPECT_FALSE(attribute.as<std::uint32_t>());
        }
        EXPECT_EQ(row.count, count) << row.attributes;
    }
    // Next hops: one with a gateway over interface 3, one that leaves the row, one shorter than its header.
    for (const char* const broken : {"0900000004000000", "0700000004000000", "08000000"}) {
        Bytes hops = fromHex(std::string("1000000003000000080005000a010001") + broken);
        std::vector<int> seen;
        forEachHop(hops, [&seen](rtnexthop& hop, const Attributes& parts) {
            EXPECT_EQ(0x0100010AU, parts.u32(RTA_GATEWAY));
            seen.push_back(hop.rtnh_ifindex);
            hop.rtnh_ifindex = 9;
            return true;
        });
        EXPECT_EQ(std::vector<int>{3}, seen);
        EXPECT_EQ(std::string("1000000009000000080005000a010001") + broken, toHex(hops));
    }
}

class SocketTest : public testing_support::PrivateNetworkTest {};

TEST_F(SocketTest, AsksDumpsExplainsAndTakesNotices) {
    testing_support::PrivateNetwork::run([] {
        shell("ip link add card0 type veth peer name far0; ip link set card0 up");
        Socket socket;
        ASSERT_TRUE(socket.open().ok());
        std::vector<Message> links;
        EXPECT_TRUE(socket.dump(Message(RTM_GETLINK, NLM_F_REQUEST | NLM_F_DUMP, ifinfomsg{}), links).ok());
        EXPECT_TRUE(socket.dump(Message(RTM_GETLINK, NLM_F_REQUEST | NLM_F_DUMP, ifinfomsg{}), links).ok());
        EXPECT_EQ(3U, links.size());
        std::optional<Link> link;
        EXPECT_TRUE(findLink(socket, "card0", link).ok());
        EXPECT_TRUE(link && link->index == 3 && link->up && !link->running);
        EXPECT_TRUE(findLink(socket, 2, link).ok());
        EXPECT_TRUE(link && !link->up);
        shell("ip link set far0 up");
        EXPECT_TRUE(findLink(socket, 2, link).ok());
        EXPECT_TRUE(link && link->name == "far0" && link->running);
        ifinfomsg odd{};
        odd.ifi_type = 1;
        EXPECT_EQ(
            "the kernel refused a netlink request (Invalid values in header for get link request): "
            "Invalid argument",
            socket.request(Message(RTM_GETLINK, NLM_F_REQUEST | NLM_F_ACK, odd)).reason());
        EXPECT_EQ(EINVAL, socket.error());

        bool overrun = true;
        ASSERT_TRUE(socket.joinGroup(RTNLGRP_IPV4_IFADDR).ok());
        EXPECT_TRUE(socket.takeNotices(overrun).empty());
        shell("ip addr add 10.0.0.1/8 dev lo; ip addr add 10.0.0.2/8 dev lo");
        EXPECT_EQ(2U, socket.takeNotices(overrun).size());
        EXPECT_FALSE(overrun);
        shell("ip addr del 10.0.0.2/8 dev lo");
        Message answer = links[0];
        Message question(RTM_GETLINK, NLM_F_REQUEST | NLM_F_ACK, ifinfomsg{});
        EXPECT_TRUE(socket.ask(question.addText(IFLA_IFNAME, "none"), answer, {ENODEV}).ok());
        EXPECT_EQ(0, answer.type()) << "a notice that is there is no answer";
        EXPECT_EQ(ENODEV, socket.error());
    });
}

TEST_F(SocketTest, TellsOfLostNoticesAndFindsFamilies) {
    testing_support::PrivateNetwork::run([] {
        Socket socket;
        std::optional<GenericFamily> family;
        ASSERT_TRUE(socket.openGeneric().ok());
        EXPECT_TRUE(findFamily(socket, "nlctrl", family).ok());
        ASSERT_TRUE(family);
        EXPECT_EQ(GENL_ID_CTRL, family->type);
        ASSERT_EQ(1U, family->groups.count("notify"));
        EXPECT_TRUE(socket.joinGroup(family->groups["notify"]).ok());
        EXPECT_TRUE(findFamily(socket, "nobody", family).ok());
        EXPECT_FALSE(family);

        bool overrun = false;
        ASSERT_TRUE(socket.open().ok());
        ASSERT_TRUE(socket.joinGroup(RTNLGRP_IPV4_IFADDR).ok());
        shell(
            "for n in $(seq 2000); do echo addr add 10.0.0.1/8 dev lo; echo addr del 10.0.0.1/8 dev lo; done "
            "|"
            "ip -batch -");
        EXPECT_FALSE(socket.takeNotices(overrun).empty());
        EXPECT_TRUE(overrun);
    });
}

}  // namespace
}  // namespace platform::netlink
