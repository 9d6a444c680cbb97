// What the agent does with two wired cards, eth0 and wlan0, on which nothing is active. The same tests run
// against the stand-in and, with its bus socket in LA_NETWORKMANAGER_BUS, against the real NetworkManager.
#include <arpa/inet.h>
#include <gtest/gtest.h>

#include <cstdlib>
#include <memory>

#include "platform/Host.h"
#include "platform/Log.h"
#include "platform/apply/Agents.h"
#include "platform/apply/networkmanager/Daemon.h"
#include "tests/unit/networkmanager/StandInDaemon.h"

namespace platform::apply {
namespace {

using testing_support::PrivateBus;
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
        for (const char* interface : {"eth0", "wlan0"}) {
            const Device card = device(interface);
            EXPECT_TRUE(daemon_.setManaged(card, true).ok());
            EXPECT_TRUE(daemon_.disconnect(card).ok());
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
        const Outcome outcome = daemon_.activate(path, device(interface));
        EXPECT_TRUE(outcome.ok()) << outcome.reason();
        return path;
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
        const Outcome outcome = daemon_.addProfile(sections, {}, path);
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
        const Outcome outcome = agent_->capture(interfaces, captured);
        EXPECT_TRUE(outcome.ok()) << outcome.reason();
        return captured;
    }
    void takeOver(const InterfacePlan& plan, const Captured& before) {
        const Outcome outcome = agent_->takeOver(plan, before);
        EXPECT_TRUE(outcome.ok()) << outcome.reason();
    }
    void giveBack(const Captured& before) {
        const Outcome outcome = agent_->giveBack(before);
        EXPECT_TRUE(outcome.ok()) << outcome.reason();
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

    EXPECT_TRUE(daemon_.disconnect(device("eth0")).ok());
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
    takeOver(off("nosuch0"), captured);
    EXPECT_EQ(agent_->takeOver(on("nosuch0"), captured).status(), kSCStatusFailed);
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

    EXPECT_TRUE(daemon_.activate(path, device("eth0")).ok());
    takeOver(on("eth0"), captured);
    EXPECT_TRUE(daemon_.deleteProfile(path).ok());
    giveBack(captured);
    EXPECT_EQ(state("eth0"), "nothing") << "somebody deleted the earlier profile";
    EXPECT_FALSE(exists(profileUUID("eth0")));
}

TEST_F(Contract, anothersProfileUnderOurUUID) {
    const Captured captured = capture({"eth0"}).at(0);
    add(profileUUID("eth0"), "eth0", "10.20.30.5");
    EXPECT_EQ(agent_->takeOver(on("eth0"), captured).status(), kSCStatusFailed);
    giveBack(captured);
    EXPECT_TRUE(exists(profileUUID("eth0")));
}

// The real daemon judges wireless profiles without a radio too.
TEST_F(Contract, wirelessProfilesAreJudged) {
    const std::string canary = "canary-e7c1";
    InterfacePlan plan = on("eth0");
    plan.wireless.emplace().network = "Printer";
    for (const AccessPoint& point :
         {AccessPoint{}, AccessPoint{true}, AccessPoint{false, true}, AccessPoint{false, true, true, true},
          AccessPoint{true, true, true, true}}) {
        WirelessFacts facts;
        facts.seen = {point};
        plan.wireless->key = point.protectedAccess ? canary : "abcde";
        Sections sections;
        ASSERT_TRUE(makeProfile(plan, &facts, {}, sections).ok());
        std::string path;
        Outcome outcome = daemon_.addProfile(sections, *plan.wireless->key, path);
        EXPECT_TRUE(outcome.ok()) << outcome.reason();
        EXPECT_TRUE(daemon_.deleteProfile(path).ok());

        sections["802-11-wireless-security"] = {{"key-mgmt", {canary}}};
        outcome = daemon_.addProfile(sections, canary, path);
        EXPECT_FALSE(outcome.ok());
        EXPECT_EQ(outcome.reason().find(canary), std::string::npos) << outcome.reason();
    }
}

TEST_F(Contract, cardsThatWereNeverTakenOverMakeWay) {
    use(desk, "eth0", "10.20.30.3");
    use(room, "wlan0", "10.20.30.2");
    const std::vector<Captured> captured = capture({"wlan0", "eth0"});
    ASSERT_EQ(captured.at(0).interface, "eth0");
    takeOver(on("eth0"), captured[0]);
    giveBack(captured[0]);
    giveBack(captured[1]);
    std::uint32_t first = 0;
    std::uint32_t second = 0;
    EXPECT_TRUE(daemon_.readMetric(device("eth0"), first).ok());
    EXPECT_TRUE(daemon_.readMetric(device("wlan0"), second).ok());
    EXPECT_LT(first, second);
    EXPECT_EQ(state("wlan0"), room);
}

}  // namespace
}  // namespace platform::apply
