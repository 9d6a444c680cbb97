// What only a daemon without cards can play: radios, access points, failures.
#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <cstring>
#include <memory>
#include <utility>

#include "platform/FileDescriptor.h"
#include "platform/Host.h"
#include "platform/Log.h"
#include "platform/apply/Agents.h"
#include "platform/apply/networkmanager/Daemon.h"
#include "tests/unit/networkmanager/StandInDaemon.h"

namespace platform::apply {
namespace {

using testing_support::PrivateBus;
using testing_support::StandInDaemon;
using testing_support::TemporaryDirectory;

const std::string canary = "canary-e7c1";
const std::string home = "11111111-2222-4333-8444-555555555555";
constexpr std::uint32_t adHocCapability = 0x80;
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
        Sections sections;
        WirelessFacts facts;
        InterfacePlan joined = plan("Home", canary);
        ASSERT_TRUE(makeProfile(joined, &facts, {}, sections).ok());
        sections.erase("user");
        sections["connection"]["uuid"] = {home};
        sections["connection"]["id"] = {std::string("Home")};
        Daemon daemon;
        std::string path;
        std::optional<Device> device;
        ASSERT_TRUE(daemon.connect().ok() && daemon.addProfile(sections, {}, path).ok() &&
                    daemon.findDevice("wlan0", device).ok() && daemon.activate(path, *device).ok());
        standIn_.changes.clear();
    }
    Captured capture() {
        std::vector<Captured> captured;
        const std::vector<std::string> interfaces = {"wlan0"};
        const Outcome outcome = agent_->capture(interfaces, captured);
        EXPECT_TRUE(outcome.ok()) << outcome.reason();
        return captured.empty() ? Captured() : captured[0];
    }
    using Changes = std::vector<std::string>;
    Changes changes() { return std::exchange(standIn_.changes, {}); }
    Sections ours() { return standIn_.profile(profileUUID("wlan0")); }

    PrivateBus bus_;
    StandInDaemon standIn_;
    HostOverride override_;
    std::shared_ptr<Agent> agent_ = makeNetworkManagerAgent();
    LogCapture log_{
        [](LogLevel, std::string_view line) { EXPECT_EQ(line.find(canary), std::string_view::npos); }};
};

TEST_F(NetworkManager, joinsWhatTheScanShows) {
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
        const Outcome outcome = agent_->takeOver(plan(row.network, row.key), before);
        ASSERT_TRUE(outcome.ok()) << outcome.reason();
        Sections profile = ours();
        EXPECT_EQ(networkOf(profile), row.network);
        EXPECT_EQ(valueOf<std::string>(profile["802-11-wireless"], "mode"), row.mode);
        EXPECT_EQ(valueOf<std::string>(profile["802-11-wireless-security"], "key-mgmt").value_or(""),
                  row.security);
    }
    changes();
    EXPECT_TRUE(agent_->giveBack(before).ok());
    EXPECT_EQ(changes(), (Changes{"ActivateConnection Home on wlan0", "Delete location-assistant wlan0"}));
}

TEST_F(NetworkManager, aCardThatCanMakesItsOwnCell) {
    standIn_.cards[0].capabilities = adHocCapability;
    ASSERT_TRUE(agent_->takeOver(plan("Nowhere"), capture()).ok());
    EXPECT_EQ(valueOf<std::string>(ours()["802-11-wireless"], "mode"), "adhoc");
}

TEST_F(NetworkManager, keepsTheNetworkOfTheCard) {
    EXPECT_TRUE(agent_->takeOver(plan({}), capture()).ok());
    EXPECT_EQ(changes(), Changes()) << "on no network it joins none";

    joinHome();
    const Captured before = capture();
    ASSERT_TRUE(agent_->takeOver(plan({}), before).ok());
    EXPECT_EQ(changes(), (Changes{"AddConnection2 location-assistant wlan0",
                                  "ActivateConnection location-assistant wlan0 on wlan0"}));
    EXPECT_EQ(networkOf(ours()), "Home");
    EXPECT_EQ(valueOf<std::string>(ours()["802-11-wireless-security"], "psk"), canary);
}

