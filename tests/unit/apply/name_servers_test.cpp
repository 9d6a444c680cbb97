#include "platform/apply/direct/NameServers.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>
#include <memory>
#include <string>

#include "platform/apply/StateFile.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"
#include "tests/unit/support/TemporaryDirectory.h"

namespace platform::apply {
namespace {

namespace fs = std::filesystem;

IPv4Address server(unsigned last) {
    return 10U | (last << 24U);
}

class NameServersTest : public testing::Test {
  protected:
    NameServersTest() {
        Host host;
        host.runtimeDirectory = folder_.at("run");
        host.resolverFile = path_;
        override_ = std::make_unique<HostOverride>(host);
        EXPECT_TRUE(makeRuntimeDirectory().ok());
    }
    void bring(const std::string& interface, unsigned rank, const NameService& service) {
        std::string trouble;
        const Outcome done = setInterfaceNameServers(interface, rank, service, trouble);
        EXPECT_TRUE(done.ok()) << done.reason();
        EXPECT_EQ("", trouble);
    }
    // The lines that a resolver reads; kind, mode and content in one.
    std::string content() {
        if (!fs::exists(fs::symlink_status(path_))) {
            return "absent";
        }
        if (fs::is_symlink(path_)) {
            return "-> " + fs::read_symlink(path_).string();
        }
        struct stat status {};
        EXPECT_EQ(0, stat(path_.c_str(), &status));
        std::string all;
        EXPECT_TRUE(readWholeFile(path_, all).ok());
        std::string lines;
        for (std::size_t at = 0; at < all.size(); at = all.find('\n', at) + 1) {
            lines += all[at] == '#' ? "" : all.substr(at, all.find('\n', at) + 1 - at);
        }
        return (status.st_mode & 07777U) == 0644 ? lines
                                                 : std::to_string(status.st_mode & 07777U) + " " + lines;
    }

    const testing_support::TemporaryDirectory folder_;
    const std::string path_ = folder_.at("etc/resolv.conf");
    const LogCapture quiet_{[](LogLevel, std::string_view) {}};
    std::unique_ptr<HostOverride> override_;
};

TEST_F(NameServersTest, EveryKindOfFileComesBack) {
    fs::create_directories(folder_.at("etc"));
    const auto goAndComeBack = [this](const std::string& before) {
        EXPECT_EQ(before, content());
        bring("eth0", 0, {});
        EXPECT_EQ(before, content());
        bring("eth0", 0, {{server(1), server(2)}, {"example.org"}});
        EXPECT_EQ("search example.org\nnameserver 10.0.0.1\nnameserver 10.0.0.2\n", content());
        bring("eth0", 0, {});
        EXPECT_EQ(before, content());
        EXPECT_FALSE(fs::exists(folder_.at("run/name-servers.plist")));
        EXPECT_FALSE(fs::exists(temporaryFor(path_)));
    };
    goAndComeBack("absent");
    folder_.write("etc/resolv.conf", "nameserver 9.9.9.9\n");
    fs::permissions(path_, fs::perms{0640});
    goAndComeBack("416 nameserver 9.9.9.9\n");
    fs::remove(path_);
    fs::create_symlink("../somewhere/stub.conf", path_);
    goAndComeBack("-> ../somewhere/stub.conf");
}

TEST_F(NameServersTest, SeveralInterfacesShareTheFileInTheirOrder) {
    folder_.write("etc/resolv.conf", "nameserver 9.9.9.9\n");
    bring("wlan0", 1, {{server(3), server(1), server(4)}, {}});
    bring("eth0", 0, {{server(1), server(2)}, {}});
    EXPECT_EQ("nameserver 10.0.0.1\nnameserver 10.0.0.2\nnameserver 10.0.0.3\n", content());
    bring("eth0", 0, {});
    EXPECT_EQ("nameserver 10.0.0.3\nnameserver 10.0.0.1\nnameserver 10.0.0.4\n", content());
    bring("wlan0", 1, {});
    EXPECT_EQ("nameserver 9.9.9.9\n", content());
}

TEST_F(NameServersTest, WhatSomebodyElseWroteStays) {
    folder_.write("etc/resolv.conf", "nameserver 9.9.9.9\n");
    bring("eth0", 0, {{server(1)}, {}});
    folder_.write("etc/resolv.conf", "nameserver 8.8.8.8\n");
    bring("eth0", 0, {{server(2)}, {}});
    EXPECT_EQ("nameserver 8.8.8.8\n", content());
    bring("eth0", 0, {});
    EXPECT_EQ("nameserver 8.8.8.8\n", content());
    EXPECT_FALSE(fs::exists(folder_.at("run/name-servers.plist")));
}

}  // namespace
}  // namespace platform::apply
