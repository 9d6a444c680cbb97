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

TEST(Message, LengthsThatLeaveItEndTheWalk) {
    const auto size = static_cast<std::uint32_t>(sizeof(nlmsghdr) + addressBody.size() / 2);
    const std::string whole = toHex(bytesOf(nlmsghdr{size, RTM_NEWADDR, 2, 7, 0})) + addressBody;
    for (std::size_t length = 0; length < whole.size() / 2; ++length) {
        const Bytes part = fromHex(whole.substr(0, length * 2));
        ByteView rest = part;
        EXPECT_FALSE(takeMessage(rest)) << length;
        EXPECT_TRUE(rest.empty());
    }
    const Bytes bytes = fromHex(whole);
    ByteView rest = bytes;
    const auto taken = takeMessage(rest);
    ASSERT_TRUE(taken);
    EXPECT_EQ("card0", taken->attributes<ifaddrmsg>().find(IFA_LABEL)->text());
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
        }
        EXPECT_EQ(row.count, count) << row.attributes;
    }
}

}  // namespace
}  // namespace platform::netlink
