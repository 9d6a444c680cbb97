#include <grp.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
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
using platform::values::Owned;
using Lines = std::vector<std::string>;

constexpr const char* page = "http://192.0.0.192/dot11_config_start.htm?a='b'&c=$(id);d";

OSStatus openUrl(const char* text, CFURLRef* opened = nullptr) {
    const auto string = platform::values::makeString(text);
    const auto url =
        Owned<CFURLRef>::adopt(CFURLCreateWithString(kCFAllocatorDefault, string.get(), nullptr));
    EXPECT_TRUE(url) << text;
    const auto begin = std::chrono::steady_clock::now();
    const OSStatus err = url ? LSOpenCFURLRef(url.get(), opened) : paramErr;
    EXPECT_LT(std::chrono::steady_clock::now() - begin, 6s);
    return err;
}

class RecordingOpener : public platform::services::Opener {
  public:
    OSStatus open(const std::string& url) override {
        urls.push_back(url);
        return 0;
    }
    Lines urls;
};

TEST(OpenUrl, OpensPagesAndNothingElse) {
    platform::Host host;
    const auto opener = std::make_shared<RecordingOpener>();
    host.opener = opener;
    const platform::HostOverride override(host);
    EXPECT_EQ(openUrl("http://192.0.0.192/a"), 0);
    EXPECT_EQ(openUrl("HTTPS://192.0.0.192/b"), 0);
    for (const char* text : {"file:///etc/passwd", "httpx://192.0.0.192/", "http:opaque", "mailto:a@b.c"}) {
        EXPECT_EQ(openUrl(text), paramErr) << text;
    }
    CFURLRef opened = nullptr;
    EXPECT_EQ(openUrl("http://192.0.0.192/c", &opened), paramErr);
    EXPECT_EQ(LSOpenCFURLRef(nullptr, nullptr), paramErr);
    EXPECT_EQ(opener->urls, (Lines{"http://192.0.0.192/a", "HTTPS://192.0.0.192/b"}));
}

