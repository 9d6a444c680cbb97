#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

#include "platform/apply/direct/OtherDaemons.h"
#include "platform/base/Host.h"
#include "tests/unit/support/PrivateNetwork.h"
#include "tests/unit/support/TemporaryDirectory.h"

using namespace platform;
using namespace platform::apply;
using testing_support::PrivateNetwork;
using testing_support::shell;

namespace {

constexpr int index = 7;

// A client by its name and arguments, with the letter of its state in /proc/PID/stat.
class Client {
  public:
    Client(const std::string& folder, const std::string& name, const std::string& arguments) {
        const std::string path = folder + "/" + name;
        std::ofstream(path) << "#!/bin/sh\necho $$ > " << path << ".pid\nread never < " << folder
                            << "/pipe\n";
        shell("chmod 755 " + path + "; mkfifo -m 600 " + folder + "/pipe 2>/dev/null; (" + path + " " +
              arguments + " </dev/null >/dev/null 2>&1 &) ; until test -s " + path +
              ".pid; do sleep 0.01; done");
        std::ifstream(path + ".pid") >> number_;
    }
    // A signal takes effect a moment later.
    [[nodiscard]] bool becomes(char state) const {
        std::string now;
        for (int i = 0; i < 200 && (now.empty() || now[0] != state); ++i) {
            usleep(10'000);
            now = shell("sed 's/.*) \\(.\\).*/\\1/' /proc/" + std::to_string(number_) + "/stat");
        }
        return now[0] == state;
    }

  private:
    int number_ = 0;
};

class OtherDaemonsTest : public testing_support::PrivateNetworkTest {
  protected:
    static void run(const std::function<void(const std::string& folder)>& body) {
        PrivateNetwork::run([&body] {
            setenv("TMPDIR", "/run", 1);
            const testing_support::TemporaryDirectory folder;
            Host host;
            host.networkdStateDirectory = folder.path();
            host.sysfsRoot = folder.path();
            const HostOverride override(host);
            for (const char* name : {"card0", "card1"}) {
                std::filesystem::create_directories(folder.at(std::string("class/net/") + name));
            }
            body(folder.path());
        });
    }
};

// Only a client of this interface alone stands still, and only in between.
TEST_F(OtherDaemonsTest, ClientStandsStill) {
    run([](const std::string& folder) {
        std::filesystem::create_directories(folder + "/shared");
        std::filesystem::create_directories(folder + "/other");
        const Client own(folder, "dhclient", "-4 -i card0");
        const Client shared(folder + "/shared", "dhclient", "card0 card1");
        const Client other(folder + "/other", "udhcpc", "-i card1");
        const OtherDaemons found = findOtherDaemons("card0", index);
        EXPECT_FALSE(found.networkd);
        suspendOtherDaemons("card0", index, found);
        EXPECT_TRUE(own.becomes('T'));
        EXPECT_TRUE(shared.becomes('S') && other.becomes('S'));
        EXPECT_EQ(1U, findOtherDaemons("card0", index).dhcpClients.size()) << "whose record is lost";
        EXPECT_TRUE(resumeOtherDaemons("card0", found).ok());
        EXPECT_TRUE(own.becomes('S'));
    });
}

TEST_F(OtherDaemonsTest, NetworkdIsAskedByAFile) {
    run([](const std::string& folder) {
        const std::string file = "/run/systemd/network/0-0-location-assistant-card0.network";
        const std::string link = folder + "/" + std::to_string(index);
        const auto isFound = [&link](const char* text) {
            std::ofstream(link) << text;
            return findOtherDaemons("card0", index).networkd;
        };
        EXPECT_FALSE(isFound("ADMIN_STATE=unmanaged\nNETWORK_FILE=/etc/a.network\n"));
        EXPECT_FALSE(isFound("ADMIN_STATE=initialized\nOPER_STATE=off\n"));
        ASSERT_TRUE(isFound("ADMIN_STATE=configured\nNETWORK_FILE=/etc/a.network\n"));
        const OtherDaemons found = findOtherDaemons("card0", index);
        suspendOtherDaemons("card0", index, found);
        EXPECT_EQ("[Match]\nName=card0\n\n[Link]\nUnmanaged=yes\n", shell("cat " + file));
        EXPECT_EQ("drwxr-xr-x\n-rw-r--r--\n", shell("stat -c %A /run/systemd/network " + file));
        EXPECT_TRUE(isFound("ADMIN_STATE=unmanaged\nNETWORK_FILE=/etc/a.network\n"))
            << "whose record is lost";
        EXPECT_FALSE(isNetworkdSettled(index));
        EXPECT_TRUE(resumeOtherDaemons("card0", found).ok());
        EXPECT_FALSE(std::filesystem::exists(file));
        EXPECT_TRUE(resumeOtherDaemons("card0", found).ok());
        EXPECT_TRUE(isFound("ADMIN_STATE=configured\nNETWORK_FILE=/etc/a.network\n") &&
                    isNetworkdSettled(index));
        suspendOtherDaemons("a*", index, found);
        EXPECT_EQ("", shell("ls /run/systemd/network"));
    });
}

}  // namespace
