#include <fcntl.h>
#include <unistd.h>

#include <filesystem>
#include <functional>

#include "tests/unit/preferences/Fixture.h"

namespace preferences_test {
namespace {

using StoreFileTest = StoreTest;

TEST_F(StoreFileTest, WhatIsNoPreferencesFileIsRefusedAndLeftAlone) {
    const auto write = [this](const char* content) {
        return [this, content] { (void)directory.write("store/preferences.plist", content); };
    };
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
    const auto expected = parsed(R"(<plist version="1.0"><dict>
        <key>CurrentSet</key><string>/Sets/0</string>
        <key>NetworkServices</key><dict><key>0</key><dict>
            <key>UserDefinedName</key><string>Managed by the system</string>
            <key>Interface</key><dict>
                <key>DeviceName</key><string>*</string>
                <key>Hardware</key><string>System</string>
                <key>Type</key><string>System</string></dict></dict></dict>
        <key>Sets</key><dict><key>0</key><dict>
            <key>UserDefinedName</key><string>Automatic</string>
            <key>Network</key><dict>
                <key>Global</key><dict>
                    <key>IPv4</key><dict>
                        <key>PPPOverridePrimary</key><integer>0</integer>
                        <key>ServiceOrder</key><array><string>0</string></array></dict>
                    <key>NetInfo</key><dict/></dict>
                <key>Service</key><dict><key>0</key><dict>
                    <key>__LINK__</key><string>/NetworkServices/0</string></dict></dict></dict></dict></dict>
        </dict></plist>)");
    EXPECT_TRUE(CFEqual(parsed(contentOf(file)).get(), expected.get())) << contentOf(file);
}

TEST_F(StoreFileTest, WhatItMakesIsPrivateAndWhatItReplacesKeepsItsMode) {
    const mode_t before = umask(0);
    SessionRef session = open();
    ASSERT_TRUE(commit(session));
    EXPECT_EQ(statusOf(file).st_mode & 07777U, 0600U);
    EXPECT_EQ(statusOf(store + "/preferences.lock").st_mode & 07777U, 0600U);
    ASSERT_EQ(chmod(file.c_str(), 0644), 0);
    session = open();
    umask(077);
    ASSERT_TRUE(set(session, "/Sets/1", "a") && commit(session));
    EXPECT_EQ(statusOf(file).st_mode & 07777U, 0644U);
    umask(before);
}

}  // namespace
}  // namespace preferences_test
