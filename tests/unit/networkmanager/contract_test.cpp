// What the agent does with two wired cards, eth0 and wlan0, on which nothing is active. The same tests run
// against the stand-in and, with its bus socket in LA_NETWORKMANAGER_BUS, against the real NetworkManager.
#include <arpa/inet.h>
#include <gtest/gtest.h>

#include <cstdlib>
#include <memory>

#include "platform/apply/Agents.h"
#include "platform/apply/networkmanager/Daemon.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"
#include "tests/unit/networkmanager/StandInDaemon.h"

namespace platform::apply {
namespace {

using testing_support::PrivateBus;
using testing_support::run;
using testing_support::StandInDaemon;

const std::string desk = "11111111-2222-4333-8444-555555555555";
const std::string room = "66666666-7777-4888-9999-aaaaaaaaaaaa";

class Contract : public ::testing::Test {
  protected:
    void SetUp() override {
        Host host;
        if (const char* const socket = std::getenv("LA_NETWORKMANAGER_BUS"); socket != nullptr) {
            host.systemBusSocket = socket;
        } else {
            privateBus_ = std::make_unique<PrivateBus>();
            host.systemBusSocket = privateBus_->socket();
            standIn_ = std::make_unique<StandInDaemon>(host.systemBusSocket,
                                                       std::vector<StandInDaemon::Card>{{"eth0"}, {"wlan0"}});
        }
        override_ = std::make_unique<HostOverride>(host);
        ASSERT_TRUE(daemon_.connect().ok());
        ASSERT_TRUE(daemon_.listen().ok());
        for (const char* interface : {"eth0", "wlan0"}) {
            const Device card = device(interface);
            EXPECT_TRUE(daemon_.setManaged(card, true).ok());
            disconnect(interface);
            EXPECT_TRUE(daemon_.setAutoconnect(card, true).ok());
        }
        agent_ = makeNetworkManagerAgent();
    }
    void TearDown() override {
        for (const std::string& uuid : {desk, room, profileUUID("eth0"), profileUUID("wlan0")}) {
            std::optional<Profile> profile;
            if (daemon_.findProfile(uuid, profile).ok() && profile) {
                EXPECT_TRUE(daemon_.deleteProfile(profile->path).ok());
            }
        }
    }

    Device device(const char* interface) {
        std::optional<Device> found;
        EXPECT_TRUE(daemon_.findDevice(interface, found).ok());
        return found.value_or(Device());
    }
    // Somebody's profile, activated.
    std::string use(const std::string& uuid, const char* interface, const char* address) {
        const std::string path = add(uuid, interface, address);
        activate(path, interface);
        return path;
    }
    void activate(const std::string& path, const char* interface) {
        std::string active;
        std::uint32_t state = 0;
        const Outcome outcome = daemon_.activate(path, device(interface), active);
        EXPECT_TRUE(outcome.ok()) << outcome.reason();
        while (state != activeActivated && daemon_.activeState(active, state).ok() &&
               daemon_.handleSignals(Clock::now() + std::chrono::milliseconds(20)).ok()) {
        }
    }
    void disconnect(const char* interface) {
        const Device card = device(interface);
        std::uint32_t state = 0;
        EXPECT_TRUE(daemon_.disconnect(card).ok());
        do {
            EXPECT_TRUE(daemon_.handleSignals(Clock::now() + std::chrono::milliseconds(20)).ok());
            state = device(interface).state;
        } while (state > deviceDisconnected);
    }
    std::string add(const std::string& uuid, const char* interface, const char* address) {
        Sections sections = {
            {"connection",
             {{"id", {"profile " + uuid.substr(0, 4)}},
              {"uuid", {uuid}},
              {"type", {std::string("802-3-ethernet")}},
              {"autoconnect", {false}},
              {"interface-name", {std::string(interface)}}}},
            {"802-3-ethernet", {}},
            {"ipv4",
             {{"method", {std::string("manual")}},
              {"gateway", {std::string("10.20.30.1")}},
              {"address-data",
               {std::vector<Dictionary>{
                   {{"address", {std::string(address)}}, {"prefix", {std::uint32_t{24}}}}}}}}},
            {"ipv6", {{"method", {std::string("disabled")}}, {"route-metric", {std::int64_t{1}}}}}};
        std::string path;
        const Outcome outcome = daemon_.addProfile(sections, Adding::heldBack, {}, path);
        EXPECT_TRUE(outcome.ok()) << outcome.reason();
        return path;
    }
    std::string activePath(const char* interface) { return device(interface).active; }
    // The card in one line: what is active, and its switches.
    std::string state(const char* interface) {
        const Device card = device(interface);
        std::optional<Active> active;
        EXPECT_TRUE(daemon_.findActive(card, active).ok());
        return (active ? active->uuid : "nothing") + (card.managed ? "" : " unmanaged") +
               (card.autoconnect ? "" : " held");
    }
    bool exists(const std::string& uuid) {
        std::optional<Profile> profile;
        EXPECT_TRUE(daemon_.findProfile(uuid, profile).ok());
        return profile.has_value();
    }
    std::vector<Captured> capture(const std::vector<std::string>& interfaces) {
        std::vector<Captured> captured;
        std::vector<Trouble> leftAlone;
        const Outcome outcome = agent_->capture(interfaces, captured, leftAlone);
        EXPECT_TRUE(outcome.ok()) << outcome.reason();
        EXPECT_TRUE(leftAlone.empty());
        return captured;
    }
    void takeOver(const InterfacePlan& plan, const Captured& before) {
        const Task task = run(*agent_, before, &plan);
        EXPECT_TRUE(task.refusal.ok()) << task.refusal.reason();
        EXPECT_EQ(task.trouble, "");
    }
    std::string giveBack(const Captured& before) {
        const Task task = run(*agent_, before, nullptr);
        EXPECT_TRUE(task.refusal.ok()) << task.refusal.reason();
        return task.trouble;
    }
    static InterfacePlan on(const char* interface, const char* address = "192.0.0.199") {
        InterfacePlan plan = off(interface);
        plan.active = true;
        plan.method = IPv4Method::manual;
        plan.addresses.emplace_back().prefixLength = 24;
        EXPECT_EQ(::inet_pton(AF_INET, address, &plan.addresses[0].address), 1);
        return plan;
    }
    static InterfacePlan off(const char* interface) {
        InterfacePlan plan;
        plan.name = interface;
        return plan;
    }

