#include "platform/apply/direct/DhcpClient.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <charconv>
#include <csignal>
#include <thread>
#include <vector>

#include "platform/FileDescriptor.h"
#include "platform/Host.h"
#include "platform/Log.h"
#include "platform/apply/Properties.h"
#include "platform/apply/StateFile.h"

namespace platform::apply {
namespace {

// For the message to the server and the program's last run.
constexpr std::chrono::milliseconds stopTime{5000};
constexpr std::chrono::milliseconds lookAgain{20};

std::string settingsPath(const std::string& interface) {
    return runtimePath("dhcp-" + interface + ".plist");
}

// A process, told from a later one with the same number by when it started.
struct Process {
    pid_t number = 0;
    std::int64_t started = 0;  // in clock ticks since the machine's start
};

// 0 when there is no such process, or it has ended and waits for its parent to notice.
std::int64_t startTimeOf(pid_t number) {
    std::string text;
    if (!readWholeFile("/proc/" + std::to_string(number) + "/stat", text).ok()) {
        return 0;
    }
    // The program's name, in parentheses, may hold anything; the fields are counted behind it.
    std::size_t position = text.rfind(')');
    constexpr int stateField = 3;
    constexpr int startField = 22;
    for (int field = stateField; position != std::string::npos && field <= startField; ++field) {
        position = text.find(' ', position + 1);
        if (field == stateField && position != std::string::npos && text[position + 1] == 'Z') {
            return 0;
        }
    }
    std::int64_t started = 0;
    if (position == std::string::npos) {
        return 0;
    }
    std::from_chars(text.data() + position + 1, text.data() + text.size(), started);
    return started;
}

bool isAlive(const Process& process) {
    return process.number > 1 && process.started != 0 && startTimeOf(process.number) == process.started;
}

// A handle that stays with the process even when its number is used again; closed when it is not alive.
FileDescriptor handleOf(const Process& process) {
    FileDescriptor handle(static_cast<int>(::syscall(SYS_pidfd_open, process.number, 0)));
    if (handle.isOpen() && !isAlive(process)) {
        handle.reset();
    }
    return handle;
}

bool hasEnded(const FileDescriptor& handle, std::chrono::milliseconds wait) {
    pollfd ended{handle.get(), POLLIN, 0};
    return ::poll(&ended, 1, static_cast<int>(wait.count())) > 0;
}

Outcome writeSettings(const DhcpSettings& settings, const Process& client) {
    ArrayBuilder domains;
    for (const std::string& domain : settings.domains) {
        domains.addText(domain);
    }
    DictionaryBuilder file;
    file.setText(CFSTR("Interface"), settings.interface)
        .setInteger(CFSTR("Rank"), settings.rank)
        .setData(CFSTR("ClientID"), std::as_bytes(std::span(settings.clientID)))
        .setBoolean(CFSTR("IgnoresServers"), settings.ignoresServers)
        .set(CFSTR("Domains"), domains.get())
        .setText(CFSTR("ResolverFile"), currentHost().resolverFile)
        .setInteger(CFSTR("Client"), client.number)
        .setInteger(CFSTR("ClientStarted"), client.started);
    return writeStateFile(settingsPath(settings.interface), file.take().get());
}

Outcome decodeSettings(CFDictionaryRef file, HookSettings& settings, Process& client) {
    const auto interface = textIn(file, CFSTR("Interface"));
    const auto rank = integerIn(file, CFSTR("Rank"));
    const auto clientID = dataIn(file, CFSTR("ClientID"));
    const auto ignores = booleanIn(file, CFSTR("IgnoresServers"));
    const auto resolverFile = textIn(file, CFSTR("ResolverFile"));
    const auto number = integerIn(file, CFSTR("Client"));
    const auto started = integerIn(file, CFSTR("ClientStarted"));
    if (!interface || !rank || !clientID || !ignores || !resolverFile || !number || !started) {
        return {kSCStatusFailed, "the settings of the DHCP client are not what this system wrote"};
    }
    settings.dhcp.interface = *interface;
    settings.dhcp.rank = static_cast<unsigned>(*rank);
    settings.dhcp.clientID.assign(reinterpret_cast<const char*>(clientID->data()), clientID->size());
    settings.dhcp.ignoresServers = *ignores;
    settings.dhcp.domains.clear();
    CFArrayRef const domains = arrayIn(file, CFSTR("Domains"));
    for (CFIndex i = 0; domains != nullptr && i < CFArrayGetCount(domains); ++i) {
        settings.dhcp.domains.push_back(asText(CFArrayGetValueAtIndex(domains, i)).value_or(""));
    }
    settings.resolverFile = *resolverFile;
    client = {static_cast<pid_t>(*number), *started};
    return {};
}

// Success with an empty interface when there is no such file.
Outcome readSettings(const std::string& path, HookSettings& settings, Process& client) {
    values::Owned<CFDictionaryRef> file;
    Outcome read = readStateFile(path, file);
    return read.ok() && file ? decodeSettings(file.get(), settings, client) : read;
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
    client = {number, startTimeOf(number)};
    opener = std::move(gateIn);
    return {};
}

}  // namespace

Outcome readDhcpSettings(const std::string& interface, std::optional<DhcpSettings>& settings) {
    settings.reset();
    HookSettings read;
    Process client;
    Outcome done = readSettings(settingsPath(interface), read, client);
    if (done.ok() && !read.dhcp.interface.empty()) {
        settings = read.dhcp;
    }
    return done;
}

Outcome readHookSettings(const std::string& path, HookSettings& settings) {
    Process client;
    Outcome done = readSettings(path, settings, client);
    if (done.ok() && settings.dhcp.interface.empty()) {
        return {kSCStatusFailed, "there are no settings for the DHCP client at " + path};
    }
    return done;
}

Outcome isDhcpClientRunning(const std::string& interface, bool& running) {
    HookSettings settings;
    Process client;
    Outcome done = readSettings(settingsPath(interface), settings, client);
    running = done.ok() && isAlive(client);
    return done;
}

Outcome startDhcpClient(const DhcpSettings& settings) {
    std::string hook;
    Process client;
    FileDescriptor opener;
    Outcome done = findHook(hook);
    if (done.ok() && !isProgram(currentHost().dhcpClient)) {
        done = Outcome::fromErrno("cannot run the DHCP client " + currentHost().dhcpClient);
    }
    if (done.ok()) {
        done = startHeld(settings, hook, client, opener);
    }
    // Only a client that the next run can find again is let go.
    if (done.ok()) {
        done = writeSettings(settings, client);
    }
    if (done.ok() && ::write(opener.get(), "g", 1) != 1) {
        done = Outcome::fromErrno("cannot start the DHCP client");
    }
    return done;
}

Outcome waitForLease(const std::string& interface, std::chrono::steady_clock::time_point deadline) {
    for (;;) {
        bool running = false;
        Outcome done = isDhcpClientRunning(interface, running);
        LeaseState state;
        if (done.ok()) {
            done = readLease(interface, state);
        }
        if (!done.ok() || state.isTaken) {
            return done;
        }
        if (!state.refusal.empty()) {
            return {kSCStatusFailed, state.refusal};
        }
        if (!running) {
            return {kSCStatusFailed, "the DHCP client ended before it had a lease"};
        }
        if (std::chrono::steady_clock::now() >= deadline) {
            return {kSCStatusFailed, "no DHCP server gave a lease in time"};
        }
        std::this_thread::sleep_for(lookAgain);
    }
}

Outcome stopDhcpClient(const std::string& interface) {
    HookSettings settings;
    Process client;
    Outcome done = readSettings(settingsPath(interface), settings, client);
    if (!done.ok() || settings.dhcp.interface.empty()) {
        return done;
    }
    const FileDescriptor handle = handleOf(client);
    if (handle.isOpen()) {
        (void)::syscall(SYS_pidfd_send_signal, handle.get(), SIGTERM, nullptr, 0);
        if (!hasEnded(handle, stopTime)) {
            logLine(LogLevel::warning, interface + ": the DHCP client does not end by itself and is ended");
            // With the program that it may be waiting for: it leads a process group of its own.
            (void)::kill(-client.number, SIGKILL);
            (void)hasEnded(handle, stopTime);
        }
    }
    done = dropLease(settings.dhcp);
    return done.ok() ? removeStateFile(settingsPath(interface)) : done;
}

}  // namespace platform::apply
