#include <gtest/gtest.h>
#include <sys/stat.h>

#include <array>
#include <chrono>
#include <fstream>
#include <iostream>
#include <memory>
#include <sstream>
#include <string>
#include <vector>

#include "platform/apply/Agents.h"
#include "platform/apply/Apply.h"
#include "platform/apply/StateFile.h"
#include "platform/apply/direct/Lease.h"
#include "platform/apply/direct/NameServers.h"
#include "platform/apply/direct/Supplicant.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"
#include "tests/unit/apply/StandInSupplicant.h"
#include "tests/unit/apply/Trees.h"
#include "tests/unit/support/Interrupted.h"
#include "tests/unit/support/PrivateNetwork.h"
#include "tests/unit/support/TemporaryDirectory.h"

namespace platform::apply {
namespace {

using testing_support::PrivateNetwork;
using testing_support::PrivateNetworkTest;
using testing_support::shell;
using testing_support::TemporaryDirectory;

IPv4Address address(unsigned a, unsigned b, unsigned c, unsigned d) {
    return a | (b << 8U) | (c << 16U) | (d << 24U);
}

InterfacePlan printerPlan(const std::string& interface) {
    InterfacePlan plan;
    plan.name = interface;
    plan.active = true;
    plan.method = IPv4Method::manual;
    plan.addresses = {{address(192, 0, 0, 199), 24}};
    plan.router = address(192, 0, 0, 192);
    return plan;
}

InterfacePlan offPlan(const std::string& interface) {
    InterfacePlan plan;
    plan.name = interface;
    return plan;
}

// Everything that ip tells of the interfaces, but what counts or comes by itself: lifetimes, carriers,
// link-local and router-advertised things.
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

class DirectAgentTest : public PrivateNetworkTest {
  protected:
    // Two cards, each with the other end of its cable up.
    static void makeCards() {
        for (const char* n : {"0", "1"}) {
            const std::string card = std::string("card") + n;
            shell("ip link add " + card + " type veth peer name far" + n + " && ip link set far" + n + " up");
        }
    }