    std::unique_ptr<PrivateBus> privateBus_;
    std::unique_ptr<StandInDaemon> standIn_;
    std::unique_ptr<HostOverride> override_;
    Daemon daemon_;
    std::shared_ptr<Agent> agent_;
    LogCapture log_{[](LogLevel, std::string_view) {}};
};

TEST_F(Contract, capturesInTheOrderOfTheWayBack) {
    use(room, "wlan0", "10.20.30.2");
    use(desk, "eth0", "10.20.30.3");
    const std::string before = state("eth0") + state("wlan0");
    std::vector<Captured> captured = capture({"eth0", "nosuch0", "wlan0"});
    ASSERT_EQ(captured.size(), 2U);
    EXPECT_EQ(captured[0].interface, "wlan0");
    EXPECT_EQ(state("eth0") + state("wlan0"), before);

    disconnect("eth0");
    captured = capture({"wlan0", "eth0"});
    ASSERT_EQ(captured.size(), 2U);
    EXPECT_EQ(captured[0].interface, "eth0") << "what has no route comes first";
}

TEST_F(Contract, thereAndBack) {
    use(desk, "eth0", "10.20.30.3");
    const std::string before = state("eth0");
    const Captured captured = capture({"eth0"}).at(0);

    takeOver(on("eth0"), captured);
    EXPECT_EQ(state("eth0"), profileUUID("eth0"));
    const std::string active = activePath("eth0");
    takeOver(on("eth0"), captured);
    EXPECT_EQ(activePath("eth0"), active) << "the same plan again changes nothing";
    takeOver(on("eth0", "192.0.0.200"), captured);
    EXPECT_NE(activePath("eth0"), active);

    for (int i = 0; i < 2; ++i) {
        giveBack(captured);
        EXPECT_EQ(state("eth0"), before);
        EXPECT_FALSE(exists(profileUUID("eth0")));
    }
}

TEST_F(Contract, offAndOnAndBack) {
    use(desk, "eth0", "10.20.30.3");
    const Captured captured = capture({"eth0"}).at(0);
    for (int i = 0; i < 2; ++i) {
        takeOver(off("eth0"), captured);
        EXPECT_EQ(state("eth0"), "nothing unmanaged held");
    }
    takeOver(on("eth0"), captured);
    EXPECT_EQ(state("eth0"), profileUUID("eth0"));
    takeOver(off("eth0"), captured);
    giveBack(captured);
    EXPECT_EQ(state("eth0"), desk);
    const Captured missing{"nosuch0", captured.state};
    takeOver(off("nosuch0"), missing);
    const InterfacePlan plan = on("nosuch0");
    EXPECT_EQ(run(*agent_, missing, &plan).trouble, "there is no such interface");
}

TEST_F(Contract, idleCards) {
    for (const bool autoconnect : {true, false}) {
        EXPECT_TRUE(daemon_.setAutoconnect(device("eth0"), autoconnect).ok());
        const std::string before = state("eth0");
        const Captured captured = capture({"eth0"}).at(0);
        for (const InterfacePlan& plan : {on("eth0"), off("eth0")}) {
            takeOver(plan, captured);
            EXPECT_NE(state("eth0"), before);
            giveBack(captured);
            EXPECT_EQ(state("eth0"), before);
        }
    }
}

TEST_F(Contract, aLostRecordIsFoundInTheProfile) {
    use(desk, "eth0", "10.20.30.3");
    takeOver(on("eth0"), capture({"eth0"}).at(0));
    const Captured again = capture({"eth0"}).at(0);
    takeOver(on("eth0", "192.0.0.200"), again);
    giveBack(again);
    EXPECT_EQ(state("eth0"), desk);
}

TEST_F(Contract, whatOthersDidMeanwhile) {
    const std::string path = use(desk, "eth0", "10.20.30.3");
    const Captured captured = capture({"eth0"}).at(0);
    takeOver(on("eth0"), captured);
    use(room, "eth0", "10.20.30.4");
    giveBack(captured);
    EXPECT_EQ(state("eth0"), room) << "somebody activated another profile";
    EXPECT_FALSE(exists(profileUUID("eth0")));

    activate(path, "eth0");
    takeOver(on("eth0"), captured);
    EXPECT_TRUE(daemon_.deleteProfile(path).ok());
    EXPECT_EQ(giveBack(captured), "the profile that was active on it is deleted");
    EXPECT_EQ(state("eth0"), "nothing");
    EXPECT_FALSE(exists(profileUUID("eth0")));
}

TEST_F(Contract, anothersProfileUnderOurUUID) {
    const Captured captured = capture({"eth0"}).at(0);
    add(profileUUID("eth0"), "eth0", "10.20.30.5");
    const InterfacePlan plan = on("eth0");
    EXPECT_EQ(run(*agent_, captured, &plan).refusal.status(), kSCStatusFailed);
    giveBack(captured);
    EXPECT_TRUE(exists(profileUUID("eth0")));
}

// The real daemon judges wireless profiles without a radio too.
TEST_F(Contract, wirelessProfilesAreJudged) {
    const std::string canary = "canary-e7c1";
    InterfacePlan plan = on("eth0");
    plan.wireless.emplace().network = "Printer";
    for (const HeardNetwork& heard : {HeardNetwork{}, HeardNetwork{true}, HeardNetwork{false, Security::wep},
                                      HeardNetwork{false, Security::wpa}, HeardNetwork{true, Security::wpa},
                                      HeardNetwork{false, Security::sae}}) {
        plan.wireless->key.reset();
        if (heard.security != Security::open) {
            plan.wireless->key = heard.security == Security::wep ? "abcde" : canary;
        }
        const WirelessLink link{chooseNetwork({&heard, 1}, plan.wireless->key).choice, {}};
        Sections sections = makeProfile(plan, &link, {});
        std::string path;
        Outcome outcome =
            daemon_.addProfile(sections, Adding::heldBack, plan.wireless->key.value_or(""), path);
        EXPECT_TRUE(outcome.ok()) << outcome.reason();
        EXPECT_TRUE(daemon_.deleteProfile(path).ok());

        sections["802-11-wireless-security"] = {{"key-mgmt", {canary}}};
        outcome = daemon_.addProfile(sections, Adding::heldBack, canary, path);
        EXPECT_FALSE(outcome.ok());
        EXPECT_EQ(outcome.reason().find(canary), std::string::npos) << outcome.reason();
    }
}

// In the order of the capture, whatever is active already: the daemon numbers the routes by that order.
TEST_F(Contract, cardsComeBackInTheirOrder) {
    use(desk, "eth0", "10.20.30.3");
    use(room, "wlan0", "10.20.30.2");
    const std::vector<Captured> captured = capture({"wlan0", "eth0"});
    ASSERT_EQ(captured.at(0).interface, "eth0");
    for (const bool isSecondAway : {false, true}) {
        takeOver(off("eth0"), captured[0]);
        if (isSecondAway) {
            takeOver(on("wlan0"), captured[1]);
        }
        std::vector<Task> tasks{{captured.data(), nullptr, {}, {}}, {&captured[1], nullptr, {}, {}}};
        const Clock::time_point deadline = Clock::now() + std::chrono::seconds(10);
        agent_->start(tasks, deadline);
        EXPECT_TRUE(agent_->settle(deadline));
        std::uint32_t first = 0;
        std::uint32_t second = 0;
        EXPECT_TRUE(daemon_.readMetric(device("eth0"), first).ok());
        EXPECT_TRUE(daemon_.readMetric(device("wlan0"), second).ok());
        EXPECT_LT(first, second);
        EXPECT_EQ(state("eth0") + state("wlan0"), desk + room);
    }
    // One that is not given back in this run stays as it is.
    takeOver(on("eth0"), captured[0]);
    const std::string active = activePath("wlan0");
    EXPECT_EQ(giveBack(captured[0]), "");
    EXPECT_EQ(activePath("wlan0"), active);
}

}  // namespace
}  // namespace platform::apply
