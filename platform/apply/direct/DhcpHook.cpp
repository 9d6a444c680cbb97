// The program that the DHCP client calls when a lease comes or goes: `location-assistant-dhcp-hook EVENT`,
// with the lease in its environment.
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <string_view>

#include "platform/apply/direct/DhcpClient.h"
#include "platform/apply/direct/Lease.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"

namespace {

using platform::Outcome;
namespace apply = platform::apply;

apply::Environment readEnvironment() {
    apply::Environment environment;
    for (char** entry = environ; *entry != nullptr; ++entry) {
        const std::string_view text(*entry);
        const std::size_t equals = text.find('=');
        if (equals != std::string_view::npos) {
            environment.emplace(text.substr(0, equals), text.substr(equals + 1));
        }
    }
    return environment;
}

Outcome handle(std::string_view event, const apply::Environment& environment,
               const apply::DhcpSettings& settings) {
    if (event == "deconfig") {
        return apply::dropLease(settings);
    }
    if (event != "bound" && event != "renew") {
        return {};  // "leasefail" and "nak": the client asks again, and the old lease ends by itself
    }
    apply::Lease lease;
    Outcome done = apply::leaseFromEnvironment(environment, lease);
    if (done.ok()) {
        done = apply::takeLease(settings, lease);
    }
    if (!done.ok()) {
        (void)apply::refuseLease(settings.interface, done.reason());
    }
    return done;
}

}  // namespace

int main(int argc, char** argv) {
    ::umask(077);
    const apply::Environment environment = readEnvironment();
    const auto path = environment.find(apply::dhcpSettingsVariable);
    if (argc != 2 || path == environment.end() || path->second.find('/') == std::string::npos) {
        return 2;
    }
    apply::HookSettings settings;
    Outcome done = apply::readHookSettings(path->second, settings);
    if (done.ok()) {
        platform::Host host;
        host.runtimeDirectory = path->second.substr(0, path->second.rfind('/'));
        host.resolverFile = settings.resolverFile;
        const platform::HostOverride override(host);
        done = handle(argv[1], environment, settings.dhcp);
    }
    if (!done.ok()) {
        platform::logLine(platform::LogLevel::error, settings.dhcp.interface + ": " + done.reason());
        return 1;
    }
    return 0;
}
