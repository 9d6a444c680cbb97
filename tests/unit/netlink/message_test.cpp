#include "platform/netlink/Message.h"

#include <gtest/gtest.h>

#include <bit>
#include <string>

#include "tests/unit/support/Hexadecimal.h"

namespace platform::netlink {
namespace {

using testing_support::fromHex;
using testing_support::toHex;

static_assert(std::endian::native == std::endian::little,
              "the messages below were captured on such a machine");

// inet 10.1.0.5/24 brd 10.1.0.255 scope global card0, index 3
const std::string addressBody =
    "0218800003000000080001000a010005080002000a010005080004000a0100ff0a0003006361726430000000080008008000000"
    "0";

std::string withHeader(const std::string& body, std::size_t length) {
    return toHex(bytesOf(nlmsghdr{static_cast<std::uint32_t>(length), RTM_NEWADDR, 2, 7, 0})) + body;
}

TEST(Message, IsBuiltAsTheKernelReadsIt) {
    ifaddrmsg family{};
    family.ifa_family = 2;
    family.ifa_prefixlen = 24;
    family.ifa_flags = 0x80;
    family.ifa_index = 3;
    Message message(RTM_NEWADDR, 2, family);
    message.addValue(IFA_ADDRESS, 0x0500010AU)
        .addValue(IFA_LOCAL, 0x0500010AU)
        .addValue(IFA_BROADCAST, 0xFF00010AU);
    message.addText(IFA_LABEL, "card0");
    message.addValue(IFA_FLAGS, 0x80U);
    message.setSequence(7);
    EXPECT_EQ(withHeader(addressBody, 16 + addressBody.size() / 2), toHex(message.bytes()));
}

TEST(Message, IsTakenApart) {
    const Bytes bytes = fromHex(withHeader(addressBody, 16 + addressBody.size() / 2) + withHeader("02", 17) +
                                "000000" + withHeader(addressBody, 20));
    ByteView rest = bytes;
    const auto first = takeMessage(rest);
    ASSERT_TRUE(first);
    EXPECT_EQ(RTM_NEWADDR, first->type());
    EXPECT_EQ(7U, first->sequence());
    ASSERT_TRUE(first->family<ifaddrmsg>());
    EXPECT_EQ(24, first->family<ifaddrmsg>()->ifa_prefixlen);
    const Attributes attributes = first->attributes<ifaddrmsg>();
    EXPECT_EQ("card0", attributes.find(IFA_LABEL)->text());
    EXPECT_EQ(0x80U, attributes.find(IFA_FLAGS)->u32());
    EXPECT_FALSE(attributes.find(IFA_FLAGS)->u8());
    EXPECT_FALSE(attributes.find(IFA_CACHEINFO));
    const auto second = takeMessage(rest);
    ASSERT_TRUE(second);
    EXPECT_FALSE(second->family<ifaddrmsg>());
    EXPECT_EQ(second->attributes<ifaddrmsg>().begin(), std::default_sentinel);
    EXPECT_EQ(4U, takeMessage(rest)->payload().size());
}

TEST(Message, LengthsThatLeaveItEndTheWalk) {
    const std::string whole = withHeader(addressBody, 16 + addressBody.size() / 2);
    for (std::size_t length = 0; length < whole.size() / 2; ++length) {
        const Bytes bytes = fromHex(whole.substr(0, length * 2));
        ByteView rest = bytes;
        EXPECT_FALSE(takeMessage(rest)) << length;
        EXPECT_TRUE(rest.empty());
    }
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
        const Bytes bytes = fromHex(row.attributes);
        int count = 0;
        for (const Attribute& attribute : Attributes(bytes)) {
            EXPECT_EQ(attribute.type, ++count);
        }
        EXPECT_EQ(row.count, count) << row.attributes;
    }
}

}  // namespace
}  // namespace platform::netlink
