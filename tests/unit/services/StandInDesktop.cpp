#include "tests/unit/services/StandInDesktop.h"

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
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <memory>
#include <stdexcept>
#include <thread>

namespace testing_support {
namespace {

struct Served {
    Session session;
    std::vector<std::string> environment;
};

int getProperty(sd_bus* /*bus*/, const char* /*path*/, const char* /*interface*/, const char* property,
                sd_bus_message* reply, void* context, sd_bus_error* /*error*/) {
    const auto& [session, environment] = *static_cast<const Served*>(context);
    const std::string_view name = property;
    if (name == "ActiveSession") {
        return sd_bus_message_append(reply, "(so)", session.id.c_str(),
                                     session.id.empty() ? "/" : "/org/freedesktop/login1/session/_32");
    }
    if (name == "User") {
        return sd_bus_message_append(reply, "(uo)", session.user, "/org/freedesktop/login1/user/self");
    }
    if (name == "Environment") {
        std::vector<char*> entries;
        for (const std::string& entry : environment) {
            entries.push_back(const_cast<char*>(entry.c_str()));
        }
        entries.push_back(nullptr);
        return sd_bus_message_append_strv(reply, entries.data());
    }
    const std::string& text = name == "Class"   ? session.sessionClass
                              : name == "State" ? session.state
                              : name == "Type"  ? session.type
                                                : session.display;
    return sd_bus_message_append(reply, "s", text.c_str());
}

const sd_bus_vtable seatTable[] = {
    SD_BUS_VTABLE_START(0),
    SD_BUS_PROPERTY("ActiveSession", "(so)", getProperty, 0, 0),
    SD_BUS_VTABLE_END,
};
const sd_bus_vtable sessionTable[] = {
    SD_BUS_VTABLE_START(0),
    SD_BUS_PROPERTY("User", "(uo)", getProperty, 0, 0),
    SD_BUS_PROPERTY("Class", "s", getProperty, 0, 0),
    SD_BUS_PROPERTY("State", "s", getProperty, 0, 0),
    SD_BUS_PROPERTY("Type", "s", getProperty, 0, 0),
    SD_BUS_PROPERTY("Display", "s", getProperty, 0, 0),
    SD_BUS_VTABLE_END,
};
const sd_bus_vtable managerTable[] = {
    SD_BUS_VTABLE_START(0),
    SD_BUS_PROPERTY("Environment", "as", getProperty, 0, 0),
    SD_BUS_VTABLE_END,
};

void require(bool holds, const char* what) {
    if (!holds) {
        throw std::runtime_error(std::string("stand-in desktop: ") + what);
    }
}

// Never returns; says one byte once it can be asked.
[[noreturn]] void serveForEver(const std::string& address, Served served, int ready) {
    sd_bus* bus = nullptr;
    const auto add = [&](const char* path, const char* interface, const sd_bus_vtable* table) {
        return sd_bus_add_object_vtable(bus, nullptr, path, interface, table, &served) >= 0;
    };
    const bool isUp =
        sd_bus_new(&bus) >= 0 && sd_bus_set_address(bus, address.c_str()) >= 0 &&
        sd_bus_set_bus_client(bus, 1) >= 0 && sd_bus_start(bus) >= 0 &&
        add("/org/freedesktop/login1/seat/seat0", "org.freedesktop.login1.Seat", seatTable) &&
        add("/org/freedesktop/login1/session/_32", "org.freedesktop.login1.Session", sessionTable) &&
        add("/org/freedesktop/systemd1", "org.freedesktop.systemd1.Manager", managerTable) &&
        sd_bus_request_name(bus, "org.freedesktop.login1", 0) >= 0 &&
        sd_bus_request_name(bus, "org.freedesktop.systemd1", 0) >= 0 && write(ready, "+", 1) == 1;
    while (isUp && sd_bus_process(bus, nullptr) >= 0 && sd_bus_wait(bus, UINT64_MAX) >= 0) {
    }
    _exit(1);
}

bool waitFor(const std::function<bool()>& condition) {
    using namespace std::chrono_literals;
    for (int i = 0; i < 500 && !condition(); ++i) {
        std::this_thread::sleep_for(10ms);
    }
    return condition();
}

}  // namespace

Process::~Process() {
    kill(id_, SIGKILL);
    while (waitpid(id_, nullptr, 0) < 0 && errno == EINTR) {
    }
}

StandInDesktop::StandInDesktop() {
    namespace fs = std::filesystem;
    chmod(directory_.path().c_str(), 0755);
    for (const char* folder : {"run/65534", "out"}) {
        fs::create_directories(directory_.path() / folder);
        chmod(directory_.at(folder).c_str(), 0777);
    }
    const std::string userBus = directory_.at("run/65534/bus");
    const std::string configuration =
        directory_.write("bus.conf",
                         "<!DOCTYPE busconfig PUBLIC \"-//freedesktop//DTD D-Bus Bus Configuration 1.0//EN\" "
                         "\"http://www.freedesktop.org/standards/dbus/1.0/busconfig.dtd\">\n"
                         "<busconfig><listen>unix:path=" +
                             systemBus() + "</listen><listen>unix:path=" + userBus +
                             "</listen><auth>EXTERNAL</auth><policy context=\"default\"><allow user=\"*\"/>"
                             "<allow own=\"*\"/><allow send_destination=\"*\" eavesdrop=\"true\"/>"
                             "<allow eavesdrop=\"true\"/></policy></busconfig>\n");
    const std::string option = "--config-file=" + configuration;
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
    require(waitFor([&] { return fs::exists(systemBus()) && fs::exists(userBus); }), "the bus is not up");
}

StandInDesktop::~StandInDesktop() = default;

std::unique_ptr<Process> StandInDesktop::serve(const Session& session,
                                               const std::vector<std::string>& environment) {
    std::array<int, 2> ends{};
    require(pipe2(ends.data(), O_CLOEXEC) == 0, "no pipe");
    const std::string address = "unix:path=" + systemBus();
    const pid_t id = fork();
    if (id == 0) {
        serveForEver(address, {session, environment}, ends[1]);
    }
    close(ends[1]);
    auto process = std::make_unique<Process>(id);
    char byte = 0;
    const bool isUp = read(ends[0], &byte, 1) == 1;
    close(ends[0]);
    require(isUp, "the login manager is not up");
    return process;
}

platform::services::Desktop StandInDesktop::withProgram(const std::string& script) {
    const std::string program = directory_.write("open-url", "#!/bin/sh\n" + script);
    chmod(program.c_str(), 0755);
    return {runtimeRoot(), {{directory_.at("not-installed")}, {program, "first argument"}}};
}

std::vector<std::string> StandInDesktop::recorded() const {
    std::vector<std::string> lines;
    if (waitFor([this] { return std::filesystem::exists(record()); })) {
        std::ifstream in(record());
        for (std::string line; std::getline(in, line);) {
            lines.push_back(line);
        }
        std::filesystem::remove(record());
    }
    return lines;
}

}  // namespace testing_support
