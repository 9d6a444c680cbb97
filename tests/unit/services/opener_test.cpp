// A desktop to open pages on, in a mount namespace of the test's own: what the login manager keeps under
// /run/systemd, a user's bus with the user's service manager, and a program that opens URLs. Needs root.
#include <grp.h>
#include <gtest/gtest.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "platform/CoreServices.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"
#include "platform/values/Values.h"
#include "tests/unit/support/Skip.h"
#include "tests/unit/support/StandInService.h"
#include "tests/unit/support/Transcript.h"

namespace {

using namespace testing_support;
using namespace std::chrono_literals;

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
        log.clear();
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
    std::vector<std::string> log;
};

TEST_F(DesktopTest, WaitsNeitherForTheUsersManagerNorForTheProgram) {
    seat();
    // Is on the bus and never says a word.
    const StandInBus bus(runtime + "/bus");
    sd_bus* const mute = bus.connect();
    ASSERT_GE(sd_bus_request_name(mute, "org.freedesktop.systemd1", 0), 0);
    EXPECT_EQ(openOn(withProgram("echo $DISPLAY; echo $$", "exec sleep 60\n")), 0);
    const std::string told = recorded();
    ASSERT_EQ(told.substr(0, 3), ":7\n");
    const pid_t program = std::stoi(told.substr(3));
    siginfo_t ended{};
    EXPECT_EQ(kill(program, SIGKILL), 0);
    EXPECT_EQ(waitid(P_PID, static_cast<id_t>(program), &ended, WEXITED), -1) << "it is nobody's child";
    EXPECT_EQ(waitid(P_ALL, 0, &ended, WEXITED | WNOHANG | WNOWAIT), 0);
    EXPECT_EQ(ended.si_pid, 0) << "a child is left to reap";
    sd_bus_unref(mute);
}

TEST_F(DesktopTest, DoesWhatItsTableSays) {
    platform::Host on = withProgram("echo opened");
    Transcript transcript("opener");
    transcript.replay("who sits at the computer", [&](const Transcript::Inputs& fields) {
        if (!fields[0].empty()) {
            seat(fields[0], fields[1]);
        }
        EXPECT_EQ(seteuid(fields.size() > 2 ? static_cast<uid_t>(std::stoul(fields[2])) : 0), 0);
        const OSStatus status = openOn(on);
        EXPECT_EQ(seteuid(0), 0);
        EXPECT_EQ(log.size(), 1U);
        return std::to_string(status) + " " + (log.empty() ? "" : log[0]);
    });
    seat();
    transcript.replay("what is no page", [&](const Transcript::Inputs& url) {
        return std::to_string(openOn(on, url[0].c_str()));
    });
    EXPECT_NE(access(record.c_str(), F_OK), 0);
    const StandInBus bus(runtime + "/bus");
    StandInService manager(bus, "org.freedesktop.systemd1");
    // The session, the program's commands, and the environment of the user's service manager.
    transcript.replay("what the program finds", [&](const Transcript::Inputs& fields) {
        seat(fields[0]);
        manager.objects["/org/freedesktop/systemd1"]["Environment"] = {
            platform::bus::Texts(fields.begin() + 2, fields.end())};
        std::filesystem::remove(record);
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
            return isReady && openOn(withProgram(fields[1])) == 0 && log.empty() ? 0 : 1;
        });
        return child.wait() == 0 ? escaped(recorded()) : "not opened";
    });
    chmod(directory.write("out/garbage", "x").c_str(), 0755);
    transcript.replay("programs that cannot be run", [&](const Transcript::Inputs& names) {
        on.openingPrograms.clear();
        for (const std::string& name : names) {
            on.openingPrograms.push_back({directory.at(name)});
        }
        return std::to_string(openOn(on));
    });
}

}  // namespace
