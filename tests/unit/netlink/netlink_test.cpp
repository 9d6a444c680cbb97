#include <gtest/gtest.h>
#include <sys/socket.h>

#include <array>
#include <bit>
#include <cerrno>
#include <sstream>
#include <string>
#include <utility>
#include <vector>

#include "platform/netlink/Generic.h"
#include "platform/netlink/Link.h"
#include "platform/netlink/Socket.h"
#include "tests/unit/support/Hexadecimal.h"
#include "tests/unit/support/PrivateNetwork.h"
#include "tests/unit/support/Transcript.h"

namespace platform::netlink {
namespace {

using testing_support::fromHex;
using testing_support::shell;
using testing_support::toHex;

static_assert(std::endian::native == std::endian::little,
              "the messages below were captured on such a machine");

using Inputs = testing_support::Transcript::Inputs;

// "type flags sequence" and the payload's digits.
std::string told(const Message& message) {
    const nlmsghdr& header = message.header();
    return std::to_string(header.nlmsg_type) + " " + std::to_string(header.nlmsg_flags) + " " +
           std::to_string(header.nlmsg_seq) + " " + toHex(message.payload());
}

// A datagram of messages that are noted so, "-" for no payload.
Bytes datagramIn(const std::string& line) {
    Bytes datagram;
    std::istringstream words(line);
    std::uint16_t type = 0, flags = 0;
    std::uint32_t sequence = 0;
    for (std::string payload; words >> type >> flags >> sequence >> payload;) {
        Message message(type, flags, ByteView(fromHex(payload)));
        message.setSequence(sequence);
        std::ranges::copy(message.bytes(), std::back_inserter(datagram));
    }
    return datagram;
}

// Behind a fixed part of three bytes and one of padding: their numbers, digits and texts.
std::string attributesIn(const Inputs& lines) {
    const Bytes bytes = fromHex(lines[0]);
    const Attributes attributes = attributesBehind<std::array<char, 3>>(bytes);
    std::string text;
    for (const Attribute& each : attributes) {
        const bool isFirst = attributes.find(each.type)->payload.data() == each.payload.data();
        text += std::to_string(each.type) + "=" + toHex(each.payload) + " \"" +
                testing_support::escaped(each.text()) + "\"" + (each.as<std::uint32_t>() ? " u32" : "") +
                (isFirst ? ", " : " again, ");
    }
    return text + "end";
}

// Next hops up to the first one that goes over interface 9; each is led over 7.
std::string hopsIn(Bytes hops) {
    std::string text;
    forEachHop(hops, [&text](rtnexthop& hop, const Attributes& parts) {
        text += std::to_string(hop.rtnh_ifindex) + " " + std::to_string(parts.u32(RTA_GATEWAY).value_or(0)) +
                ", ";
        return std::exchange(hop.rtnh_ifindex, 7) != 9;
    });
    return text + toHex(hops);
}

// To request 7, of which ENOENT is tolerated.
std::string answersIn(const Inputs& datagrams) {
    Answers answers{.sequence = 7, .tolerated = {ENOENT}};
    std::string text;
    for (const std::string& datagram : datagrams) {
        answers.take(datagramIn(datagram));
    }
    for (const Message& message : answers.messages) {
        text += told(message) + ", ";
    }
    return text + (answers.isInterrupted ? "interrupted, " : "") + "error " + std::to_string(answers.error) +
           ", " +
           (!answers.end        ? "goes on"
            : answers.end->ok() ? "done"
                                : answers.end->reason());
}

TEST(Netlink, TakesApartWhatItsTablesSay) {
    testing_support::Transcript transcript("netlink");
    transcript.replay("messages", [](const Inputs& lines) {
        std::string text;
        for (const Message& message : messagesIn(fromHex(lines[0]))) {
            text += (text.empty() ? "" : "; ") + told(message);
        }
        return text.empty() ? "none" : text;
    });
    transcript.replay("attributes", attributesIn);
    transcript.replay("next hops", [](const Inputs& lines) { return hopsIn(fromHex(lines[0])); });
    transcript.replay("answers", answersIn);
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
        // Another process's word is none; the first socket of a process has its number.
        const sockaddr_nl ours{AF_NETLINK, 0, static_cast<std::uint32_t>(getpid()), 0};
        const FileDescriptor other(::socket(AF_NETLINK, SOCK_RAW | SOCK_CLOEXEC, NETLINK_ROUTE));
        EXPECT_LT(0, ::sendto(other.get(), links[0].bytes().data(), links[0].bytes().size(), 0,
                              reinterpret_cast<const sockaddr*>(&ours), sizeof ours));
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
