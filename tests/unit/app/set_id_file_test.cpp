#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>
#include <fstream>
#include <functional>
#include <iterator>
#include <sstream>
#include <string>
#include <vector>

#include "app/SetIDFile.h"
#include "platform/base/Log.h"
#include "tests/unit/support/TemporaryDirectory.h"

namespace {

using testing_support::TemporaryDirectory;

std::string contentOf(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    std::ostringstream text;
    text << file.rdbuf();
    return text.str();
}

void fill(const std::string& path, const std::string& text) {
    std::ofstream(path, std::ios::binary) << text;
}

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
    const std::string path = directory.at("id");
    const struct {
        std::string content;
        std::string id;
    } rows[] = {
        {"12", "12"},
        {"12\n", "12\n"},
        {"12\n13\n", "12\n"},
        {"", "none"},
        {std::string(1023, '7'), std::string(1023, '7')},
        {std::string(1030, '7'), std::string(1023, '7')},
        {"\xff\xfe", "none"},
        {"L\xc3\xa4ge", "L\xc3\xa4ge"},
    };
    for (const auto& row : rows) {
        fill(path, row.content);
        EXPECT_EQ(read(path), row.id);
    }
}

TEST(SetIDFile, ReplacesTheWholeContentAndKeepsNewFilesPrivate) {
    const TemporaryDirectory directory;
    const std::string path = directory.at("id");
    fill(path, "a much longer text than the new one");
    WriteSetIDFile(path.c_str(), "4");
    EXPECT_EQ(contentOf(path), "4");

    const std::string fresh = directory.at("fresh");
    const mode_t before = umask(0);
    WriteSetIDFile(fresh.c_str(), "5");
    umask(before);
    EXPECT_EQ(contentOf(fresh), "5");
    struct stat status = {};
    ASSERT_EQ(stat(fresh.c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777U, 0600U);
}

TEST(SetIDFile, AFullDiskLeavesTheOldContent) {
    const TemporaryDirectory folder;
    const std::string path = folder.at("set.orig");
    WriteSetIDFile(path.c_str(), "4");
    // The second byte does not fit.
    rlimit whole{};
    getrlimit(RLIMIT_FSIZE, &whole);
    const rlimit small{1, whole.rlim_max};
    const auto before = std::signal(SIGXFSZ, SIG_IGN);
    setrlimit(RLIMIT_FSIZE, &small);
    WriteSetIDFile(path.c_str(), "12");
    setrlimit(RLIMIT_FSIZE, &whole);
    std::signal(SIGXFSZ, before);
    EXPECT_EQ("4", read(path));
    EXPECT_EQ(1, std::distance(std::filesystem::directory_iterator(folder.path()), {}));
}

TEST(SetIDFile, WhatIsNotAPlainFileOfOursIsNotReadAndIsReplaced) {
    const TemporaryDirectory directory;
    const std::string victim = directory.at("victim");
    const std::string path = directory.at("id");
    const struct {
        const char* what;
        std::function<int()> make;
    } rows[] = {
        {"a link", [&] { return symlink(victim.c_str(), path.c_str()); }},
        {"a link to nowhere", [&] { return symlink("/nonexistent/nowhere", path.c_str()); }},
        {"a second name of a file", [&] { return link(victim.c_str(), path.c_str()); }},
        {"a directory", [&] { return mkdir(path.c_str(), 0700); }},
        {"a FIFO without a reader", [&] { return mkfifo(path.c_str(), 0600); }},
        {"a file that others may write",
         [&] {
             fill(path, "7");
             return chmod(path.c_str(), 0622);
         }},
        {"another user's file",
         [&] {
             fill(path, "7");
             return geteuid() == 0 ? chown(path.c_str(), 65534, 65534) : chmod(path.c_str(), 0622);
         }},
    };
    std::vector<std::string> log;
    const platform::LogCapture capture(
        [&log](platform::LogLevel, std::string_view line) { log.emplace_back(line); });
    for (const auto& row : rows) {
        SCOPED_TRACE(row.what);
        fill(victim, "untouched");
        ASSERT_EQ(row.make(), 0);
        EXPECT_EQ(read(path), "refused");
        WriteSetIDFile(path.c_str(), "9");
        EXPECT_EQ(contentOf(victim), "untouched");
        const bool isDirectory = std::filesystem::is_directory(path);
        EXPECT_EQ(read(path), isDirectory ? "refused" : "9");
        EXPECT_EQ(log.size(), isDirectory ? 1U : 0U) << "what cannot be replaced is told";
        log.clear();
        std::filesystem::remove(path);
    }
    EXPECT_EQ(read(directory.at("missing")), "refused");
    std::size_t count = 0;
    for ([[maybe_unused]] const auto& entry : std::filesystem::directory_iterator(directory.path())) {
        ++count;
    }
    EXPECT_EQ(count, 1U) << "only the victim is left";
}

}  // namespace
