#include <gtest/gtest.h>

#include <filesystem>
#include <memory>

#include "platform/apply/Apply.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"
#include "tests/unit/apply/Trees.h"
#include "tests/unit/support/RecordingAgent.h"
#include "tests/unit/support/TemporaryDirectory.h"

namespace platform::apply {
namespace {

using testing_support::RecordingAgent;
using Services = std::vector<Service>;

class EngineTest : public testing::Test {
  protected:
    EngineTest() {
        agent_->machine = earlier_;
        install({agent_});
    }
    void install(std::vector<std::shared_ptr<Agent>> agents) {
        override_.reset();
        Host host;
        host.runtimeDirectory = folder_.at("run");
        host.agents = std::move(agents);
        override_ = std::make_unique<HostOverride>(host);
    }
    // A commit of these services in place of the last one's: why it failed.
    std::string apply(const Services& services) {
        const auto replaced = std::exchange(committed_, makeTree(services));
        return applyTree(committed_.get(), replaced.get()).reason();
    }
    // A commit that does not change the plan.
    std::string commitOther() {
        const auto copy = values::Owned<CFMutableDictionaryRef>::adopt(
            CFDictionaryCreateMutableCopy(kCFAllocatorDefault, 0, committed_.get()));
        CFDictionarySetValue(copy.get(), CFSTR("Another"), CFSTR("value"));
        return applyTree(committed_.get(), copy.get()).reason();
    }
    std::string finish() { return applyTree(committed_.get(), nullptr).reason(); }
    // What was asked and changed since the last look.
    Lines taken(RecordingAgent& agent) {
        Lines all = std::exchange(agent.calls, {});
        const Lines changes = std::exchange(agent.changes, {});
        all.insert(all.end(), changes.begin(), changes.end());
        return all;
    }
    Lines taken() { return taken(*agent_); }
    Lines log() { return std::exchange(log_, {}); }
    bool hasRecord() const { return std::filesystem::exists(folder_.at("run/applied.plist")); }

