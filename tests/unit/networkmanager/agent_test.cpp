// What only a daemon that lies, fails or hangs can show; what the real one does by itself, the laboratories
// show.
#include <gtest/gtest.h>

#include <memory>
#include <utility>

#include "platform/apply/Agents.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"
#include "tests/unit/networkmanager/StandInDaemon.h"

namespace platform::apply {
namespace {

using testing_support::StandInDaemon;
using Lines = std::vector<std::string>;

const std::string canary = "canary-e7c1";
const std::string home = "11111111-2222-4333-8444-555555555555";
const std::string added = "AddConnection2 held back";
const std::string activated = "Activate location-assistant wlan0";
const Lines going{added, "Disconnect", activated};
const Lines returning{"Activate Home", "Delete"};
const std::string noServer = "no DHCP server answered; NetworkManager goes on asking";
constexpr std::uint32_t adHoc = 1;
constexpr std::uint32_t infrastructure = 2;
constexpr std::uint32_t sharedKey = 0x100;

class NetworkManager : public ::testing::Test {
  protected:
    static Host host(const std::string& socket) {
        Host host;
        host.systemBusSocket = socket;
        return host;
    }
    static InterfacePlan plan(std::optional<std::string> network, std::optional<std::string> key = {}) {
        InterfacePlan plan;
        plan.name = "wlan0";
        plan.active = true;
        plan.method = IPv4Method::dhcp;
        plan.wireless = WirelessSettings{true, std::move(network), std::move(key)};
        return plan;
    }
    // Puts the card on a network of the user's.
    void joinHome() {
        const WirelessLink link{JoinChoice{true, false, Security::wpa, 0}, {}};
        Sections& sections = daemon_.profiles["/home"];
        sections = makeProfile(plan("Home", canary), &link, {});
        sections.erase("user");
        sections["connection"]["uuid"] = {home};
        sections["connection"]["id"] = {std::string("Home")};
        daemon_.objects["/home"];
        daemon_.objects["/onHome"] = {
            {"Connection", {std::string("/home")}}, {"Uuid", {home}}, {"State", {2U}}};
        card("ActiveConnection", {std::string("/onHome")});
        card("State", {deviceActivated});
    }
    void card(const char* property, Value value) {
        daemon_.objects[StandInDaemon::card][property] = std::move(value);
    }
    Snapshot takeSnapshots() {
        std::vector<Snapshot> snapshots;
        leftAlone_.clear();
        const Outcome outcome =
            agent_->takeSnapshots(std::vector<std::string>{"wlan0"}, snapshots, leftAlone_);
        EXPECT_TRUE(outcome.ok()) << outcome.reason();
        return snapshots.empty() ? Snapshot() : snapshots[0];
    }
    // What was changed, and what stood against it; the status of a refusal goes before its reason.
    Lines takeOver(const InterfacePlan* plan, const Snapshot& before, double seconds = 10) {
        std::vector<Task> tasks{{&before, plan, {}, {}}};
        const auto bound = std::chrono::duration<double>(seconds);
        const Clock::time_point deadline = Clock::now() + std::chrono::duration_cast<Clock::duration>(bound);
        agent_->start(tasks, deadline);
        while (!agent_->settle(deadline)) {
        }
        Lines lines = std::exchange(daemon_.changes, {});
        const Outcome& refusal = tasks[0].refusal;
        if (!refusal.ok() || !tasks[0].trouble.empty()) {
            lines.push_back(refusal.ok() ? tasks[0].trouble
                                         : std::to_string(refusal.status()) + " " + refusal.reason());
        }
        return lines;
    }
    Lines takeOver(const InterfacePlan& plan, const Snapshot& before, double seconds = 10) {
        return takeOver(&plan, before, seconds);
    }
    Lines giveBack(const Snapshot& before) { return takeOver(nullptr, before); }
    Sections ours() {
        for (const auto& [path, sections] : daemon_.profiles) {
            if (valueOf<std::string>(sections.at("connection"), "uuid") == profileUUID("wlan0")) {
                return sections;
            }
        }
        return {};
    }

