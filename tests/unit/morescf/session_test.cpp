#include <fcntl.h>
#include <sys/file.h>

#include <chrono>
#include <thread>

#include "morescf/MoreSCFHelpers.h"
#include "platform/base/FileDescriptor.h"
#include "tests/unit/morescf/Fixture.h"

namespace morescf_test {
namespace {

class SessionTest : public MoreSCFTest {
  protected:
    SessionTest() { setTree(twoSets); }
};

TEST_F(SessionTest, CommitsAndAppliesOnceAtTheOutermostClose) {
    const std::string before = tree();
    OSStatus err = MoreSCOpen(false, false);
    SCPreferencesRef session = MoreSCGetSCPreferencesRef();
    EXPECT_EQ(0, MoreSCRenameSet(Str("1"), Str("Cottage")));
    EXPECT_EQ(0, MoreSCSetServiceActive(nullptr, Str("5"), false));
    EXPECT_EQ(session, MoreSCGetSCPreferencesRef());
    EXPECT_EQ(before, tree());
    EXPECT_TRUE(agent->changes.empty());
    MoreSCClose(&err, false);
    EXPECT_EQ(0, err);
    EXPECT_NE(std::string::npos, tree().find("Cottage"));
    EXPECT_EQ(std::vector<std::string>({"eth0: idle -> ours: off"}), agent->changes);
}

// That a writer marks the session, and only when it succeeds, every operation shows.
TEST_F(SessionTest, TheMarkOutlivesFailuresButNotTheSession) {
    for (const Boolean dirty : {true, false}) {
        for (const bool isMarked : {true, false}) {
            setTree(twoSets);
            const std::string before = tree();
            OSStatus err = MoreSCOpen(false, false);
            SCPreferencesSetValue(MoreSCGetSCPreferencesRef(), CFSTR("CurrentSet"), CFSTR("/Sets/2"));
            EXPECT_EQ(isMarked ? 0 : 1004, MoreSCRenameSet(Str(isMarked ? "1" : "none"), Str("Cottage")));
            err = -1;
            MoreSCClose(&err, dirty);
            EXPECT_EQ(-1, err);
            EXPECT_EQ(isMarked, before != tree());
        }
    }
}

TEST_F(SessionTest, AFailedCommitReplacesOnlySuccessAndIsNotApplied) {
    for (const OSStatus earlier : {0, -17}) {
        OSStatus err = MoreSCOpen(false, false);
        EXPECT_EQ(0, MoreSCSetServiceActive(nullptr, Str("5"), false));
        setTree("{CurrentSet = /Sets/1}");
        err = earlier;
        MoreSCClose(&err, true);
        EXPECT_EQ(earlier != 0 ? earlier : kSCStatusStale, err);
        EXPECT_EQ("{CurrentSet = /Sets/1}", tree());
        EXPECT_TRUE(agent->calls.empty());
        setTree(twoSets);
    }
    agent->failing.insert("takeOver eth0");
    EXPECT_EQ(kSCStatusFailed, MoreSCSetServiceActive(nullptr, Str("5"), false));
    EXPECT_NE(std::string::npos, tree().find("__INACTIVE__")) << "saved, though not made so";
}

TEST_F(SessionTest, AnOpenThatFailsIsBalancedAndTheLogNamesTheClient) {
    const auto failure = [this] {
        log.clear();
        (void)directory.write("store/preferences.plist", "no property list");
        OSStatus err = MoreSCOpen(true, false);
        EXPECT_EQ(kSCStatusFailed, err);
        EXPECT_EQ(kSCStatusNoPrefsSession, MoreSCRenameSet(Str("1"), Str("x")));
        MoreSCClose(&err, true);
        EXPECT_EQ(kSCStatusFailed, err);
        setTree(twoSets);
        EXPECT_EQ(0, MoreSCRenameSet(Str("1"), Str("x")));
        return log.substr(0, log.find(':'));
    };
    EXPECT_EQ(nullptr, MoreSCGetClient());
    EXPECT_EQ("MoreSCF", failure());
    const auto name = platform::values::makeString("assistant");
    EXPECT_EQ(0, MoreSCSetClient(name.get()));
    EXPECT_EQ(2, CFGetRetainCount(MoreSCGetClient()));
    EXPECT_EQ("assistant", failure());
    EXPECT_EQ(0, MoreSCSetClient(nullptr));
    EXPECT_EQ(1, CFGetRetainCount(name.get()));
}

TEST_F(SessionTest, LocksForAsLongAsTheOutermostUse) {
    const auto lockFile = [this] {
        return platform::FileDescriptor(
            ::open(directory.at("store/preferences.lock").c_str(), O_RDWR | O_CREAT, 0600));
    };
    const auto isFree = [&] { return flock(lockFile().get(), LOCK_EX | LOCK_NB) == 0; };
    OSStatus err = MoreSCOpen(false, false);
    // Held on to, so that only giving the lock back frees it.
    SCPreferencesRef session = MoreSCGetSCPreferencesRef();
    CFRetain(session);
    platform::FileDescriptor other = lockFile();
    ASSERT_EQ(0, flock(other.get(), LOCK_EX));
    OSStatus inner = MoreSCOpen(true, false);
    EXPECT_EQ(kSCStatusPrefsBusy, inner);
    MoreSCClose(&inner, false);
    std::thread release([&] {
        std::this_thread::sleep_for(std::chrono::milliseconds(50));
        other.reset();
    });
    EXPECT_EQ(0, inner = MoreSCOpen(true, true)) << "a failure is not taken for the lock, and waiting waits";
    release.join();
    MoreSCClose(&inner, false);
    EXPECT_FALSE(isFree());
    MoreSCClose(&err, false);
    EXPECT_TRUE(isFree());
    CFRelease(session);
}

TEST_F(SessionTest, ReleaseIsTwoCommitsAndTwoApplies) {
    EXPECT_EQ(0, MoreSCDHCPRelease(Str("5")));
    EXPECT_EQ((std::vector<std::string>{"eth0: idle -> ours: none 0", "eth0: ours: none 0 -> ours: dhcp 0"}),
              agent->changes);
    EXPECT_EQ(std::string::npos, tree().find("__INACTIVE__"));
    agent->failing.insert("takeOver eth0");
    EXPECT_EQ(kSCStatusFailed, MoreSCDHCPRelease(Str("5")));
    EXPECT_NE(std::string::npos, tree().find("__INACTIVE__")) << "not switched on again after a failure";
    EXPECT_EQ(-50, MoreSCDHCPRelease(nullptr));
}

}  // namespace
}  // namespace morescf_test
