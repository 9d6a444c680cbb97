// The profiles, as pure functions. With the socket of a bus in LA_NETWORKMANAGER_BUS the real NetworkManager
// judges each of them.
#include <gtest/gtest.h>

#include <cstdlib>

#include "platform/apply/networkmanager/Daemon.h"
#include "platform/base/Host.h"
#include "tests/unit/apply/Trees.h"
#include "tests/unit/networkmanager/Show.h"
#include "tests/unit/support/Transcript.h"

namespace platform::apply {
namespace {

using testing_support::showValue;
using Inputs = testing_support::Transcript::Inputs;

Sections made(const InterfacePlan& plan, const WirelessLink* link = nullptr,
              const ProfileSnapshot& before = {}) {
    Sections profile = makeProfile(plan, link, before);
    if (const char* const socket = std::getenv("LA_NETWORKMANAGER_BUS"); socket != nullptr) {
        Host host;
        host.systemBusSocket = socket;
        const HostOverride override(host);
        Daemon daemon;
        std::string path;
        EXPECT_EQ("", daemon.connect().reason());
        EXPECT_EQ("", daemon.addProfile(profile, Adding::heldBack, {}, path).reason());
        EXPECT_EQ("", daemon.deleteProfile(path).reason());
    }
    return profile;
}

// The second of two active interfaces, by the entries of its service.
InterfacePlan planOf(const std::string& entries) {
    std::vector<Trouble> troubles;
    return makePlan(makeTree({"eth1", "eth0 " + entries}).get(), troubles).at(1);
}

// Of networks on the air, "SECURITY STRENGTH [old] [cell]", and a key: the profile's sections about the
// wireless link, or why there are none.
std::string joiningOf(const Inputs& inputs) {
    const std::map<std::string, Security> names{{"open", Security::open},
                                                {"wep", Security::wep},
                                                {"wpa", Security::wpa},
                                                {"sae", Security::sae},
                                                {"enterprise", Security::enterprise}};
    std::vector<HeardNetwork> heard;
    std::istringstream air(inputs[0]);
    for (std::string each; std::getline(air, each, ',');) {
        const auto has = [&each](const char* word) { return each.find(word) != std::string::npos; };
        std::istringstream words(each);
        std::string security;
        HeardNetwork network;
        words >> security >> network.strength;
        if (security == "nothing") {
            continue;
        }
        network.security = names.at(security);
        network.isAdHoc = has("cell");
        network.frequency = 2462;
        network.age = oldestCell + std::chrono::seconds(has("old") ? 1 : 0);
        heard.push_back(network);
    }
    InterfacePlan plan = planOf("AirPort = {PreferredNetwork = Printer}");
    plan.wireless->key = inputs.size() > 1 ? std::optional(inputs[1]) : std::nullopt;
    const JoinDecision decision = chooseNetwork(heard, plan.wireless->key);
    const std::string reason = decision.reason.empty() ? "" : " (" + decision.reason + ")";
    if (!decision.choice) {
        return "none" + reason;
    }
    const WirelessLink link{decision.choice, {}};
    const Sections profile = made(plan, &link);
    EXPECT_EQ("Printer", networkOf(profile));
    return showValue(wirelessSections(profile)) + reason;
}

TEST(Profile, IsAsItWas) {
    testing_support::Transcript transcript("profiles");
    transcript.replay("a wired card, by the entries of its service",
                      [](const Inputs& inputs) { return showValue(made(planOf(inputs[0]))); });
    transcript.replay("an earlier profile, the card's autoconnect and the radio", [](const Inputs& inputs) {
        const ProfileSnapshot before{inputs[0], inputs[1] == "on", inputs[2] == "on"};
        Sections profile = made(planOf(""), nullptr, before);
        EXPECT_TRUE(isOurs(profile) && snapshotIn(profile) == before);
        const std::string kept = showValue(profile["user"]);
        profile.erase("user");
        EXPECT_FALSE(isOurs(profile));
        return kept;
    });
    transcript.replay("networks on the air, and a key", joiningOf);
}

}  // namespace
}  // namespace platform::apply