    const InterfacePlan printer_ = plan("Printer");
    const testing_support::PrivateBus bus_{};
    StandInDaemon daemon_{bus_};
    const HostOverride override_{host(bus_.socket())};
    const std::shared_ptr<Agent> agent_ = makeNetworkManagerAgent();
    std::vector<Trouble> leftAlone_;
    const LogCapture log_{
        [](LogLevel, std::string_view line) { EXPECT_EQ(line.find(canary), std::string_view::npos); }};
};

TEST_F(NetworkManager, ReadsWhatIsOnTheAir) {
    const struct {
        std::uint32_t mode, privacy, protection;
        const char* made;
    } rows[] = {
        {adHoc, 0, 0, "adhoc "},
        {infrastructure, 1, 0, "infrastructure none"},
        {infrastructure, 1, sharedKey | 0x400, "infrastructure wpa-psk"},
        {infrastructure, 1, 0x400, "infrastructure sae"},
        {infrastructure, 1, 0x200, " "},
    };
    const Snapshot before = takeSnapshots();
    for (const auto& row : rows) {
        const std::string name = row.made;
        daemon_.offer(name, row.mode, row.privacy, row.protection);
        const bool isOpen = row.privacy == 0;
        (void)takeOver(plan(name, isOpen ? std::optional<std::string>() : "abcdefghijklm"), before);
        Sections made = ours();
        EXPECT_EQ(name, valueOf<std::string>(made["802-11-wireless"], "mode").value_or("") + " " +
                            valueOf<std::string>(made["802-11-wireless-security"], "key-mgmt").value_or(""));
        daemon_.profiles.clear();
    }
}

TEST_F(NetworkManager, GoesAndComesBack) {
    joinHome();
    daemon_.offer("Printer", infrastructure, 0, 0);
    const Snapshot before = takeSnapshots();
    EXPECT_EQ(going, takeOver(printer_, before));
    // The same again changes nothing; another rank does.
    EXPECT_EQ(Lines{"Update2"}, takeOver(printer_, before));
    InterfacePlan other = printer_;
    other.rank = 1;
    EXPECT_EQ((Lines{"Update2", activated}), takeOver(other, before));
    // The record of how it was may be lost: the profile has it too.
    const Snapshot again = takeSnapshots();
    EXPECT_EQ(returning, giveBack(again));
    EXPECT_EQ(Lines{}, giveBack(again));

    InterfacePlan off;
    off.name = "wlan0";
    EXPECT_EQ((Lines{"Disconnect", "Managed off"}), takeOver(off, before));
    EXPECT_EQ(Lines{}, takeOver(off, before));
    EXPECT_EQ((Lines{"Managed on", added, activated}), takeOver(printer_, before));
    EXPECT_EQ((Lines{"Disconnect", "Managed off", "Delete"}), takeOver(off, before));
    EXPECT_EQ((Lines{"Managed on", "Activate Home"}), giveBack(before));

    // Somebody's own profile under our UUID is nobody's to change.
    daemon_.profiles["/theirs"] = {{"connection", {{"uuid", {profileUUID("wlan0")}}}}};
    EXPECT_EQ(Lines{"1001 another program has a profile under this system's UUID"},
              takeOver(printer_, before));
    EXPECT_EQ(Lines{}, giveBack(before));
    EXPECT_TRUE(daemon_.profiles.contains("/theirs"));
    daemon_.profiles.erase("/theirs");
    // Somebody else activated another profile meanwhile.
    EXPECT_EQ(going, takeOver(printer_, before));
    daemon_.objects["/other"] = {{"Uuid", {std::string("other")}}, {"State", {2U}}};
    card("ActiveConnection", {std::string("/other")});
    EXPECT_EQ(Lines{"Delete"}, giveBack(before));
}

TEST_F(NetworkManager, WaitsForWhatIsNotHeardYet) {
    joinHome();
    const Snapshot before = takeSnapshots();
    for (const std::uint32_t mode : {adHoc, infrastructure}) {
        daemon_.offer("Printer", mode, 0, 0, true);
        EXPECT_EQ((Lines{added, "Disconnect", activated, "Update2", activated}), takeOver(printer_, before));
        EXPECT_EQ(returning, giveBack(before));
        std::erase_if(daemon_.objects,
                      [](const auto& each) { return each.first.find("/AccessPoint/") != std::string::npos; });
    }

    // One that never comes: looked for until the end, and then left to the daemon.
    daemon_.failure = 53;
    EXPECT_EQ((Lines{added, "Disconnect", activated, "RequestScan", "Delete", "AddConnection2",
                     "Autoconnect on", "the network was not found"}),
              takeOver(printer_, before, 1));

    // It comes while an access point of the name is looked for.
    daemon_.failure = 0;
    daemon_.hangs = true;
    daemon_.offer("Printer", adHoc, 0, 0, true);
    EXPECT_EQ(noServer, takeOver(printer_, before, 3).back());
    EXPECT_EQ("adhoc", valueOf<std::string>(ours()["802-11-wireless"], "mode"));
}

TEST_F(NetworkManager, KeepsTheNetworkOfTheCard) {
    EXPECT_EQ(Lines{"no network is named and the card is on none, so it joins none"},
              takeOver(plan({}), takeSnapshots()));
    joinHome();
    EXPECT_EQ(going, takeOver(plan({}), takeSnapshots()));
    EXPECT_EQ("Home", networkOf(ours()));
    EXPECT_EQ(canary, valueOf<std::string>(ours()["802-11-wireless-security"], "psk"));
    // With a key it is joined anew.
    (void)takeOver(plan("Home", "another key"), takeSnapshots());
    EXPECT_EQ("another key", valueOf<std::string>(ours()["802-11-wireless-security"], "psk"));
}

TEST_F(NetworkManager, Radio) {
    daemon_.objects[daemon_.manager]["WirelessEnabled"] = {false};
    card("State", {20U});
    daemon_.offer("Printer", infrastructure, 0, 0);
    const Snapshot before = takeSnapshots();
    EXPECT_EQ((Lines{"WirelessEnabled on", added, activated}), takeOver(printer_, before));
    EXPECT_EQ((Lines{"Disconnect", "Delete", "Autoconnect on", "WirelessEnabled off"}), giveBack(before));

    // The daemon is told all the same, for the day when the switch on the computer is on again.
    daemon_.objects[daemon_.manager] = {{"WirelessEnabled", {true}}, {"WirelessHardwareEnabled", {false}}};
    card("State", {20U});
    EXPECT_EQ(
        (Lines{"AddConnection2", "Autoconnect on", "the radio is switched off by a switch on the computer"}),
        takeOver(printer_, before));
}

TEST_F(NetworkManager, Failures) {
    joinHome();
    daemon_.offer("Office", infrastructure, 1, sharedKey);
    daemon_.offer("Users", infrastructure, 1, 0x200);
    const Snapshot before = takeSnapshots();
    const InterfacePlan office = plan("Office", canary);
    EXPECT_EQ((Lines{"Autoconnect off", "Disconnect",
                     "the network asks each user for a name and a password, which a location does not hold"}),
              takeOver(plan("Users", canary), before));
    EXPECT_EQ(Lines{"Activate Home"}, giveBack(before));
    // None of these is a refusal of the machine, and the card turns to no other network.
    for (const auto& [reason, said] : {std::pair{5U, "no DHCP server answered"},
                                       {7U, "the network's key is wrong or missing"},
                                       {8U, "the network broke off the joining"},
                                       {40U, "the cable is out, or the network went away"},
                                       {53U, "the network was not found"},
                                       {60U, "somebody else took over the card"},
                                       {999U, "NetworkManager gives the reason 999"}}) {
        daemon_.failure = reason;
        EXPECT_EQ((Lines{added, "Disconnect", activated, "Autoconnect off", said}), takeOver(office, before));
        daemon_.failure = 0;
        EXPECT_EQ(returning, giveBack(before));
    }
    EXPECT_EQ(going, takeOver(office, before));
    daemon_.failure = 5;
    EXPECT_EQ((Lines{"Activate Home", "Delete",
                     "the profile that was active before does not come up: no DHCP server answered"}),
              giveBack(before));
    daemon_.failure = 0;
    EXPECT_EQ(Lines{"Activate Home"}, giveBack(before));
    daemon_.refusal = "to " + canary;
    EXPECT_EQ(Lines{"1003 AddConnection2: org.freedesktop.NetworkManager.PermissionDenied"},
              takeOver(office, before))
        << "nothing that holds the key is repeated";
    daemon_.refusal.clear();
    EXPECT_EQ(going, takeOver(office, before));
    daemon_.refusal = "!";
    EXPECT_EQ("1003", giveBack(before).back().substr(0, 4)) << "a profile that stays is tried again";
}

TEST_F(NetworkManager, BelievesNoSignalFromSomebodyElse) {
    daemon_.hangs = true;
    daemon_.offer("Printer", infrastructure, 0, 0);
    sd_bus* const forger = bus_.connect();
    const Snapshot before = takeSnapshots();
    std::thread forging([forger] {
        for (int i = 0; i < 40; ++i) {
            for (const char* number : {"1", "2", "3", "4"}) {
                sd_bus_emit_signal(forger, (StandInDaemon::manager + "/ActiveConnection/" + number).c_str(),
                                   "org.freedesktop.NetworkManager.Connection.Active", "StateChanged", "uu",
                                   2U, 0U);
            }
            sd_bus_flush(forger);
            std::this_thread::sleep_for(std::chrono::milliseconds(10));
        }
    });
    EXPECT_EQ(noServer, takeOver(printer_, before, 0.5).back());
    forging.join();
    sd_bus_flush_close_unref(forger);
}

TEST_F(NetworkManager, LeavesAloneWhatIsNotItsOwn) {
    joinHome();
    const struct {
        const char *object, *property;
        std::uint32_t flags;
        const char* reason;
    } rows[] = {{"/home", "Flags", 4, "it is left as it is: its profile would be lost with its connection"},
                {"/onHome", "StateFlags", 0x80,
                 "it is left as it is: another program than NetworkManager configured it"},
                {StandInDaemon::card.c_str(), "DeviceType", 13,
                 "it is left as it is: it is neither a wired nor a wireless card"}};
    for (const auto& row : rows) {
        const Dictionary before = daemon_.objects[row.object];
        daemon_.objects[row.object][row.property] = {row.flags};
        takeSnapshots();
        ASSERT_EQ(1U, leftAlone_.size());
        EXPECT_EQ(row.reason, leftAlone_[0].reason);
        daemon_.objects[row.object] = before;
    }
    card("Managed", {false});
    EXPECT_EQ("", takeSnapshots().interface);
    EXPECT_TRUE(leftAlone_.empty()) << "it may have another agent";
}

TEST_F(NetworkManager, CardWithoutCarrier) {
    joinHome();
    const Snapshot before = takeSnapshots();
    card("State", {20U});
    card("ActiveConnection", {std::string("/")});
    EXPECT_EQ(Lines{"no profile can be active on it now"}, giveBack(before));
    card("DeviceType", {1U});
    InterfacePlan wired = plan({});
    wired.wireless.reset();
    EXPECT_EQ((Lines{"AddConnection2", "Autoconnect on", "it has no carrier: the cable is out"}),
              takeOver(wired, before))
        << "the daemon activates it when the cable is in";
}

}  // namespace
}  // namespace platform::apply
