// What only a supplicant that is made to can show; the rows over the air show the rest with the real one.
#include "platform/apply/direct/Supplicant.h"

#include <gtest/gtest.h>

#include <memory>
#include <sstream>
#include <thread>

#include "platform/base/Host.h"
#include "tests/unit/apply/StandInSupplicant.h"
#include "tests/unit/support/TemporaryDirectory.h"
#include "tests/unit/support/Transcript.h"

namespace platform::apply {
namespace {

using testing_support::unescaped;

class Scene {
  public:
    // A command of the stand-in's, or what is asked of it: what that changed, and what came of it.
    std::string play(const std::string& step) {
        const std::string name = step.substr(0, step.find(' '));
        const std::string rest = step.substr(std::min(name.size() + 1, step.size()));
        std::istringstream words(rest);
        if (name == "answer") {
            const std::size_t equals = rest.find(" = ");
            supplicant_->answers[rest.substr(0, equals)] = unescaped(rest.substr(equals + 3));
        } else if (name == "hear") {
            supplicant_->hear(rest);
        } else if (name == "hear-of-old") {
            supplicant_->hear(rest, 16);
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
            return readKnownNetworks("wlan0", before_).reason();
        } else if (name == "join") {
            const std::size_t space = rest.find(' ');
            const std::string network = unescaped(rest.substr(0, space));
            WirelessSettings settings{{}, network, {}};
            if (space != std::string::npos) {
                settings.key = unescaped(rest.substr(space + 1));
            }
            std::string text = told(joinBySupplicant("wlan0", settings, false, join_));
            text += wait();
            return text;
        } else if (name == "leave") {
            return told(leaveBySupplicant("wlan0", before_, join_));
        } else if (name == "wait") {
            return wait();
        }
        return "";
    }

  private:
    // The commands that changed something, each in a line.
    std::string told(const Outcome& outcome) {
        std::string text;
        for (const std::string& line : supplicant_ ? supplicant_->changes() : Lines()) {
            text += line + "\n";
        }
        return text + (outcome.ok() ? "" : outcome.reason() + "\n");
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
        const std::string changes = told({});
        return changes + (state == WirelessJoin::State::joined ? "joined" : reason);
    }
    static Host hostIn(const std::string& directory) {
        Host host;
        host.supplicantDirectory = directory;
        return host;
    }

    const testing_support::TemporaryDirectory folder_;
    const HostOverride override_{hostIn(folder_.path())};
    std::unique_ptr<StandInSupplicant> supplicant_ = std::make_unique<StandInSupplicant>(folder_.at("wlan0"));
    std::optional<KnownNetworks> before_;
    std::unique_ptr<WirelessJoin> join_;
};

TEST(Supplicant, JoinsAndComesBack) {
    std::unique_ptr<Scene> scene;
    testing_support::Transcript("supplicant").playItself([&scene](const std::string& step) {
        if (step == "another supplicant") {
            scene.reset();
            scene = std::make_unique<Scene>();
        }
        std::string text = scene->play(step);
        return text.ends_with('\n') ? text.substr(0, text.size() - 1) : text;
    });
}

}  // namespace
}  // namespace platform::apply
