// What is committed is what the machine becomes: from a store to agents that lead a made-up machine.
#include <cmath>
#include <cstdlib>
#include <filesystem>
#include <memory>

#include "platform/SystemConfiguration.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"
#include "platform/values/PropertyListXML.h"
#include "tests/unit/apply/Trees.h"
#include "tests/unit/support/RecordingAgent.h"
#include "tests/unit/support/TemporaryDirectory.h"
#include "tests/unit/support/Transcript.h"

namespace platform::apply {
namespace {

using testing_support::RecordingAgent;

// A machine of three interfaces, and a store in which a location of this number is current.
class Scene {
  public:
    explicit Scene(int location) : location_(std::to_string(location)) {
        agent_->machine = {{"eth0", "E"}, {"eth1", "F"}, {"wlan0", "W"}};
        write("");
        install();
        session_ = Session::adopt(SCPreferencesCreate(nullptr, CFSTR("tester"), nullptr));
    }

    // What came of it: the status of a failure and the log, then what each agent was asked and changed.
    std::string play(const std::string& step) {
        const std::string name = step.substr(0, step.find(' '));
        const std::string rest = step.substr(std::min(step.size(), name.size() + 1));
        if (name == "commit") {
            const auto tree = treeOf(rest);
            for (const auto& [key, value] : values::entriesOf(tree.get())) {
                EXPECT_TRUE(SCPreferencesSetValue(session_.get(), static_cast<CFStringRef>(key), value));
            }
        } else if (name == "other") {
            EXPECT_TRUE(
                SCPreferencesSetValue(session_.get(), CFSTR("Other"), values::makeString(rest).get()));
        } else if (name == "daemon") {
            daemon_->machine[rest] = "D";
            install();
        } else if (name == "slow") {
            agent_->slow = daemon_->slow = 1;
        } else if (name == "fail") {
            rest.empty() ? agent_->failing.clear() : (void)agent_->failing.insert(rest);
        } else if (name == "trouble") {
            rest.empty() ? agent_->troubled.clear() : (void)agent_->troubled.insert(rest);
        } else if (name == "foreign") {
            agent_->foreign = {rest};
        } else if (name == "meanwhile") {
            agent_->interruption = [this, rest] { write(rest); };
        } else if (name == "store") {
            write(rest);
        } else if (name == "sh") {
            EXPECT_EQ(0, std::system(("cd " + folder_.path().string() + " && " + rest).c_str())) << rest;
        }
        if (name != "commit" && name != "other" && name != "finish") {
            return "";
        }
        const bool isDone = (name == "finish" || SCPreferencesCommitChanges(session_.get()) != 0) &&
                            SCPreferencesApplyChanges(session_.get()) != 0;
        std::vector<std::string> told;
        if (!isDone) {
            told.push_back(std::to_string(SCError()));
        }
        for (const std::string& line : std::exchange(log_, {})) {
            const std::size_t path = line.find(folder_.path().string());
            told.push_back(path == std::string::npos
                               ? line
                               : std::string(line).erase(path, folder_.path().string().size() + 1));
        }
        take(*daemon_, told);
        take(*agent_, told);
        if (!std::filesystem::exists(folder_.at("run/applied.plist"))) {
            told.emplace_back("no record");
        }
        return joined(told, "\n");
    }

  private:
    using Session = values::Owned<SCPreferencesRef>;

    void install() {
        override_.reset();
        Host host;
        host.preferencesDirectory = folder_.at("store");
        host.runtimeDirectory = folder_.at("run");
        host.agents = {agent_};
        if (!daemon_->machine.empty()) {
            host.agents.insert(host.agents.begin(), daemon_);
        }
        override_ = std::make_unique<HostOverride>(host);
    }
    values::Owned<CFDictionaryRef> treeOf(const std::string& services) const {
        return makeTree(services.empty() ? Lines() : testing_support::Transcript::inputsIn(services),
                        location_);
    }
    void write(const std::string& services) const {
        (void)folder_.write("store/preferences.plist", *values::writePropertyListXML(treeOf(services).get()));
    }
    static std::string joined(const std::vector<std::string>& parts, const char* between) {
        std::string text;
        for (const std::string& part : parts) {
            text += (text.empty() ? "" : between) + part;
        }
        return text;
    }
    static void take(RecordingAgent& agent, std::vector<std::string>& told) {
        const std::string name(agent.name());
        if (!agent.calls.empty()) {
            told.push_back(name + ": " + joined(std::exchange(agent.calls, {}), "; ") + ", " +
                           std::to_string(std::lround(agent.seconds)) + " s");
        }
        if (!agent.changes.empty()) {
            told.push_back(name + ": " + joined(std::exchange(agent.changes, {}), "; "));
        }
    }

    const std::string location_;
    const testing_support::TemporaryDirectory folder_;
    const std::shared_ptr<RecordingAgent> agent_ = std::make_shared<RecordingAgent>("agent");
    const std::shared_ptr<RecordingAgent> daemon_ = std::make_shared<RecordingAgent>("daemon");
    std::vector<std::string> log_;
    const LogCapture capture_{[this](LogLevel, std::string_view text) { log_.emplace_back(text); }};
    std::unique_ptr<HostOverride> override_;
    Session session_;
};

TEST(Engine, MakesTheMachineWhatIsCommitted) {
    std::unique_ptr<Scene> scene;
    testing_support::Transcript("engine").playItself([&, location = 0](const std::string& step) mutable {
        if (step == "another machine") {
            scene.reset();
            scene = std::make_unique<Scene>(++location);
            return std::string();
        }
        return scene->play(step);
    });
}

}  // namespace
}  // namespace platform::apply
