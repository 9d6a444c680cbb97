#include "platform/apply/direct/Kernel.h"

#include <gtest/gtest.h>

#include <bit>
#include <string>
#include <vector>

#include "tests/unit/support/Hexadecimal.h"

namespace platform::apply {
namespace {

using testing_support::fromHex;
using testing_support::toHex;

static_assert(std::endian::native == std::endian::little,
              "the messages below were captured on such a machine");

std::optional<Address> addressIn(const std::string& hex, int index) {
    const netlink::Bytes bytes = fromHex(hex);
    nlmsghdr header{};
    header.nlmsg_type = RTM_NEWADDR;
    return decodeAddress({header, bytes}, index);
}

std::optional<Route> routeIn(const std::string& hex, int index, const std::vector<Address>& addresses = {}) {
    const netlink::Bytes bytes = fromHex(hex);
    nlmsghdr header{};
    header.nlmsg_type = RTM_NEWROUTE;
    return decodeRoute({header, bytes}, index, addresses);
}

// inet 10.1.0.5/24 brd 10.1.0.255 scope global card0
const std::string manual =
    "0218800003000000080001000a010005080002000a010005080004000a0100ff0a00030063617264300000000800080080000000"
    "14000600"
    "ffffffffffffffffe5c20700e5c20700";
// inet 10.1.0.6/24 scope global secondary dynamic card0, valid 599 s, preferred 299 s
const std::string dynamic =
    "0218010003000000080001000a010006080002000a0100060a00030063617264300000000800080001000000140006002b010000"
    "57020000"
    "e5c20700e5c20700";
// inet6 fe80::ccf9:68ff:fe63:3150/64 scope link tentative, made by the kernel
const std::string linkLocal =
    "0a40c0fd0300000014000100fe80000000000000ccf968fffe63315014000600ffffffffffffffffe4c20700e4c2070008000800"
    "c0000000"
    "05000b0003000000";
// inet6 2001:db8::5/64 scope global nodad
const std::string global =
    "0a408200030000001400010020010db800000000000000000000000514000600ffffffffffffffffe5c20700e5c2070008000800"
    "82000000";

TEST(Kernel, ReadsAddresses) {
    const auto first = addressIn(manual, 3);
    ASSERT_TRUE(first);
    EXPECT_EQ(makeAddress("card0", {0x0500010AU, 24}).key, first->key);
    EXPECT_EQ(forever, first->valid);
    const auto second = addressIn(dynamic, 3);
    ASSERT_TRUE(second);
    EXPECT_EQ(599U, second->valid);
    EXPECT_EQ(299U, second->preferred);
    EXPECT_FALSE(second->comesByItself);
    EXPECT_TRUE(addressIn(linkLocal, 3)->comesByItself);
    EXPECT_FALSE(addressIn(global, 3)->comesByItself);

    EXPECT_FALSE(addressIn(manual, 4));
    EXPECT_FALSE(addressIn(manual.substr(0, 14), 3));
    // What changes while it stays the same address is no part of it: secondary, tentative, lifetimes.
    std::string older = dynamic;
    older.replace(older.find("2b010000"), 8, "01000000").replace(older.find("57020000"), 8, "02000000");
    older.replace(4, 2, "00").replace(older.find("0800080001000000") + 8, 8, "00000000");
    EXPECT_EQ(second->key, addressIn(older, 3)->key);
}

TEST(Kernel, ReadsRoutes) {
    // default via 10.1.0.1 dev card0 metric 100
    const std::string byMetric =
        "02000000fe0300010000000008000f00fe0000000800060064000000080005000a0100010800040003000000";
    // 10.1.0.0/24 dev card0 proto kernel scope link src 10.1.0.5
    const std::string connected =
        "02180000fe02fd010000000008000f00fe000000080001000a010000080007000a0100050800040003000000";
    // 10.8.0.0/16 nexthop via 10.1.0.1 dev card0 nexthop via 10.2.0.1 dev card1
    const std::string shared =
        "02100000fe0300010000000008000f00fe000000080001000a080000240009001000000003000000080005000a0100011000"
        "0000050000"
        "00080005000a020001";
    // local 10.1.0.5 dev card0 table local proto kernel scope host src 10.1.0.5
    const std::string local =
        "02200000ff02fe020000000008000f00ff000000080001000a010005080007000a0100050800040003000000";
    // 2001:db8::/64 dev card0 proto kernel metric 256
    const std::string connected6 =
        "0a400000fe0200010000000008000f00fe0000001400010020010db800000000000000000000000008000600000100000800"
        "04000300000"
        "024000c0000000000000000000000000000000000000000000000000000000000000000000500140000000000";
    const auto route = routeIn(byMetric, 3);
    ASSERT_TRUE(route);
    EXPECT_TRUE(route->hasGateway());
    EXPECT_FALSE(route->isShared || route->comesByItself);
    EXPECT_FALSE(routeIn(byMetric, 5));
    EXPECT_FALSE(routeIn(local, 3));
    EXPECT_FALSE(routeIn(connected, 3)->hasGateway());
    EXPECT_TRUE(routeIn(connected6, 3)->comesByItself);
    EXPECT_TRUE(routeIn(shared, 3)->isShared);
    EXPECT_TRUE(routeIn(shared, 5));
    EXPECT_FALSE(routeIn(shared, 4));
    // A dead hop is the same route.
    std::string dead = shared;
    dead.replace(dead.find("1000000005000000"), 8, "10000100");
    EXPECT_EQ(routeIn(shared, 3)->key, routeIn(dead, 3)->key);
    // Through another interface, but from an address of this one.
    EXPECT_TRUE(routeIn(connected, 9, {*addressIn(manual, 3)})->isElsewhere);
    EXPECT_FALSE(routeIn(connected, 9, {*addressIn(dynamic, 3)}));
}

TEST(Kernel, MakesTheWayToTheRouter) {
    const auto near = makeDefaultRoute(0xC00000C0U, 0, {{0xC70000C0U, 24}});
    ASSERT_EQ(1U, near.size());
    EXPECT_EQ(
        "02000000fe4c00010000000008000400000000000800050"
        "0c00000c008000f00fe000000",
        toHex(near[0].key));
    const auto far = makeDefaultRoute(0xC00000C0U, 2, {{0xC70000C0U, 32}, {0x0100000AU, 8}});
    ASSERT_EQ(2U, far.size());
    EXPECT_EQ(
        "02200000fe4cfd0100000000080001"
        "00c00000c0080004000000000008000600"
        "0200000008000f00fe000000",
        toHex(far[0].key));
    EXPECT_TRUE(makeDefaultRoute(0, 0, {{1, 24}}).empty());
    EXPECT_TRUE(makeDefaultRoute(1, 0, {}).empty());
}

}  // namespace
}  // namespace platform::apply
