// A desktop to open pages on: a private message bus that is both the system's and the user's, with stand-ins
// for the login manager and the user's service manager on it, and room for a program that opens URLs.
#pragma once

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
#include <map>
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
    for (int i = 0; i < 500 && !condition(); ++i) {
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    return condition();
}

// Somebody, or nobody, at the computer.
struct Session {
    std::string path = "/org/freedesktop/login1/session/_32";  // "/": nobody
    std::uint32_t user = 65534;
    std::map<std::string, std::string> texts = {};  // beside those of an active X11 session on ":7"
    std::vector<const char*> environment = {};      // what the user's service manager has

    // Answers the properties that are asked for where the real managers have them.
    static int answer(sd_bus_message* call, void* context, sd_bus_error* /*error*/) {
        auto& session = *static_cast<Session*>(context);
        const char* interface = nullptr;
        const char* name = nullptr;
        if (sd_bus_message_is_method_call(call, "org.freedesktop.DBus.Properties", "Get") <= 0 ||
            sd_bus_message_read(call, "ss", &interface, &name) <= 0) {
            return 0;
        }
        session.texts.merge(std::map<std::string, std::string>{
            {"Class", "user"}, {"State", "active"}, {"Type", "x11"}, {"Display", ":7"}});
        const std::string asked = std::string(sd_bus_message_get_path(call)) + " " + interface + " " + name;
        const std::string inSession = session.path + " org.freedesktop.login1.Session ";
        const char* path = session.path.c_str();
        if (asked == "/org/freedesktop/login1/seat/seat0 org.freedesktop.login1.Seat ActiveSession") {
            return sd_bus_reply_method_return(call, "v", "(so)", path[1] == 0 ? "" : "2", path);
        }
        if (asked == inSession + "User") {
            return sd_bus_reply_method_return(call, "v", "(uo)", session.user, "/user");
        }
        if (asked == "/org/freedesktop/systemd1 org.freedesktop.systemd1.Manager Environment") {
            return answerEnvironment(call, session.environment);
        }
        return asked == inSession + name && session.texts.contains(name)
                   ? sd_bus_reply_method_return(call, "v", "s", session.texts.at(name).c_str())
                   : sd_bus_reply_method_errorf(call, SD_BUS_ERROR_UNKNOWN_PROPERTY, "%s", name);
    }

  private:
    static int answerEnvironment(sd_bus_message* call, std::vector<const char*> entries) {
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
};

class StandInDesktop {
  public:
    // Starts the bus; every user may talk to it and see the directory.
    StandInDesktop() {
        chmod(directory_.path().c_str(), 0755);
        for (const char* folder : {"run/65534", "out"}) {
            std::filesystem::create_directories(at(folder));
            chmod(at(folder).c_str(), 0777);
        }
        std::filesystem::create_symlink(systemBus(), at("run/65534/bus"));
        const std::string option =
            "--config-file=" +
            directory_.write("bus.conf", "<busconfig><listen>unix:path=" + systemBus() +
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
        waitFor([this] { return std::filesystem::exists(systemBus()); });
    }

    // Serves the session until the end of the returned scope.
    [[nodiscard]] std::unique_ptr<Process> serve(Session session) const {
        const std::string ready = directory_.write("ready", "");
        auto process = std::make_unique<Process>([&] { serveForEver(session, ready); });
        if (!waitFor([&] { return !std::filesystem::exists(ready); })) {
            throw std::runtime_error("the stand-in managers are not up");
        }
        return process;
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
    [[nodiscard]] std::string systemBus() const { return at("system_bus"); }

  private:
    // Removes the file once it can be asked.
    void serveForEver(Session& session, const std::string& ready) const {
        const std::string address = "unix:path=" + systemBus();
        sd_bus* bus = nullptr;
        const bool isUp = sd_bus_new(&bus) >= 0 && sd_bus_set_address(bus, address.c_str()) >= 0 &&
                          sd_bus_set_bus_client(bus, 1) >= 0 && sd_bus_start(bus) >= 0 &&
                          sd_bus_add_filter(bus, nullptr, Session::answer, &session) >= 0 &&
                          sd_bus_request_name(bus, "org.freedesktop.login1", 0) >= 0 &&
                          sd_bus_request_name(bus, "org.freedesktop.systemd1", 0) >= 0 &&
                          std::filesystem::remove(ready);
        while (isUp && sd_bus_process(bus, nullptr) >= 0 && sd_bus_wait(bus, UINT64_MAX) >= 0) {
        }
    }

    TemporaryDirectory directory_;
    std::unique_ptr<Process> bus_;
};

}  // namespace testing_support
