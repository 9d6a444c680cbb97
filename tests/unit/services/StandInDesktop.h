// A desktop to open pages on, in a mount namespace of the test's own: what the login manager keeps under
// /run/systemd, a user's bus with a stand-in for the user's service manager, and room for a program that
// opens URLs. Needs root.
#pragma once

#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <systemd/sd-bus.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstdint>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <functional>
#include <memory>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include "platform/services/Opener.h"
#include "tests/unit/support/TemporaryDirectory.h"

namespace testing_support {

// Work done in a process of its own, ended with the scope.
class Process {
  public:
    explicit Process(const std::function<void()>& work) : id_(fork()) {
        if (id_ == 0) {
            work();
            _exit(1);
        }
    }
    ~Process() {
        kill(id_, SIGKILL);
        while (waitpid(id_, nullptr, 0) < 0 && errno == EINTR) {
        }
    }
    Process(const Process&) = delete;
    Process& operator=(const Process&) = delete;

  private:
    pid_t id_;
};

inline bool waitFor(const std::function<bool()>& condition) {
    for (int i = 0; i < 500; ++i) {
        if (condition()) {
            return true;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    return false;
}

class StandInDesktop {
  public:
    StandInDesktop() {
        if (unshare(CLONE_NEWNS) != 0 || mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0 ||
            mount("tmpfs", "/run", "tmpfs", 0, "mode=755") != 0) {
            throw std::runtime_error("no mount namespace");
        }
        chmod(directory_.path().c_str(), 0755);
        for (const char* folder : {"run/65534", "out"}) {
            std::filesystem::create_directories(at(folder));
            chmod(at(folder).c_str(), 0777);
        }
    }

    // Puts somebody, or nobody, at the computer: the fields of the seat and of its session "2", as in
    // "UID=0\n", beside those of an active X11 session of user 65534 on ":7".
    static void seat(const std::string& session, const std::string& seat = "ACTIVE=2\n") {
        for (const char* folder : {"/run/systemd/seats", "/run/systemd/sessions"}) {
            std::filesystem::create_directories(folder);
        }
        std::ofstream("/run/systemd/seats/seat0") << seat;
        // Of a field that is there twice the last one counts.
        std::ofstream("/run/systemd/sessions/2")
            << "UID=65534\nCLASS=user\nSTATE=active\nTYPE=x11\nDISPLAY=:7\n"
            << session;
    }
    // Starts the user's bus, which every user may talk to, with a service manager of this environment on it.
    void manage(const std::vector<const char*>& environment) {
        const std::string option =
            "--config-file=" +
            directory_.write("bus.conf", "<busconfig><listen>unix:path=" + userBus() +
                                             "</listen><policy context=\"default\"><allow user=\"*\"/>"
                                             "<allow own=\"*\"/><allow send_destination=\"*\"/>"
                                             "<allow receive_sender=\"*\"/></policy></busconfig>\n");
        bus_ = std::make_unique<Process>([&] {
            // It complains about limits that only the machine's own bus may have.
            if (std::freopen("/dev/null", "w", stderr) == nullptr) {
                _exit(1);
            }
            const char* none[] = {nullptr};
            execle("/usr/bin/dbus-daemon", "dbus-daemon", option.c_str(), "--nofork", "--nopidfile", nullptr,
                   none);
        });
        const std::string ready = directory_.write("ready", "");
        manager_ = std::make_unique<Process>([&] { serveForEver(environment, ready); });
        if (!waitFor([&] { return !std::filesystem::exists(ready); })) {
            throw std::runtime_error("the stand-in manager is not up");
        }
    }
    // The desktop with the script as its opening program, after one that is not installed.
    [[nodiscard]] platform::services::Desktop withProgram(const std::string& script) const {
        const std::string program = directory_.write("open-url", "#!/bin/sh\n" + script);
        chmod(program.c_str(), 0755);
        return {at("run"), {{at("not-installed")}, {program, "first argument"}}};
    }
    // The lines of the file that the program moves to record(), once it is there; none after five seconds.
    [[nodiscard]] std::vector<std::string> recorded() const {
        std::vector<std::string> lines;
        if (waitFor([this] { return std::filesystem::exists(record()); })) {
            std::ifstream in(record());
            for (std::string line; std::getline(in, line);) {
                lines.push_back(line);
            }
        }
        return lines;
    }
    [[nodiscard]] std::string at(std::string_view name) const { return directory_.at(name); }
    [[nodiscard]] std::string record() const { return at("out/record"); }
    [[nodiscard]] std::string userBus() const { return at("run/65534/bus"); }

  private:
    static int answer(sd_bus_message* call, void* context, sd_bus_error* /*error*/) {
        const char* interface = nullptr;
        const char* name = nullptr;
        if (sd_bus_message_is_method_call(call, "org.freedesktop.DBus.Properties", "Get") <= 0 ||
            sd_bus_message_read(call, "ss", &interface, &name) <= 0 ||
            std::string(sd_bus_message_get_path(call)) + " " + interface + " " + name !=
                "/org/freedesktop/systemd1 org.freedesktop.systemd1.Manager Environment") {
            return 0;
        }
        std::vector<const char*> entries = *static_cast<const std::vector<const char*>*>(context);
        entries.push_back(nullptr);
        sd_bus_message* reply = nullptr;
        sd_bus_message_new_method_return(call, &reply);
        sd_bus_message_open_container(reply, 'v', "as");
        sd_bus_message_append_strv(reply, const_cast<char**>(entries.data()));
        sd_bus_message_close_container(reply);
        const int sent = sd_bus_send(nullptr, reply, nullptr);
        sd_bus_message_unref(reply);
        return sent;
    }
    // Removes the file once it can be asked.
    void serveForEver(std::vector<const char*> environment, const std::string& ready) const {
        const std::string address = "unix:path=" + userBus();
        sd_bus* bus = nullptr;
        // The bus is there a moment before it listens.
        const auto connect = [&] {
            return sd_bus_new(&bus) >= 0 && sd_bus_set_address(bus, address.c_str()) >= 0 &&
                   sd_bus_set_bus_client(bus, 1) >= 0 && sd_bus_start(bus) >= 0;
        };
        const bool isUp = waitFor(connect) && sd_bus_add_filter(bus, nullptr, answer, &environment) >= 0 &&
                          sd_bus_request_name(bus, "org.freedesktop.systemd1", 0) >= 0 &&
                          std::filesystem::remove(ready);
        while (isUp && sd_bus_process(bus, nullptr) >= 0 && sd_bus_wait(bus, UINT64_MAX) >= 0) {
        }
    }

    TemporaryDirectory directory_;
    std::unique_ptr<Process> bus_;
    std::unique_ptr<Process> manager_;
};

}  // namespace testing_support
