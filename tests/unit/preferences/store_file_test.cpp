#include <unistd.h>

#include <filesystem>
#include <functional>

#include "tests/unit/preferences/Fixture.h"

namespace preferences_test {
namespace {

class StoreFileTest : public StoreTest {
  protected:
    std::string lockFile = directory.at("store/preferences.lock");
};

TEST_F(StoreFileTest, WhatIsNoPreferencesFileIsRefusedAndLeftAlone) {
    const auto write = [this](const char* content) { return [this, content] { writeStore(content); }; };
    const struct {
        const char* what;
        std::function<void()> make;
        const char* reason;
    } rows[] = {
        {"a broken tag in the third line", write("<plist version=\"1.0\">\n<dict>\n<key>a</kex>"),
         "line 3, column "},
        {"a string instead of a dictionary", write("<plist version=\"1.0\"><string>a</string></plist>"),
         "holds no dictionary"},
        {"a link to a good file",
         [this] { std::filesystem::create_symlink(directory.write("good", smallTree), file); },
         "symbolic link"},
        {"65 MiB",
         [this] { std::filesystem::resize_file(directory.write("store/preferences.plist", ""), 65U << 20U); },
         "larger than"},
        {"a FIFO", [this] { ASSERT_EQ(mkfifo(file.c_str(), 0600), 0); }, "not a regular file"},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.what);
        std::filesystem::remove_all(store);
        std::filesystem::create_directory(store);
        log.clear();
        row.make();
        const struct stat before = statusOf(file);
        EXPECT_FALSE(open());
        EXPECT_EQ(SCError(), 1001);
        ASSERT_EQ(log.size(), 1U);
        EXPECT_TRUE(logHas("tester: " + file) && logHas(row.reason)) << log[0];
        const struct stat after = statusOf(file);
        EXPECT_EQ(before.st_ino, after.st_ino);
        EXPECT_EQ(before.st_ctim.tv_nsec, after.st_ctim.tv_nsec);
        EXPECT_EQ(std::distance(std::filesystem::directory_iterator(store), {}), 1);
    }
}

TEST_F(StoreFileTest, TheFirstRunTreeIsCommittedAsItIs) {
    SessionRef session = open();
    ASSERT_TRUE(session);
    EXPECT_FALSE(std::filesystem::exists(store));
    ASSERT_TRUE(commit(session));
    const std::string written = contentOf(file);
    writeStore(written);
    EXPECT_EQ(shown(open()),
              "{CurrentSet = /Sets/0; NetworkServices = {0 = {UserDefinedName = Managed by the system; "
              "Interface = {DeviceName = *; Hardware = System; Type = System}}}; Sets = {0 = "
              "{UserDefinedName = Automatic; Network = {Global = {IPv4 = {PPPOverridePrimary = #0; "
              "ServiceOrder = (0)}; NetInfo = {}}; Service = {0 = {__LINK__ = /NetworkServices/0}}}}}}");
}

TEST_F(StoreFileTest, WhatItWritesIsPrivate) {
    const mode_t before = umask(0);
    for (const mode_t wide : {0600U, 0666U, 0640U}) {
        SessionRef session = open();
        ASSERT_TRUE(set(session, "/Sets/1", std::to_string(wide)) && commit(session));
        EXPECT_EQ(statusOf(store).st_mode & 07777U, 0700U);
        EXPECT_EQ(statusOf(file).st_mode & 07777U, 0600U);
        EXPECT_EQ(statusOf(lockFile).st_mode & 07777U, 0600U);
        ASSERT_EQ(chmod(file.c_str(), wide), 0);
        (void)open();
        EXPECT_EQ(statusOf(file).st_mode & 07777U, 0600U) << "what an editor or a copy made of it";
        ASSERT_EQ(chmod(file.c_str(), wide), 0);
    }
    umask(before);
}

// The tool runs as root: whoever can change the store, or hold its lock, decides on the network.
TEST_F(StoreFileTest, WhatOthersCanChangeIsNotUsed) {
    const struct {
        const char* what;
        std::function<void()> make;
        bool opens;
        const char* reason;
    } rows[] = {
        // Only root can give a folder away; others see to it that somebody else may write to it.
        {"a folder of somebody else",
         [this] {
             if (chown(store.c_str(), 65534, 65534) != 0) {
                 ASSERT_EQ(chmod(store.c_str(), 0722), 0);
             }
         },
         false, "somebody else"},
        {"a folder that the group may write to", [this] { ASSERT_EQ(chmod(store.c_str(), 0770), 0); }, false,
         "others may write"},
        {"a folder that everybody may write to", [this] { ASSERT_EQ(chmod(store.c_str(), 0702), 0); }, false,
         "others may write"},
        {"a link to a folder",
         [this] {
             std::filesystem::rename(store, directory.at("real"));
             std::filesystem::create_symlink(directory.at("real"), store);
         },
         false, "not a directory"},
        {"a lock that others may write to",
         [this] { ASSERT_EQ(chmod(directory.write("store/preferences.lock", "").c_str(), 0602), 0); }, true,
         "others may write"},
        {"a FIFO for a lock", [this] { ASSERT_EQ(mkfifo(lockFile.c_str(), 0600), 0); }, true,
         "not a regular file"},
        {"a link for a lock",
         [this] { std::filesystem::create_symlink(directory.write("elsewhere", ""), lockFile); }, true,
         "cannot open"},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.what);
        std::filesystem::remove_all(store);
        makeStore();
        ASSERT_EQ(chmod(store.c_str(), 0700), 0);
        row.make();
        log.clear();
        SessionRef session = open();
        EXPECT_EQ(static_cast<bool>(session), row.opens);
        EXPECT_FALSE(session && set(session, "/Sets/1", "new") && commit(session));
        EXPECT_EQ(SCError(), 1001);
        EXPECT_TRUE(logHas(row.reason)) << (log.empty() ? "" : log[0]);
        EXPECT_EQ(contentOf(file), smallTree);
    }
}

}  // namespace
}  // namespace preferences_test
