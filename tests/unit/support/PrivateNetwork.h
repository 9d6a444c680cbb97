// Runs test code in namespaces of its own: users, network, processes and mounts, with empty /etc, /run and
// /var, so that nothing it does to addresses, name servers or processes reaches the machine. All of it ends
// with the code.
#pragma once

#include <gtest/gtest.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <functional>
#include <string>

#include "tests/unit/support/Child.h"
#include "tests/unit/support/Skip.h"

namespace testing_support {

// Runs a command line and gives back what it printed; a failure is a failure of the test.
inline std::string shell(const std::string& command) {
    std::string output;
    FILE* const pipe = popen((command + " 2>&1").c_str(), "re");
    if (pipe == nullptr) {
        ADD_FAILURE() << "cannot run " << command;
        return output;
    }
    std::array<char, 4096> piece{};
    while (const std::size_t size = fread(piece.data(), 1, piece.size(), pipe)) {
        output.append(piece.data(), size);
    }
    EXPECT_EQ(0, pclose(pipe)) << command << "\n" << output;
    return output;
}

class PrivateNetwork {
  public:
    // True when namespaces can be made here.
    static bool isAvailable() {
        Child child([] { return enter() && access("/proc/sys/net/ipv4", F_OK) == 0 ? 0 : 1; });
        return child.wait() == 0 && std::system("command -v ip >/dev/null") == 0;
    }

    // The body's failures are the test's. Its process is the first one of its namespace.
    static void run(const std::function<void()>& body) {
        const auto inside = [&body] {
            prctl(PR_SET_PDEATHSIG, SIGKILL);
            mount("proc", "/proc", "proc", 0, nullptr);
            shell("ip link set lo up");
            body();
            return testing::Test::HasFailure() ? 1 : 0;
        };
        const auto between = [&inside] {
            prctl(PR_SET_PDEATHSIG, SIGKILL);
            return enter() ? Child(inside).wait() : 2;
        };
        EXPECT_EQ(0, Child(between).wait())
            << "the part of the test in its own namespaces failed, see above (2: it could not enter them)";
    }

  private:
    static bool write(const char* path, const std::string& text) {
        return static_cast<bool>(std::ofstream(path) << text << std::flush);
    }

    static bool enter() {
        const uid_t user = geteuid();
        const gid_t group = getegid();
        if (unshare(CLONE_NEWUSER | CLONE_NEWNET | CLONE_NEWNS | CLONE_NEWPID) != 0 ||
            !write("/proc/self/setgroups", "deny") ||
            !write("/proc/self/uid_map", "0 " + std::to_string(user) + " 1") ||
            !write("/proc/self/gid_map", "0 " + std::to_string(group) + " 1") ||
            mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0) {
            return false;
        }
        for (const char* folder : {"/etc", "/run", "/var"}) {
            if (mount("tmpfs", folder, "tmpfs", 0, "mode=755") != 0) {
                return false;
            }
        }
        return write("/etc/passwd", "root:x:0:0:root:/root:/bin/sh\n") && write("/etc/group", "root:x:0:\n");
    }
};

class PrivateNetworkTest : public testing::Test {
  protected:
    void SetUp() override {
        static const bool isAvailable = PrivateNetwork::isAvailable();
        if (!isAvailable) {
            LA_SKIP("needs user, network and mount namespaces, and ip");
        }
    }
};

}  // namespace testing_support
