#include "platform/apply/direct/DhcpClient.h"

#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <chrono>
#include <csignal>
#include <vector>

#include "platform/apply/StateFile.h"
#include "platform/apply/direct/DhcpHookPath.h"
#include "platform/base/ChildProcess.h"
#include "platform/base/FileDescriptor.h"
#include "platform/base/Hexadecimal.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"

namespace platform::apply {
namespace {

// For the message to the server and the program's last run.
constexpr std::chrono::milliseconds stopTime{3000};

std::string clientPath(const std::string& interface) {
    return runtimePath("dhcp-" + interface + ".plist");
}

bool hasEnded(const FileDescriptor& handle, std::chrono::milliseconds wait) {
    pollfd ended{handle.get(), POLLIN, 0};
    return ::poll(&ended, 1, static_cast<int>(wait.count())) > 0;
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

// Starts the client held at the gate: it waits for a byte, and ends when this process ends before.
Outcome startHeld(const DhcpSettings& settings, const std::string& hook, Process& client,
                  FileDescriptor& gate) {
    const auto run = [&](int channel) {
        // Until it listens: on a network that the card is on already it is hurried at once.
        (void)std::signal(SIGUSR1, SIG_IGN);
        const pid_t number = getpid();
        char go = 0;
        if (::write(channel, &number, sizeof number) == sizeof number && ::read(channel, &go, 1) == 1 &&
            ::chdir("/") == 0) {
            (void)becomeProgram(currentHost().dhcpClient, argumentsFor(settings, hook),
                                {"PATH=/usr/sbin:/usr/bin:/sbin:/bin",
                                 std::string(dhcpSettingsVariable) + "=" + clientPath(settings.interface)});
        }
    };
    RETURN_IF_FAILED(startDetached(run, gate));
    pid_t number = 0;
    if (::read(gate.get(), &number, sizeof number) != sizeof number) {
        return {kSCStatusFailed, "cannot start the DHCP client"};
    }
    client = processOf(number);
    return {};
}

void signalClient(const std::string& interface, int signal) {
    std::optional<DhcpClient> client;
    if (readDhcpClient(interface, client).ok() && client) {
        sendSignal(client->process, signal);
    }
}

}  // namespace

Outcome readDhcpClient(const std::string& interface, std::optional<DhcpClient>& client) {
    return readState(clientPath(interface), client);
}

Outcome startDhcpClient(const DhcpSettings& settings) {
    std::string hook;
    RETURN_IF_FAILED(findDhcpHook(hook));
    if (!isProgram(currentHost().dhcpClient)) {
        return Outcome::fromErrno("cannot run the DHCP client " + currentHost().dhcpClient);
    }
    DhcpClient client{settings, currentHost().resolverFile, {}};
    FileDescriptor gate;
    RETURN_IF_FAILED(startHeld(settings, hook, client.process, gate));
    // Only a client that the next run can find again is let go.
    RETURN_IF_FAILED(writeState(clientPath(settings.interface), client));
    return ::send(gate.get(), "g", 1, MSG_NOSIGNAL) == 1 ? Outcome()
                                                         : Outcome::fromErrno("cannot start the DHCP client");
}

void hurryDhcpClient(const std::string& interface) {
    signalClient(interface, SIGUSR1);
}

void askDhcpClientToEnd(const std::string& interface) {
    signalClient(interface, SIGTERM);
}

Outcome stopDhcpClient(const std::string& interface) {
    std::optional<DhcpClient> client;
    RETURN_IF_FAILED(readDhcpClient(interface, client));
    if (!client) {
        return {};
    }
    const FileDescriptor handle = handleOf(client->process);
    if (handle.isOpen()) {
        sendSignal(client->process, SIGTERM);
        if (!hasEnded(handle, stopTime)) {
            logLine(LogLevel::warning, interface + ": the DHCP client does not end by itself and is ended");
            // With the program that it may be waiting for: it leads a process group of its own.
            (void)::kill(-client->process.number, SIGKILL);
            (void)hasEnded(handle, stopTime);
        }
    }
    RETURN_IF_FAILED(dropLease(client->settings));
    return removeFile(clientPath(interface));
}

}  // namespace platform::apply
