#include <functional>

#include "tests/unit/apply/Trees.h"
#include "tests/unit/preferences/Fixture.h"
#include "tests/unit/support/RecordingAgent.h"

namespace preferences_test {
namespace {

// Lets something happen in the middle of an apply.
class InterruptedAgent : public testing_support::RecordingAgent {
  public:
    std::function<void()> interruption;

    bool settle(platform::apply::Clock::time_point until) override {
        if (const std::function<void()> once = std::exchange(interruption, nullptr)) {
            once();
        }
        return RecordingAgent::settle(until);
    }
};

class ApplyTest : public StoreTest {
  protected:
    ApplyTest() {
        agent->machine = {{"eth0", "as found"}, {"eth1", "as found"}};
        putLocationOf("eth0");
        session = open();
    }
    void putLocationOf(const std::string& device) {
        const auto tree = platform::apply::makeTree({platform::apply::fixedService(device)}, "1");
        (void)directory.write("store/preferences.plist", *platform::values::writePropertyListXML(tree.get()));
    }
    static int apply(const SessionRef& session) {
        return SCPreferencesApplyChanges(session.get()) != 0 ? 0 : SCError();
    }
    // Commits the tree as it is, and applies it.
    static int activate(const SessionRef& session) { return commit(session) ? apply(session) : SCError(); }
    // The interfaces that are ours.
    [[nodiscard]] std::string taken() const {
        std::string names;
        for (const auto& [name, state] : agent->machine) {
            names += state != "as found" ? name : "";
        }
        return names;
    }

    std::shared_ptr<InterruptedAgent> agent = std::make_shared<InterruptedAgent>();
    platform::HostOverride withAgent{[this] {
        platform::Host made = hostIn(directory.path().string());
        made.agents = {agent};
        return made;
    }()};
    SessionRef session;
};

TEST_F(ApplyTest, OnlyWhatIsCommittedIsApplied) {
    EXPECT_EQ(apply(session), 0);
    EXPECT_EQ(taken(), "") << "without a commit there is nothing to apply, and nothing that was left undone";
    ASSERT_TRUE(set(session, "/Sets/2", "another location"));
    EXPECT_EQ(activate(session), 0);
    EXPECT_EQ(taken(), "") << "a commit that leaves the plan alone leaves the machine alone";
    EXPECT_TRUE(agent->calls.empty());
    EXPECT_EQ(activate(session), 0);
    EXPECT_EQ(taken(), "eth0") << "a commit that changes nothing asks for just that";
    ASSERT_TRUE(SCPreferencesPathRemoveValue(session.get(), CFSTR("/NetworkServices/100/Interface")));
    EXPECT_EQ(apply(session), 0);
    EXPECT_EQ(taken(), "eth0");
    EXPECT_EQ(activate(session), 0);
    EXPECT_EQ(taken(), "");
}

TEST_F(ApplyTest, ATreeCommittedInTheMiddleOfAnApplyIsAppliedAsWell) {
    agent->interruption = [this] { putLocationOf("eth1"); };
    EXPECT_EQ(activate(session), 0);
    EXPECT_EQ(taken(), "eth1");
}

TEST_F(ApplyTest, FailuresAreTold) {
    agent->failing = {"takeOver eth0"};
    EXPECT_EQ(activate(session), 1001);
    EXPECT_TRUE(logHas("takeOver eth0 was told to fail"));
    EXPECT_EQ(apply(session), 0) << "what is left undone is tried again in the background of the status";
    (void)directory.write("store/preferences.plist", "garbage");
    EXPECT_EQ(apply(session), 1001);
    EXPECT_TRUE(logHas("tester: " + file + ", line 1"));
}

}  // namespace
}  // namespace preferences_test
