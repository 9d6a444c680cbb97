#include "platform/apply/direct/DhcpClient.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <csignal>
#include <vector>

#include "platform/apply/StateFile.h"
#include "platform/apply/direct/Process.h"
#include "platform/base/FileDescriptor.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"

namespace platform::apply {
namespace {

// For the message to the server and the program's last run.
constexpr std::chrono::milliseconds stopTime{3000};

std::string settingsPath(const std::string& interface) {
    return runtimePath("dhcp-" + interface + ".plist");
}

// What is kept of a client.
struct ClientState {
    HookSettings settings;
    Process client;

    template <class Self, class Fields>
    static void listFields(Self& self, Fields& fields) {
        fields("Settings", self.settings.dhcp);
        fields("ResolverFile", self.settings.resolverFile);
        fields("Client", self.client);
    }
};

bool hasEnded(const FileDescriptor& handle, std::chrono::milliseconds wait) {
    pollfd ended{handle.get(), POLLIN, 0};
    return ::poll(&ended, 1, static_cast<int>(wait.count())) > 0;
}

bool isProgram(const std::string& path) {
    return ::access(path.c_str(), X_OK) == 0;
}

std::string folderOfThisProgram() {
    std::string path(4096, '\0');
    const ssize_t size = ::readlink("/proc/self/exe", path.data(), path.size());
    path.resize(size < 0 ? 0 : static_cast<std::size_t>(size));
    const std::size_t slash = path.rfind('/');
    return slash == std::string::npos ? "" : path.substr(0, slash);
}

Outcome findHook(std::string& hook) {
    constexpr const char* name = "/location-assistant-dhcp-hook";
    hook = currentHost().dhcpHook;
    if (hook.empty()) {
        hook = folderOfThisProgram() + name;
        if (!isProgram(hook)) {
            hook = LA_LIBEXEC_DIRECTORY + std::string(name);
        }
    }
    return isProgram(hook) ? Outcome() : Outcome::fromErrno("cannot run the DHCP client's program " + hook);
}

std::string hexOf(std::string_view bytes) {
    constexpr const char* digits = "0123456789abcdef";
    std::string text;
    for (const char c : bytes) {
        const auto byte = static_cast<unsigned char>(c);
        text += digits[byte >> 4U];
        text += digits[byte & 0xFU];
    }
    return text;
}

std::vector<std::string> argumentsFor(const DhcpSettings& settings, const std::string& hook) {
    // Four questions two seconds apart, then a pause of three, until told to stop; the lease is given back at
    // the end; no word about what this client or machine is called.
    std::vector<std::string> arguments{"busybox", "udhcpc", "-f", "-R", "-i", settings.interface,
                                       "-s",      hook,     "-t", "4",  "-T", "2",
                                       "-A",      "3",      "-V", "",   "-O", "search"};
    if (!settings.clientID.empty()) {
        // Type 0: an identifier that is no hardware address.
        arguments.insert(arguments.end(), {"-x", "0x3d:00" + hexOf(settings.clientID)});
    }
    return arguments;
}

std::vector<char*> pointersTo(std::vector<std::string>& texts) {
    std::vector<char*> pointers;
    pointers.reserve(texts.size() + 1);
    for (std::string& text : texts) {
        pointers.push_back(text.data());
    }
    pointers.push_back(nullptr);
    return pointers;
}

// In the child, between fork and exec: only what is safe there.
[[noreturn]] void becomeClient(int gate, const char* program, char* const* arguments,
                               char* const* environment) {
    ::setsid();
    sigset_t none;
    sigemptyset(&none);
    ::sigprocmask(SIG_SETMASK, &none, nullptr);
    for (int signal = 1; signal < NSIG; ++signal) {
        ::signal(signal, SIG_DFL);
    }
    char go = 0;
    if (::read(gate, &go, 1) != 1 || ::chdir("/") != 0) {
        ::_exit(126);
    }
    const int nowhere = ::open("/dev/null", O_RDWR | O_CLOEXEC);
    if (nowhere < 0 || ::dup2(nowhere, 0) < 0 || ::dup2(nowhere, 1) < 0 || ::dup2(nowhere, 2) < 0) {
        ::_exit(126);
    }
    ::close_range(3, ~0U, 0);
    ::execve(program, arguments, environment);
    ::_exit(127);
}

// Starts the client as a child of nobody in particular, held at the gate until a byte comes through it; if
// this process ends before, so does the client.
Outcome startHeld(const DhcpSettings& settings, const std::string& hook, Process& client,
                  FileDescriptor& opener) {
    std::vector<std::string> arguments = argumentsFor(settings, hook);
    std::vector<std::string> environment{
        "PATH=/usr/sbin:/usr/bin:/sbin:/bin",
        std::string(dhcpSettingsVariable) + "=" + settingsPath(settings.interface)};
    const std::vector<char*> argumentPointers = pointersTo(arguments);
    const std::vector<char*> environmentPointers = pointersTo(environment);
    const char* const program = currentHost().dhcpClient.c_str();

    std::array<int, 2> gate{};
    std::array<int, 2> report{};
    if (::pipe2(gate.data(), O_CLOEXEC) != 0) {
        return Outcome::fromErrno("cannot make a pipe");
    }
    FileDescriptor gateOut(gate[0]);
    FileDescriptor gateIn(gate[1]);
    if (::pipe2(report.data(), O_CLOEXEC) != 0) {
        return Outcome::fromErrno("cannot make a pipe");
    }
    FileDescriptor reportOut(report[0]);
    FileDescriptor reportIn(report[1]);
    const pid_t between = ::fork();
    if (between < 0) {
        return Outcome::fromErrno("cannot start the DHCP client");
    }
    if (between == 0) {
        ::close(gateIn.get());
        const pid_t number = ::fork();
        if (number == 0) {
            ::close(reportIn.get());
            becomeClient(gateOut.get(), program, argumentPointers.data(), environmentPointers.data());
        }
        (void)!::write(reportIn.get(), &number, sizeof number);
        ::_exit(0);
    }
    reportIn.reset();
    pid_t number = -1;
    const bool reported = ::read(reportOut.get(), &number, sizeof number) == sizeof number && number > 1;
    (void)::waitpid(between, nullptr, 0);
    if (!reported) {
        return {kSCStatusFailed, "cannot start the DHCP client"};
    }
    client = processOf(number);
    opener = std::move(gateIn);
    return {};
}

void signalClient(const std::string& interface, int signal) {
    std::optional<ClientState> state;
    if (readState(settingsPath(interface), state).ok() && state) {
        sendSignal(state->client, signal);
    }
}

}  // namespace

Outcome readDhcpSettings(const std::string& interface, std::optional<DhcpSettings>& settings) {
    settings.reset();
    std::optional<ClientState> state;
    RETURN_IF_FAILED(readState(settingsPath(interface), state));
    if (state) {
        settings = state->settings.dhcp;
    }
    return {};
}

Outcome readHookSettings(const std::string& path, HookSettings& settings) {
    std::optional<ClientState> state;
    RETURN_IF_FAILED(readState(path, state));
    if (!state) {
        return {kSCStatusFailed, "there are no settings for the DHCP client at " + path};
    }
    settings = std::move(state->settings);
    return {};
}

Outcome isDhcpClientRunning(const std::string& interface, bool& running) {
    std::optional<ClientState> state;
    RETURN_IF_FAILED(readState(settingsPath(interface), state));
    running = state && isAlive(state->client);
    return {};
}

Outcome startDhcpClient(const DhcpSettings& settings) {
    std::string hook;
    RETURN_IF_FAILED(findHook(hook));
    if (!isProgram(currentHost().dhcpClient)) {
        return Outcome::fromErrno("cannot run the DHCP client " + currentHost().dhcpClient);
    }
    Process client;
    FileDescriptor opener;
    RETURN_IF_FAILED(startHeld(settings, hook, client, opener));
    // Only a client that the next run can find again is let go.
    RETURN_IF_FAILED(writeState(settingsPath(settings.interface),
                                ClientState{{settings, currentHost().resolverFile}, client}));
    return ::write(opener.get(), "g", 1) == 1 ? Outcome()
                                              : Outcome::fromErrno("cannot start the DHCP client");
}

void hurryDhcpClient(const std::string& interface) {
    signalClient(interface, SIGUSR1);
}

void askDhcpClientToEnd(const std::string& interface) {
    signalClient(interface, SIGTERM);
}

Outcome stopDhcpClient(const std::string& interface) {
    std::optional<ClientState> state;
    RETURN_IF_FAILED(readState(settingsPath(interface), state));
    if (!state) {
        return {};
    }
    const FileDescriptor handle = handleOf(state->client);
    if (handle.isOpen()) {
        sendSignal(state->client, SIGTERM);
        if (!hasEnded(handle, stopTime)) {
            logLine(LogLevel::warning, interface + ": the DHCP client does not end by itself and is ended");
            // With the program that it may be waiting for: it leads a process group of its own.
            (void)::kill(-state->client.number, SIGKILL);
            (void)hasEnded(handle, stopTime);
        }
    }
    RETURN_IF_FAILED(dropLease(state->settings.dhcp));
    return removeStateFile(settingsPath(interface));
}

}  // namespace platform::apply
