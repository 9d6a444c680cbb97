// The engine and the direct agent on the kernel of a private network.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <fstream>
#include <iostream>
#include <sstream>

#include "platform/apply/Apply.h"
#include "platform/apply/StateFile.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"
#include "tests/unit/apply/StandInSupplicant.h"
#include "tests/unit/support/Interrupted.h"
#include "tests/unit/support/PrivateNetwork.h"
#include "tests/unit/support/Transcript.h"

namespace platform::apply {
namespace {

using testing_support::PrivateNetwork;
using testing_support::shell;
using Inputs = testing_support::Transcript::Inputs;

// Everything that ip tells of the interfaces, but what counts or comes by itself: lifetimes, carriers,
// link-local and router-advertised things; and what stands under the name of the name servers' file.
std::string machineState() {
    std::istringstream all(
        shell("ip addr show; ip -4 route show table all; ip -6 route show table all;"
              "cat /etc/resolv.conf; stat -c '%A %u %N' /etc/resolv.conf; ls /etc || true"));
    std::string state;
    for (std::string line; std::getline(all, line);) {
        const auto has = [&line](const char* text) { return line.find(text) != std::string::npos; };
        if (has("valid_lft") || has("scope link \n") || has("inet6 fe80") || has("table local") ||
            has("proto ra") || (has("proto kernel") && has("::"))) {
            continue;
        }
        for (const char* word : {"NO-CARRIER,", ",LOWER_UP", ",M-DOWN", " linkdown"}) {
            if (const std::size_t at = line.find(word); at != std::string::npos) {
                line.erase(at, std::string(word).size());
            }
        }
        state += line.substr(0, line.find(" qdisc")) + "\n";
    }
    return state;
}

std::string addressesOf(const std::string& interface) {
    return shell("ip -br -4 addr show dev " + interface + " 2>/dev/null | tr -s ' ' | cut -d' ' -f3-");
}

std::string defaultRoutes() {
    return shell("ip route show default | sed 's/ linkdown//'");
}

// What is kept of the time before, and the DHCP clients that still run.
std::string kept() {
    return shell(
        "ls /run/location-assistant | grep -v -e lock$ -e new$ || true;"
        "grep -l '[u]dhcpc' /proc/[0-9]*/cmdline 2>/dev/null || true");
}

// What a commit that changes nothing asks for: why it failed.
std::string activate(CFDictionaryRef root) {
    return applyTree(root, root).reason();
}

class DirectAgentTest : public testing_support::PrivateNetworkTest {
  protected:
    // Two cards, each with the other end of its cable up. What is logged is shown, and kept in /run/log.
    static void run(const std::function<void()>& body) {
        PrivateNetwork::run([&body] {
            Host host;
            host.dhcpHook = LA_DHCP_HOOK;
            host.dhcpClient = "/run/client";
            const HostOverride override(host);
            const LogCapture log([](LogLevel, std::string_view text) {
                std::cout << "log: " << text << "\n";
                std::ofstream("/run/log", std::ios::app) << text << "\n";
            });
            for (const std::string n : {"0", "1"}) {
                shell("ip link add card" + n + " type veth peer name far" + n + "; ip link set far" + n +
                      " up");
            }
            body();
        });
    }
    // What the body gives back, which is all that comes out of there.
    static std::string seen(const std::function<std::string()>& body) {
        FILE* const file = tmpfile();
        run([&] {
            const std::string text = body();
            EXPECT_EQ(text.size(), fwrite(text.data(), 1, text.size(), file));
        });
        rewind(file);
        std::string text(4096, '\0');
        text.resize(fread(text.data(), 1, text.size(), file));
        fclose(file);
        std::ranges::replace(text, '\n', ';');
        return text;
    }
    static std::string log() { return shell("cat /run/log 2>/dev/null; rm -f /run/log"); }
};

values::Owned<CFDictionaryRef> thereTree(const std::string& address = "192.0.0.199") {
    Service card0 = fixedService("card0", address);
    card0.entries += "DNS = {ServerAddresses = (192.0.0.53)};";
    return makeTree({{"card1", switchedOff}, card0, {"missing", switchedOff}});
}

TEST_F(DirectAgentTest, GivesBackEveryEarlierState) {
    testing_support::Transcript("earlier_states").replay("the machine's commands", [](const Inputs& inputs) {
        run([&inputs] {
            shell(inputs[0]);
            const std::string before = machineState();
            const auto there = thereTree();
            EXPECT_EQ("", activate(there.get()));
            const std::string made = machineState();
            EXPECT_EQ("192.0.0.199/24 \n", addressesOf("card0"));
            EXPECT_EQ("192.0.0.192 dev card0 src 192.0.0.199 uid 0 \n    cache \n",
                      shell("ip route get 192.0.0.192"));
            EXPECT_EQ("default via 192.0.0.192 dev card0 proto 76 \n", defaultRoutes());
            EXPECT_EQ("nameserver 192.0.0.53\n1\n600\n",
                      shell("grep -v '^#' /etc/resolv.conf; cat /proc/sys/net/ipv6/conf/card0/disable_ipv6;"
                            "stat -c %a /run/location-assistant/applied.plist"));
            EXPECT_EQ("", shell("ip -br addr show up dev card1"));
            EXPECT_EQ("", activate(there.get()));
            EXPECT_EQ(made, machineState());
            EXPECT_EQ("", activate(makeTree({}).get()));
            EXPECT_EQ(before, machineState());
            EXPECT_EQ("", log());
        });
        return HasFailure() ? "not given back" : "given back";
    });
}

// The process ends before every single step of going there, elsewhere and back; the next run goes on, or
// comes back at once.
TEST_F(DirectAgentTest, AProcessThatEndsAnywhereLeavesTheWayBack) {
    const auto back = makeTree({});
    const auto there = thereTree();
    const auto elsewhere = thereTree("192.0.0.200");
    const struct {
        CFDictionaryRef from, to;
        bool isGoingOn;
    } rows[] = {{back.get(), there.get(), true},
                {back.get(), there.get(), false},
                {there.get(), elsewhere.get(), false},
                {there.get(), back.get(), false}};
    for (const auto& row : rows) {
        run([&row, &back] {
            shell(
                "ip addr add 10.1.0.5/24 dev card0; ip addr add 10.1.0.6/24 dev card0; ip link set card0 up;"
                "ip addr add 10.2.0.5/24 dev card1; ip link set card1 up;"
                "ip route add default via 10.1.0.1 metric 9; ip route append default via 10.2.0.1 metric 9;"
                "ip -6 addr add 2001:db8::5/64 dev card0 nodad; echo nameserver 9.9.9.9 > /etc/resolv.conf");
            const std::string before = machineState();
            EXPECT_EQ("", activate(row.to));
            const std::string made = machineState();
            EXPECT_EQ("", activate(back.get()));
            bool wasEnded = true;
            int step = 0;
            for (; wasEnded && !testing::Test::HasFailure(); ++step) {
                SCOPED_TRACE("step " + std::to_string(step));
                EXPECT_EQ("", row.from == back.get() ? "" : activate(row.from));
                wasEnded = testing_support::endBeforeStep(step, [&row] { (void)activate(row.to); });
                if (row.isGoingOn) {
                    EXPECT_EQ("", activate(row.to));
                    EXPECT_EQ(made, machineState());
                }
                EXPECT_EQ("", activate(back.get()));
                EXPECT_EQ(before, machineState());
                EXPECT_EQ("", kept());
            }
            EXPECT_GT(step, 20);
        });
    }
}

// What somebody does meanwhile, and what the interfaces are when the same location is made so again, or after
// the way back.
TEST_F(DirectAgentTest, LooksAtTheMachineAgain) {
    testing_support::Transcript transcript("meanwhile");
    for (const bool isAgain : {true, false}) {
        transcript.replay(isAgain ? "made so again" : "given back", [isAgain](const Inputs& inputs) {
            return seen([&] {
                shell(
                    "ip addr add 10.1.0.5/24 dev card0; ip link set card0 up;"
                    "ip route add default via 10.1.0.1");
                const auto there = thereTree();
                EXPECT_EQ("", activate(there.get()));
                const std::string made = machineState();
                shell(inputs[0]);
                EXPECT_NE(made, machineState());
                EXPECT_EQ("", activate(isAgain ? there.get() : makeTree({}).get()));
                EXPECT_EQ(made == machineState(), isAgain);
                EXPECT_TRUE(isAgain || kept().empty());
                return shell("ip -br link show up dev card1 | cut -d' ' -f1") + addressesOf("card0") +
                       defaultRoutes();
            });
        });
    }
}

TEST_F(DirectAgentTest, KeepsWhatAWayBackNeedsUntilItIsBack) {
    run([] {
        shell(
            "echo nameserver 9.9.9.9 >/run/outer; touch /etc/resolv.conf; mount --bind /run/outer "
            "/etc/resolv.conf");
        const std::string before = machineState();
        EXPECT_EQ("", activate(thereTree().get()));
        shell("mount -o remount,bind,ro /etc/resolv.conf");
        EXPECT_EQ("cannot open /etc/resolv.conf: Read-only file system", activate(makeTree({}).get()));
        shell("mount -o remount,bind,rw /etc/resolv.conf");
        EXPECT_EQ("", activate(makeTree({}).get()));
        EXPECT_EQ(before + kept(), machineState());
    });
}

// A DHCP client that does what the test writes into /run/offer, once each; $hook is the program that it
// calls.
const char* const client = R"(#!/bin/sh
echo "$*" >/run/arguments
hook=$7
trap '"$hook" deconfig; exit' TERM
while :; do
    if mv /run/offer /run/taken 2>/dev/null; then . /run/taken; rm /run/taken; fi
    sleep 0.02
done
)";

values::Owned<CFDictionaryRef> dhcpTree(const std::string& dns) {
    return makeTree({{"card0", "IPv4 = {ConfigMethod = DHCP; DHCPClientID = me}; DNS = {" + dns + "};"}});
}

// Steps: a shell's commands behind "sh", the client's next ones behind "offer", "there" with an entity for
// the name servers, and "back", after which the machine has to be as it was.
TEST_F(DirectAgentTest, FollowsItsDhcpClient) {
    run([] {
        std::ofstream("/run/client") << client;
        chmod("/run/client", 0700);
        shell("ip link set card0 up; echo nameserver 9.9.9.9 >/run/real; ln -s /run/real /etc/resolv.conf");
        const std::string before = machineState();
        testing_support::Transcript("dhcp").playItself([&before](const std::string& step) {
            const std::string name = step.substr(0, step.find(' '));
            const std::string rest = step.substr(std::min(name.size() + 1, step.size()));
            std::string seen;
            if (name == "sh") {
                seen = shell(rest);
            } else if (name == "offer") {
                shell("printf '%s' '" + rest + "' >/run/new; mv /run/new /run/offer");
            } else if (name == "there") {
                // A client that dies leaves its steps behind.
                seen = activate(dhcpTree(rest).get());
                shell(seen.empty() ? "while [ -e /run/offer ] || [ -e /run/taken ]; do sleep 0.02; done"
                                   : "rm -f /run/taken");
                seen += (seen.empty() ? "" : "\n") + addressesOf("card0") + defaultRoutes() +
                        shell("grep -v '^#' /etc/resolv.conf") + log();
            } else {
                seen = activate(makeTree({}).get());
                EXPECT_EQ(before + kept(), machineState());
                seen += log();
            }
            return seen.substr(0, seen.find_last_not_of('\n') + 1);
        });
    });
}

TEST_F(DirectAgentTest, StaysOnTheNetworkThatItJoined) {
    run([] {
        mkdir("/run/wpa_supplicant", 0700);
        StandInSupplicant supplicant("/run/wpa_supplicant/card0");
        supplicant.next = 1;
        supplicant.answers["LIST_NETWORKS"] = "0\tprinter\tany\t[CURRENT]\n";
        supplicant.answers["GET_NETWORK 0"] = "\"location-assistant\"";
        const auto tree = [](const char* address, const char* key) {
            Service service = fixedService("card0", address);
            service.entries +=
                std::string("AirPort = {PreferredNetwork = printer; AuthPassword = <") + key + ">};";
            return makeTree({service});
        };
        const char* const key = "00310032003300340035003600370038";
        const char* const otherKey = "00320032003300340035003600370038";
        const struct {
            const char *address, *key;
            int number;
            bool isJoined;
        } rows[] = {{"192.0.0.1", key, 1, true},
                    {"192.0.0.2", key, 0, false},
                    {"192.0.0.2", otherKey, 2, true},
                    {"192.0.0.3", "0066", 0, true}};
        for (const auto& row : rows) {
            supplicant.join(row.number);
            EXPECT_EQ("", activate(tree(row.address, row.key).get()));
            EXPECT_EQ(row.isJoined, !supplicant.changes().empty()) << row.number;
            EXPECT_EQ(std::string(row.address) + "/24 \n", addressesOf("card0"));
        }
        supplicant.answers["STATUS"] = "wpa_state=SCANNING\n";
        EXPECT_EQ("", activate(thereTree().get()));
        EXPECT_EQ(Lines{"REMOVE_NETWORK 0"}, supplicant.changes())
            << "a location without a network leaves it";
    });
}

}  // namespace
}  // namespace platform::apply
