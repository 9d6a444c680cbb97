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

namespace platform::apply {
namespace {

using testing_support::PrivateNetwork;
using testing_support::shell;

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
    static std::string log() { return shell("cat /run/log 2>/dev/null; rm -f /run/log"); }
};

values::Owned<CFDictionaryRef> thereTree(const std::string& address = "192.0.0.199") {
    Service card0 = fixedService("card0", address);
    card0.entries += "DNS = {ServerAddresses = (192.0.0.53)};";
    return makeTree({{"card1", switchedOff}, card0, {"missing", switchedOff}});
}

TEST_F(DirectAgentTest, GivesBackEveryEarlierState) {
    static const struct {
        const char* name;
        const char* commands;
    } rows[] = {
        {"idle", "true"},
        {"several addresses, secondary ones, labels and scopes",
         "ip addr add 10.1.0.5/24 brd + dev card0; ip addr add 10.1.0.6/24 dev card0 label card0:x;"
         "ip addr add 10.2.0.1/16 dev card0; ip addr add 10.3.0.1 peer 10.3.0.2 dev card0;"
         "ip addr add 169.254.7.7/16 scope link dev card0; ip link set card0 up; ln -s ../run/stub "
         "/etc/resolv.conf"},
        {"addresses with metrics, flags and lifetimes",
         "ip link set card0 up; echo nameserver 9.9.9.9 >/etc/resolv.conf; chmod 640 /etc/resolv.conf;"
         "ip addr add 10.1.0.5/24 dev card0 metric 1024 valid_lft 4000 preferred_lft 3000;"
         "ip addr add 10.4.0.5/24 dev card0 noprefixroute; ip addr add 10.5.0.5/24 dev card0 preferred_lft 0;"
         "ip -6 addr add 2001:db8::5/64 dev card0 nodad metric 1025 preferred_lft 0"},
        {"a source that the network has to confirm",
         "ip link set card0 up; ip -6 addr add 2001:db8::5/64 dev card0; sleep 2.5;"
         "ip -6 route add 2001:db8:9::/48 via 2001:db8::1 src 2001:db8::5"},
        {"IPv6 off, and the other card on",
         "echo 1 > /proc/sys/net/ipv6/conf/card0/disable_ipv6; ip link set card0 up; ip link set card1 up"},
        {"routes with metrics, tables, sources and types",
         "ip addr add 10.1.0.5/24 dev card0; ip addr add 10.1.0.6/24 dev card0; ip link set card0 up;"
         "ip -6 addr add 2001:db8::5/64 dev card0 nodad; ip -6 route add default via 2001:db8::1 dev card0 "
         "metric 77;"
         "ip route add default via 10.1.0.1 dev card0 metric 100;"
         "ip route add default via 10.1.0.2 dev card0 metric 200;"
         "ip route add 10.9.0.0/16 via 10.1.0.3 src 10.1.0.6 mtu 1300;"
         "ip route add 10.46.0.0/16 via 10.1.0.2 realm 3 mtu lock 1200 congctl reno quickack 1 tos 0x10;"
         "ip route add 10.45.0.0/16 nexthop via 10.1.0.2 weight 2 nexthop via 10.1.0.3 onlink dev card0;"
         "ip route add 10.44.0.0/16 via inet6 fe80::1 dev card0;"
         "ip route add 10.43.0.0/16 encap ip id 5 dst 1.2.3.4 dev card0;"
         "ip -6 route add 2001:db8:7::/48 dev card0 metric 9 pref high;"
         "ip route add 10.8.0.0/16 dev card0 scope link table 42; ip route add 10.7.0.0/16 via 10.5.5.5 dev "
         "card0 onlink"},
        {"a connected route that was taken away",
         "ip addr add 10.1.0.5/24 dev card0; ip link set card0 up; ip route del 10.1.0.0/24 dev card0"},
        {"default routes of the same metric, this card's last",
         "ip addr add 10.1.0.5/24 dev card0; ip addr add 10.2.0.5/24 dev card1; ip link set card0 up;"
         "ip link set card1 up; ip route add default via 10.2.0.1; ip route append default via 10.1.0.1"},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.name);
        run([&row] {
            shell(row.commands);
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
    }
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

// What somebody does meanwhile, and what the interfaces are after the way back; null: the same location is
// made so again.
TEST_F(DirectAgentTest, LooksAtTheMachineAgain) {
    static const struct {
        const char* theirs;
        const char* addresses;
        const char* routes;
    } rows[] = {
        {"ip addr flush dev card0", nullptr, nullptr},
        {"ip link set card0 down", nullptr, nullptr},
        {"ip route flush dev card0", nullptr, nullptr},
        {"ip addr add 10.9.9.9/8 dev card0", nullptr, nullptr},
        {"ip link set card1 up; ip addr add 10.8.8.8/8 dev card1", nullptr, nullptr},
        {"ip addr flush dev card0; ip addr add 10.7.0.1/24 dev card0; ip route add default via 10.7.0.9",
         "10.7.0.1/24 \n", "default via 10.7.0.9 dev card0 \n"},
        {"ip addr add 10.7.0.1/24 dev card0", "10.7.0.1/24 \n", ""},
        // A daemon that watches for cards without an address stands for nobody.
        {"ip addr add 169.254.7.7/16 scope link dev card0", "10.1.0.5/24 \n",
         "default via 10.1.0.1 dev card0 \n"},
        {"ip link del card0; ip link add dummy0 type veth; ip link add card0 type veth peer name far0",
         "10.1.0.5/24 \n", "default via 10.1.0.1 dev card0 \n"},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.theirs);
        run([&row] {
            shell(
                "ip addr add 10.1.0.5/24 dev card0; ip link set card0 up; ip route add default via 10.1.0.1");
            const auto there = thereTree();
            EXPECT_EQ("", activate(there.get()));
            const std::string made = machineState();
            shell(row.theirs);
            ASSERT_NE(made, machineState());
            if (row.addresses == nullptr) {
                EXPECT_EQ("", activate(there.get()));
                EXPECT_EQ(made, machineState());
                return;
            }
            EXPECT_EQ("", activate(makeTree({}).get()));
            EXPECT_EQ(row.addresses, addressesOf("card0"));
            EXPECT_EQ(row.routes, defaultRoutes());
            EXPECT_EQ("", kept());
        });
    }
    run([] {
        EXPECT_EQ("", activate(thereTree().get()));
        shell("ip link set card1 up");
        EXPECT_EQ("", activate(makeTree({}).get()));
        EXPECT_NE("", shell("ip -br link show up dev card1")) << "somebody has switched it on";
    });
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

void offer(const std::string& commands) {
    shell("printf '%s' '" + commands + "' >/run/new; mv /run/new /run/offer");
}

values::Owned<CFDictionaryRef> dhcpTree(const std::string& dns = "") {
    return makeTree({{"card0", "IPv4 = {ConfigMethod = DHCP; DHCPClientID = me}; DNS = {" + dns + "};"}});
}

TEST_F(DirectAgentTest, FollowsItsDhcpClient) {
    static const struct {
        const char* offer;
        const char* addresses;
        const char* routes;
        const char* servers;
    } rows[] = {
        {"export ip=10.50.0.10 mask=24 router=10.50.0.1 dns=10.50.0.53 domain=x lease=600; $hook bound",
         "10.50.0.10/24 \n", "default via 10.50.0.1 dev card0 proto 76 \n",
         "search own.example\nnameserver 10.50.0.53\n"},
        {"export router=10.50.0.2 dns=10.50.0.54; $hook renew", "10.50.0.10/24 \n",
         "default via 10.50.0.2 dev card0 proto 76 \n", "search own.example\nnameserver 10.50.0.54\n"},
        {"$hook nak; export ip=10.51.0.7 mask=16 router= dns=; $hook bound", "10.51.0.7/16 \n", "",
         "search own.example\n"},
        {"export mask=0; $hook bound", "10.51.0.7/16 \n", "", "search own.example\n"},
    };
    run([] {
        shell("ip link set card0 up; echo nameserver 9.9.9.9 >/run/real; ln -s /run/real /etc/resolv.conf");
        std::ofstream("/run/client") << client;
        chmod("/run/client", 0700);
        const std::string before = machineState();
        const auto there = dhcpTree("SearchDomains = (own.example)");
        for (const auto& row : rows) {
            SCOPED_TRACE(row.offer);
            offer(row.offer);
            EXPECT_EQ("", activate(there.get()));
            shell("while [ -e /run/offer ] || [ -e /run/taken ]; do sleep 0.02; done");
            EXPECT_EQ(row.addresses, addressesOf("card0"));
            EXPECT_EQ(row.routes, defaultRoutes());
            EXPECT_EQ(row.servers, shell("grep -v '^#' /etc/resolv.conf"));
        }
        EXPECT_EQ("-x 0x3d:006d65\n", shell("grep -o -e '-x .*' /run/arguments"));
        EXPECT_EQ("", activate(makeTree({}).get()));
        EXPECT_EQ(before, machineState());
        EXPECT_EQ("/run/real\n", shell("readlink /etc/resolv.conf"));
        EXPECT_EQ("", kept());
        EXPECT_EQ("", log());

        // The location's own name servers; a client that does not end.
        offer("trap \"\" TERM; export ip=10.50.0.10 dns=10.50.0.53; $hook bound");
        EXPECT_EQ("", activate(dhcpTree("ServerAddresses = (10.0.0.53)").get()));
        EXPECT_EQ("nameserver 10.0.0.53\n", shell("grep -v '^#' /etc/resolv.conf"));
        EXPECT_EQ("", activate(makeTree({}).get()));
        EXPECT_EQ("card0: the DHCP client does not end by itself and is ended\n", log());
        EXPECT_EQ(before + kept(), machineState());

        // What no machine can have; a client that dies, and the one after it.
        offer("export ip=127.0.0.1; $hook bound");
        EXPECT_EQ("", activate(there.get()));
        EXPECT_EQ("card0: the DHCP server offered no address that a machine can have\n", log());
        EXPECT_EQ("", activate(makeTree({}).get()));
        offer("exit 1");
        EXPECT_EQ("the DHCP client ended before it had a lease", activate(there.get()));
        offer("export ip=10.50.0.10; $hook bound");
        EXPECT_EQ("", activate(there.get()));
        EXPECT_EQ("10.50.0.10/8 \n", addressesOf("card0"));
        EXPECT_EQ("", activate(makeTree({}).get()));
        EXPECT_EQ(before, machineState());
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