    static void run(const std::function<void()>& body) {
        PrivateNetwork::run([&body] {
            setenv("TMPDIR", "/run", 1);
            const TemporaryDirectory folder;
            Host host;
            host.runtimeDirectory = folder.at("run");
            host.networkdStateDirectory = folder.at("links");
            host.dhcpHook = LA_DHCP_HOOK;
            const HostOverride override(host);
            const LogCapture log(
                [](LogLevel, std::string_view text) { std::cout << "log: " << text << "\n"; });
            ASSERT_TRUE(makeRuntimeDirectory().ok());
            makeCards();
            body();
        });
    }
};

void expectOk(const Outcome& outcome) {
    EXPECT_TRUE(outcome.ok()) << outcome.reason();
}

// One task at a time, to its end.
Task runTask(Agent& agent, const Captured& before, const InterfacePlan* plan) {
    std::vector<Task> tasks{{&before, plan, {}, {}}};
    const Clock::time_point deadline = Clock::now() + std::chrono::seconds(10);
    agent.start(tasks, deadline);
    EXPECT_TRUE(agent.settle(deadline));
    return tasks[0];
}

void takeOver(Agent& agent, const InterfacePlan& plan, const Captured& before) {
    const Task task = runTask(agent, before, &plan);
    expectOk(task.refusal);
    EXPECT_EQ("", task.trouble);
}

void giveBack(Agent& agent, const Captured& before) {
    const Task task = runTask(agent, before, nullptr);
    expectOk(task.refusal);
    EXPECT_EQ("", task.trouble);
}

std::vector<Captured> capture(Agent& agent, const std::vector<std::string>& cards) {
    std::vector<Captured> captured;
    std::vector<Trouble> leftAlone;
    expectOk(agent.capture(cards, captured, leftAlone));
    return captured;
}

// What a commit that changes nothing asks for.
Outcome activate(CFDictionaryRef root) {
    return applyTree(root, root);
}

struct Earlier {
    const char* name;
    const char* commands;
};

TEST_F(DirectAgentTest, GivesBackEveryEarlierState) {
    static const Earlier earlierStates[] = {
        {"idle", "true"},
        {"several addresses, secondary ones, labels and scopes",
         "ip addr add 10.1.0.5/24 brd + dev card0; ip addr add 10.1.0.6/24 dev card0 label card0:x;"
         "ip addr add 10.2.0.1/16 dev card0; ip addr add 10.3.0.1 peer 10.3.0.2 dev card0;"
         "ip addr add 169.254.7.7/16 scope link dev card0; ip link set card0 up"},
        {"addresses with metrics, flags and lifetimes",
         "ip link set card0 up; ip addr add 10.1.0.5/24 dev card0 metric 1024 valid_lft 4000 preferred_lft "
         "3000;"
         "ip addr add 10.4.0.5/24 dev card0 noprefixroute; ip addr add 10.5.0.5/24 dev card0 preferred_lft 0;"
         "ip -6 addr add 2001:db8::5/64 dev card0 nodad metric 1025 preferred_lft 0"},
        {"a source that the network has to confirm",
         "ip link set card0 up; ip -6 addr add 2001:db8::5/64 dev card0; sleep 2.5;"
         "ip -6 route add 2001:db8:9::/48 via 2001:db8::1 src 2001:db8::5"},
        {"static IPv6",
         "ip link set card0 up; ip -6 addr add 2001:db8::5/64 dev card0 nodad;"
         "ip -6 route add default via 2001:db8::1 dev card0 metric 77"},
        {"IPv6 off", "echo 1 > /proc/sys/net/ipv6/conf/card0/disable_ipv6; ip link set card0 up"},
        {"routes with metrics, tables, sources and types",
         "ip addr add 10.1.0.5/24 dev card0; ip addr add 10.1.0.6/24 dev card0; ip link set card0 up;"
         "ip route add default via 10.1.0.1 dev card0 metric 100; ip route add default via 10.1.0.2 dev "
         "card0 metric 200;"
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
         "ip addr add 10.1.0.5/24 dev card0; ip addr add 10.2.0.5/24 dev card1; ip link set card0 up; ip "
         "link set card1 up;"
         "ip route add default via 10.2.0.1; ip route append default via 10.1.0.1"},
    };
    for (const Earlier& earlier : earlierStates) {
        SCOPED_TRACE(earlier.name);
        run([&earlier] {
            shell(earlier.commands);
            const std::string before = machineState();
            const auto agent = makeDirectAgent();
            const std::vector<Captured> captured = capture(*agent, {"card0", "card1", "missing"});
            ASSERT_EQ(2U, captured.size());
            InterfacePlan plan = printerPlan("card0");
            plan.nameServers = {address(192, 0, 0, 53)};
            takeOver(*agent, plan, captured[0]);
            takeOver(*agent, offPlan("card1"), captured[1]);
            const std::string made = machineState();
            EXPECT_NE(before, made);
            EXPECT_EQ("192.0.0.199/24 \n", addressesOf("card0"));
            EXPECT_EQ("192.0.0.192 dev card0 src 192.0.0.199 uid 0 \n    cache \n",
                      shell("ip route get 192.0.0.192"));
            EXPECT_EQ("default via 192.0.0.192 dev card0 proto 76 \n", defaultRoutes());
            EXPECT_EQ("", shell("ip -br addr show up dev card1"));
            takeOver(*agent, plan, captured[0]);
            takeOver(*agent, offPlan("card1"), captured[1]);
            EXPECT_EQ(made, machineState());
            for (const Captured& one : captured) {
                giveBack(*agent, one);
                giveBack(*agent, one);
            }
            EXPECT_EQ(before, machineState());
        });
    }
}

// The process ends before every single step of going there and of coming back; the next run comes back at
// once, or goes on and then comes back.
TEST_F(DirectAgentTest, AProcessThatEndsAnywhereLeavesTheWayBack) {
    for (const bool isGoingOn : {true, false}) {
        run([isGoingOn] {
            shell(
                "ip addr add 10.1.0.5/24 dev card0; ip addr add 10.1.0.6/24 dev card0; ip link set card0 up;"
                "ip addr add 10.2.0.5/24 dev card1; ip link set card1 up; ip route add default via 10.1.0.1 "
                "metric 9;"
                "ip route append default via 10.2.0.1 metric 9; ip -6 addr add 2001:db8::5/64 dev card0 "
                "nodad;"
                "echo nameserver 9.9.9.9 > /etc/resolv.conf");
            const std::string before = machineState();
            Service card0 = fixedService("card0");
            card0.entries +=
                "<key>DNS</key><dict><key>ServerAddresses</key><array><string>10.0.0.53</string></array></"
                "dict>";
            const auto there = makeTree({{"card1", switchedOff}, card0});
            const auto back = makeTree({});
            expectOk(activate(there.get()));
            const std::string made = machineState();
            expectOk(activate(back.get()));
            for (const bool isGoing : {true, false}) {
                bool wasEnded = true;
                int step = 0;
                for (; wasEnded && !testing::Test::HasFailure(); ++step) {
                    SCOPED_TRACE((isGoing ? "going, step " : "coming back, step ") + std::to_string(step));
                    if (!isGoing) {
                        expectOk(activate(there.get()));
                    }
                    wasEnded = testing_support::endBeforeStep(
                        step, [&] { (void)activate(isGoing ? there.get() : back.get()); });
                    if (isGoingOn) {
                        expectOk(activate(isGoing ? there.get() : back.get()));
                        EXPECT_EQ(isGoing ? made : before, machineState());
                    }
                    expectOk(activate(back.get()));
                    EXPECT_EQ(before, machineState());
                    EXPECT_EQ("", shell("ls " + currentHost().runtimeDirectory +
                                        " | grep -v -e lock$ -e new$ || true"));
                }
                EXPECT_GT(step, 30);
            }
        });
    }
}

TEST_F(DirectAgentTest, LeavesAnInterfaceThatSomebodyElseTookOver) {
    struct Row {
        const char* what;
        const char* theirs;
        const char* addresses;  // at the end
        const char* routes;
    };
    static const Row rows[] = {
        {"another address instead",
         "ip addr flush dev card0; ip addr add 10.7.0.1/24 dev card0; ip route add default via 10.7.0.9",
         "10.7.0.1/24 \n", "default via 10.7.0.9 dev card0 \n"},
        {"another address beside ours", "ip addr add 10.7.0.1/24 dev card0", "10.7.0.1/24 \n", ""},
        {"pulled out and put in again",
         "ip link del card0; ip link add dummy0 type veth; ip link add card0 type veth peer name far0",
         "10.1.0.5/24 \n", "default via 10.1.0.1 dev card0 \n"},
    };
    for (const Row& row : rows) {
        SCOPED_TRACE(row.what);
        run([&row] {
            shell(
                "ip addr add 10.1.0.5/24 dev card0; ip link set card0 up; ip route add default via 10.1.0.1");
            const auto there = makeTree({fixedService("card0")});
            expectOk(activate(there.get()));
            shell(row.theirs);
            expectOk(activate(makeTree({}).get()));
            EXPECT_EQ(row.addresses, addressesOf("card0"));
            EXPECT_EQ(row.routes, defaultRoutes());
        });
    }
}

// The command for a daemon: installed, or unpacked for the laboratory by scripts/install-dependencies. Empty
// when it is neither.
std::string commandFor(const std::string& name) {
    if (testing_support::hasProgram(name)) {
        return name;
    }
    const std::string usr = LA_LABORATORY "/usr";
    const std::string program = usr + "/sbin/" + name;
    return access(program.c_str(), X_OK) != 0
               ? ""
               : "env LD_LIBRARY_PATH=" + usr + "/lib/" LA_LIBRARY_ARCHITECTURE " " + program;
}

// A DHCP server in a network of its own at the far end of card0's cable. It ends with the test's namespaces.
class DhcpServer {
  public:
    explicit DhcpServer(const std::string& dnsmasq) {
        std::array<int, 2> gate{};
        std::array<int, 2> ready{};
        EXPECT_EQ(0, pipe(gate.data()));
        EXPECT_EQ(0, pipe(ready.data()));
        const pid_t child = fork();
        if (child == 0) {
            char go = 0;
            const std::string command =
                "ip addr add 10.50.0.1/24 dev far0; ip link set lo up; ip link set far0 up;"
                "exec " +
                dnsmasq +
                " --no-daemon --conf-file=/dev/null --port=0 --interface=far0 --bind-interfaces"
                " --dhcp-range=10.50.0.10,10.50.0.10,255.255.255.0,1h --dhcp-leasefile=/var/leases --no-ping"
                " --dhcp-authoritative --log-dhcp --user=root --pid-file="
                " --dhcp-option=3,10.50.0.1 --dhcp-option=6,10.50.0.53 --dhcp-option=15,example.org"
                " >/var/dnsmasq.log 2>&1";
            if (unshare(CLONE_NEWNET) == 0 && write(ready[1], "r", 1) == 1 && read(gate[0], &go, 1) == 1) {
                execl("/bin/sh", "sh", "-c", command.c_str(), nullptr);
            }
            _exit(1);
        }
        char isReady = 0;
        EXPECT_EQ(1, read(ready[0], &isReady, 1));
        shell("ip link set far0 netns " + std::to_string(child));
        EXPECT_EQ(1, write(gate[1], "g", 1));
    }
    // What the server was asked for, one word each ("DHCPDISCOVER", ...).
    static std::vector<std::string> messages() {
        std::ifstream log("/var/dnsmasq.log");
        std::vector<std::string> found;
        for (std::string line; std::getline(log, line);) {
            for (const char* message : {"DHCPDISCOVER", "DHCPREQUEST", "DHCPRELEASE", "DHCPACK"}) {
                if (line.find(message) != std::string::npos) {
                    found.emplace_back(message);
                }
            }
        }
        return found;
    }
};

TEST_F(DirectAgentTest, TakesALeaseAndGivesItBack) {
    const std::string dnsmasq = commandFor("dnsmasq");
    if (dnsmasq.empty() || !testing_support::hasProgram("busybox")) {
        testing_support::skip("needs dnsmasq and busybox");
        return;
    }
    run([&dnsmasq] {
        shell(
            "echo 'nameserver 9.9.9.9' > /run/real; ln -s /run/real /etc/resolv.conf; ip link set card0 up");
        const DhcpServer server(dnsmasq);
        const std::string before = machineState();
        const auto agent = makeDirectAgent();
        const std::vector<Captured> captured = capture(*agent, {"card0"});
        ASSERT_EQ(1U, captured.size());
        InterfacePlan plan;
        plan.name = "card0";
        plan.active = true;
        plan.method = IPv4Method::dhcp;
        plan.dhcpClientID = "a client";
        takeOver(*agent, plan, captured[0]);
        EXPECT_EQ("10.50.0.10/24 \n", addressesOf("card0"));
        EXPECT_EQ("default via 10.50.0.1 dev card0 proto 76 \n", defaultRoutes());
        EXPECT_EQ("search example.org\nnameserver 10.50.0.53\n", shell("grep -v '^#' /etc/resolv.conf"));
        takeOver(*agent, plan, captured[0]);
        EXPECT_EQ((std::vector<std::string>{"DHCPDISCOVER", "DHCPREQUEST", "DHCPACK"}),
                  DhcpServer::messages());

        giveBack(*agent, captured[0]);
        EXPECT_EQ("DHCPRELEASE", DhcpServer::messages().back());
        EXPECT_EQ(before, machineState());
        EXPECT_EQ("/run/real\n", shell("readlink /etc/resolv.conf"));
        EXPECT_EQ("", shell("grep -l '[u]dhcpc' /proc/[0-9]*/cmdline 2>/dev/null || true"));
    });
}

TEST_F(DirectAgentTest, RenewsALeaseWithOtherValues) {
    run([] {
        shell("ip link set card0 up; echo nameserver 9.9.9.9 > /etc/resolv.conf");
        const std::string before = machineState();
        const DhcpSettings settings{"card0", 0, "", false, {"own.example"}};
        const struct {
            Lease lease;
            const char* addresses;
            const char* routes;
            const char* servers;
        } rows[] = {
            {{{address(10, 50, 0, 10), 24}, address(10, 50, 0, 1), {{address(10, 50, 0, 53)}, {"x"}}, 600},
             "10.50.0.10/24 \n",
             "default via 10.50.0.1 dev card0 proto 76 \n",
             "search own.example\nnameserver 10.50.0.53\n"},
            {{{address(10, 50, 0, 10), 24}, address(10, 50, 0, 2), {{address(10, 50, 0, 54)}, {}}, 600},
             "10.50.0.10/24 \n",
             "default via 10.50.0.2 dev card0 proto 76 \n",
             "search own.example\nnameserver 10.50.0.54\n"},
            {{{address(10, 51, 0, 7), 16}, 0, {}, forever}, "10.51.0.7/16 \n", "", "search own.example\n"},
        };
        for (const auto& row : rows) {
            expectOk(takeLease(settings, row.lease));
            EXPECT_EQ(row.addresses, addressesOf("card0"));
            EXPECT_EQ(row.routes, defaultRoutes());
            EXPECT_EQ(row.servers, shell("grep -v '^#' /etc/resolv.conf"));
        }
        expectOk(dropLease(settings));
        EXPECT_EQ(before, machineState());
    });
}

TEST_F(DirectAgentTest, LooksAtTheMachineWhenALocationIsMadeCurrentAgain) {
    for (const char* const trouble :
         {"ip addr flush dev card0", "ip link set card0 down", "ip route flush dev card0",
          "ip addr add 10.9.9.9/8 dev card0", "ip link set card1 up; ip addr add 10.8.8.8/8 dev card1"}) {
        SCOPED_TRACE(trouble);
        run([trouble] {
            const auto there = makeTree({{"card1", switchedOff}, fixedService("card0")});
            expectOk(activate(there.get()));
            const std::string made = machineState();
            shell(trouble);
            ASSERT_NE(made, machineState());
            expectOk(activate(there.get()));
            EXPECT_EQ(made, machineState());
        });
    }
}

// What cannot be replaced is written in place, and a run may be ended in the middle of that.
TEST_F(DirectAgentTest, WritesANameServersFileThatIsAMountInPlace) {
    run([] {
        shell(
            "printf 'nameserver 9.9.9.9\noptions edns0\n' > /run/outer; chmod 640 /run/outer; touch "
            "/etc/resolv.conf;"
            "mount --bind /run/outer /etc/resolv.conf");
        const std::string before = machineState();
        std::string trouble;
        for (const char* const ended : {"true", "truncate -s 0 /run/outer", "truncate -s 9 /run/outer"}) {
            SCOPED_TRACE(ended);
            expectOk(setInterfaceNameServers("card0", 0, {{address(10, 0, 0, 53)}, {}}, trouble));
            EXPECT_EQ("nameserver 10.0.0.53\n", shell("grep -v '^#' /run/outer"));
            shell(ended);
            expectOk(setInterfaceNameServers("card0", 0, {}, trouble));
            EXPECT_EQ(before, machineState());
        }
        shell("mount -o remount,bind,ro /etc/resolv.conf");
        expectOk(setInterfaceNameServers("card0", 0, {{address(10, 0, 0, 53)}, {}}, trouble));
        EXPECT_NE("", trouble) << "the addresses stand without it";
        expectOk(setInterfaceNameServers("card0", 0, {}, trouble));
        EXPECT_EQ("", trouble);
        EXPECT_EQ(before, machineState());
    });
}

Service printerNetwork() {
    Service service = fixedService("card0");
    service.entries +=
        "<key>AirPort</key><dict><key>PreferredNetwork</key><string>printer</string><key>AuthPassword</key>"
        "<data>AEMAQQBOAEEAUgBZAEMAQQBOAEEAUgBZ</data></dict>";  // "CANARYCANARY"
    return service;
}

TEST_F(DirectAgentTest, JoinsANetworkThroughTheSupplicant) {
    run([] {
        const std::string before = machineState();
        const auto there = makeTree({printerNetwork()});
        const auto back = makeTree({});
        mkdir("/run/wpa_supplicant", 0700);
        StandInSupplicant supplicant("/run/wpa_supplicant/card0");
        supplicant.networks[4] = {{{"ssid", "\"home\""}}, false};
        expectOk(activate(there.get()));
        EXPECT_EQ(5, supplicant.current());
        EXPECT_EQ("\"CANARYCANARY\"", supplicant.networks[5].values["psk"]);
        EXPECT_EQ("", shell("grep -rl -e CANARY -e Q0FOQVJZ " + currentHost().runtimeDirectory + " || true"));
        // The same network with another address: it stays joined.
        supplicant.changes();
        Service other = printerNetwork();
        other.entries.replace(other.entries.find("192.0.0.199"), 11, "192.0.0.200");
        expectOk(activate(makeTree({other}).get()));
        EXPECT_EQ(std::vector<std::string>{}, supplicant.changes());
        EXPECT_EQ("192.0.0.200/24 \n", addressesOf("card0"));
        expectOk(activate(back.get()));
        EXPECT_EQ(1U, supplicant.networks.size());
        EXPECT_FALSE(supplicant.networks[4].isDisabled);
        EXPECT_EQ(before, machineState());
    });
}

// A supplicant without a radio takes the whole conversation, and never gets onto the network.
TEST_F(DirectAgentTest, TalksToARealSupplicant) {
    const std::string program = commandFor("wpa_supplicant");
    if (program.empty()) {
        testing_support::skip("needs wpa_supplicant");
        return;
    }
    run([&program] {
        const TemporaryDirectory folder;
        const std::string configuration = folder.write(
            "conf", "ctrl_interface=DIR=/run/wpa_supplicant\nnetwork={\nssid=\"home\"\nkey_mgmt=NONE\n}\n");
        shell("ip link set card0 up; " + program + " -B -i card0 -D wired -c " + configuration +
              " -f /run/log");
        std::optional<KnownNetworks> before;
        expectOk(readKnownNetworks("card0", before));
        ASSERT_TRUE(before);
        EXPECT_EQ(std::vector<int>{0}, before->enabled);
        std::unique_ptr<WirelessJoin> join;
        WirelessJoin::State state{};
        std::string reason;
        expectOk(joinBySupplicant("card0", {{}, "printer", "p\"ss wörd"}, false, join));
        ASSERT_TRUE(join);
        expectOk(join->poll(state, reason));
        EXPECT_EQ(WirelessJoin::State::waiting, state);
        EXPECT_EQ("the network was not found", reason);
        std::optional<KnownNetworks> now;
        expectOk(readKnownNetworks("card0", now));
        EXPECT_EQ((std::vector<int>{0, 1}), now->all);
        EXPECT_EQ(std::vector<int>{1}, now->enabled);
        expectOk(leaveBySupplicant("card0", before, join));
        EXPECT_FALSE(join);
        expectOk(readKnownNetworks("card0", now));
        EXPECT_EQ(before->all, now->all);
        EXPECT_EQ(before->enabled, now->enabled);
    });
}

}  // namespace
}  // namespace platform::apply
