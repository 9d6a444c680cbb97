// The live state on a real kernel, in a network namespace of the test's own.
#include <unistd.h>

#include <array>
#include <cstdio>
#include <fstream>

#include "tests/unit/live/Fixture.h"
#include "tests/unit/support/PrivateNetwork.h"
#include "tests/unit/support/Transcript.h"

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

// Each line is a command line, and whether it changes the state; the outcome is the state behind it.
TEST_F(KernelNetworkTest, TheGlobalStateFollowsTheDefaultRoute) {
    run([] {
        testing_support::Transcript transcript("default_route");
        Watcher watcher(onlyGlobal);
        transcript.replay("the route that counts", [&watcher](const std::vector<std::string>& inputs) {
            const bool isChange = inputs.size() > 1;
            watcher.notices.clear();
            shell(inputs[0]);
            watcher.waitFor(isChange ? 1 : 0);
            const std::string state = valueAt(openStore().get(), globalKey);
            EXPECT_EQ(watcher.notices.empty() ? "" : watcher.notices.back(), isChange ? global + state : "")
                << inputs[0];
            return state;
        });
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
        EXPECT_EQ(watcher.notices,
                  std::vector<std::string>{global + "{PrimaryInterface = card1; Router = 10.0.1.1}"});
        shell("ip route del default");
        watcher.waitFor(2);
        EXPECT_EQ(watcher.notices.back(), global + "status 1004");
    });
}

// A line is a command line, one to wait for until it prints something, or an address whose flags are asked
// for.
TEST_F(KernelNetworkTest, ReachabilityIsTheKernelsAnswer) {
    run([] {
        testing_support::Transcript transcript("reachability");
        transcript.replay("what an address is reached by", [](const std::vector<std::string>& inputs) {
            const std::string& line = inputs[0];
            if (line.starts_with("ip ")) {
                return shell(line);
            }
            if (line.starts_with("until ")) {
                waitForOutput(line.substr(6));
                return std::string();
            }
            SCNetworkConnectionFlags flags = 77;
            EXPECT_TRUE(SCNetworkCheckReachabilityByName(line.c_str(), &flags)) << line;
            std::array<char, 16> text{};
            std::snprintf(text.data(), text.size(), "%#x", flags);
            return std::string(text.data());
        });
    });
}

}  // namespace
}  // namespace live_test
