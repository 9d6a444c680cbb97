#include "platform/preferences/Session.h"

#include <filesystem>
#include <functional>

#include "tests/unit/preferences/Fixture.h"
#include "tests/unit/support/Child.h"

namespace preferences_test {
namespace {

using platform::preferences::Session;

using SessionTest = StoreTest;

TEST_F(SessionTest, AnUnchangedTreeIsNotWrittenAgain) {
    makeStore();
    const ino_t inode = statusOf(file).st_ino;
    SessionRef session = open();
    EXPECT_TRUE(commit(session));
    ASSERT_TRUE(set(session, "/Sets/1", "other"));
    ASSERT_TRUE(set(session, "/Sets/1", "one"));
    EXPECT_TRUE(commit(session));
    EXPECT_EQ(statusOf(file).st_ino, inode);
    EXPECT_EQ(contentOf(file), smallTree);
    // Nor is what this process wrote read again.
    ASSERT_TRUE(set(session, "/Sets/2", "two") && commit(session));
    EXPECT_EQ(SCPreferencesPathGetValue(open().get(), CFSTR("/")),
              SCPreferencesPathGetValue(session.get(), CFSTR("/")));
}

TEST_F(SessionTest, AFileThatSomebodyElseChangedIsNotOverwritten) {
    const std::function<void()> changes[] = {
        [] {
            SessionRef other = open();
            ASSERT_TRUE(set(other, "/Sets/9", "theirs") && commit(other));
        },
        [this] { writeStore(std::string(smallTree) + "\n"); },
        [this] { std::filesystem::remove(file); },
    };
    for (const auto& change : changes) {
        makeStore();
        SessionRef session = open();
        SessionRef reader = open();
        ASSERT_TRUE(set(session, "/Sets/2", "ours"));
        change();
        const std::string content = contentOf(file);
        EXPECT_FALSE(commit(session));
        EXPECT_EQ(SCError(), 3005);
        EXPECT_FALSE(SCPreferencesLock(session.get(), 0));
        EXPECT_EQ(SCError(), 3005);
        EXPECT_FALSE(SCPreferencesUnlock(session.get()));
        EXPECT_FALSE(commit(reader)) << "there is nothing to write, but what it would apply is old";
        EXPECT_EQ(nameAt(session, "/Sets/2"), "ours");
        EXPECT_EQ(contentOf(file), content);
    }
}

TEST_F(SessionTest, ATreeThatXMLCannotCarryIsNotCommitted) {
    makeStore();
    SessionRef session = open();
    ASSERT_TRUE(set(session, "/Sets/2", "a\x01z"));
    EXPECT_FALSE(commit(session));
    EXPECT_EQ(SCError(), 1001);
    EXPECT_TRUE(logHas("XML"));
    EXPECT_EQ(contentOf(file), smallTree);
    EXPECT_EQ(nameAt(session, "/Sets/2"), "a\x01z");
}

TEST_F(SessionTest, TheLockKeepsOthersOut) {
    makeStore();
    SessionRef session = open();
    EXPECT_FALSE(SCPreferencesUnlock(session.get()));
    EXPECT_EQ(SCError(), 1007);
    EXPECT_TRUE(SCPreferencesLock(session.get(), 0));
    const auto tryAsOther = [] {
        SessionRef other = open();
        const bool locked = SCPreferencesLock(other.get(), 0) != 0;
        const int lockStatus = SCError();
        (void)set(other, "/Sets/2", "theirs");
        const int commitStatus = Session::from(other.get())->commit(std::chrono::milliseconds(20)).status();
        return !locked && lockStatus == 3002 && commitStatus == 3002 ? 0 : 1;
    };
    EXPECT_EQ(testing_support::Child(tryAsOther).wait(), 0);
    EXPECT_EQ(tryAsOther(), 0) << "another session of the same process";
    ASSERT_TRUE(set(session, "/Sets/3", "three") && commit(session));
    EXPECT_EQ(testing_support::Child(tryAsOther).wait(), 0) << "a commit keeps the lock";
    writeStore(smallTree);
    ASSERT_TRUE(set(session, "/Sets/3", "again"));
    EXPECT_FALSE(commit(session)) << "an editor heeds no lock";
    EXPECT_EQ(SCError(), 3005);
    EXPECT_TRUE(SCPreferencesLock(session.get(), 0)) << "twice";
    session = {};
    session = open();
    EXPECT_TRUE(SCPreferencesLock(session.get(), 0)) << "the lock ended with the session";
    EXPECT_TRUE(SCPreferencesUnlock(session.get()));
    ASSERT_TRUE(set(session, "/Sets/4", "four") && commit(session));
    SessionRef next = open();
    EXPECT_TRUE(SCPreferencesLock(next.get(), 0)) << "a commit that took the lock gives it back";
}

}  // namespace
}  // namespace preferences_test
