// The live state on a real kernel, in a network namespace of the test's own.
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "tests/unit/live/Fixture.h"
#include "tests/unit/support/PrivateNetwork.h"

namespace live_test {
namespace {

using testing_support::shell;

class KernelNetworkTest : public testing_support::PrivateNetworkTest {
  protected:
    // The body in a namespace with two pairs of links, of which card0 and card1 carry addresses.
    static void run(const std::function<void()>& body) {
        testing_support::PrivateNetwork::run([&body] {
            const testing_support::TemporaryDirectory directory;
            platform::Host made;
            made.preferencesDirectory = directory.at("store");
            const platform::HostOverride host(made);
            for (const char* card : {"0", "1"}) {
                const std::string number = card;
                shell("ip link add card" + number + " type veth peer name other" + number);
                shell("ip link set other" + number + " up && ip link set card" + number + " up");
                shell("ip address add 10.0." + number + ".2/24 dev card" + number);
            }
            // The carrier comes a moment later, and with it the routes of IPv6.
            waitForOutput("ip -6 route show fe80::/64 dev card0");
            body();
        });
    }

    // For what the kernel does a moment later.
    static void waitForOutput(const std::string& command) {
        for (int i = 0; i < 500 && shell(command).empty(); ++i) {
            usleep(10'000);
        }
    }
};

std::string overCard(const std::string& card, const std::string& router = "") {
    return "{PrimaryInterface = card" + card + (router.empty() ? "" : "; Router = " + router) + "}";
}

TEST_F(KernelNetworkTest, TheGlobalStateFollowsTheDefaultRoute) {
    run([] {
        const struct {
            const char* command;
            std::string state;
        } steps[] = {
            {"true", "status 1004"},
            {"ip route add default via 10.0.1.1 dev card1 metric 200", overCard("1", "10.0.1.1")},
            {"ip route add default dev card0 metric 100", overCard("0")},
            {"ip route add default via 10.0.1.7 metric 300", overCard("0")},
            {"ip route add default via 10.0.1.9 table 99", overCard("0")},
            {"ip route add default via 10.0.1.9 tos 0x10 metric 1", overCard("0")},
            {"ip route add default metric 50 nexthop via 10.0.0.5 dev card0 nexthop via 10.0.1.5 dev card1",
             overCard("0", "10.0.0.5")},
            {"ip link set other0 down", overCard("1", "10.0.1.5")},
            {"ip link set other0 up", overCard("0", "10.0.0.5")},
            {"ip route del default metric 50", overCard("0")},
            {"ip link set other0 down", overCard("1", "10.0.1.1")},
            {"ip link set other0 up", overCard("0")},
            {"ip link set card0 down", overCard("1", "10.0.1.1")},
            {"ip link set card1 name card5", overCard("5", "10.0.1.1")},
            {"ip route add blackhole default metric 7", "status 1004"},
            {"ip route del blackhole default metric 7", overCard("5", "10.0.1.1")},
            {"ip link del card5", "status 1004"},
        };
        Watcher watcher(onlyGlobal);
        std::string before = "status 1004";
        for (const auto& step : steps) {
            SCOPED_TRACE(step.command);
            watcher.notices.clear();
            shell(step.command);
            watcher.waitFor(before == step.state ? 0 : 1);
            EXPECT_EQ(valueAt(openStore().get(), globalKey), step.state);
            EXPECT_EQ(watcher.notices.empty() ? "" : watcher.notices.back(),
                      before == step.state ? "" : global + step.state);
            before = step.state;
        }
    });
}

TEST_F(KernelNetworkTest, ARouteThatGoesWithSomethingElseIsNoticed) {
    run([] {
        const struct {
            const char* come;
            const char* go;
        } rows[] = {
            {"ip address add 10.0.0.50/32 dev card0 && ip route add default dev card0 src 10.0.0.50",
             "ip address del 10.0.0.50/32 dev card0"},
            {"ip nexthop add id 7 via 10.0.0.1 dev card0 && ip route add default nhid 7",
             "ip nexthop del id 7"},
        };
        for (const auto& row : rows) {
            shell(row.come);
            Watcher watcher(onlyGlobal);
            shell(row.go);
            watcher.waitFor(1);
            EXPECT_EQ(watcher.notices, std::vector<std::string>{global + "status 1004"}) << row.go;
        }
    });
}

// What the kernel could not deliver to our sockets for want of room: the ninth of a row's ten fields.
unsigned long droppedNotices() {
    std::ifstream table("/proc/net/netlink");
    unsigned long dropped = 0;
    std::string word;
    for (int field = 0; table >> word; ++field) {
        dropped += field > 10 && field % 10 == 8 ? std::stoul(word) : 0;
    }
    return dropped;
}

TEST_F(KernelNetworkTest, TenThousandChangesUnreadAreSurvived) {
    run([] {
        shell("ip route add default via 10.0.0.1");
        Watcher watcher(onlyGlobal);
        const testing_support::TemporaryDirectory directory;
        std::string batch;
        for (int i = 0; i < 5000; ++i) {
            const std::string address = "10.7." + std::to_string(i / 100 % 250) + "." +
                                        std::to_string(i % 100 + 1) + "/24 dev card1\n";
            batch += "address add " + address + "address del " + address;
        }
        batch += "route del default\nroute add default via 10.0.1.1\n";
        shell("ip -batch " + directory.write("batch", batch));
        EXPECT_GT(droppedNotices(), 0U) << "the socket was not overrun, so this shows nothing";
        watcher.waitFor(1);
        EXPECT_EQ(watcher.calls, 1U);
        EXPECT_EQ(watcher.notices, std::vector<std::string>{global + overCard("1", "10.0.1.1")});
        shell("ip route del default");
        watcher.waitFor(2);
        EXPECT_EQ(watcher.notices.back(), global + "status 1004");
    });
}

TEST_F(KernelNetworkTest, ReachabilityIsTheKernelsAnswer) {
    run([] {
        shell(
            "ip route add 172.16.0.0/24 via 10.0.0.1 && ip route add unreachable 172.16.1.0/24 && "
            "ip address add fd00::2/64 dev card0 nodad && ip -6 route add fd01::/64 via fd00::1 && "
            "ip -6 route add unreachable fd02::/64 && ip address add fd03::2/64 dev card1 nodad && "
            "ip route add 172.16.2.0/24 nexthop via 10.0.1.1 dev card1 nexthop via 10.0.0.1 dev card0");
        waitForOutput("ip -6 route show table local fd00::2");
        using Flags = std::vector<std::pair<const char*, SCNetworkConnectionFlags>>;
        const auto expect = [](const char* when, const Flags& rows) {
            for (const auto& [name, expected] : rows) {
                SCNetworkConnectionFlags flags = 77;
                EXPECT_TRUE(SCNetworkCheckReachabilityByName(name, &flags)) << name << when;
                EXPECT_EQ(flags, expected) << name << when;
            }
        };
        expect("", {{"10.0.0.1", 0x20002},
                    {"10.0.0.2", 0x30002},
                    {"127.0.0.1", 0x30002},
                    {"172.16.0.9", 2},
                    {"172.16.1.9", 0},
                    {"192.0.2.1", 0},
                    {"10.0.0.255", 0},
                    {"224.0.0.1", 0},
                    {"fd00::1", 0x20002},
                    {"fd00::2", 0x30002},
                    {"::1", 0x30002},
                    {"fd01::1", 2},
                    {"fd02::1", 0},
                    {"2001:db8::1", 0},
                    {"10.0.1.1", 0x20002},
                    {"172.16.2.9", 2},
                    {"fd03::1", 0x20002},
                    {"fe80::1%card0", 0x20002}});
        shell("ip link set other1 down");
        waitForOutput("ip route show dev card1 | grep linkdown || true");
        waitForOutput("ip -6 route show dev card1 | grep linkdown || true");
        expect(" without a carrier",
               {{"10.0.1.1", 0}, {"fd03::1", 0}, {"10.0.1.2", 0x30002}, {"172.16.2.9", 2}});
        shell("ip link set card1 down");
        expect(" with the link down", {{"10.0.1.1", 0}, {"fd03::1", 0}});
    });
}

}  // namespace
}  // namespace live_test
