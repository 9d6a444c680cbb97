#include <gtest/gtest.h>

#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include "platform/apply/Apply.h"
#include "platform/apply/StateFile.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"
#include "tests/unit/apply/Trees.h"
#include "tests/unit/support/RecordingAgent.h"
#include "tests/unit/support/TemporaryDirectory.h"

namespace platform::apply {
namespace {

using testing_support::Crash;
using testing_support::RecordingAgent;
using testing_support::TemporaryDirectory;
using Lines = std::vector<std::string>;
using Services = std::vector<Service>;

Service offService(const std::string& device) {
    return {device, switchedOff};
}

class EngineTest : public testing::Test {
  protected:
    EngineTest() {
        agent_->machine = {{"eth0", "E"}, {"eth1", "F"}, {"wlan0", "W"}};
        earlier_ = agent_->machine;
        install({agent_});
    }
    void install(std::vector<std::shared_ptr<Agent>> agents) {
        override_.reset();
        Host host;
        host.runtimeDirectory = folder_.at("run");
        host.agents = std::move(agents);
        override_ = std::make_unique<HostOverride>(host);
    }
    // A commit of these services in place of the last one's.
    Outcome apply(const Services& services) {
        const auto replaced = std::exchange(committed_, makeTree(services));
        return applyTree(committed_.get(), replaced.get());
    }
    // A commit that does not change the plan, and no commit at all.
    Outcome commitOther() { return applyTree(committed_.get(), withName(committed_.get()).get()); }
    Outcome finish() { return applyTree(committed_.get(), nullptr); }
    static values::Owned<CFDictionaryRef> withName(CFDictionaryRef root) {
        CFMutableDictionaryRef const copy = CFDictionaryCreateMutableCopy(kCFAllocatorDefault, 0, root);
        CFDictionarySetValue(copy, CFSTR("Another"), CFSTR("value"));
        return values::Owned<CFDictionaryRef>::adopt(copy);
    }
    // What was asked and changed since the last look.
    Lines taken(RecordingAgent* agent = nullptr) {
        agent = agent != nullptr ? agent : agent_.get();
        Lines all = std::exchange(agent->calls, {});
        const Lines changes = std::exchange(agent->changes, {});
        all.insert(all.end(), changes.begin(), changes.end());
        return all;
    }
    std::string recordPath() const { return folder_.at("run/applied.plist"); }
    bool hasRecord() const { return std::filesystem::exists(recordPath()); }

