#include "platform/apply/direct/OtherDaemons.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <charconv>
#include <chrono>
#include <csignal>
#include <filesystem>
#include <sstream>
#include <thread>

#include "platform/apply/StateFile.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"
#include "platform/bus/Bus.h"

namespace platform::apply {
namespace {

constexpr std::chrono::milliseconds letGoBound{2000};
constexpr std::chrono::milliseconds lookAgain{20};
constexpr pid_t firstProcess = 1;

bool sharesNetwork(pid_t number) {
    std::error_code ignored;
    return std::filesystem::equivalent("/proc/self/ns/net", "/proc/" + std::to_string(number) + "/ns/net",
                                       ignored);
}

// The value of NAME=VALUE in what networkd says of a link; empty without one.
std::string networkdValue(int index, const std::string& name) {
    std::string text;
    if (!readWholeFile(currentHost().networkdStateDirectory + "/" + std::to_string(index), text).ok()) {
        return {};
    }
    std::istringstream lines(text);
    for (std::string line; std::getline(lines, line);) {
        if (line.starts_with(name + "=")) {
            return line.substr(name.size() + 1);
        }
    }
    return {};
}

bool hasLetGo(int index) {
    return networkdValue(index, "ADMIN_STATE") == "unmanaged";
}

// The first name in the order of its letters that matches counts, and administrators begin theirs with two
// digits.
std::string networkdFile(const std::string& interface) {
    return currentHost().networkdDirectory + "/0-0-location-assistant-" + interface + ".network";
}

Outcome reloadNetworkd(bool& isRunning) {
    bus::Bus bus;
    bus::MessageRef reply;
    RETURN_IF_FAILED(bus.connect("org.freedesktop.network1", isRunning));
    return isRunning
               ? bus.call({"/org/freedesktop/network1", "org.freedesktop.network1.Manager", "Reload", {}, {}},
                          reply)
               : Outcome();
}

Outcome suspendNetworkd(const std::string& interface, int index) {
    // Name= takes patterns and lists: a kernel's name with such signs in it can't be told apart there.
    if (interface.find_first_of("*?[]!\"'\\") != std::string::npos) {
        return {kSCStatusFailed, "its name is a pattern there"};
    }
    const std::string path = networkdFile(interface);
    const std::string wish = "[Match]\nName=" + interface + "\n\n[Link]\nUnmanaged=yes\n";
    std::string found;
    if (readWholeFile(path, found).ok() && found == wish && hasLetGo(index)) {
        return {};
    }
    std::error_code ignored;
    if (std::filesystem::create_directories(currentHost().networkdDirectory, ignored)) {
        (void)::chmod(currentHost().networkdDirectory.c_str(), 0755);
    }
    bool isRunning = false;
    RETURN_IF_FAILED(replaceFile(path, wish, {0644, ::geteuid(), ::getegid()}));
    RETURN_IF_FAILED(reloadNetworkd(isRunning));
    const auto deadline = std::chrono::steady_clock::now() + letGoBound;
    while (isRunning && !hasLetGo(index)) {
        if (std::chrono::steady_clock::now() > deadline) {
            return {kSCStatusFailed, "it has not let go of it"};
        }
        std::this_thread::sleep_for(lookAgain);
    }
    return {};
}

std::vector<std::string> argumentsOf(pid_t number) {
    std::string text;
    std::vector<std::string> arguments;
    if (readWholeFile("/proc/" + std::to_string(number) + "/cmdline", text).ok()) {
        std::istringstream words(text);
        for (std::string word; std::getline(words, word, '\0');) {
            arguments.push_back(word);
        }
    }
    return arguments;
}

bool isInterface(const std::string& name) {
    std::error_code ignored;
    return !name.empty() && name.find('/') == std::string::npos &&
           std::filesystem::exists(currentHost().sysfsRoot + "/class/net/" + name, ignored);
}

bool isClientOf(const std::string& interface, pid_t number) {
    std::string name;
    if (!readWholeFile("/proc/" + std::to_string(number) + "/comm", name).ok() ||
        (name != "dhclient\n" && name != "udhcpc\n") || !sharesNetwork(number)) {
        return false;
    }
    const std::vector<std::string> arguments = argumentsOf(number);
    const bool isNamed = std::ranges::count(arguments, interface) != 0;
    const bool namesOther = std::ranges::any_of(
        arguments, [&](const std::string& word) { return word != interface && isInterface(word); });
    if (!isNamed && namesOther) {
        return false;
    }
    // One that names none serves all of them.
    const bool isShared = !isNamed || namesOther;
    if (isShared) {
        logLine(LogLevel::notice, interface + ": its DHCP client (process " + std::to_string(number) +
                                      ") serves other interfaces too, and goes on");
    }
    return !isShared;
}

std::vector<Process> clientsOf(const std::string& interface) {
    std::vector<Process> clients;
    std::error_code error;
    for (std::filesystem::directory_iterator entry("/proc", error), end; !error && entry != end;
         entry.increment(error)) {
        const std::string name = entry->path().filename();
        pid_t number = 0;
        std::from_chars(name.data(), name.data() + name.size(), number);
        if (number > firstProcess && isClientOf(interface, number)) {
            clients.push_back(processOf(number));
        }
    }
    return clients;
}

}  // namespace

OtherDaemons findOtherDaemons(const std::string& interface, int index) {
    // Its own file of an earlier run whose record is lost counts like the administrator's.
    const bool networkd = sharesNetwork(firstProcess) && !networkdValue(index, "NETWORK_FILE").empty() &&
                          (!hasLetGo(index) || ::access(networkdFile(interface).c_str(), F_OK) == 0);
    return {networkd, clientsOf(interface)};
}

void suspendOtherDaemons(const std::string& interface, int index, const OtherDaemons& daemons) {
    if (const Outcome done = daemons.networkd ? suspendNetworkd(interface, index) : Outcome(); !done.ok()) {
        logLine(LogLevel::warning,
                interface + ": systemd-networkd could not be asked to leave it alone: " + done.reason());
    }
    for (const Process& client : daemons.dhcpClients) {
        sendSignal(client, SIGSTOP);
    }
}

Outcome resumeOtherDaemons(const std::string& interface, const OtherDaemons& daemons) {
    for (const Process& client : daemons.dhcpClients) {
        sendSignal(client, SIGCONT);
    }
    if (!daemons.networkd) {
        return {};
    }
    bool isRunning = false;
    const std::string path = networkdFile(interface);
    if (::unlink(path.c_str()) != 0 && errno != ENOENT) {
        return Outcome::fromErrno("cannot remove " + path);
    }
    return reloadNetworkd(isRunning);
}

bool isNetworkdSettled(int index) {
    const std::string state = networkdValue(index, "ADMIN_STATE");
    return state != "pending" && state != "initialized" && state != "configuring" && state != "unmanaged";
}

}  // namespace platform::apply
