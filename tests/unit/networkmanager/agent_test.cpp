// What only a daemon without cards can play: radios, access points, failures.
#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <cstring>
#include <memory>
#include <utility>

#include "platform/apply/Agents.h"
#include "platform/apply/networkmanager/Daemon.h"
#include "platform/base/FileDescriptor.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"
#include "tests/unit/networkmanager/StandInDaemon.h"

namespace platform::apply {
namespace {

using testing_support::PrivateBus;
using testing_support::run;
using testing_support::StandInDaemon;
using testing_support::TemporaryDirectory;

const std::string canary = "canary-e7c1";
const std::string home = "11111111-2222-4333-8444-555555555555";
constexpr std::uint32_t sharedKey = 0x100;

class NetworkManager : public ::testing::Test {
  protected:
    NetworkManager() : standIn_(bus_.socket(), {wlan0()}), override_(host(bus_.socket())) {}

    static StandInDaemon::Card wlan0() {
        StandInDaemon::Card card{"wlan0"};
        card.type = 2;
        card.points = {
            {"Printer", true}, {"Office", false, true, sharedKey}, {"Quiet", false, true, 0, false}};
        return card;
    }
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
        const InterfacePlan joined = plan("Home", canary);
        const WirelessLink link{JoinChoice{true, false, Security::wpa, 0}, {}};
        Sections sections = makeProfile(joined, &link, {});
        sections.erase("user");
        sections["connection"]["uuid"] = {home};
        sections["connection"]["id"] = {std::string("Home")};
        Daemon daemon;
        std::string path;
        std::optional<Device> device;
        std::string active;
        std::uint32_t state = 0;
        ASSERT_TRUE(daemon.connect().ok() && daemon.listen().ok() &&
                    daemon.addProfile(sections, Adding::heldBack, {}, path).ok() &&
                    daemon.findDevice("wlan0", device).ok() && daemon.activate(path, *device, active).ok());
        while (state != activeActivated && daemon.activeState(active, state).ok() &&
               daemon.handleSignals(Clock::now() + std::chrono::milliseconds(20)).ok()) {
        }
        standIn_.changes.clear();
    }
    Captured capture() {
        std::vector<Captured> captured;
        const std::vector<std::string> interfaces = {"wlan0"};
        const Outcome outcome = agent_->capture(interfaces, captured, leftAlone_);
        EXPECT_TRUE(outcome.ok()) << outcome.reason();
        return captured.empty() ? Captured() : captured[0];
    }
    Task takeOver(const InterfacePlan& plan, const Captured& before) { return run(*agent_, before, &plan); }
    Task giveBack(const Captured& before) { return run(*agent_, before, nullptr); }
    // Nothing was refused and nothing stood against it.
    static std::string wrong(const Task& task) { return task.refusal.reason() + task.trouble; }
    using Changes = std::vector<std::string>;
    Changes changes() { return std::exchange(standIn_.changes, {}); }
    Sections ours() { return standIn_.profile(profileUUID("wlan0")); }

    // Somebody's wired profile, on its way.
    void joinHomeUnfinished() {
        InterfacePlan wired = plan({});
        wired.wireless.reset();
        Sections sections = makeProfile(wired, nullptr, {});
        sections.erase("user");
        sections["connection"]["uuid"] = {home};
        Daemon daemon;
        std::string path;
        std::optional<Device> device;
        std::string active;
        ASSERT_TRUE(daemon.connect().ok() && daemon.addProfile(sections, Adding::heldBack, {}, path).ok() &&
                    daemon.findDevice("wlan0", device).ok() && daemon.activate(path, *device, active).ok());
        while (daemon.findDevice("wlan0", device).ok() && device->state != deviceGetsAddresses) {
        }
        standIn_.changes.clear();
    }

