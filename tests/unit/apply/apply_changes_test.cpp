#include "platform/values/PropertyListXML.h"
#include "tests/unit/apply/Trees.h"
#include "tests/unit/preferences/Fixture.h"
#include "tests/unit/support/RecordingAgent.h"

namespace preferences_test {
namespace {

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
    // The status, and the interfaces that are ours.
    std::string apply() {
        std::string text = std::to_string(SCPreferencesApplyChanges(session.get()) != 0 ? 0 : SCError());
        for (const auto& [name, state] : agent->machine) {
            text += state != "as found" ? " " + name : "";
        }
        return text;
    }
    // Commits the tree as it is, and applies it.
    std::string activate() { return commit(session) ? apply() : "not committed"; }

    const std::shared_ptr<testing_support::RecordingAgent> agent =
        std::make_shared<testing_support::RecordingAgent>();
    platform::HostOverride withAgent{[this] {
        platform::Host made = hostIn(directory.path().string());
        made.agents = {agent};
        return made;
    }()};
    SessionRef session;
};

TEST_F(ApplyTest, OnlyWhatIsCommittedIsApplied) {
    EXPECT_EQ("0", apply()) << "without a commit there is nothing to apply, and nothing that was left undone";
    ASSERT_TRUE(set(session, "/Sets/2", "another location"));
    EXPECT_EQ("0", activate()) << "a commit that leaves the plan alone leaves the machine alone";
    EXPECT_TRUE(agent->calls.empty());
    EXPECT_EQ("0 eth0", activate()) << "a commit that changes nothing asks for just that";
    ASSERT_TRUE(SCPreferencesPathRemoveValue(session.get(), CFSTR("/NetworkServices/100/Interface")));
    EXPECT_EQ("0 eth0", apply());
    EXPECT_EQ("0", activate());
}

TEST_F(ApplyTest, ATreeCommittedInTheMiddleOfAnApplyIsAppliedAsWell) {
    agent->interruption = [this] { putLocationOf("eth1"); };
    EXPECT_EQ("0 eth1", activate());
}

TEST_F(ApplyTest, FailuresAreTold) {
    agent->failing = {"takeOver eth0"};
    EXPECT_EQ("1001", activate());
    EXPECT_TRUE(logHas("takeOver eth0 was told to fail"));
    EXPECT_EQ("0", apply()) << "what is left undone is tried again in the background of the status";
    (void)directory.write("store/preferences.plist", "garbage");
    EXPECT_EQ("1001", apply());
    EXPECT_TRUE(logHas("tester: " + file + ", line 1"));
}

}  // namespace
}  // namespace preferences_test
