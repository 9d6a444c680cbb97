#include "platform/apply/direct/LinkSnapshot.h"

#include <fcntl.h>
#include <sys/random.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>

#include "platform/apply/Digest.h"
#include "platform/apply/StateFile.h"
#include "platform/base/FileDescriptor.h"

namespace platform::apply {
namespace {

std::string appliedPath(const std::string& interface) {
    return runtimePath("direct-" + interface + ".plist");
}

std::string switchPath(const std::string& interface) {
    return "/proc/sys/net/ipv6/conf/" + interface + "/disable_ipv6";
}

std::uint32_t checkOf(const WirelessSettings& settings, const Salt& salt) {
    const std::string text = settings.network.value_or("") + '\0' + settings.key.value_or("");
    return static_cast<std::uint32_t>(sipHash(salt, text) & 0xFFFFU);
}

}  // namespace

bool LinkSnapshot::hasLedAddress() const {
    return (others.networkd || !others.dhcpClients.empty()) &&
           std::ranges::any_of(state.addresses,
                               [](const Address& address) { return address.family() == AF_INET; });
}

bool LinkSnapshot::hasLeaseEnded() const {
    const std::int64_t elapsed = secondsSinceStart() - takenAt;
    return std::ranges::any_of(state.addresses, [elapsed](const Address& address) {
        return address.family() == AF_INET && address.valid != forever && address.valid <= elapsed;
    });
}

JoinedNetwork makeJoinedNetwork(const WirelessSettings& settings) {
    JoinedNetwork joined;
    // Without random bytes the check is still right, only easier to guess from.
    (void)!::getrandom(joined.salt.data(), joined.salt.size(), 0);
    joined.check = checkOf(settings, joined.salt);
    return joined;
}

bool isSameNetwork(const JoinedNetwork& joined, const WirelessSettings& settings) {
    return joined.check == checkOf(settings, joined.salt);
}

std::optional<bool> isIPv6Disabled(const std::string& interface) {
    std::string text;
    if (!readWholeFile(switchPath(interface), text).ok() || text.empty()) {
        return std::nullopt;
    }
    return text[0] != '0';
}

Outcome disableIPv6(const std::string& interface, bool disabled) {
    const std::string path = switchPath(interface);
    const FileDescriptor file(::open(path.c_str(), O_WRONLY | O_CLOEXEC));
    if (!file.isOpen() || ::write(file.get(), disabled ? "1" : "0", 1) != 1) {
        return Outcome::fromErrno("cannot write " + path);
    }
    return {};
}

Outcome readApplied(const std::string& interface, std::optional<AppliedLink>& applied) {
    return readState(appliedPath(interface), applied);
}

Outcome writeApplied(const std::string& interface, const AppliedLink& applied) {
    return writeState(appliedPath(interface), applied);
}

Outcome removeApplied(const std::string& interface) {
    return removeFile(appliedPath(interface));
}

}  // namespace platform::apply