    const InterfacePlan printer_ = plan("Printer");
    PrivateBus bus_;
    StandInDaemon standIn_;
    HostOverride override_;
    std::shared_ptr<Agent> agent_ = makeNetworkManagerAgent();
    std::vector<Trouble> leftAlone_;
    LogCapture log_{
        [](LogLevel, std::string_view line) { EXPECT_EQ(line.find(canary), std::string_view::npos); }};
};

TEST_F(NetworkManager, joinsWhatIsOnTheAir) {
    joinHome();
    const Captured before = capture();
    const struct {
        const char* network;
        std::optional<std::string> key;
        const char* mode;
        const char* security;
    } rows[] = {
        {"Printer", {}, "adhoc", ""},
        {"Office", canary, "infrastructure", "wpa-psk"},
        {"Quiet", "abcde", "infrastructure", "none"},
        {"Nowhere", {}, "infrastructure", ""},
    };
    for (const auto& row : rows) {
        EXPECT_EQ(wrong(takeOver(plan(row.network, row.key), before)), "");
        Sections profile = ours();
        EXPECT_EQ(networkOf(profile), row.network);
        EXPECT_EQ(valueOf<std::string>(profile["802-11-wireless"], "mode"), row.mode);
        EXPECT_EQ(valueOf<std::string>(profile["802-11-wireless-security"], "key-mgmt").value_or(""),
                  row.security);
    }
    changes();
    EXPECT_EQ(wrong(giveBack(before)), "");
    EXPECT_EQ(changes(), (Changes{"ActivateConnection Home on wlan0", "Delete location-assistant wlan0"}));
}

TEST_F(NetworkManager, turnsToACellOnceItIsHeard) {
    standIn_.cards[0].hangs = true;
    standIn_.cards[0].points = {{"Printer", true, false, 0, false}};
    EXPECT_NE(run(*agent_, capture(), &printer_, std::chrono::seconds(3)).trouble, "");
    EXPECT_EQ(valueOf<std::string>(ours()["802-11-wireless"], "mode"), "adhoc");
    EXPECT_EQ(changes(), (Changes{"AddConnection2 location-assistant wlan0",
                                  "ActivateConnection location-assistant wlan0 on wlan0",
                                  "Update2 location-assistant wlan0",
                                  "ActivateConnection location-assistant wlan0 on wlan0"}));
}

TEST_F(NetworkManager, keepsTheNetworkOfTheCard) {
    EXPECT_EQ(takeOver(plan({}), capture()).trouble,
              "no network is named and the card is on none, so it joins none");
    EXPECT_EQ(changes(), Changes());

    joinHome();
    const Captured before = capture();
    EXPECT_EQ(wrong(takeOver(plan({}), before)), "");
    EXPECT_EQ(changes(), (Changes{"AddConnection2 location-assistant wlan0",
                                  "ActivateConnection location-assistant wlan0 on wlan0"}));
    EXPECT_EQ(networkOf(ours()), "Home");
    EXPECT_EQ(valueOf<std::string>(ours()["802-11-wireless-security"], "psk"), canary);
}

TEST_F(NetworkManager, radio) {
    standIn_.radio = false;
    standIn_.cards[0].state = 20;
    const Captured before = capture();
    EXPECT_EQ(wrong(takeOver(printer_, before)), "");
    EXPECT_EQ(changes(), (Changes{"Set WirelessEnabled on", "AddConnection2 location-assistant wlan0",
                                  "ActivateConnection location-assistant wlan0 on wlan0"}));
    EXPECT_EQ(wrong(giveBack(before)), "");
    EXPECT_EQ(changes(), (Changes{"Disconnect wlan0", "Delete location-assistant wlan0",
                                  "Set Autoconnect of wlan0 on", "Set WirelessEnabled off"}));
    EXPECT_FALSE(standIn_.radio);

    // The daemon is told all the same, for the day when the switch is on again.
    standIn_.radio = true;
    standIn_.radioHardware = false;
    standIn_.cards[0].state = 20;
    const Task task = takeOver(printer_, before);
    EXPECT_TRUE(task.refusal.ok());
    EXPECT_EQ(task.trouble, "the radio is switched off by a switch on the computer");
    EXPECT_EQ(changes(), (Changes{"AddConnection2 location-assistant wlan0", "Set Autoconnect of wlan0 on"}));
}

TEST_F(NetworkManager, failures) {
    joinHome();
    const Captured before = capture();
    const InterfacePlan office = plan("Office", canary);
    const struct {
        std::uint32_t reason;
        const char* said;
    } rows[] = {{5, "no DHCP server answered"},
                {7, "the network's key is wrong or missing"},
                {8, "the network broke off the joining"},
                {40, "the cable is out, or the network went away"},
                {53, "the network was not found"},
                {60, "somebody else took over the card"},
                {999, "NetworkManager gives the reason 999"}};
    for (const auto& row : rows) {
        standIn_.cards[0].failure = row.reason;
        const Task task = takeOver(office, before);
        EXPECT_TRUE(task.refusal.ok())
            << "a network that does not take the card is no refusal of the machine";
        EXPECT_EQ(task.trouble, row.said);
        standIn_.cards[0].failure = 0;
        EXPECT_EQ(wrong(giveBack(before)), "");
        EXPECT_TRUE(ours().empty());
    }
    standIn_.cards[0].hangs = true;
    EXPECT_EQ(run(*agent_, before, &office, std::chrono::milliseconds(300)).trouble,
              "no DHCP server answered; NetworkManager goes on asking");
    standIn_.cards[0].hangs = false;

    standIn_.cards[0].failure = 5;
    EXPECT_EQ(wrong(giveBack(before)),
              "the profile that was active before does not come up: no DHCP server answered");
    EXPECT_TRUE(ours().empty()) << "the temporary profile does not stay in its place";
    standIn_.cards[0].failure = 0;
    EXPECT_EQ(wrong(giveBack(before)), "");

    standIn_.forbidsChanges = true;
    EXPECT_EQ(takeOver(office, before).refusal.status(), kSCStatusAccessError);
    standIn_.forbidsChanges = false;
    EXPECT_EQ(wrong(takeOver(office, before)), "");
    standIn_.forbidsChanges = true;
    EXPECT_EQ(giveBack(before).refusal.status(), kSCStatusAccessError)
        << "a profile that stays is tried again";
    standIn_.forbidsChanges = false;

    standIn_.leavesAtActivation = true;
    EXPECT_EQ(takeOver(office, before).refusal.reason(),
              "org.freedesktop.NetworkManager left the bus while it was waited for");
    agent_ = makeNetworkManagerAgent();
    EXPECT_EQ(giveBack(before).refusal.reason(), "NetworkManager does not run");
}

// What was still connecting before is asked for, and not waited for.
TEST_F(NetworkManager, waitsOnlyForWhatWasUpBefore) {
    standIn_.cards[0].hangs = true;
    standIn_.cards[0].type = 20;
    joinHomeUnfinished();
    const Captured before = capture();
    InterfacePlan wired = plan({});
    wired.wireless.reset();
    standIn_.cards[0].hangs = false;
    EXPECT_EQ(wrong(takeOver(wired, before)), "");
    standIn_.cards[0].hangs = true;
    const Clock::time_point begin = Clock::now();
    EXPECT_EQ(wrong(giveBack(before)), "");
    EXPECT_LT(Clock::now() - begin, std::chrono::seconds(1));
}

TEST_F(NetworkManager, believesNoSignalFromSomebodyElse) {
    standIn_.cards[0].hangs = true;
    StandInDaemon::Forger forger(bus_.socket());
    const Captured before = capture();
    EXPECT_EQ(run(*agent_, before, &printer_, std::chrono::seconds(1)).trouble,
              "no DHCP server answered; NetworkManager goes on asking");
}

TEST_F(NetworkManager, leavesAloneWhatIsNotItsOwn) {
    joinHome();
    for (const bool external : {true, false}) {
        standIn_.cards[0].external = external;
        standIn_.profileFlags = external ? 0 : 4;
        capture();
        ASSERT_EQ(leftAlone_.size(), 1U);
        EXPECT_EQ(leftAlone_[0].interface, "wlan0");
        EXPECT_NE(leftAlone_[0].reason.find(external ? "another program" : "would be lost"),
                  std::string::npos);
    }
}

TEST_F(NetworkManager, aWiredCardJoinsNoNetwork) {
    standIn_.cards[0].type = 1;
    EXPECT_EQ(takeOver(printer_, capture()).trouble,
              "a network to join is named, and the card is not a wireless one");
    EXPECT_EQ(changes(), (Changes{"AddConnection2 location-assistant wlan0",
                                  "ActivateConnection location-assistant wlan0 on wlan0"}))
        << "the other settings stand";
}

TEST_F(NetworkManager, cardWithoutCarrier) {
    joinHome();
    const Captured before = capture();
    EXPECT_EQ(wrong(takeOver(printer_, before)), "");
    standIn_.cards[0].state = 20;
    standIn_.cards[0].active.clear();
    changes();
    EXPECT_EQ(giveBack(before).trouble, "no profile can be active on it now");
    EXPECT_EQ(changes(), Changes{"Delete location-assistant wlan0"});

    agent_ = makeNetworkManagerAgent();
    standIn_.cards[0].type = 1;
    standIn_.cards[0].state = 20;
    InterfacePlan wired = plan({});
    wired.wireless.reset();
    EXPECT_EQ(takeOver(wired, before).trouble, "it has no carrier: the cable is out");
    EXPECT_EQ(changes(), (Changes{"AddConnection2 location-assistant wlan0", "Set Autoconnect of wlan0 on"}))
        << "the daemon activates it when the cable is in";
}

// Whether it runs decides which agent leads, so a doubt is no answer.
TEST(NetworkManagerIsRunning, inEveryStateOfTheBus) {
    const auto ask = [](const std::string& socket, bool& running) {
        Host host;
        host.systemBusSocket = socket;
        const HostOverride override(host);
        return isNetworkManagerRunning(running);
    };
    const TemporaryDirectory directory;
    bool running = true;
    EXPECT_TRUE(ask(directory.at("no bus"), running).ok());
    EXPECT_FALSE(running);
    {
        const PrivateBus bus;
        EXPECT_TRUE(ask(bus.socket(), running).ok());
        EXPECT_FALSE(running);
        const StandInDaemon daemon(bus.socket(), {});
        EXPECT_TRUE(ask(bus.socket(), running).ok());
        EXPECT_TRUE(running);
    }
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, directory.at("mute, %").c_str(), sizeof address.sun_path - 1);
    const FileDescriptor mute(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    ASSERT_EQ(bind(mute.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    EXPECT_FALSE(ask(address.sun_path, running).ok()) << "nobody listens";
    ASSERT_EQ(listen(mute.get(), 1), 0);
    const Outcome outcome = ask(address.sun_path, running);
    EXPECT_EQ(outcome.reason(), "connecting to the system bus: no answer in 1 s");
    EXPECT_FALSE(running);
}

}  // namespace
}  // namespace platform::apply
