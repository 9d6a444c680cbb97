#include <gtest/gtest.h>

#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include "platform/Host.h"
#include "platform/Log.h"
#include "platform/apply/Apply.h"
#include "platform/apply/StateFile.h"
#include "tests/unit/apply/Trees.h"
#include "tests/unit/support/RecordingAgent.h"
#include "tests/unit/support/TemporaryDirectory.h"

namespace platform::apply {
namespace {

using testing_support::Crash;
using testing_support::RecordingAgent;
using testing_support::TemporaryDirectory;
using Lines = std::vector<std::string>;

Service offService(const std::string& device) {
    return {device, switchedOff};
}

class EngineTest : public testing::Test {
  protected:
    EngineTest() {
        agent_->machine = {{"eth0", "E"}, {"eth1", "F"}, {"wlan0", "W"}};
        earlier_ = agent_->machine;
        Host host;
        host.runtimeDirectory = folder_.at("run");
        host.agent = agent_;
        override_ = std::make_unique<HostOverride>(host);
    }
    Outcome apply(const std::vector<Service>& services) { return applyTree(makeTree(services).get()); }
    // What was asked and changed since the last look.
    Lines taken() {
        Lines all = std::exchange(agent_->calls, {});
        const Lines changes = std::exchange(agent_->changes, {});
        all.insert(all.end(), changes.begin(), changes.end());
        return all;
    }
    std::string recordPath() const { return folder_.at("run/applied.plist"); }
    bool hasRecord() const { return std::filesystem::exists(recordPath()); }

    const std::vector<Service> there_{offService("eth0"), fixedService("wlan0")};
    const TemporaryDirectory folder_;
    const std::shared_ptr<RecordingAgent> agent_ = std::make_shared<RecordingAgent>();
    std::map<std::string, std::string> earlier_;
    Lines log_;
    const LogCapture capture_{[this](LogLevel, std::string_view text) { log_.emplace_back(text); }};
    std::unique_ptr<HostOverride> override_;
};

TEST_F(EngineTest, GoesThereAndBackAndAsksNobodyForTheSameAgain) {
    EXPECT_TRUE(apply({}).ok());
    EXPECT_FALSE(std::filesystem::exists(folder_.at("run")));

    EXPECT_TRUE(apply(there_).ok());
    EXPECT_EQ((Lines{"capture eth0 wlan0", "takeOver eth0", "takeOver wlan0", "eth0: E -> ours: off",
                     "wlan0: W -> ours: manual 0"}),
              taken());
    EXPECT_TRUE(apply(there_).ok());
    EXPECT_EQ(Lines{}, taken());

    // A changed interface is made anew, a new one captured, one no longer named given back, all against the
    // first capture.
    EXPECT_TRUE(apply({fixedService("wlan0", "10.0.0.1"), fixedService("eth1")}).ok());
    EXPECT_EQ((Lines{"giveBack eth0", "capture eth1", "takeOver wlan0", "takeOver eth1",
                     "eth0: ours: off -> E", "eth1: F -> ours: manual 1"}),
              taken());
    EXPECT_TRUE(apply({fixedService("*")}).ok());
    EXPECT_EQ(
        (Lines{"giveBack wlan0", "giveBack eth1", "wlan0: ours: manual 0 -> W", "eth1: ours: manual 1 -> F"}),
        taken());
    EXPECT_FALSE(hasRecord());
    EXPECT_EQ(earlier_, agent_->machine);
}

TEST_F(EngineTest, TriesEveryInterfaceAndReportsTheFirstFailure) {
    agent_->failing = {"takeOver eth0", "takeOver wlan0"};
    const Outcome failed = apply({offService("eth0"), fixedService("wlan0"), offService("eth1")});
    EXPECT_EQ(kSCStatusFailed, failed.status());
    EXPECT_EQ("takeOver eth0 was told to fail", failed.reason());
    EXPECT_EQ((Lines{"eth0: takeOver eth0 was told to fail", "wlan0: takeOver wlan0 was told to fail"}),
              log_);
    EXPECT_EQ("ours: off", agent_->machine["eth1"]);
    taken();

    // Only what failed is tried again.
    agent_->failing = {"takeOver eth0"};
    EXPECT_FALSE(apply({offService("eth0"), fixedService("wlan0"), offService("eth1")}).ok());
    EXPECT_EQ((Lines{"takeOver eth0", "takeOver wlan0", "wlan0: W -> ours: manual 0"}), taken());

    // What cannot be given back keeps its entry until it can.
    agent_->failing = {"giveBack wlan0"};
    EXPECT_EQ("giveBack wlan0 was told to fail", apply({}).reason());
    EXPECT_TRUE(hasRecord());
    agent_->failing.clear();
    taken();
    EXPECT_TRUE(apply({}).ok());
    EXPECT_EQ((Lines{"giveBack wlan0", "wlan0: ours: manual 0 -> W"}), taken());
    EXPECT_FALSE(hasRecord());
}

// A machine at which the process ends at every single step, and then runs again: with the same plan and then
// back, or back at once.
TEST_F(EngineTest, FinishesWhatAnEndedRunBegan) {
    const std::vector<Service> next{fixedService("wlan0", "10.0.0.1"), fixedService("eth1")};
    for (const bool isGoingOn : {true, false}) {
        for (int way = 0; way < 3; ++way) {
            bool hasCrashed = true;
            for (int step = 0; hasCrashed; ++step) {
                SCOPED_TRACE("way " + std::to_string(way) + ", step " + std::to_string(step));
                agent_->machine = earlier_;
                if (way != 0) {
                    ASSERT_TRUE(apply(there_).ok());
                }
                const std::vector<Service> wanted = way == 0   ? there_
                                                    : way == 1 ? next
                                                               : std::vector<Service>{};
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
    std::vector<std::string> broken{"", "<plist><array/></plist>", "<plist><dict/></plist>"};
    for (std::size_t length = 100; length < good.size() - 10; length += 97) {
        broken.push_back(good.substr(0, length));
    }
    for (const std::string& content : broken) {
        SCOPED_TRACE(content);
        folder_.write("run/applied.plist", content);
        log_.clear();
        EXPECT_EQ(kSCStatusFailed, apply({}).status());
        EXPECT_EQ(1U, log_.size());
        EXPECT_EQ(Lines{}, taken());
    }
}

}  // namespace
}  // namespace platform::apply
