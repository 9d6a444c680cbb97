// A desktop to open pages on: a private message bus that is both the system's and the user's, with stand-ins
// for the login manager and the user's service manager on it, and room for a program that opens URLs.
#pragma once

#include <fcntl.h>
#include <spawn.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <systemd/sd-bus.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstdint>
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

// A process of the test's own, ended with its scope.
class Process {
  public:
    explicit Process(pid_t id) : id_(id) {}
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

struct Session {
    std::string id = "2";  // empty: nobody sits at the computer
    std::uint32_t user = 65534;
    std::string sessionClass = "user";
    std::string state = "active";
    std::string type = "x11";
    std::string display = ":7";
    std::vector<std::string> environment = {};  // what the user's service manager has

    // Answers the properties that are asked for where the real managers have them.
    static int answer(sd_bus_message* call, void* context, sd_bus_error* /*error*/) {
        const auto& session = *static_cast<const Session*>(context);
        const char* interface = nullptr;
        const char* name = nullptr;
        if (sd_bus_message_is_method_call(call, "org.freedesktop.DBus.Properties", "Get") <= 0 ||
            sd_bus_message_read(call, "ss", &interface, &name) <= 0) {
            return 0;
        }
        const std::string asked = std::string(sd_bus_message_get_path(call)) + " " + interface + " " + name;
        const std::string path = "/org/freedesktop/login1/session/_32";
        const std::string inSession = path + " org.freedesktop.login1.Session ";
        sd_bus_message* reply = nullptr;
        int made = sd_bus_message_new_method_return(call, &reply);
        if (asked == "/org/freedesktop/login1/seat/seat0 org.freedesktop.login1.Seat ActiveSession") {
            made = sd_bus_message_append(reply, "v", "(so)", session.id.c_str(),
                                         session.id.empty() ? "/" : path.c_str());
        } else if (asked == "/org/freedesktop/systemd1 org.freedesktop.systemd1.Manager Environment") {
            std::vector<char*> entries;
            for (const std::string& entry : session.environment) {
                entries.push_back(const_cast<char*>(entry.c_str()));
            }
            entries.push_back(nullptr);
            sd_bus_message_open_container(reply, 'v', "as");
            sd_bus_message_append_strv(reply, entries.data());
            made = sd_bus_message_close_container(reply);
        } else if (asked == inSession + "User") {
            made =
                sd_bus_message_append(reply, "v", "(uo)", session.user, "/org/freedesktop/login1/user/self");
        } else {
            const std::string* text = asked == inSession + "Class"     ? &session.sessionClass
                                      : asked == inSession + "State"   ? &session.state
                                      : asked == inSession + "Type"    ? &session.type
                                      : asked == inSession + "Display" ? &session.display
                                                                       : nullptr;
            made = text == nullptr ? -ENOENT : sd_bus_message_append(reply, "v", "s", text->c_str());
        }
        const int sent = made < 0 ? made : sd_bus_send(nullptr, reply, nullptr);
        sd_bus_message_unref(reply);
        return sent < 0 ? sent : 1;
    }
};

class StandInDesktop {
  public:
    // Starts the bus; every user may talk to it and see the directory.
    StandInDesktop() {
        chmod(directory_.path().c_str(), 0755);
        for (const char* folder : {"run/65534", "out"}) {
            std::filesystem::create_directories(directory_.path() / folder);
            chmod(directory_.at(folder).c_str(), 0777);
        }
        const std::string userBus = directory_.at("run/65534/bus");
        const std::string option =
            "--config-file=" +
            directory_.write(
                "bus.conf",
                "<!DOCTYPE busconfig PUBLIC \"-//freedesktop//DTD D-Bus Bus Configuration 1.0//EN\" "
                "\"http://www.freedesktop.org/standards/dbus/1.0/"
                "busconfig.dtd\">\n<busconfig><listen>unix:path=" +
                    systemBus() + "</listen><listen>unix:path=" + userBus +
                    "</listen><auth>EXTERNAL</auth><policy context=\"default\"><allow user=\"*\"/>"
                    "<allow own=\"*\"/><allow send_destination=\"*\"/><allow "
                    "receive_sender=\"*\"/></policy></busconfig>\n");
        const char* arguments[] = {"dbus-daemon", option.c_str(), "--nofork", "--nopidfile", nullptr};
        char* environment[] = {nullptr};
        // It complains about limits that only the machine's own bus may have.
        posix_spawn_file_actions_t quietly;
        posix_spawn_file_actions_init(&quietly);
        posix_spawn_file_actions_addopen(&quietly, 2, "/dev/null", O_WRONLY, 0);
        pid_t id = 0;
        require(posix_spawn(&id, "/usr/bin/dbus-daemon", &quietly, nullptr, const_cast<char**>(arguments),
                            environment) == 0,
                "no dbus-daemon");
        posix_spawn_file_actions_destroy(&quietly);
        bus_ = std::make_unique<Process>(id);
        require(waitFor([&] { return std::filesystem::exists(userBus); }), "the bus is not up");
    }

    // Serves the session until the end of the returned scope.
    [[nodiscard]] std::unique_ptr<Process> serve(Session session) const {
        std::array<int, 2> ends{};
        require(pipe2(ends.data(), O_CLOEXEC) == 0, "no pipe");
        const pid_t id = fork();
        if (id == 0) {
            serveForEver("unix:path=" + systemBus(), session, ends[1]);
        }
        close(ends[1]);
        auto process = std::make_unique<Process>(id);
        char byte = 0;
        const bool isUp = read(ends[0], &byte, 1) == 1;
        close(ends[0]);
        require(isUp, "the login manager is not up");
        return process;
    }
    // The desktop with the script as its opening program, after one that is not installed.
    [[nodiscard]] platform::services::Desktop withProgram(const std::string& script) const {
        const std::string program = directory_.write("open-url", "#!/bin/sh\n" + script);
        chmod(program.c_str(), 0755);
        return {runtimeRoot(), {{at("not-installed")}, {program, "first argument"}}};
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
    [[nodiscard]] std::string systemBus() const { return at("system_bus"); }
    [[nodiscard]] std::string runtimeRoot() const { return at("run"); }

  private:
    static void require(bool holds, const char* what) {
        if (!holds) {
            throw std::runtime_error(std::string("stand-in desktop: ") + what);
        }
    }
    static bool waitFor(const std::function<bool()>& condition) {
        for (int i = 0; i < 500 && !condition(); ++i) {
            std::this_thread::sleep_for(std::chrono::milliseconds(10));
        }
        return condition();
    }
    // Says one byte once it can be asked.
    [[noreturn]] static void serveForEver(const std::string& address, Session& session, int ready) {
        sd_bus* bus = nullptr;
        const bool isUp = sd_bus_new(&bus) >= 0 && sd_bus_set_address(bus, address.c_str()) >= 0 &&
                          sd_bus_set_bus_client(bus, 1) >= 0 && sd_bus_start(bus) >= 0 &&
                          sd_bus_add_filter(bus, nullptr, Session::answer, &session) >= 0 &&
                          sd_bus_request_name(bus, "org.freedesktop.login1", 0) >= 0 &&
                          sd_bus_request_name(bus, "org.freedesktop.systemd1", 0) >= 0 &&
                          write(ready, "+", 1) == 1;
        while (isUp && sd_bus_process(bus, nullptr) >= 0 && sd_bus_wait(bus, UINT64_MAX) >= 0) {
        }
        _exit(1);
    }

    TemporaryDirectory directory_;
    std::unique_ptr<Process> bus_;
};

}  // namespace testing_support