// Takes connections and never says a word.
class MuteBus {
  public:
    explicit MuteBus(const std::string& path) : listener_(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        path.copy(address.sun_path, sizeof address.sun_path - 1);
        EXPECT_EQ(bind(listener_.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
        EXPECT_EQ(listen(listener_.get(), 4), 0);
        EXPECT_EQ(chmod(path.c_str(), 0777), 0);
    }

  private:
    platform::FileDescriptor listener_;
};

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
    // A program that tells how it was run.
    [[nodiscard]] std::string recorder() const {
        return "{ id -u; id -g; id -G; cut -d' ' -f6 /proc/$$/stat | grep -vx " + std::to_string(getsid(0)) +
               " | wc -l; pwd; printf '%s\\n' \"$@\"; readlink /proc/self/fd/0; ls "
               "/proc/self/fd "
               "| "
               "tr '\\n' ' '; echo; grep SigIgn /proc/$$/status; umask; env | sort; } > " +
               desktop.record() + ".part && mv " + desktop.record() + ".part " + desktop.record() + "\n";
    }

    StandInDesktop desktop;
    Lines log;
};

TEST_F(DesktopTest, RunsTheProgramAsTheUserWithACleanEnvironment) {
    const auto session = desktop.serve({.environment = {"DISPLAY=:3", "XAUTHORITY=/run/x",
                                                        "LD_PRELOAD=/evil.so", "PATH=/evil", "DISPLAYS=no"}});
    setenv("DISPLAY", ":99", 1);
    setenv("SECRET", "of root", 1);
    const auto previous = std::signal(SIGPIPE, SIG_IGN);
    const mode_t previousMask = umask(077);
    const gid_t group = 4;
    ASSERT_EQ(setgroups(1, &group), 0);
    const platform::FileDescriptor leaked(dup(0));
    EXPECT_EQ(openOn(desktop.withProgram(recorder()), desktop.systemBus()), 0);
    std::signal(SIGPIPE, previous);
    umask(previousMask);
    EXPECT_EQ(setgroups(0, nullptr), 0);
    unsetenv("DISPLAY");
    unsetenv("SECRET");

    Lines lines = desktop.recorded();
    std::erase_if(lines, [](const std::string& line) {  // what the shell adds by itself
        return line.starts_with("PWD=") || line.starts_with("OLDPWD=") || line.starts_with("_=") ||
               line.starts_with("SHLVL=");
    });
    const std::string runtime = desktop.runtimeRoot() + "/65534";
    std::string told;
    for (const std::string& line : lines) {
        told += line + "\n";
    }
    EXPECT_EQ(told,
              "65534\n65534\n65534\n1\n/\nfirst argument\n" + std::string(page) +
                  "\n/dev/null\n0 1 2 3 \nSigIgn:\t0000000000000000\n0022\n"
                  "DBUS_SESSION_BUS_ADDRESS=unix:path=" +
                  runtime +
                  "/bus\nDISPLAY=:3\nHOME=/nonexistent\nLOGNAME=nobody\nPATH=/usr/local/bin:/usr/bin:/bin\n"
                  "SHELL=/usr/sbin/nologin\nUSER=nobody\nXAUTHORITY=/run/x\nXDG_RUNTIME_DIR=" +
                  runtime + "\nXDG_SESSION_TYPE=x11\n");
    EXPECT_EQ(log, Lines{});
}

TEST_F(DesktopTest, TakesTheSessionsDisplayWhenTheUsersManagerIsSilent) {
    const auto session = desktop.serve({});
    platform::services::Desktop on = desktop.withProgram(recorder());
    on.runtimeRoot = desktop.at("elsewhere");
    std::filesystem::create_directories(on.runtimeRoot + "/65534");
    const MuteBus bus(on.runtimeRoot + "/65534/bus");
    EXPECT_EQ(openOn(on, desktop.systemBus()), 0);
    const Lines lines = desktop.recorded();
    EXPECT_EQ(std::count(lines.begin(), lines.end(), "DISPLAY=:7"), 1);
}

TEST_F(DesktopTest, DoesNotWaitForAProgramThatHangs) {
    const auto session = desktop.serve({});
    const std::string script = "echo $$ > " + desktop.record() + ".part; mv " + desktop.record() + ".part " +
                               desktop.record() + "; exec sleep 60\n";
    EXPECT_EQ(openOn(desktop.withProgram(script), desktop.systemBus()), 0);
    const Lines lines = desktop.recorded();
    ASSERT_EQ(lines.size(), 1U);
    siginfo_t ended{};
    EXPECT_EQ(waitid(P_ALL, 0, &ended, WEXITED | WNOHANG | WNOWAIT), 0);
    EXPECT_EQ(ended.si_pid, 0) << "a child is left to reap";
    EXPECT_EQ(kill(std::stoi(lines[0]), SIGKILL), 0);
}

TEST_F(DesktopTest, OpensNothingWithoutAUsersDesktop) {
    const std::string leaveAMark = "touch " + desktop.record() + "\n";
    const auto on = desktop.withProgram(leaveAMark);
    struct Row {
        const char* what;
        Session session;
        OSStatus status;
        const char* reason;
    };
    const Row rows[] = {
        {"nobody", {.id = ""}, fnfErr, "nobody sits at the computer"},
        {"log-in screen", {.sessionClass = "greeter"}, fnfErr, "class greeter"},
        {"text console", {.type = "tty"}, fnfErr, "type tty"},
        {"being closed", {.state = "closing"}, fnfErr, "state closing"},
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
    EXPECT_EQ(openOn(on, desktop.systemBus()), fnfErr) << "no login manager";
    EXPECT_EQ(openOn(on, desktop.at("no bus")), fnfErr);
    EXPECT_NE(access(desktop.record().c_str(), F_OK), 0);
}

TEST_F(DesktopTest, ReportsAProgramThatCannotBeRun) {
    const auto session = desktop.serve({});
    EXPECT_EQ(openOn({desktop.runtimeRoot(), {{desktop.at("not-installed")}}}, desktop.systemBus()), fnfErr);
    EXPECT_EQ(openOn({desktop.runtimeRoot(), {{desktop.systemBus()}}}, desktop.systemBus()), permErr);
}

TEST_F(DesktopTest, GivesUpOnASystemBusThatIsMute) {
    const MuteBus bus(desktop.at("mute"));
    EXPECT_EQ(openOn(desktop.withProgram(""), desktop.at("mute")), fnfErr);
    ASSERT_EQ(log.size(), 1U);
    EXPECT_NE(log[0].find("timed out"), std::string::npos) << log[0];
}

TEST_F(DesktopTest, WorksWithoutStandardStreams) {
    const auto session = desktop.serve({});
    const auto on = desktop.withProgram(recorder());
    Child child([&] {
        for (const int stream : {0, 1, 2}) {
            close(stream);
        }
        return openOn(on, desktop.systemBus()) == 0 ? 0 : 1;
    });
    EXPECT_EQ(child.wait(), 0);
    EXPECT_EQ(desktop.recorded().at(7), "/dev/null");
}

}  // namespace