    const Services there_{{"eth0", switchedOff}, fixedService("wlan0")};
    const std::map<std::string, std::string> earlier_{{"eth0", "E"}, {"eth1", "F"}, {"wlan0", "W"}};
    const testing_support::TemporaryDirectory folder_;
    const std::shared_ptr<RecordingAgent> agent_ = std::make_shared<RecordingAgent>();
    values::Owned<CFDictionaryRef> committed_ = makeTree({});
    Lines log_;
    const LogCapture capture_{[this](LogLevel, std::string_view text) { log_.emplace_back(text); }};
    std::unique_ptr<HostOverride> override_;
};

TEST_F(EngineTest, GoesThereAndBackAndAsksNobodyForTheSameAgain) {
    EXPECT_EQ("", apply({}));
    EXPECT_FALSE(std::filesystem::exists(folder_.at("run")));

    agent_->slow = 1;
    EXPECT_EQ("", apply(there_));
    EXPECT_EQ((Lines{"capture eth0 wlan0", "takeOver eth0", "takeOver wlan0", "settle", "settle",
                     "eth0: E -> ours: off", "wlan0: W -> ours: manual 0"}),
              taken())
        << "all are started before any is waited for";
    EXPECT_NEAR(20, agent_->seconds, 1);
    agent_->slow = 0;
    EXPECT_EQ("", commitOther() + finish());
    EXPECT_EQ(Lines{}, taken());

    // Whoever commits the same once more wants the machine looked at.
    EXPECT_EQ("", apply(there_));
    EXPECT_EQ((Lines{"takeOver eth0", "takeOver wlan0", "settle"}), taken());

    // A changed interface is made anew, a new one captured, one no longer named given back, all against the
    // first capture.
    EXPECT_EQ("", apply({fixedService("wlan0", "10.0.0.1"), fixedService("eth1")}));
    EXPECT_EQ((Lines{"giveBack eth0", "settle", "capture eth1", "takeOver wlan0", "takeOver eth1", "settle",
                     "eth0: ours: off -> E", "eth1: F -> ours: manual 1"}),
              taken());
    EXPECT_EQ("", apply({fixedService("*")}));
    EXPECT_EQ((Lines{"giveBack wlan0", "giveBack eth1", "settle", "wlan0: ours: manual 0 -> W",
                     "eth1: ours: manual 1 -> F"}),
              taken());
    EXPECT_NEAR(15, agent_->seconds, 1);
    EXPECT_FALSE(hasRecord());
    EXPECT_EQ(earlier_, agent_->machine);
}

TEST_F(EngineTest, TellsWhatTheMachineRefusedAndOnlyLogsTheRest) {
    agent_->foreign = {"eth1"};
    agent_->troubled = {"takeOver wlan0"};
    EXPECT_EQ("", apply({{"eth0", switchedOff},
                         fixedService("wlan0"),
                         fixedService("eth7"),
                         fixedService("eth1"),
                         {"eth2", "IPv4 = {ConfigMethod = #true};"}}));
    EXPECT_EQ((Lines{"eth2: its settings cannot be used, and it is left to the system: \"ConfigMethod\" is "
                     "not a string",
                     "eth1: it is somebody else's", "eth7: there is no such interface",
                     "wlan0: takeOver wlan0 met trouble"}),
              log());
    taken();
    EXPECT_EQ("", commitOther() + finish());
    EXPECT_EQ(Lines{}, taken()) << "nothing of this is unfinished";
    EXPECT_EQ(Lines{}, log());

    // What failed is tried again, once in a process, and is only logged.
    agent_->troubled.clear();
    agent_->failing = {"takeOver eth0"};
    EXPECT_EQ("takeOver eth0 was told to fail", apply(there_));
    taken();
    EXPECT_EQ("", commitOther());
    EXPECT_EQ((Lines{"takeOver eth0", "takeOver wlan0", "settle"}), taken());
    EXPECT_EQ("", commitOther());
    EXPECT_EQ(Lines{}, taken());
    log();
    agent_->failing.insert("takeOver wlan0");
    EXPECT_EQ("takeOver eth0 was told to fail", apply(there_));
    EXPECT_EQ((Lines{"eth0: takeOver eth0 was told to fail", "wlan0: takeOver wlan0 was told to fail"}),
              log());
    agent_->failing = {"capture eth7"};
    EXPECT_EQ("capture eth7 was told to fail", apply({there_[0], there_[1], fixedService("eth7")}));
    EXPECT_EQ(Lines{"capture eth7 was told to fail"}, log());

    // What cannot be given back keeps its entry until it can; trouble on the way back is no reason to keep
    // it.
    agent_->failing = {"giveBack wlan0"};
    EXPECT_EQ("giveBack wlan0 was told to fail", apply({}));
    EXPECT_TRUE(hasRecord());
    agent_->failing.clear();
    agent_->troubled = {"giveBack wlan0"};
    taken();
    EXPECT_EQ("", apply({}));
    EXPECT_EQ((Lines{"giveBack wlan0", "settle", "wlan0: ours: manual 0 -> W"}), taken());
    EXPECT_FALSE(hasRecord());
}

TEST_F(EngineTest, ChoosesAnAgentForEachInterface) {
    const auto daemon = std::make_shared<RecordingAgent>("daemon");
    install({daemon, agent_});
    daemon->machine = {{"wlan0", "D"}};
    agent_->slow = 1;
    EXPECT_EQ("", apply(there_));
    EXPECT_EQ(
        (Lines{"capture eth0 wlan0", "takeOver wlan0", "settle", "settle", "wlan0: D -> ours: manual 0"}),
        taken(*daemon))
        << "each is asked until all have settled";
    EXPECT_EQ((Lines{"capture eth0", "takeOver eth0", "settle", "settle", "eth0: E -> ours: off"}), taken());

    // The daemon has begun to lead eth0 too.
    daemon->machine["eth0"] = "D";
    EXPECT_EQ("", apply(there_));
    EXPECT_EQ("ours: off", daemon->machine["eth0"]);
    EXPECT_EQ("E", agent_->machine["eth0"]);
    EXPECT_EQ("", apply({}));
    EXPECT_EQ(earlier_, agent_->machine);
    EXPECT_EQ("D", daemon->machine["wlan0"]);
}

TEST_F(EngineTest, ChangesNothingWithoutARecordItCanRead) {
    ASSERT_EQ("", apply(there_));
    taken();
    for (const char* const broken : {"", "<plist><array/></plist>", "<plist><dict/></plist>"}) {
        folder_.write("run/applied.plist", broken);
        EXPECT_NE("", apply({}));
        EXPECT_EQ("", finish());
        EXPECT_EQ(2U, log().size());
        EXPECT_EQ(Lines{}, taken());
    }
}

}  // namespace
}  // namespace platform::apply
