#include "platform/apply/direct/DirectInterface.h"

#include <sys/socket.h>

#include <algorithm>

#include "platform/apply/Radio.h"
#include "platform/apply/StateFile.h"
#include "platform/apply/direct/DhcpClient.h"
#include "platform/apply/direct/KernelWireless.h"
#include "platform/apply/direct/NameServers.h"
#include "platform/apply/direct/Supplicant.h"
#include "platform/base/Log.h"

namespace platform::apply {
namespace {

// What is left at least to an address whose own DHCP client renews it.
constexpr std::uint32_t shortestLife = 60;

// For steps of which each is taken even when one before failed: keeps the first failure, and tells whether
// this one was none.
bool take(Outcome& first, const Outcome& step) {
    first = first.ok() ? step : first;
    return step.ok();
}

std::vector<Address> manualAddresses(const InterfacePlan& plan) {
    std::vector<Address> addresses;
    for (const ManualAddress& address : plan.addresses) {
        Address made = makeAddress(plan.name, address);
        if (std::ranges::count(addresses, made) == 0) {
            addresses.push_back(std::move(made));
        }
    }
    return addresses;
}

DhcpSettings dhcpSettings(const InterfacePlan& plan) {
    return {plan.name, plan.rank, plan.dhcpClientID, !plan.nameServers.empty(), plan.searchDomains};
}

std::string appliedPath(const std::string& interface) {
    return runtimePath("direct-" + interface + ".plist");
}

// What lasts, in an order of its own: two readings of the same state are then equal.
template <class List>
List lasting(List list) {
    std::erase_if(list, [](const auto& one) {
        if constexpr (requires { one.isShared; }) {
            return one.isKernelManaged || one.isShared;
        }
        return one.isKernelManaged;
    });
    std::ranges::sort(list, {}, [](const auto& one) { return one.key; });
    return list;
}

}  // namespace

bool joinsNetwork(const InterfacePlan& plan) noexcept {
    return !isOff(plan) && plan.wireless && plan.wireless->network;
}

Outcome DirectInterface::takeSnapshot(LinkSnapshot& snapshot) {
    snapshot = {};
    snapshot.up = link()->up;
    snapshot.ipv6Disabled = kernel_.isIPv6Disabled();
    snapshot.takenAt = secondsSinceStart();
    snapshot.others = findOtherDaemons(interface_, link()->index);
    RETURN_IF_FAILED(kernel_.read(snapshot.state));
    if (const std::optional<Radio> radio = readRadio(interface_)) {
        snapshot.radioOff = radio->isOff;
    }
    RETURN_IF_FAILED(readKnownNetworks(interface_, snapshot.networks));
    return snapshot.networks ? Outcome() : readWirelessState(interface_, snapshot.wireless);
}

Outcome DirectInterface::apply(const InterfacePlan& plan, const std::optional<LinkSnapshot>& before,
                               std::unique_ptr<WirelessJoin>& join, std::string& trouble) {
    std::optional<AppliedLink> found;
    RETURN_IF_FAILED(readState(appliedPath(interface_), found));
    const AppliedLink earlier = found.value_or(AppliedLink{});
    const bool mayStay = joinsNetwork(plan) && earlier.joined &&
                         earlier.phase == AppliedLink::Phase::applied &&
                         isSameNetwork(*earlier.joined, *plan.wireless);
    AppliedLink applied{AppliedLink::Phase::applied, isOff(plan), {}, {}};
    if (!isOff(plan)) {
        applied.addresses = manualAddresses(plan);
    }
    if (joinsNetwork(plan)) {
        applied.joined = mayStay ? earlier.joined : makeJoinedNetwork(*plan.wireless);
    }
    // On the way everything counts as ours that is to be, or that an earlier run may have left.
    AppliedLink applying = applied;
    applying.phase = AppliedLink::Phase::applying;
    applying.joined = applied.joined ? applied.joined : earlier.joined;
    for (const Address& address : earlier.addresses) {
        if (std::ranges::count(applying.addresses, address) == 0) {
            applying.addresses.push_back(address);
        }
    }
    RETURN_IF_FAILED(writeState(appliedPath(interface_), applying));
    if (before) {
        suspendOtherDaemons(interface_, link()->index, before->others);
    }
    std::optional<DhcpClient> client;
    RETURN_IF_FAILED(readDhcpClient(interface_, client));
    const bool wantsClient = !isOff(plan) && plan.method == IPv4Method::dhcp;
    const bool staysOnNetwork = mayStay || (!earlier.joined && !joinsNetwork(plan));
    if (client && !(wantsClient && staysOnNetwork && client->settings == dhcpSettings(plan))) {
        // While the address is still there, so that the server hears of it: what one network lent is nothing
        // on the next.
        RETURN_IF_FAILED(stopDhcpClient(interface_));
    }
    if (earlier.joined && !joinsNetwork(plan)) {
        std::unique_ptr<WirelessJoin> ignored;
        RETURN_IF_FAILED(leaveNetwork(before.value_or(LinkSnapshot()), ignored));
    }
    if (isOff(plan)) {
        RETURN_IF_FAILED(switchOff(trouble));
    } else {
        bool isUsable = true;
        RETURN_IF_FAILED(switchRadioOn(plan, isUsable));
        if (!isUsable) {
            trouble = "the radio is switched off";
            return writeState(appliedPath(interface_), applied);
        }
        RETURN_IF_FAILED(switchOn(plan, trouble));
        RETURN_IF_FAILED(startJoin(plan, mayStay, join, trouble));
        if (wantsClient) {
            RETURN_IF_FAILED(startClient(plan, trouble));
        }
    }
    return writeState(appliedPath(interface_), applied);
}

Outcome DirectInterface::switchOff(std::string& trouble) {
    RETURN_IF_FAILED(setInterfaceNameServers(interface_, 0, {}, trouble));
    RETURN_IF_FAILED(kernel_.makeRoutes({}, false));
    RETURN_IF_FAILED(kernel_.makeAddresses({}));
    return kernel_.setUp(false);
}

Outcome DirectInterface::switchOn(const InterfacePlan& plan, std::string& trouble) {
    std::vector<Address> addresses = manualAddresses(plan);
    std::vector<Route> routes = makeDefaultRoute(plan.router, plan.rank, plan.addresses);
    if (plan.method == IPv4Method::dhcp) {
        LeaseState held;
        RETURN_IF_FAILED(readLease(interface_, held));
        if (held.lease) {
            addresses = {addressOf(interface_, *held.lease)};
            routes = routesOf(*held.lease, plan.rank);
        }
    }
    // IPv6 is off in a location: it has no settings for it, and the routes of a network that the machine is
    // only visiting would lead past the location's own.
    RETURN_IF_FAILED(kernel_.setIPv6Disabled(true));
    RETURN_IF_FAILED(kernel_.setUp(true));
    RETURN_IF_FAILED(kernel_.makeAddresses(addresses));
    if (!kernel_.makeRoutes(routes, true).ok()) {
        // Somebody took the way to the addresses' own networks away: it comes with the addresses.
        RETURN_IF_FAILED(kernel_.makeAddresses({}));
        RETURN_IF_FAILED(kernel_.makeAddresses(addresses));
        RETURN_IF_FAILED(kernel_.makeRoutes(routes, true));
    }
    if (plan.method != IPv4Method::dhcp) {
        return setInterfaceNameServers(interface_, plan.rank, {plan.nameServers, plan.searchDomains},
                                       trouble);
    }
    return {};
}

// A card whose radio is off cannot even be switched on.
Outcome DirectInterface::switchRadioOn(const InterfacePlan& plan, bool& isUsable) {
    std::optional<Radio> radio = readRadio(interface_);
    const bool isWanted = plan.wireless && plan.wireless->powerEnabled.value_or(false);
    if (radio && radio->isOff && isWanted) {
        RETURN_IF_FAILED(switchRadio(interface_, true));
        radio->isOff = false;
    }
    isUsable = !radio || (!radio->isOff && !radio->isBlocked);
    return {};
}

Outcome DirectInterface::startJoin(const InterfacePlan& plan, bool mayStay,
                                   std::unique_ptr<WirelessJoin>& join, std::string& trouble) {
    if (!joinsNetwork(plan)) {
        return {};
    }
    RETURN_IF_FAILED(joinBySupplicant(interface_, *plan.wireless, mayStay, join));
    if (!join) {
        RETURN_IF_FAILED(joinByKernel(interface_, *plan.wireless, mayStay, join));
    }
    if (!join) {
        trouble = "a network to join is named, and the card is not a wireless one";
    }
    return {};
}

Outcome DirectInterface::leaveNetwork(const LinkSnapshot& before, std::unique_ptr<WirelessJoin>& join) {
    RETURN_IF_FAILED(leaveBySupplicant(interface_, before.networks, join));
    return before.networks ? Outcome() : leaveByKernel(interface_, before.wireless, join);
}

Outcome DirectInterface::startClient(const InterfacePlan& plan, std::string& trouble) {
    std::optional<DhcpClient> client;
    RETURN_IF_FAILED(readDhcpClient(interface_, client));
    const bool isRunning = client && isAlive(client->process);
    if (!isRunning) {
        RETURN_IF_FAILED(stopDhcpClient(interface_));  // what one that died left behind
    }
    const NameService own{plan.nameServers, plan.searchDomains};
    if (!isRunning || !own.servers.empty()) {
        RETURN_IF_FAILED(setInterfaceNameServers(interface_, plan.rank, own, trouble));
    }
    // What an earlier server offered in vain says nothing about the next one.
    return isRunning ? forgetRefusal(interface_) : startDhcpClient(dhcpSettings(plan));
}

void DirectInterface::noteJoined() {
    if (refresh().ok() && link()) {
        (void)kernel_.forgetSilentNeighbours().ok();
    }
}

Outcome DirectInterface::giveBack(const LinkSnapshot& before, std::unique_ptr<WirelessJoin>& join,
                                  std::string& obstacle) {
    obstacle.clear();
    std::optional<AppliedLink> applied;
    RETURN_IF_FAILED(readState(appliedPath(interface_), applied));
    if (!applied) {
        return {};
    }
    Outcome done;
    take(done, stopDhcpClient(interface_));
    // The file of before is kept nowhere else: until it is back, this interface is not given back.
    std::string notBack;
    take(done, setInterfaceNameServers(interface_, 0, {}, notBack));
    take(done, notBack.empty() ? Outcome() : Outcome(kSCStatusFailed, notBack));
    if (applied->joined) {
        take(done, leaveNetwork(before, join));
    }
    if (link()) {
        bool taken = false;
        if (!take(done, isTakenOver(*applied, before, taken))) {
            return done;
        }
        if (taken) {
            logLine(LogLevel::notice,
                    interface_ + ": configured by somebody else meanwhile, and left to them");
            take(done, removeOurs(*applied, before));
            join.reset();
        } else {
            applied->phase = AppliedLink::Phase::restoring;
            // For a run that is ended half-way. A runtime directory that is full does not stop the way back.
            if (const Outcome noted = writeState(appliedPath(interface_), *applied); !noted.ok()) {
                logLine(LogLevel::warning, interface_ + ": " + noted.reason());
            }
            take(done, restore(before, obstacle));
            if (before.radioOff.value_or(false)) {
                take(done, switchRadio(interface_, false));
            }
        }
    }
    return done;
}

Outcome DirectInterface::letOthersIn(const LinkSnapshot& before, bool isBack) {
    RETURN_IF_FAILED(resumeOtherDaemons(interface_, before.others));
    return isBack ? removeFile(appliedPath(interface_)) : Outcome();
}

Outcome DirectInterface::hasAddress(bool& has) {
    InterfaceState now;
    RETURN_IF_FAILED(kernel_.read(now));
    has = std::ranges::any_of(now.addresses, [](const Address& address) {
        return address.family() == AF_INET && address.scope() == RT_SCOPE_UNIVERSE;
    });
    return {};
}

Outcome DirectInterface::isTakenOver(const AppliedLink& applied, const LinkSnapshot& before, bool& taken) {
    InterfaceState now;
    RETURN_IF_FAILED(kernel_.read(now));
    const bool isForeign = std::ranges::any_of(now.addresses, [&](const Address& address) {
        // Link-local ones are taken by daemons that watch for cards without an address, and stand for nobody.
        return address.family() == AF_INET && address.scope() < RT_SCOPE_LINK &&
               std::ranges::count(applied.addresses, address) == 0 &&
               std::ranges::count(before.state.addresses, address) == 0;
    });
    // Half-way there or back it may be on by our own doing.
    const bool isOn = applied.phase == AppliedLink::Phase::applied && applied.off && link()->up;
    taken = isForeign || isOn;
    return {};
}

Outcome DirectInterface::removeOurs(const AppliedLink& applied, const LinkSnapshot& before) {
    InterfaceState now;
    Outcome done;
    if (take(done, kernel_.read(now))) {
        for (const Route& route : now.routes) {
            if (route.protocol() == ourRouteProtocol) {
                take(done, kernel_.removeRoute(route));
            }
        }
        for (const Address& address : now.addresses) {
            if (std::ranges::count(applied.addresses, address) != 0 &&
                std::ranges::count(before.state.addresses, address) == 0) {
                take(done, kernel_.removeAddress(address));
            }
        }
    }
    take(done, kernel_.setIPv6Disabled(before.ipv6Disabled));
    return done;
}

Outcome DirectInterface::restore(const LinkSnapshot& before, std::string& obstacle) {
    std::vector<Address> addresses = before.state.addresses;
    const std::int64_t elapsed = std::max<std::int64_t>(secondsSinceStart() - before.takenAt, 0);
    for (Address& address : addresses) {
        const auto left = [elapsed](std::uint32_t life) {
            return life == forever || life == 0
                       ? life
                       : static_cast<std::uint32_t>(std::max<std::int64_t>(life - elapsed, shortestLife));
        };
        address.valid = left(address.valid);
        address.preferred = left(address.preferred);
    }
    // IPv6 before the link, so that the kernel makes its own addresses when the link comes up.
    RETURN_IF_FAILED(kernel_.setIPv6Disabled(before.ipv6Disabled));
    // Without its radio a card cannot be switched on, and no route goes through it.
    const std::optional<Radio> radio = readRadio(interface_);
    if (before.up && radio && (radio->isOff || radio->isBlocked)) {
        obstacle = "its radio was switched off meanwhile: the next run gives it back when it is on again";
        return {};
    }
    RETURN_IF_FAILED(kernel_.setUp(before.up));
    RETURN_IF_FAILED(kernel_.makeAddresses(addresses));
    RETURN_IF_FAILED(kernel_.makeRoutes(before.state.routes, false));
    return compare(before);
}

Outcome DirectInterface::compare(const LinkSnapshot& before) {
    RETURN_IF_FAILED(refresh());
    if (!link()) {
        return {};
    }
    InterfaceState now;
    RETURN_IF_FAILED(kernel_.read(now));
    const char* const different =
        link()->up != before.up || kernel_.isIPv6Disabled() != before.ipv6Disabled ? "link is"
        : lasting(now.addresses) != lasting(before.state.addresses)                ? "addresses are"
        : lasting(now.routes) != lasting(before.state.routes)                      ? "routes are"
                                                                                   : nullptr;
    return different == nullptr
               ? Outcome()
               : Outcome(kSCStatusFailed, std::string("the ") + different + " not as before");
}

}  // namespace platform::apply
