// A desktop to open pages on, in a mount namespace of the test's own: what the login manager keeps under
// /run/systemd, a user's bus with the user's service manager, and a program that opens URLs. Needs root.
#include <grp.h>
#include <gtest/gtest.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "platform/CoreServices.h"
#include "platform/base/FileDescriptor.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"
#include "platform/values/Values.h"
#include "tests/unit/support/Skip.h"
#include "tests/unit/support/StandInService.h"
#include "tests/unit/support/Transcript.h"

namespace {

using namespace testing_support;
using namespace std::chrono_literals;
using Lines = std::vector<std::string>;

constexpr const char* page = "http://192.0.0.192/dot11_config_start.htm?a='b'&c=$(id);d";

class DesktopTest : public testing::Test {
  protected:
    void SetUp() override {
        if (geteuid() != 0) {
            LA_SKIP("becoming another user needs root");
        }
        ASSERT_EQ(unshare(CLONE_NEWNS), 0);
        ASSERT_EQ(mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr), 0);
        ASSERT_EQ(mount("tmpfs", "/run", "tmpfs", 0, "mode=755"), 0);
        chmod(directory.path().c_str(), 0755);
        for (const std::string& folder : {runtime, directory.at("out")}) {
            std::filesystem::create_directories(folder);
            chmod(folder.c_str(), 0777);
        }
    }
    // Puts somebody, or nobody, at the computer: the fields of the seat and of its session "2", as in
    // "UID=0\n", beside those of an active X11 session of user 65534 on ":7".
    static void seat(const std::string& session = "", const std::string& seat = "ACTIVE=2\n") {
        for (const char* folder : {"/run/systemd/seats", "/run/systemd/sessions"}) {
            std::filesystem::create_directories(folder);
        }
        std::ofstream("/run/systemd/seats/seat0") << seat;
        // Of a field that is there twice the last one counts.
        std::ofstream("/run/systemd/sessions/2")
            << "UID=65534\nCLASS=user\nSTATE=active\nTYPE=x11\nDISPLAY=:7\n"
            << session;
    }
    // The opening program records what the commands write; it stands behind one that is not installed.
    [[nodiscard]] platform::Host withProgram(const std::string& commands, const std::string& then = "") {
        platform::Host host;
        host.userRuntimeRoot = directory.at("run");
        const std::string program =
            directory.write("open-url", "#!/bin/sh\n{ " + commands + "; } > " + record + ".part && mv " +
                                            record + ".part " + record + "\n" + then);
        chmod(program.c_str(), 0755);
        host.openingPrograms = {{directory.at("not-installed")}, {program, "first argument"}};
        return host;
    }
    OSStatus openOn(const platform::Host& host, const char* text = page) {
        const platform::HostOverride override(host);
        const platform::LogCapture capture(
            [this](platform::LogLevel, std::string_view line) { log.emplace_back(line); });
        const auto string = platform::values::makeString(text);
        const auto url = platform::values::Owned<CFURLRef>::adopt(
            CFURLCreateWithString(kCFAllocatorDefault, string.get(), nullptr));
        const auto begin = std::chrono::steady_clock::now();
        const OSStatus err = LSOpenCFURLRef(url.get(), nullptr);
        EXPECT_LT(std::chrono::steady_clock::now() - begin, 6s);
        return err;
    }
    // Once the program is done with it; nothing after five seconds.
    [[nodiscard]] std::string recorded() const {
        for (int i = 0; i < 500 && !std::filesystem::exists(record); ++i) {
            std::this_thread::sleep_for(10ms);
        }
        std::ifstream in(record);
        return {std::istreambuf_iterator<char>(in), {}};
    }

    TemporaryDirectory directory;
    const std::string runtime = directory.at("run/65534");
    const std::string record = directory.at("out/record");
    Lines log;
};

TEST_F(DesktopTest, RunsTheProgramAsTheUserWithNothingOfOurs) {
    seat();
    const StandInBus bus(runtime + "/bus");
    StandInService manager(bus, "org.freedesktop.systemd1");
    manager.objects["/org/freedesktop/systemd1"]["Environment"] = {platform::bus::Texts{
        "DISPLAY=:3", "XAUTHORITY=/run/x", "LD_PRELOAD=/evil.so", "PATH=/evil", "DISPLAYS=no"}};
    const auto on = withProgram(
        "id -u; id -g; id -G; cut -d' ' -f6 /proc/$$/stat | grep -vx " + std::to_string(getsid(0)) +
        " | wc -l; pwd; printf '%s\\n' \"$@\"; readlink /proc/self/fd/0; ls /proc/self/fd | "
        "tr '\\n' ' '; echo; grep SigIgn /proc/$$/status; umask; "
        "env | grep -Ev '^(PWD|OLDPWD|_|SHLVL)=' | sort");
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
    EXPECT_EQ(recorded(),
              "65534\n65534\n65534\n1\n/\nfirst argument\n" + std::string(page) +
                  "\n/dev/null\n0 1 2 3 \nSigIgn:\t0000000000000000\n0022\n"
                  "DBUS_SESSION_BUS_ADDRESS=unix:path=" +
                  runtime +
                  "/bus\nDISPLAY=:3\nHOME=/nonexistent\nLOGNAME=nobody\nPATH=/usr/local/bin:/usr/bin:/bin\n"
                  "SHELL=/usr/sbin/nologin\nUSER=nobody\nXAUTHORITY=/run/x\nXDG_RUNTIME_DIR=" +
                  runtime + "\nXDG_SESSION_TYPE=x11\n");
}

TEST_F(DesktopTest, WaitsNeitherForTheUsersManagerNorForTheProgram) {
    seat();
    // Takes connections and never says a word.
    const platform::FileDescriptor mute(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    (runtime + "/bus").copy(address.sun_path, sizeof address.sun_path - 1);
    ASSERT_EQ(bind(mute.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
    ASSERT_EQ(listen(mute.get(), 4), 0);
    chmod(address.sun_path, 0777);
    EXPECT_EQ(openOn(withProgram("echo $DISPLAY; echo $$", "exec sleep 60\n")), 0);
    const std::string told = recorded();
    ASSERT_EQ(told.substr(0, 3), ":7\n");
    siginfo_t ended{};
    EXPECT_EQ(waitid(P_ALL, 0, &ended, WEXITED | WNOHANG | WNOWAIT), -1) << "a child is left to reap";
    EXPECT_EQ(errno, ECHILD);
    EXPECT_EQ(kill(std::stoi(told.substr(3)), SIGKILL), 0);
}

TEST_F(DesktopTest, OpensNothingWithoutAUsersDesktop) {
    platform::Host on = withProgram("echo opened");
    Transcript transcript("opener");
    transcript.replay("who sits at the computer", [&](const Transcript::Inputs& fields) {
        if (!fields[0].empty()) {
            seat(fields[0], fields.back());
        }
        log.clear();
        const OSStatus status = openOn(on);
        EXPECT_EQ(log.size(), 1U);
        return std::to_string(status) + " " + (log.empty() ? "" : log[0]);
    });
    seat();
    for (const char* url : {"file:///etc/passwd", "httpx://192.0.0.192/", "http:opaque", "mailto:a@b.c"}) {
        EXPECT_EQ(openOn(on, url), paramErr) << url;
    }
    EXPECT_NE(access(record.c_str(), F_OK), 0);
    on.openingPrograms.pop_back();
    EXPECT_EQ(openOn(on), fnfErr);
    on.openingPrograms = {{directory.at("out")}};
    EXPECT_EQ(openOn(on), permErr);
}

}  // namespace
