// What only a daemon that lies, fails or hangs can show; what the real one does by itself, the laboratories
// show.
#include <gtest/gtest.h>

#include <memory>
#include <utility>

#include "platform/apply/Agents.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"
#include "tests/unit/networkmanager/Show.h"
#include "tests/unit/networkmanager/StandInDaemon.h"
#include "tests/unit/support/Transcript.h"

namespace platform::apply {
namespace {

using testing_support::StandInDaemon;

const std::string canary = "canary-e7c1";

// Nothing for "back": the card is given back.
std::optional<InterfacePlan> planOf(const std::string& task, const std::string& network,
                                    const std::string& key) {
    InterfacePlan plan;
    plan.name = "wlan0";
    plan.active = task != "off";
    plan.method = plan.active ? IPv4Method::dhcp : IPv4Method::none;
    plan.rank = task == "join-second" ? 1 : 0;
    if (task.starts_with("join")) {
        plan.wireless = WirelessSettings{task != "join-dark", {}, {}};
        plan.wireless->network = network.empty() ? std::nullopt : std::optional(network);
        plan.wireless->key = key.empty() ? std::nullopt : std::optional(key);
    }
    return task == "back" ? std::nullopt : std::optional(plan);
}

// A daemon, the agent that is to lead its card, and how the card was.
class Scene {
  public:
    // The outcome of a look, or of a task: what was changed, and what stood against it.
    std::string play(const std::string& step) {
        std::istringstream words(step);
        const auto word = [&words](std::string text = "") {
            words >> text;
            return text;
        };
        const auto number = [&word] { return static_cast<std::uint32_t>(std::stoul(word("0"))); };
        const std::string name = word();
        if (name == "offer") {
            const std::string network = word();
            const std::uint32_t mode = number(), privacy = number(), protection = number();
            daemon_.offer(network, mode, privacy, protection, word() == "quietly");
        } else if (name == "home") {
            joinHome();
        } else if (name == "theirs") {
            daemon_.profiles["/theirs"] = {{"connection", {{"uuid", {profileUUID("wlan0")}}}},
                                           {"user", {{"data", {TextMap{{"mine", "1"}}}}}}};
        } else if (name == "forget") {
            const auto isMeant = [part = word()](const auto& each) {
                return each.first.find(part) != std::string::npos;
            };
            std::erase_if(daemon_.service.objects, isMeant);
            std::erase_if(daemon_.profiles, isMeant);
        } else if (name == "set") {
            const std::string path = word(), property = word(), value = word();
            daemon_.service
                .objects[path[0] == '/' ? path : StandInDaemon::manager + path.substr(1)][property] =
                value == "true" || value == "false" ? Value{value == "true"}
                : std::isdigit(value[0]) != 0       ? Value{static_cast<std::uint32_t>(std::stoul(value))}
                                                    : Value{value};
        } else if (name == "fail") {
            daemon_.failure = number();
        } else if (name == "hang") {
            daemon_.hangs = true;
        } else if (name == "refuse") {
            daemon_.service.refusal = word();
            daemon_.service.refused = word();
        } else if (name == "start") {
            daemon_.starts();
        } else if (name == "within") {
            deadline_ = std::chrono::milliseconds(number());
        } else if (name == "forge") {
            daemon_.forger = bus_.connect();
        } else if (name == "look") {
            return look();
        } else if (name == "ours") {
            return ours();
        } else {
            const std::string network = word(), key = word();
            return perform(planOf(name, network, key));
        }
        return "";
    }

  private:
    // Puts the card on a network of the user's.
    void joinHome() {
        const WirelessLink link{JoinChoice{true, false, Security::wpa, 0}, {}};
        Sections& sections = daemon_.profiles["/home"];
        sections = makeProfile(*planOf("join", "Home", canary), &link, {});
        sections.erase("user");
        sections["802-11-wireless"].insert(
            {{"hidden", {true}}, {"seen-bssids", {Texts{"00:11:22:33:44:55"}}}});
        sections["802-11-wireless-security"].insert({{"psk-flags", {1U}}, {"leap-password-flags", {1U}}});
        sections["connection"]["uuid"] = {std::string("home")};
        sections["connection"]["id"] = {std::string("Home")};
        daemon_.service.objects["/home"];
        daemon_.service.objects["/onHome"] = {{"Connection", {std::string("/home")}},
                                              {"Uuid", {std::string("home")}},
                                              {"State", {activeActivated}}};
        daemon_.service.objects[StandInDaemon::card]["ActiveConnection"] = {std::string("/onHome")};
        daemon_.service.objects[StandInDaemon::card]["State"] = {deviceActivated};
    }

    std::string look() {
        std::vector<Snapshot> snapshots;
        std::vector<Trouble> leftAlone;
        const std::vector<std::string> cards{"wlan0"};
        const Outcome outcome = agent_->takeSnapshots(cards, snapshots, leftAlone);
        before_ = snapshots.empty() ? Snapshot() : snapshots[0];
        return outcome.reason() + (!leftAlone.empty()  ? leftAlone[0].reason
                                   : snapshots.empty() ? "it may have another agent"
                                                       : "");
    }

    // The status of a refusal goes before its reason.
    std::string perform(const std::optional<InterfacePlan>& plan) {
        std::vector<Task> tasks{{&before_, plan ? &*plan : nullptr, {}, {}}};
        const Clock::time_point deadline = Clock::now() + deadline_;
        agent_->start(tasks, deadline);
        while (!agent_->settle(deadline)) {
        }
        EXPECT_LT(Clock::now(), deadline + std::chrono::seconds(1));
        std::string text;
        for (const std::string& line : std::exchange(daemon_.changes, {})) {
            text += (text.empty() ? "" : "; ") + line;
        }
        const Outcome& refusal = tasks[0].refusal;
        const std::string against =
            refusal.ok() ? tasks[0].trouble : std::to_string(refusal.status()) + " " + refusal.reason();
        return text + (text.empty() || against.empty() ? "" : "\n") + against;
    }

    // The wireless link of our profile.
    std::string ours() {
        std::string text;
        for (const auto& [path, sections] : daemon_.profiles) {
            if (valueOf<std::string>(sections.at("connection"), "uuid") == profileUUID("wlan0")) {
                text += testing_support::showValue(wirelessSections(sections));
            }
        }
        return text;
    }

    static Host hostOf(const testing_support::StandInBus& bus) {
        Host host;
        host.systemBusSocket = bus.socket();
        return host;
    }

    const testing_support::TemporaryDirectory folder_;
    const testing_support::StandInBus bus_{folder_.at("bus")};
    StandInDaemon daemon_{bus_};
    const HostOverride override_{hostOf(bus_)};
    const std::shared_ptr<Agent> agent_ = makeNetworkManagerAgent();
    Snapshot before_;
    std::chrono::milliseconds deadline_{10'000};
};

TEST(NetworkManager, GoesAndComesBack) {
    const LogCapture log(
        [](LogLevel, std::string_view line) { EXPECT_EQ(line.find(canary), std::string_view::npos); });
    std::unique_ptr<Scene> scene;
    testing_support::Transcript("networkmanager").playItself([&scene](const std::string& step) {
        if (step == "another daemon") {
            scene.reset();
            scene = std::make_unique<Scene>();
            return std::string();
        }
        return scene->play(step);
    });
}

}  // namespace
}  // namespace platform::apply
