#include "platform/apply/direct/LinkSnapshot.h"

#include <sys/random.h>
#include <sys/socket.h>

#include <algorithm>

#include "platform/apply/Digest.h"

namespace platform::apply {
namespace {

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

}  // namespace platform::apply
