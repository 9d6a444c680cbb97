#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <map>
#include <set>

#include "platform/base/DurableFile.h"
#include "platform/base/FileOperations.h"
#include "platform/preferences/Session.h"
#include "tests/unit/preferences/Fixture.h"

namespace preferences_test {
namespace {

using platform::FileOperations;
using platform::Outcome;
using platform::preferences::Session;

struct Crash {};

// Fails one step, or stops before it and loses what was written and not synced, as a power cut may.
class FaultyOperations : public FileOperations {
  public:
    void begin() {
        failAt = crashAt = -1;
        steps = syncs = 0;
        failed.clear();
        unsynced_.clear();
    }

    int failAt = -1;
    int crashAt = -1;
    int error = EIO;
    int steps = 0;
    int syncs = 0;
    std::string failed;

    int makeDirectory(const std::string& path, mode_t mode) override {
        return fails("mkdir") ? -1 : FileOperations::makeDirectory(path, mode);
    }
    int open(const std::string& path, int flags, mode_t mode) override {
        if (fails("open")) {
            return -1;
        }
        const int descriptor = FileOperations::open(path, flags, mode);
        names_[descriptor] = path;
        return descriptor;
    }
    ssize_t write(int descriptor, std::string_view bytes) override {
        if (fails("write")) {
            return -1;
        }
        unsynced_.insert(names_[descriptor]);
        return FileOperations::write(descriptor, bytes.substr(0, std::max(bytes.size() / 2, std::size_t{7})));
    }
    int sync(int descriptor) override {
        if (fails("fsync")) {
            return -1;
        }
        ++syncs;
        unsynced_.erase(names_[descriptor]);
        return FileOperations::sync(descriptor);
    }
    int close(int descriptor) override {
        const bool failing = fails("close");
        const int result = FileOperations::close(descriptor);
        return failing ? -1 : result;
    }
    int rename(const std::string& from, const std::string& to) override {
        if (fails("rename")) {
            return -1;
        }
        if (unsynced_.erase(from) != 0) {
            unsynced_.insert(to);
        }
        return FileOperations::rename(from, to);
    }
    int remove(const std::string& path) override {
        return fails("unlink") ? -1 : FileOperations::remove(path);
    }

  private:
    bool fails(const char* what) {
        const int step = steps++;
        if (step == crashAt) {
            for (const std::string& path : unsynced_) {
                std::filesystem::resize_file(path, 0);
            }
            throw Crash();
        }
        if (step == failAt) {
            failed = what;
            errno = error;
            return true;
        }
        return false;
    }

    std::map<int, std::string> names_;
    std::set<std::string> unsynced_;
};

class DiskFaultTest : public StoreTest {
  protected:
    DiskFaultTest() : override_(hostWith(operations)) {}

    // A store with one location, and a session that changes its name.
    SessionRef begin(bool withStore) {
        operations->begin();
        std::filesystem::remove_all(store);
        if (withStore) {
            makeStore();
        }
        SessionRef session = open();
        EXPECT_TRUE(set(session, "/Sets/1", "new"));
        operations->steps = 0;
        return session;
    }
    [[nodiscard]] bool leftovers() const { return std::filesystem::exists(platform::temporaryFor(file)); }

    std::shared_ptr<FaultyOperations> operations = std::make_shared<FaultyOperations>();

  private:
    static platform::Host hostWith(const std::shared_ptr<FaultyOperations>& operations) {
        platform::Host host = platform::currentHost();
        host.files = operations;
        return host;
    }
    platform::HostOverride override_;
};

TEST_F(DiskFaultTest, AfterAnyFailingStepTheFileIsTheOldOneOrTheNewOne) {
    for (const bool withStore : {true, false}) {
        for (const int error : {EIO, EROFS}) {
            std::set<std::string> failed;
            bool done = false;
            for (int step = 0; !done; ++step) {
                const SessionRef session = begin(withStore);
                operations->failAt = step;
                operations->error = error;
                done = commit(session);
                SCOPED_TRACE(operations->failed + " at step " + std::to_string(step));
                failed.insert(operations->failed);
                if (!done) {
                    EXPECT_EQ(SCError(), error == EROFS ? 1003 : 1001);
                    EXPECT_FALSE(log.empty());
                    EXPECT_FALSE(leftovers());
                    EXPECT_EQ(nameAt(session, "/Sets/1"), "new");
                    const std::string onDisk = nameAt(open(), "/Sets/1");
                    EXPECT_TRUE(onDisk == "new" || onDisk == (withStore ? "one" : "-")) << onDisk;
                    EXPECT_TRUE(commit(session)) << "the same again, on a disk that is well";
                }
                EXPECT_FALSE(leftovers());
                EXPECT_EQ(nameAt(open(), "/Sets/1"), "new");
            }
            failed.erase("");
            std::set<std::string> expected = {"open", "write", "fsync", "close", "rename", "unlink"};
            if (!withStore) {
                expected.insert("mkdir");
            }
            EXPECT_EQ(failed, expected);
        }
    }
}

TEST_F(DiskFaultTest, AfterAPowerCutAtAnyStepTheFileIsTheOldOneOrTheNewOne) {
    for (const bool withStore : {true, false}) {
        int crashes = 0;
        for (bool done = false; !done; ++crashes) {
            SessionRef session = begin(withStore);
            operations->crashAt = crashes;
            try {
                // Not through the faces, which end the process at an exception.
                done = Session::from(session.get())->commit(std::chrono::milliseconds(0)).ok();
            } catch (const Crash&) {
            }
            operations->crashAt = -1;
            // The file, its folder, and the folder of a new one.
            EXPECT_TRUE(!done || operations->syncs == (withStore ? 2 : 3));
            SCOPED_TRACE("step " + std::to_string(crashes));
            session = open();
            ASSERT_TRUE(session);
            const std::string onDisk = nameAt(session, "/Sets/1");
            EXPECT_TRUE(onDisk == "new" || onDisk == (withStore ? "one" : "-")) << onDisk;
            ASSERT_TRUE(set(session, "/Sets/1", "next") && commit(session));
            EXPECT_FALSE(leftovers());
            EXPECT_EQ(nameAt(open(), "/Sets/1"), "next");
        }
        EXPECT_GT(crashes, 9);
    }
}

}  // namespace
}  // namespace preferences_test
