#include <fcntl.h>
#include <sys/file.h>

#include <chrono>
#include <thread>

#include "platform/base/FileDescriptor.h"
#include "tests/unit/morescf/Fixture.h"

namespace morescf_test {
namespace {

class SessionTest : public MoreSCFTest {
  protected:
    SessionTest() { setTree(twoSets); }
};

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
    EXPECT_EQ(0, MoreSCOpen(true, false)) << "what is locked is not locked again";
    MoreSCClose(&inner, false);
    MoreSCClose(&inner, false);
    EXPECT_FALSE(isFree());
    MoreSCClose(&err, false);
    EXPECT_TRUE(isFree());
    CFRelease(session);
    EXPECT_EQ(0, err = MoreSCOpen(true, false));
    EXPECT_FALSE(isFree()) << "the next session has a lock of its own";
    MoreSCClose(&err, false);
}

}  // namespace
}  // namespace morescf_test
