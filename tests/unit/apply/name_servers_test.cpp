#include "platform/apply/direct/NameServers.h"

#include "platform/apply/StateFile.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"
#include "tests/unit/apply/Trees.h"
#include "tests/unit/support/PrivateNetwork.h"

namespace platform::apply {
namespace {

using testing_support::shell;

const std::string before = "nameserver 9.9.9.9 options edns0 ";

class NameServersTest : public testing_support::PrivateNetworkTest {
  protected:
    static void run(const std::function<void()>& body) {
        testing_support::PrivateNetwork::run([&body] {
            const LogCapture quiet([](LogLevel, std::string_view) {});
            ASSERT_TRUE(makeRuntimeDirectory().ok());
            shell("printf 'nameserver 9.9.9.9\noptions edns0\n' >/etc/resolv.conf");
            body();
            EXPECT_EQ("", shell("ls /run/location-assistant/*.plist 2>/dev/null || true"));
        });
    }
    // What is in the file then; without servers and domains the interface has none any more.
    static std::string bring(const std::string& interface, unsigned rank,
                             const std::vector<const char*>& servers,
                             const std::vector<std::string>& domains = {}) {
        NameService service{{}, domains};
        std::ranges::transform(servers, std::back_inserter(service.servers), address);
        std::string trouble;
        EXPECT_EQ("", setInterfaceNameServers(interface, rank, service, trouble).reason());
        return (trouble.empty() ? "" : "trouble ") + shell("grep -hv '^#' /etc/resolv.conf | tr '\n' ' '");
    }
};

TEST_F(NameServersTest, SeveralInterfacesShareTheFileInTheirOrder) {
    run([] {
        const std::string a0 = "search x nameserver 10.0.0.3 nameserver 10.0.0.1 nameserver 10.0.0.4 ";
        EXPECT_EQ(a0, bring("a0", 1, {"10.0.0.3", "10.0.0.1", "10.0.0.4"}, {"x"}));
        EXPECT_EQ("search x nameserver 10.0.0.1 nameserver 10.0.0.2 nameserver 10.0.0.3 ",
                  bring("e0", 0, {"10.0.0.1", "10.0.0.2"}));
        EXPECT_EQ(a0, bring("e0", 0, {}));
        EXPECT_EQ(a0, bring("e1", 0, {}));
        EXPECT_EQ(before, bring("a0", 1, {}));
    });
}

TEST_F(NameServersTest, WhatSomebodyElseWroteStays) {
    run([] {
        bring("e0", 0, {"10.0.0.1"});
        shell("echo nameserver 8.8.8.8 >/etc/resolv.conf");
        EXPECT_EQ("nameserver 8.8.8.8 ", bring("e0", 0, {"10.0.0.2"}));
        EXPECT_EQ("nameserver 8.8.8.8 ", bring("e0", 0, {}));
    });
}

// What cannot be replaced is written in place, and a run may be ended in the middle of that.
TEST_F(NameServersTest, WritesAFileThatIsAMountInPlace) {
    run([] {
        shell(
            "mv /etc/resolv.conf /run/outer; touch /etc/resolv.conf; mount --bind /run/outer "
            "/etc/resolv.conf");
        for (const char* const ended : {"true", "truncate -s 0 /run/outer", "truncate -s 9 /run/outer"}) {
            EXPECT_EQ("nameserver 10.0.0.53 ", bring("e0", 0, {"10.0.0.53"}));
            shell(ended);
            EXPECT_EQ(before, bring("e0", 0, {}));
        }
        shell("mount -o remount,bind,ro /etc/resolv.conf");
        EXPECT_EQ("trouble " + before, bring("e0", 0, {"10.0.0.53"})) << "the addresses stand without it";
        EXPECT_EQ(before, bring("e0", 0, {}));
    });
}

}  // namespace
}  // namespace platform::apply
