// The engine and the direct agent on the kernel of a private network, and the daemons and files around them.
#include <gtest/gtest.h>

#include <fstream>
#include <iostream>
#include <sstream>
#include <thread>

#include "platform/apply/Apply.h"
#include "platform/apply/StateFile.h"
#include "platform/apply/direct/Kernel.h"
#include "platform/apply/direct/NameServers.h"
#include "platform/apply/direct/OtherDaemons.h"
#include "platform/apply/direct/Supplicant.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"
#include "tests/unit/apply/StandInSupplicant.h"
#include "tests/unit/support/Interrupted.h"
#include "tests/unit/support/PrivateNetwork.h"
#include "tests/unit/support/TemporaryDirectory.h"
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
            has("mngtmpaddr") || has("proto ra") || (has("proto kernel") && has("::"))) {
            continue;
        }
        for (const char* word : {"NO-CARRIER,", ",LOWER_UP", ",M-DOWN", " linkdown"}) {
            if (const std::size_t at = line.find(word); at != std::string::npos) {
                line.erase(at, std::string(word).size());
            }
        }
        if (has("expires ")) {
            line.erase(line.find("expires ") + 8);
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
            host.sysfsRoot = "/run/sys";
            const HostOverride override(host);
            const LogCapture log([](LogLevel, std::string_view text) {
                std::cout << "log: " << text << "\n";
                std::ofstream("/run/log", std::ios::app) << text << "\n";
            });
            for (const std::string n : {"0", "1"}) {
                shell("ip link add card" + n + " type veth peer name far" + n + "; ip link set far" + n +
                      " up; mkdir -p /run/sys/class/net/card" + n);
            }
            body();
        });
    }
    // What the body gives back, which is all that comes out of there.
    static std::string seen(const std::function<std::string()>& body) {
        const testing_support::TemporaryDirectory folder;
        run([&] { (void)folder.write("seen", body()); });
        std::string text = shell("cat " + folder.at("seen"));
        std::ranges::replace(text, '\n', ';');
        return text;
    }
};

std::string takeLog() {
    return shell("cat /run/log 2>/dev/null; rm -f /run/log");
}

values::Owned<CFDictionaryRef> thereTree(const std::string& address = "192.0.0.199") {
    return makeTree({"card1 __INACTIVE__ = #1",
                     "card0 IPv4 = {ConfigMethod = Manual; Addresses = (" + address +
                         "); SubnetMasks = (255.255.255.0); Router = 192.0.0.192};"
                         "DNS = {ServerAddresses = (192.0.0.53)}",
                     "missing __INACTIVE__ = #1"});
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

// What the machine was before, or what somebody does meanwhile: what the interfaces are when the same
// location is made so again, or after the way back.
TEST_F(DirectAgentTest, LooksAtTheMachineAgain) {
    testing_support::Transcript transcript("machines");
    for (const std::string part : {"before", "made so again", "given back"}) {
        transcript.replay(part, [&part](const Inputs& inputs) {
            return seen([&] {
                shell(part == "before" ? inputs[0]
                                       : "ip addr add 10.1.0.5/24 dev card0; ip link set card0 up;"
                                         "ip route add default via 10.1.0.1");
                const std::string before = machineState();
                const auto there = thereTree();
                EXPECT_EQ("", activate(there.get()));
                const std::string made = machineState();
                if (part != "before") {
                    shell(inputs[0]);
                    EXPECT_NE(made, machineState());
                }
                if (part != "given back") {
                    EXPECT_EQ("", activate(there.get()));
                    EXPECT_EQ(made, machineState());
                }
                if (part != "made so again") {
                    EXPECT_EQ("", activate(makeTree({}).get()));
                    EXPECT_TRUE(part != "before" || before == machineState()) << machineState();
                    EXPECT_EQ("", kept());
                }
                return shell("ip -br link show up dev card1 | cut -d' ' -f1") + addressesOf("card0") +
                       defaultRoutes() + takeLog();
            });
        });
    }
}

// A DHCP client that does what the test writes into /run/begin at its start and into /run/offer, once each;
// $hook is the program that it calls.
const char* const client = R"(#!/bin/sh
echo "$*" >/run/arguments
hook=$7
trap '"$hook" deconfig; exit' TERM
[ ! -e /run/begin ] || . /run/begin
while :; do
    if mv /run/offer /run/taken 2>/dev/null; then . /run/taken; rm /run/taken; fi
    sleep 0.02
done
)";

// A machine, what happens to it step by step, and what comes of it.
class Scene {
  public:
    Scene() { std::ofstream("/run/client") << client; }

    std::string play(const std::string& step) {
        const std::string name = step.substr(0, step.find(' '));
        const std::string rest = step.substr(std::min(name.size() + 1, step.size()));
        std::istringstream words(rest);
        if (name == "sh") {
            return shell(rest);
        }
        if (name == "offer") {
            shell("printf '%s' '" + rest + "' >/run/new; mv /run/new /run/offer");
        } else if (name == "location") {
            before_ = before_.empty() ? machineState() : before_;
            return locate(rest);
        } else if (name == "back") {
            const std::string reason = activate(makeTree({}).get());
            const bool isBack = before_ + kept() == machineState();
            before_.erase(isBack ? 0 : before_.size());
            return told(reason) + (isBack ? "" : "not as before");
        } else if (name == "bring") {
            return bring(words);
        } else if (name == "daemons") {
            daemons_ = findOtherDaemons("card0", linkIndex);
            return std::string(daemons_.networkd ? "networkd" : "no networkd") +
                   (isNetworkdSettled(linkIndex) ? ", settled, clients " : ", clients ") +
                   std::to_string(daemons_.dhcpClients.size());
        } else if (name == "suspend") {
            suspendOtherDaemons(rest, linkIndex, daemons_);
        } else if (name == "resume") {
            return resumeOtherDaemons("card0", daemons_).reason();
        } else if (name == "forget") {
            Kernel kernel;
            EXPECT_TRUE(kernel.open("card0").ok() && kernel.link());
            return kernel.forgetSilentNeighbours().reason();
        } else {
            return playSupplicant(name, rest);
        }
        return "";
    }