TEST_F(NetworkManager, radio) {
    standIn_.radio = false;
    standIn_.cards[0].state = 20;
    const Captured before = capture();
    ASSERT_TRUE(agent_->takeOver(plan("Printer"), before).ok());
    EXPECT_EQ(changes(), (Changes{"Set WirelessEnabled on", "AddConnection2 location-assistant wlan0",
                                  "ActivateConnection location-assistant wlan0 on wlan0"}));
    ASSERT_TRUE(agent_->giveBack(before).ok());
    EXPECT_EQ(changes(), (Changes{"Disconnect wlan0", "Delete location-assistant wlan0",
                                  "Set Autoconnect of wlan0 on", "Set WirelessEnabled off"}));
    EXPECT_FALSE(standIn_.radio);

    standIn_.radioHardware = false;
    EXPECT_EQ(agent_->takeOver(plan("Printer"), before).status(), kSCStatusFailed);
    EXPECT_EQ(changes(), Changes());
}

TEST_F(NetworkManager, failures) {
    joinHome();
    const Captured before = capture();
    const struct {
        std::uint32_t reason;
        const char* said;
    } rows[] = {{5, "no address was had"},
                {7, "the network's key is wrong or missing"},
                {8, "the network broke off the joining"},
                {40, "the cable is out, or the network went away"},
                {53, "the network was not found"},
                {60, "somebody else took over the card"},
                {999, "NetworkManager gives the reason 999"}};
    for (const auto& row : rows) {
        standIn_.cards[0].failure = row.reason;
        const Outcome outcome = agent_->takeOver(plan("Office", canary), before);
        EXPECT_EQ(outcome.status(), kSCStatusFailed);
        EXPECT_EQ(outcome.reason(), row.said);
        standIn_.cards[0].failure = 0;
        EXPECT_TRUE(agent_->giveBack(before).ok());
        EXPECT_TRUE(ours().empty());
    }

    ASSERT_TRUE(agent_->takeOver(plan("Office", canary), before).ok());
    standIn_.cards[0].failure = 5;
    EXPECT_EQ(agent_->giveBack(before).reason(),
              "the profile that was active before does not come up: no address was had");
    EXPECT_TRUE(ours().empty()) << "the temporary profile does not stay in its place";
    standIn_.cards[0].failure = 0;
    EXPECT_TRUE(agent_->giveBack(before).ok());

    standIn_.forbidsChanges = true;
    EXPECT_EQ(agent_->takeOver(plan("Office", canary), before).status(), kSCStatusAccessError);
    standIn_.forbidsChanges = false;

    standIn_.leavesAtActivation = true;
    EXPECT_EQ(agent_->takeOver(plan("Office", canary), before).reason(),
              "org.freedesktop.NetworkManager left the bus while it was waited for");
    EXPECT_EQ(agent_->giveBack(before).reason(), "NetworkManager does not run");
}

TEST_F(NetworkManager, leavesAloneWhatIsNotItsOwn) {
    joinHome();
    for (const bool external : {true, false}) {
        standIn_.cards[0].external = external;
        standIn_.profileFlags = external ? 0 : 4;
        const Captured before = capture();
        EXPECT_EQ(agent_->takeOver(plan("Printer"), before).status(), kSCStatusFailed);
        InterfacePlan off = plan({});
        off.active = false;
        EXPECT_EQ(agent_->takeOver(off, before).status(), kSCStatusFailed);
        EXPECT_TRUE(agent_->giveBack(before).ok());
        EXPECT_EQ(changes(), Changes());
    }
}

TEST_F(NetworkManager, aWiredCardJoinsNoNetwork) {
    standIn_.cards[0].type = 1;
    EXPECT_EQ(agent_->takeOver(plan("Printer"), capture()).status(), kSCStatusFailed);
    EXPECT_EQ(changes(), Changes());
}

TEST_F(NetworkManager, cardWithoutCarrierOnTheWayBack) {
    joinHome();
    const Captured before = capture();
    ASSERT_TRUE(agent_->takeOver(plan("Printer"), before).ok());
    standIn_.cards[0].state = 20;
    standIn_.cards[0].active.clear();
    changes();
    EXPECT_TRUE(agent_->giveBack(before).ok());
    EXPECT_EQ(changes(), Changes{"Delete location-assistant wlan0"});
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
