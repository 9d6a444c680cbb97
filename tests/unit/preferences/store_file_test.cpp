#include <fcntl.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <filesystem>
#include <functional>

#include "tests/unit/preferences/Fixture.h"
#include "tests/unit/support/Child.h"
#include "tests/unit/support/Skip.h"

namespace preferences_test {
namespace {

using StoreFileTest = StoreTest;

std::string nested(int depth) {
    std::string xml = "<plist version=\"1.0\"><dict><key>a</key>";
    for (int i = 0; i < depth; ++i) {
        xml += "<array>";
    }
    for (int i = 0; i < depth; ++i) {
        xml += "</array>";
    }
    return xml + "</dict></plist>";
}

TEST_F(StoreFileTest, WhatIsNoPreferencesFileIsRefusedAndLeftAlone) {
    const auto write = [this](std::string_view content) {
        return [this, content = std::string(content)] {
            (void)directory.write("store/preferences.plist", content);
        };
    };
    const struct {
        const char* what;
        std::function<void()> make;
        const char* reason;
    } rows[] = {
        {"empty", write(""), "line 1"},
        {"not XML", write("bplist00\x01\x02\n\n  garbage"), "line "},
        {"XML, but no property list", write("<html><body/></html>"), "line 1"},
        {"a broken tag in the third line", write("<plist version=\"1.0\">\n<dict>\n<key>a</kex>"),
         "line 3, column "},
        {"a string instead of a dictionary", write("<plist version=\"1.0\"><string>a</string></plist>"),
         "holds no dictionary"},
        {"nested a million deep", write(nested(1'000'000)), "line 1"},
        {"a gigabyte",
         [this] {
             (void)directory.write("store/preferences.plist", "<");
             std::filesystem::resize_file(file, 1U << 30U);
         },
         "larger than"},
        {"a link to nowhere", [this] { std::filesystem::create_symlink("nowhere", file); }, "symbolic link"},
        {"a link to a good file",
         [this] { std::filesystem::create_symlink(directory.write("good", smallTree), file); },
         "symbolic link"},
        {"a directory", [this] { std::filesystem::create_directory(file); }, "not a regular file"},
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

TEST_F(StoreFileTest, AFileCutAtAnyByteIsRefused) {
    for (std::size_t length = 0; length < smallTree.size(); ++length) {
        (void)directory.write("store/preferences.plist", smallTree.substr(0, length));
        EXPECT_FALSE(open()) << length;
        EXPECT_EQ(SCError(), 1001) << length;
        EXPECT_EQ(contentOf(file), smallTree.substr(0, length));
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
    EXPECT_EQ(statusOf(store).st_mode & 07777U, 0700U);
    EXPECT_EQ(statusOf(file).st_mode & 07777U, 0600U);
    EXPECT_EQ(statusOf(store + "/preferences.lock").st_mode & 07777U, 0600U);
    ASSERT_EQ(chmod(file.c_str(), 0644), 0);
    session = open();
    umask(077);
    ASSERT_TRUE(set(session, "/Sets/1", "a") && commit(session));
    EXPECT_EQ(statusOf(file).st_mode & 07777U, 0644U);
    umask(before);
}

TEST_F(StoreFileTest, TheDirectoryMayLieBehindALinkAndMissItsParents) {
    std::filesystem::create_directory(directory.at("real"));
    std::filesystem::create_symlink("real", directory.at("link"));
    const platform::HostOverride inForce(hostIn(directory.at("link/a/b")));
    SessionRef session = open();
    ASSERT_TRUE(commit(session));
    EXPECT_EQ(statusOf(directory.at("real/a/b/store")).st_mode & 07777U, 0700U);
    ASSERT_TRUE(set(session, "/Sets/1", "a") && commit(session));
}

TEST_F(StoreFileTest, WithoutRightsNothingIsReadOrMade) {
    if (geteuid() != 0) {
        LA_SKIP("only root can become somebody without rights");
    }
    std::filesystem::permissions(directory.path(), std::filesystem::perms(0755));
    const auto asNobody = [](const std::function<int()>& work) {
        return testing_support::Child([&work] {
                   return setresgid(65534, 65534, 65534) != 0 || setresuid(65534, 65534, 65534) != 0 ? 98
                                                                                                     : work();
               })
            .wait();
    };
    const auto openStatus = [] { return open() ? 0 : SCError() - 1000; };
    const auto commitStatus = [] {
        SessionRef session = open();
        return session && set(session, "/Sets/1", "x") && commit(session) ? 0 : SCError() - 1000;
    };
    EXPECT_EQ(asNobody(openStatus), 3) << "no store, and none could be made";
    makeStore();
    std::filesystem::permissions(store, std::filesystem::perms(0700));
    EXPECT_EQ(asNobody(openStatus), 3) << "a private store";
    std::filesystem::permissions(store, std::filesystem::perms(0755));
    std::filesystem::permissions(file, std::filesystem::perms(0600));
    EXPECT_EQ(asNobody(openStatus), 3) << "a private file";
    std::filesystem::permissions(file, std::filesystem::perms(0644));
    EXPECT_EQ(asNobody(openStatus), 0) << "a file for everybody to read";
    EXPECT_EQ(asNobody(commitStatus), 3) << "but not to write";
    EXPECT_EQ(contentOf(file), smallTree);
    EXPECT_EQ(std::distance(std::filesystem::directory_iterator(store), {}), 1);
}

}  // namespace
}  // namespace preferences_test