  private:
    static constexpr int linkIndex = 7;

    std::string locate(const std::string& entities) {
        // Behind "//" the second card's.
        const std::size_t end = std::min(entities.find("//"), entities.size());
        Lines services{"card0 " + entities.substr(0, end)};
        if (end < entities.size()) {
            services.push_back("card1 " + entities.substr(end + 2));
        }
        const std::string reason = activate(makeTree(services).get());
        // A client that dies leaves its steps behind.
        shell(reason.empty() ? "while [ -e /run/offer ] || [ -e /run/taken ]; do sleep 0.02; done"
                             : "rm -f /run/taken");
        return told(reason) + addressesOf("card0") + defaultRoutes() +
               shell("grep -v '^#' /etc/resolv.conf || true");
    }

    // Servers and search domains.
    static std::string bring(std::istringstream& words) {
        std::string interface;
        unsigned rank = 0;
        NameService service;
        words >> interface >> rank;
        for (std::string word; words >> word;) {
            if (word.find_first_not_of("0123456789.") == std::string::npos) {
                service.servers.push_back(address(word.c_str()));
            } else {
                service.domains.push_back(word);
            }
        }
        std::string trouble;
        const Outcome outcome = setInterfaceNameServers(interface, rank, service, trouble);
        return outcome.reason() + (trouble.empty() ? "" : "trouble: " + trouble + "\n") +
               shell("grep -v '^#' /etc/resolv.conf || true") + takeLog();
    }

    // A command of the stand-in's, or what is asked of it: what that changed, and what came of it.
    std::string playSupplicant(const std::string& name, const std::string& rest) {
        std::istringstream words(rest);
        if (name == "supplicant") {
            supplicant_.reset();
            join_.reset();
            shell("mkdir -p /run/wpa_supplicant");
            supplicant_ = std::make_unique<StandInSupplicant>("/run/wpa_supplicant/card0");
        } else if (name == "answer") {
            const std::size_t equals = rest.find(" = ");
            supplicant_->answers[rest.substr(0, equals)] =
                testing_support::unescaped(rest.substr(equals + 3));
        } else if (name == "hear") {
            supplicant_->hear(rest);
        } else if (name == "hear-later") {
            supplicant_->heardLater = rest;
        } else if (name == "notice") {
            supplicant_->notice = rest;
        } else if (name == "on") {
            int number = 0;
            std::string bssid;
            words >> number >> bssid;
            supplicant_->join(number, bssid.empty() ? "02:00:00:00:00:01" : bssid);
        } else if (name == "next") {
            words >> supplicant_->next;
        } else if (name == "end") {
            supplicant_.reset();
        } else if (name == "look") {
            return readKnownNetworks("card0", networks_).reason();
        } else if (name == "join") {
            const std::size_t space = rest.find(' ');
            WirelessSettings settings{{}, testing_support::unescaped(rest.substr(0, space)), {}};
            if (space != std::string::npos) {
                settings.key = testing_support::unescaped(rest.substr(space + 1));
            }
            const std::string text = told(joinBySupplicant("card0", settings, false, join_).reason());
            return text + wait();
        } else if (name == "leave") {
            return told(leaveBySupplicant("card0", networks_, join_).reason());
        } else if (name == "wait") {
            return wait();
        } else {
            ADD_FAILURE() << name;
        }
        return "";
    }
    std::string wait() {
        WirelessJoin::State state = WirelessJoin::State::waiting;
        std::string reason = "no network is on its way";
        const auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(400);
        while (join_ && state == WirelessJoin::State::waiting &&
               std::chrono::steady_clock::now() < deadline) {
            EXPECT_EQ("", join_->poll(state, reason).reason());
            std::this_thread::sleep_for(std::chrono::milliseconds(5));
        }
        return told("") + (state == WirelessJoin::State::joined ? "joined" : reason);
    }
    // The commands that changed something, each in a line; why it failed, and what was logged.
    std::string told(const std::string& reason) {
        std::string text;
        for (const std::string& line : supplicant_ ? supplicant_->changes() : Lines()) {
            text += line + "\n";
        }
        return text + reason + (reason.empty() ? "" : "\n") + takeLog();
    }

    std::string before_;
    OtherDaemons daemons_;
    std::unique_ptr<StandInSupplicant> supplicant_;
    std::optional<KnownNetworks> networks_;
    std::unique_ptr<WirelessJoin> join_;
};

class DaemonsAndFilesTest : public DirectAgentTest, public testing::WithParamInterface<const char*> {};
INSTANTIATE_TEST_SUITE_P(Scenes, DaemonsAndFilesTest,
                         testing::Values("dhcp", "supplicant", "name_servers", "other_daemons", "way_back"));

TEST_P(DaemonsAndFilesTest, AreWorkedWith) {
    run([] {
        EXPECT_TRUE(makeRuntimeDirectory().ok());
        Scene scene;
        testing_support::Transcript(GetParam()).playItself([&scene](const std::string& step) {
            const std::string text = scene.play(step);
            return text.substr(0, text.find_last_not_of('\n') + 1);
        });
    });
}

}  // namespace
}  // namespace platform::apply
