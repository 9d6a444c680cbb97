// The program that the DHCP client calls when a lease comes or goes: `location-assistant-dhcp-hook EVENT`,
// with the lease in its environment.
#include <sys/stat.h>

#include <cstdlib>
#include <optional>
#include <string>
#include <string_view>

#include "platform/apply/StateFile.h"
#include "platform/apply/direct/DhcpClient.h"
#include "platform/apply/direct/Lease.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"

namespace {

using platform::Outcome;
namespace apply = platform::apply;

Outcome handle(std::string_view event, const apply::DhcpSettings& settings) {
    if (event == "deconfig") {
        return apply::dropLease(settings);
    }
    if (event != "bound" && event != "renew") {
        return {};  // "leasefail" and "nak": the client asks again, and the old lease ends by itself
    }
    apply::Lease lease;
    Outcome done = apply::leaseFromEnvironment(lease);
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
    const char* const variable = std::getenv(apply::dhcpSettingsVariable);
    const std::string path = variable == nullptr ? "" : variable;
    if (argc != 2 || path.find('/') == std::string::npos) {
        return 2;
    }
    std::optional<apply::DhcpClient> client;
    Outcome done = apply::readState(path, client);
    if (done.ok() && !client) {
        done = {kSCStatusFailed, "there are no settings for the DHCP client at " + path};
    }
    if (done.ok()) {
        platform::Host host;
        host.runtimeDirectory = path.substr(0, path.rfind('/'));
        host.resolverFile = client->resolverFile;
        const platform::HostOverride override(host);
        done = handle(argv[1], client->settings);
    }
    if (!done.ok()) {
        platform::logLine(platform::LogLevel::error,
                          (client ? client->settings.interface : "") + ": " + done.reason());
        return 1;
    }
    return 0;
}
