#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>
#include <functional>
#include <iterator>
#include <string>
#include <utility>

#include "app/SetIDFile.h"
#include "platform/base/Log.h"
#include "tests/unit/support/TemporaryDirectory.h"

namespace {

using testing_support::TemporaryDirectory;

// "refused", "none" for a file without an ID, or the ID.
std::string read(const std::string& path) {
    CFStringRef id = nullptr;
    if (!CopySetIDFromFile(path.c_str(), &id)) {
        return "refused";
    }
    if (id == nullptr) {
        return "none";
    }
    const std::string text = CFStringGetCStringPtr(id, kCFStringEncodingUTF8);
    CFRelease(id);
    return text;
}

TEST(SetIDFile, ReadsOneLineOfAtMost1023Bytes) {
    const TemporaryDirectory directory;
    const std::pair<std::string, std::string> rows[] = {
        {"12", "12"},         {"12\n13\n", "12\n"},
        {"", "none"},         {std::string(1030, '7'), std::string(1023, '7')},
        {"\xff\xfe", "none"}, {"L\xc3\xa4ge", "L\xc3\xa4ge"}};
    for (const auto& [content, id] : rows) {
        EXPECT_EQ(read(directory.write("id", content)), id);
    }
    EXPECT_EQ(read(directory.at("missing")), "refused");
}

TEST(SetIDFile, IsNewPrivateAndWhole) {
    const TemporaryDirectory directory;
    const std::string path = directory.write("id", "a much longer text than the new one");
    const mode_t before = umask(0);
    WriteSetIDFile(path.c_str(), "4");
    umask(before);
    struct stat status = {};
    EXPECT_EQ(stat(path.c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777U, 0600U);
    EXPECT_EQ(read(path), "4");
    // A full disk, on which the second byte does not fit, leaves the old content.
    rlimit whole{};
    getrlimit(RLIMIT_FSIZE, &whole);
    const rlimit small{1, whole.rlim_max};
    const auto handler = std::signal(SIGXFSZ, SIG_IGN);
    setrlimit(RLIMIT_FSIZE, &small);
    WriteSetIDFile(path.c_str(), "12");
    setrlimit(RLIMIT_FSIZE, &whole);
    std::signal(SIGXFSZ, handler);
    EXPECT_EQ(read(path), "4");
    EXPECT_EQ(1, std::distance(std::filesystem::directory_iterator(directory.path()), {}));
}

TEST(SetIDFile, WhatIsNotAPlainFileOfOursIsNotReadAndIsReplaced) {
    const TemporaryDirectory directory;
    const std::string victim = directory.at("victim");
    const std::string path = directory.at("id");
    const std::pair<const char*, std::function<int()>> rows[] = {
        {"a link", [&] { return symlink(victim.c_str(), path.c_str()); }},
        {"a link to nowhere", [&] { return symlink("/nonexistent/nowhere", path.c_str()); }},
        {"a second name of a file", [&] { return link(victim.c_str(), path.c_str()); }},
        {"a directory", [&] { return mkdir(path.c_str(), 0700); }},
        {"a FIFO without a reader", [&] { return mkfifo(path.c_str(), 0600); }},
        {"a file that others may write", [&] { return chmod(directory.write("id", "7").c_str(), 0622); }},
        {"another user's file",
         [&] {
             directory.write("id", "7");
             return geteuid() == 0 ? chown(path.c_str(), 65534, 65534) : chmod(path.c_str(), 0622);
         }},
    };
    std::size_t logged = 0;
    const platform::LogCapture capture([&logged](platform::LogLevel, std::string_view) { ++logged; });
    for (const auto& [what, make] : rows) {
        SCOPED_TRACE(what);
        directory.write("victim", "untouched");
        ASSERT_EQ(make(), 0);
        EXPECT_EQ(read(path), "refused");
        WriteSetIDFile(path.c_str(), "9");
        const bool isDirectory = std::filesystem::is_directory(path);
        EXPECT_EQ(read(path), isDirectory ? "refused" : "9");
        EXPECT_EQ(logged, isDirectory ? 1U : 0U) << "what cannot be replaced is logged";
        logged = 0;
        std::filesystem::remove(path);
        EXPECT_EQ(read(victim), "untouched");
        EXPECT_EQ(1, std::distance(std::filesystem::directory_iterator(directory.path()), {}));
    }
}

}  // namespace
