#include <sys/resource.h>
#include <sys/stat.h>

#include <cerrno>
#include <csignal>
#include <filesystem>
#include <set>

#include "platform/base/DurableFile.h"
#include "platform/preferences/Session.h"
#include "tests/unit/preferences/Store.h"

namespace preferences_test {
namespace {

using platform::preferences::Session;

struct Crash {};

// Fails one step, or stops before it and loses what was written and not synced, as a power cut may.
class DiskFaultTest : public StoreTest {
  protected:
    // A store with one location, and a session that changes its name.
    SessionRef begin(bool withStore, int failingStep, int lastStep) {
        failAt = crashAt = -1;
        std::filesystem::remove_all(directory.at("store"));
        if (withStore) {
            makeStore();
        }
        SessionRef session = open();
        EXPECT_TRUE(set(session, "/Sets/1", "{Name = new}"));
        steps_ = syncs = 0;
        failed.clear();
        unsynced_.clear();
        log.clear();
        failAt = failingStep;
        crashAt = lastStep;
        return session;
    }
    static void expectOldOrNew(bool withStore) {
        const std::string onDisk = shown(open(), "/Sets/1");
        EXPECT_TRUE(onDisk == "{Name = new}" || onDisk == (withStore ? "{Name = one}" : "null")) << onDisk;
    }
    [[nodiscard]] bool leftovers() const { return std::filesystem::exists(platform::temporaryFor(file)); }

    int failAt = -1;
    int crashAt = -1;
    int error = EIO;
    int syncs = 0;
    std::string failed;
    const std::string file = directory.at("store/preferences.plist");

  private:
    bool isAllowed(const std::string& step, const std::string& path) {
        if (steps_ == crashAt) {
            for (const std::string& each : unsynced_) {
                std::filesystem::resize_file(each, 0);
            }
            throw Crash();
        }
        if (steps_++ == failAt) {
            failed = step;
            errno = error;
            return false;
        }
        if (step == "fsync") {
            ++syncs;
            unsynced_.erase(path);
        } else if (step == "write" ||
                   (step == "rename" && unsynced_.erase(platform::temporaryFor(path)) != 0)) {
            unsynced_.insert(path);
        }
        return true;
    }

    int steps_ = 0;
    std::set<std::string> unsynced_;
    const platform::HostOverride override_{[this] {
        platform::Host made = host;
        made.fileStep = [this](const char* step, const std::string& path) { return isAllowed(step, path); };
        return made;
    }()};
};

TEST_F(DiskFaultTest, AfterAnyFailingStepTheFileIsTheOldOneOrTheNewOne) {
    for (const bool withStore : {true, false}) {
        for (const int reason : {EIO, EROFS}) {
            std::set<std::string> all;
            bool done = false;
            for (int step = 0; !done; ++step) {
                error = reason;
                const SessionRef session = begin(withStore, step, -1);
                done = commit(session);
                EXPECT_EQ(SCError(), done ? 0 : reason == EROFS ? 1003 : 1001);
                SCOPED_TRACE(failed + " at step " + std::to_string(step));
                all.insert(failed);
                EXPECT_FALSE(leftovers());
                expectOldOrNew(withStore);
                EXPECT_EQ(shown(session, "/Sets/1"), "{Name = new}");
                EXPECT_NE(done, !log.empty());
                // What it was, and then the same again, on a disk that is well.
                failAt = -1;
                for (const char* const value : {"{Name = one}", "{Name = new}"}) {
                    EXPECT_TRUE(set(session, "/Sets/1", value) && commit(session));
                    EXPECT_EQ(shown(open(), "/Sets/1"), value);
                }
            }
            std::set<std::string> expected = {"", "open", "write", "fsync", "close", "rename", "unlink"};
            if (!withStore) {
                expected.insert("mkdir");
            }
            EXPECT_EQ(all, expected);
        }
    }
}

TEST_F(DiskFaultTest, AfterAPowerCutAtAnyStepTheFileIsTheOldOneOrTheNewOne) {
    for (const bool withStore : {true, false}) {
        int crashes = 0;
        for (bool done = false; !done; ++crashes) {
            SCOPED_TRACE("step " + std::to_string(crashes));
            SessionRef session = begin(withStore, -1, crashes);
            try {
                // Not through the faces, which end the process at an exception.
                done = Session::from(session.get())->commit(std::chrono::milliseconds(0)).ok();
            } catch (const Crash&) {
            }
            crashAt = -1;
            // The file, its folder, and the folder of a new one.
            EXPECT_TRUE(!done || syncs == (withStore ? 2 : 3));
            expectOldOrNew(withStore);
            session = open();
            EXPECT_TRUE(set(session, "/Sets/1", "{Name = next}") && commit(session));
            EXPECT_FALSE(leftovers());
            EXPECT_EQ(shown(open(), "/Sets/1"), "{Name = next}");
        }
        EXPECT_GT(crashes, 9);
    }
}

// A write may take less than it was given, as here the first 100 bytes.
TEST_F(DiskFaultTest, AFileThatWasWrittenInPartIsNotTaken) {
    rlimit limit{};
    const SessionRef session = begin(true, -1, -1);
    ASSERT_EQ(getrlimit(RLIMIT_FSIZE, &limit), 0);
    const rlimit small{100, limit.rlim_max};
    const auto before = std::signal(SIGXFSZ, SIG_IGN);
    setrlimit(RLIMIT_FSIZE, &small);
    EXPECT_FALSE(commit(session));
    setrlimit(RLIMIT_FSIZE, &limit);
    static_cast<void>(std::signal(SIGXFSZ, before));
    EXPECT_EQ(std::filesystem::file_size(file), smallTree.size());
    EXPECT_EQ(shown(open(), "/Sets/1"), "{Name = one}");
}

// The kernel's own have no size, and come in pieces.
TEST_F(DiskFaultTest, AFileIsReadToItsEndOrNotAtAll) {
    std::string content;
    EXPECT_TRUE(platform::readWholeFile("/proc/self/smaps", content).ok());
    EXPECT_GT(content.size(), 8192U);
    EXPECT_FALSE(platform::readWholeFile("/proc/self/smaps", content, 8192).ok());
    EXPECT_EQ(mkfifo(directory.at("fifo").c_str(), 0600), 0);
    EXPECT_FALSE(platform::readWholeFile(directory.at("fifo"), content).ok());
}

}  // namespace
}  // namespace preferences_test
