#include <grp.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include "platform/base/FileDescriptor.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"
#include "platform/services/Opener.h"
#include "platform/values/Values.h"
#include "tests/unit/services/StandInDesktop.h"
#include "tests/unit/support/Child.h"
#include "tests/unit/support/Skip.h"
#include "tests/unit/support/Transcript.h"

namespace {

using namespace testing_support;
using namespace std::chrono_literals;
using Lines = std::vector<std::string>;

constexpr const char* page = "http://192.0.0.192/dot11_config_start.htm?a='b'&c=$(id);d";

OSStatus openUrl(const char* text) {
    const auto string = platform::values::makeString(text);
    const auto url = platform::values::Owned<CFURLRef>::adopt(
        CFURLCreateWithString(kCFAllocatorDefault, string.get(), nullptr));
    EXPECT_TRUE(url) << text;
    const auto begin = std::chrono::steady_clock::now();
    const OSStatus err = url ? LSOpenCFURLRef(url.get(), nullptr) : paramErr;
    EXPECT_LT(std::chrono::steady_clock::now() - begin, 6s);
    return err;
}

// Takes connections and never says a word.
platform::FileDescriptor muteSocket(const std::string& path) {
    platform::FileDescriptor listener(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    path.copy(address.sun_path, sizeof address.sun_path - 1);
    EXPECT_EQ(bind(listener.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
    EXPECT_EQ(listen(listener.get(), 4), 0);
    EXPECT_EQ(chmod(path.c_str(), 0777), 0);
    return listener;
}

class DesktopTest : public testing::Test {
  protected:
    void SetUp() override {
        if (geteuid() != 0) {
            LA_SKIP("becoming another user needs root");
        }
        made = std::make_unique<StandInDesktop>();
    }
    OSStatus openOn(const platform::services::Desktop& on, const char* url = page) {
        platform::Host host;
        host.opener = platform::services::makeDesktopOpener(on);
        const platform::HostOverride override(host);
        const platform::LogCapture capture(
            [this](platform::LogLevel, std::string_view line) { log.emplace_back(line); });
        return openUrl(url);
    }
    // A program that records what the commands write.
    [[nodiscard]] std::string recorder(const std::string& commands) const {
        return "{ " + commands + "; } > " + desktop().record() + ".part && mv " + desktop().record() +
               ".part " + desktop().record() + "\n";
    }
    [[nodiscard]] StandInDesktop& desktop() const { return *made; }

    std::unique_ptr<StandInDesktop> made;
    Lines log;
};

TEST_F(DesktopTest, RunsTheProgramAsTheUserWithNothingOfOurs) {
    StandInDesktop::seat("");
    desktop().manage({"DISPLAY=:3", "XAUTHORITY=/run/x", "LD_PRELOAD=/evil.so", "PATH=/evil", "DISPLAYS=no"});
    const auto on = desktop().withProgram(
        recorder("id -u; id -g; id -G; cut -d' ' -f6 /proc/$$/stat | grep -vx " + std::to_string(getsid(0)) +
                 " | wc -l; pwd; printf '%s\\n' \"$@\"; readlink /proc/self/fd/0; ls /proc/self/fd | "
                 "tr '\\n' ' '; echo; grep SigIgn /proc/$$/status; umask; "
                 "env | grep -Ev '^(PWD|OLDPWD|_|SHLVL)=' | sort"));
    Child child([&] {
        setenv("DISPLAY", ":99", 1);
        setenv("SECRET", "of root", 1);
        std::signal(SIGPIPE, SIG_IGN);
        umask(077);
        const gid_t group = 4;
        const bool isReady = setgroups(1, &group) == 0 && dup2(0, 9) == 9;
        for (const int stream : {0, 1, 2}) {
            close(stream);
        }
        return isReady && openOn(on) == 0 && log.empty() ? 0 : 1;
    });
    EXPECT_EQ(child.wait(), 0);
    std::string told;
    for (const std::string& line : desktop().recorded()) {
        told += line + "\n";
    }
    const std::string runtime = desktop().at("run/65534");
    EXPECT_EQ(told,
              "65534\n65534\n65534\n1\n/\nfirst argument\n" + std::string(page) +
                  "\n/dev/null\n0 1 2 3 \nSigIgn:\t0000000000000000\n0022\n"
                  "DBUS_SESSION_BUS_ADDRESS=unix:path=" +
                  runtime +
                  "/bus\nDISPLAY=:3\nHOME=/nonexistent\nLOGNAME=nobody\nPATH=/usr/local/bin:/usr/bin:/bin\n"
                  "SHELL=/usr/sbin/nologin\nUSER=nobody\nXAUTHORITY=/run/x\nXDG_RUNTIME_DIR=" +
                  runtime + "\nXDG_SESSION_TYPE=x11\n");
}

TEST_F(DesktopTest, WaitsNeitherForTheUsersManagerNorForTheProgram) {
    StandInDesktop::seat("");
    const auto bus = muteSocket(desktop().userBus());
    const auto on = desktop().withProgram(recorder("echo $$; echo $DISPLAY") + "exec sleep 60\n");
    EXPECT_EQ(openOn(on), 0);
    const Lines lines = desktop().recorded();
    ASSERT_EQ(lines.size(), 2U);
    EXPECT_EQ(lines[1], ":7");
    siginfo_t ended{};
    EXPECT_EQ(waitid(P_ALL, 0, &ended, WEXITED | WNOHANG | WNOWAIT), -1) << "a child is left to reap";
    EXPECT_EQ(errno, ECHILD);
    EXPECT_EQ(kill(std::stoi(lines[0]), SIGKILL), 0);
}

TEST_F(DesktopTest, OpensNothingWithoutAUsersDesktop) {
    const auto on = desktop().withProgram(recorder("echo opened"));
    testing_support::Transcript transcript("opener");
    transcript.replay("who sits at the computer", [&](const testing_support::Transcript::Inputs& fields) {
        if (!fields[0].empty()) {
            StandInDesktop::seat(fields[0], fields.back());
        }
        log.clear();
        const OSStatus status = openOn(on);
        EXPECT_EQ(log.size(), 1U);
        return std::to_string(status) + " " + (log.empty() ? "" : log[0]);
    });
    StandInDesktop::seat("");
    for (const char* url : {"file:///etc/passwd", "httpx://192.0.0.192/", "http:opaque", "mailto:a@b.c"}) {
        EXPECT_EQ(openOn(on, url), paramErr) << url;
    }
    EXPECT_NE(access(desktop().record().c_str(), F_OK), 0);
    EXPECT_EQ(openOn({desktop().at("run"), {{desktop().at("not-installed")}}}), fnfErr);
    EXPECT_EQ(openOn({desktop().at("run"), {{desktop().at("out")}}}), permErr);
}

}  // namespace
