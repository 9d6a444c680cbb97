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

#include "platform/FileDescriptor.h"
#include "platform/Host.h"
#include "platform/Log.h"
#include "platform/services/Opener.h"
#include "platform/values/Values.h"
#include "tests/unit/services/StandInDesktop.h"
#include "tests/unit/support/Child.h"
#include "tests/unit/support/Skip.h"

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
    }
    OSStatus openOn(const platform::services::Desktop& on, const std::string& bus, const char* url = page) {
        platform::Host host;
        host.systemBusSocket = bus;
        host.opener = platform::services::makeDesktopOpener(on);
        const platform::HostOverride override(host);
        const platform::LogCapture capture(
            [this](platform::LogLevel, std::string_view line) { log.emplace_back(line); });
        return openUrl(url);
    }
    // A program that records what the commands write.
    [[nodiscard]] std::string recorder(const std::string& commands) const {
        return "{ " + commands + "; } > " + desktop.record() + ".part && mv " + desktop.record() + ".part " +
               desktop.record() + "\n";
    }

    StandInDesktop desktop;
    Lines log;
};

TEST_F(DesktopTest, RunsTheProgramAsTheUserWithNothingOfOurs) {
    const auto session = desktop.serve({.environment = {"DISPLAY=:3", "XAUTHORITY=/run/x",
                                                        "LD_PRELOAD=/evil.so", "PATH=/evil", "DISPLAYS=no"}});
    const auto on = desktop.withProgram(
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
        return isReady && openOn(on, desktop.systemBus()) == 0 && log.empty() ? 0 : 1;
    });
    EXPECT_EQ(child.wait(), 0);
    std::string told;
    for (const std::string& line : desktop.recorded()) {
        told += line + "\n";
    }
    const std::string runtime = desktop.at("run/65534");
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
    const auto session = desktop.serve({});
    std::filesystem::remove(desktop.at("run/65534/bus"));
    const auto bus = muteSocket(desktop.at("run/65534/bus"));
    const auto on = desktop.withProgram(recorder("echo $$; echo $DISPLAY") + "exec sleep 60\n");
    EXPECT_EQ(openOn(on, desktop.systemBus()), 0);
    const Lines lines = desktop.recorded();
    ASSERT_EQ(lines.size(), 2U);
    EXPECT_EQ(lines[1], ":7");
    siginfo_t ended{};
    EXPECT_EQ(waitid(P_ALL, 0, &ended, WEXITED | WNOHANG | WNOWAIT), 0);
    EXPECT_EQ(ended.si_pid, 0) << "a child is left to reap";
    EXPECT_EQ(kill(std::stoi(lines[0]), SIGKILL), 0);
}

TEST_F(DesktopTest, OpensNothingWithoutAUsersDesktop) {
    const auto on = desktop.withProgram(recorder("echo opened"));
    struct Row {
        const char* what;
        Session session;
        OSStatus status;
        const char* reason;
    };
    const Row rows[] = {
        {"nobody", {.path = "/"}, fnfErr, "nobody sits at the computer"},
        {"log-in screen", {.texts = {{"Class", "greeter"}}}, fnfErr, "class greeter"},
        {"text console", {.texts = {{"Type", "tty"}}}, fnfErr, "type tty"},
        {"being closed", {.texts = {{"State", "closing"}}}, fnfErr, "state closing"},
        {"root", {.user = 0}, permErr, "no browser runs as root"},
        {"no such user", {.user = 64999}, fnfErr, "no user 64999"},
    };
    for (const auto& [what, served, status, reason] : rows) {
        SCOPED_TRACE(what);
        const auto session = desktop.serve(served);
        log.clear();
        EXPECT_EQ(openOn(on, desktop.systemBus()), status);
        ASSERT_EQ(log.size(), 1U);
        EXPECT_NE(log[0].find(reason), std::string::npos) << log[0];
    }
    const auto mute = muteSocket(desktop.at("mute"));
    for (const std::string& bus : {desktop.systemBus(), desktop.at("no bus"), desktop.at("mute")}) {
        EXPECT_EQ(openOn(on, bus), fnfErr) << bus;
    }
    EXPECT_NE(log.back().find("timed out"), std::string::npos) << log.back();

    const auto session = desktop.serve({});
    for (const char* url : {"file:///etc/passwd", "httpx://192.0.0.192/", "http:opaque", "mailto:a@b.c"}) {
        EXPECT_EQ(openOn(on, desktop.systemBus(), url), paramErr) << url;
    }
    EXPECT_NE(access(desktop.record().c_str(), F_OK), 0);
    EXPECT_EQ(openOn({desktop.at("run"), {{desktop.at("not-installed")}}}, desktop.systemBus()), fnfErr);
    EXPECT_EQ(openOn({desktop.at("run"), {{desktop.systemBus()}}}, desktop.systemBus()), permErr);
}

}  // namespace