    const Services there_{offService("eth0"), fixedService("wlan0")};
    const TemporaryDirectory folder_;
    const std::shared_ptr<RecordingAgent> agent_ = std::make_shared<RecordingAgent>();
    std::map<std::string, std::string> earlier_;
    values::Owned<CFDictionaryRef> committed_ = makeTree({});
    Lines log_;
    const LogCapture capture_{[this](LogLevel, std::string_view text) { log_.emplace_back(text); }};
    std::unique_ptr<HostOverride> override_;
};

TEST_F(EngineTest, GoesThereAndBackAndAsksNobodyForTheSameAgain) {
    EXPECT_TRUE(apply({}).ok());
    EXPECT_FALSE(std::filesystem::exists(folder_.at("run")));

    agent_->slow = 1;
    EXPECT_TRUE(apply(there_).ok());
    EXPECT_EQ((Lines{"capture eth0 wlan0", "takeOver eth0", "takeOver wlan0", "settle", "settle",
                     "eth0: E -> ours: off", "wlan0: W -> ours: manual 0"}),
              taken())
        << "all are started before any is waited for";
    EXPECT_NEAR(20, agent_->seconds, 1);
    agent_->slow = 0;
    EXPECT_TRUE(commitOther().ok());
    EXPECT_TRUE(finish().ok());
    EXPECT_EQ(Lines{}, taken());

    // Whoever commits the same once more wants the machine looked at.
    EXPECT_TRUE(apply(there_).ok());
    EXPECT_EQ((Lines{"takeOver eth0", "takeOver wlan0", "settle"}), taken());

    // A changed interface is made anew, a new one captured, one no longer named given back, all against the
    // first capture.
    EXPECT_TRUE(apply({fixedService("wlan0", "10.0.0.1"), fixedService("eth1")}).ok());
    EXPECT_EQ((Lines{"giveBack eth0", "settle", "capture eth1", "takeOver wlan0", "takeOver eth1", "settle",
                     "eth0: ours: off -> E", "eth1: F -> ours: manual 1"}),
              taken());
    EXPECT_TRUE(apply({fixedService("*")}).ok());
    EXPECT_EQ((Lines{"giveBack wlan0", "giveBack eth1", "settle", "wlan0: ours: manual 0 -> W",
                     "eth1: ours: manual 1 -> F"}),
              taken());
    EXPECT_NEAR(15, agent_->seconds, 1);
    EXPECT_FALSE(hasRecord());
    EXPECT_EQ(earlier_, agent_->machine);
}

TEST_F(EngineTest, TellsWhatTheMachineRefusedAndOnlyLogsTheRest) {
    const Services services{offService("eth0"),
                            fixedService("wlan0"),
                            fixedService("eth7"),
                            fixedService("eth1"),
                            {"eth2", "<key>IPv4</key><dict><key>ConfigMethod</key><true/></dict>"}};
    agent_->foreign = {"eth1"};
    agent_->troubled = {"takeOver wlan0"};
    EXPECT_TRUE(apply(services).ok());
    EXPECT_EQ((Lines{"eth2: its settings cannot be used, and it is left to the system: \"ConfigMethod\" is "
                     "not a string",
                     "eth1: it is somebody else's", "eth7: there is no such interface",
                     "wlan0: takeOver wlan0 met trouble"}),
              log_);
    taken();
    log_.clear();
    EXPECT_TRUE(commitOther().ok());
    EXPECT_TRUE(finish().ok());
    EXPECT_EQ(Lines{}, taken()) << "nothing of this is unfinished";
    EXPECT_EQ(Lines{}, log_);

    agent_->troubled.clear();
    agent_->failing = {"takeOver eth0", "takeOver wlan0"};
    const Outcome failed = apply({offService("eth0"), fixedService("wlan0")});
    EXPECT_EQ(kSCStatusFailed, failed.status());
    EXPECT_EQ("takeOver eth0 was told to fail", failed.reason());
    EXPECT_EQ((Lines{"eth0: takeOver eth0 was told to fail", "wlan0: takeOver wlan0 was told to fail"}),
              log_);
    // What failed is tried again, once in a process, and is only logged.
    agent_->failing = {"takeOver eth0"};
    taken();
    EXPECT_TRUE(commitOther().ok());
    EXPECT_EQ((Lines{"takeOver eth0", "takeOver wlan0", "settle"}), taken());
    EXPECT_TRUE(commitOther().ok());
    EXPECT_EQ(Lines{}, taken());

    // What cannot be given back keeps its entry until it can; trouble on the way back is no reason to keep
    // it.
    agent_->failing = {"giveBack wlan0"};
    EXPECT_EQ("giveBack wlan0 was told to fail", apply({}).reason());
    EXPECT_TRUE(hasRecord());
    agent_->failing.clear();
    agent_->troubled = {"giveBack wlan0"};
    taken();
    EXPECT_TRUE(apply({}).ok());
    EXPECT_EQ((Lines{"giveBack wlan0", "settle", "wlan0: ours: manual 0 -> W"}), taken());
    EXPECT_FALSE(hasRecord());
}

TEST_F(EngineTest, GivesEverythingBackWhenThereIsNoCurrentLocation) {
    ASSERT_TRUE(apply(there_).ok());
    EXPECT_TRUE(
        applyTree(parseTree("<key>CurrentSet</key><string>/Sets/77</string>").get(), committed_.get()).ok());
    EXPECT_EQ(Lines{"\"CurrentSet\" names no location, so every interface is left to the system"}, log_);
    EXPECT_EQ(earlier_, agent_->machine);
    EXPECT_FALSE(hasRecord());
}

TEST_F(EngineTest, ChoosesAnAgentForEachInterface) {
    const auto daemon = std::make_shared<RecordingAgent>("daemon");
    install({daemon, agent_});
    daemon->machine = {{"wlan0", "D"}};
    agent_->slow = 1;
    EXPECT_TRUE(apply(there_).ok());
    EXPECT_EQ(
        (Lines{"capture eth0 wlan0", "takeOver wlan0", "settle", "settle", "wlan0: D -> ours: manual 0"}),
        taken(daemon.get()))
        << "each is asked until all have settled";
    EXPECT_EQ((Lines{"capture eth0", "takeOver eth0", "settle", "settle", "eth0: E -> ours: off"}), taken());

    // The daemon has begun to lead eth0 too.
    daemon->machine["eth0"] = "D";
    EXPECT_TRUE(apply(there_).ok());
    EXPECT_EQ("ours: off", daemon->machine["eth0"]);
    EXPECT_EQ("E", agent_->machine["eth0"]);
    EXPECT_TRUE(apply({}).ok());
    EXPECT_EQ(earlier_, agent_->machine);
    EXPECT_EQ("D", daemon->machine["wlan0"]);
}

// A machine at which the process ends at every single step, and then runs again: the next run finishes it, or
// goes back at once.
TEST_F(EngineTest, FinishesWhatAnEndedRunBegan) {
    const Services next{fixedService("wlan0", "10.0.0.1"), fixedService("eth1")};
    for (const bool isGoingOn : {true, false}) {
        for (int way = 0; way < 3; ++way) {
            bool hasCrashed = true;
            for (int step = 0; hasCrashed; ++step) {
                SCOPED_TRACE("way " + std::to_string(way) + ", step " + std::to_string(step));
                agent_->machine = earlier_;
                if (way != 0) {
                    ASSERT_TRUE(apply(there_).ok());
                }
                const Services wanted = way == 0 ? there_ : way == 1 ? next : Services{};
                agent_->crashAt = step;
                try {
                    (void)apply(wanted);
                    hasCrashed = false;
                } catch (const Crash&) {
                }
                agent_->crashAt = -1;
                if (isGoingOn) {
                    EXPECT_TRUE(apply(wanted).ok());
                    if (way == 1) {
                        EXPECT_EQ("E", agent_->machine["eth0"]);
                        EXPECT_EQ("ours: manual 1", agent_->machine["eth1"]);
                    }
                }
                EXPECT_TRUE(apply({}).ok());
                EXPECT_EQ(earlier_, agent_->machine);
                EXPECT_FALSE(hasRecord());
                ASSERT_LT(step, 50);
            }
        }
    }
}

TEST_F(EngineTest, ChangesNothingWithoutARecordItCanRead) {
    ASSERT_TRUE(apply(there_).ok());
    taken();
    std::string good;
    ASSERT_TRUE(readWholeFile(recordPath(), good).ok());
    Lines broken{"", "<plist><array/></plist>", "<plist><dict/></plist>"};
    for (std::size_t length = 100; length < good.size() - 10; length += 97) {
        broken.push_back(good.substr(0, length));
    }
    for (const std::string& content : broken) {
        SCOPED_TRACE(content);
        folder_.write("run/applied.plist", content);
        log_.clear();
        EXPECT_EQ(kSCStatusFailed, apply({}).status());
        EXPECT_TRUE(finish().ok());
        EXPECT_EQ(2U, log_.size());
        EXPECT_EQ(Lines{}, taken());
    }
}

}  // namespace
}  // namespace platform::apply
