#include <sys/socket.h>

#include <algorithm>
#include <chrono>
#include <ctime>
#include <memory>
#include <optional>
#include <thread>

#include "platform/Log.h"
#include "platform/apply/Agents.h"
#include "platform/apply/StateFile.h"
#include "platform/apply/direct/DhcpClient.h"
#include "platform/apply/direct/Kernel.h"
#include "platform/apply/direct/NameServers.h"
#include "platform/apply/direct/Snapshot.h"
#include "platform/apply/direct/Supplicant.h"

namespace platform::apply {
namespace {

using std::chrono::steady_clock;

// An interface without a carrier by then keeps its settings and gets no more of our time: the cable or the
// radio may come later.
constexpr std::chrono::milliseconds carrierTime{5000};
constexpr std::chrono::seconds joinTime{20};
constexpr std::chrono::seconds leaseTime{20};
constexpr std::chrono::milliseconds lookAgain{20};
// What is left at least to an address whose own DHCP client renews it.
constexpr std::uint32_t shortestLife = 60;

std::int64_t secondsSinceStart() {
    timespec now{};
    ::clock_gettime(CLOCK_BOOTTIME, &now);
    return now.tv_sec;
}

// Does what follows even when something failed, and keeps the first failure.
class Steps {
  public:
    bool take(const Outcome& outcome) {
        if (first_.ok()) {
            first_ = outcome;
        }
        return outcome.ok();
    }
    [[nodiscard]] bool ok() const noexcept { return first_.ok(); }
    [[nodiscard]] Outcome first() const { return first_; }

  private:
    Outcome first_;
};

bool contains(const std::vector<Address>& list, const Address& address) {
    return std::find(list.begin(), list.end(), address) != list.end();
}

bool isOff(const InterfacePlan& plan) {
    return !plan.active || (plan.wireless && plan.wireless->powerEnabled == false);
}

bool joinsNetwork(const InterfacePlan& plan) {
    return !isOff(plan) && plan.wireless && plan.wireless->network;
}

std::vector<Address> manualAddresses(const InterfacePlan& plan) {
    std::vector<Address> addresses;
    for (const ManualAddress& address : plan.addresses) {
        Address made = makeAddress(plan.name, address);
        if (!contains(addresses, made)) {
            addresses.push_back(std::move(made));
        }
    }
    return addresses;
}

DhcpSettings dhcpSettings(const InterfacePlan& plan) {
    return {plan.name, plan.rank, plan.dhcpClientID, !plan.nameServers.empty(), plan.searchDomains};
}

class DirectAgent : public Agent {
  public:
    [[nodiscard]] std::string_view name() const noexcept override { return "direct"; }

    Outcome capture(std::span<const std::string> interfaces, std::vector<Captured>& captured) override {
        Kernel kernel;
        Outcome done = kernel.open();
        for (const std::string& interface : interfaces) {
            std::optional<Link> link;
            if (done.ok()) {
                done = kernel.findLink(interface, link);
            }
            if (!done.ok() || !link) {
                continue;
            }
            Snapshot snapshot{link->up, isIPv6Disabled(interface), {}, {}, secondsSinceStart()};
            done = kernel.read(*link, snapshot.state);
            if (done.ok()) {
                done = readKnownNetworks(interface, snapshot.networks);
            }
            captured.push_back({interface, encodeSnapshot(snapshot)});
        }
        return done;
    }

    Outcome takeOver(const InterfacePlan& plan, const Captured& before) override;
    Outcome giveBack(const Captured& before) override;
};

// One interface on its way out or back.
class Way {
  public:
    explicit Way(std::string interface) : interface_(std::move(interface)) {}

    Outcome open() {
        Outcome done = kernel_.open();
        return done.ok() ? kernel_.findLink(interface_, link_) : done;
    }
    [[nodiscard]] bool isThere() const noexcept { return link_.has_value(); }

    Outcome switchOff();
    // mayStay: the card may be on the plan's wireless network already.
    Outcome switchOn(const InterfacePlan& plan, bool mayStay);
    Outcome restore(const Snapshot& before);
    Outcome removeOurs(const Notes& notes, const Snapshot& before);
    // Whether somebody else has configured the interface since: it has addresses that it neither had nor got
    // from here, or was switched off here and is on.
    Outcome isTakenOver(const Notes& notes, const Snapshot& before, bool& taken);

  private:
    Outcome setUp(bool up) {
        if (link_->up == up) {
            return {};
        }
        Outcome done = kernel_.setUp(*link_, up);
        link_->up = done.ok() ? up : link_->up;
        return done;
    }
    Outcome setIPv6Disabled(std::optional<bool> disabled) {
        const std::optional<bool> now = isIPv6Disabled(interface_);
        return disabled && now && now != disabled ? disableIPv6(interface_, *disabled) : Outcome();
    }
    Outcome awaitCarrier();
    Outcome lease(const InterfacePlan& plan, steady_clock::time_point deadline);
    Outcome compare(const Snapshot& before);

    std::string interface_;
    Kernel kernel_;
    std::optional<Link> link_;
};

Outcome Way::awaitCarrier() {
    const auto deadline = steady_clock::now() + carrierTime;
    for (;;) {
        Outcome done = kernel_.findLink(interface_, link_);
        if (!done.ok()) {
            return done;
        }
        if (!link_) {
            return {kSCStatusFailed, "the interface is gone"};
        }
        if (link_->running || steady_clock::now() >= deadline) {
            return {};
        }
        std::this_thread::sleep_for(lookAgain);
    }
}

Outcome Way::switchOff() {
    Steps steps;
    steps.take(bringNameServers(interface_, 0, {}));
    if (steps.take(kernel_.makeRoutes(*link_, {}, false)) && steps.take(kernel_.makeAddresses(*link_, {}))) {
        steps.take(setUp(false));
    }
    return steps.first();
}

Outcome Way::switchOn(const InterfacePlan& plan, bool mayStay) {
    std::vector<Address> addresses = manualAddresses(plan);
    std::vector<Route> routes = makeDefaultRoute(plan.router, plan.rank, plan.addresses);
    if (plan.method == IPv4Method::dhcp) {
        LeaseState held;
        Outcome done = readLease(interface_, held);
        if (!done.ok()) {
            return done;
        }
        if (held.isTaken) {
            addresses = {addressOf(interface_, held.lease)};
            routes = routesOf(held.lease, plan.rank);
        }
    }
    // IPv6 is off in a location: it has no settings for it, and the routes of a network that the machine is
    // only visiting would lead past the location's own.
    Outcome done = setIPv6Disabled(true);
    if (done.ok()) {
        done = setUp(true);
    }
    if (done.ok()) {
        done = kernel_.makeAddresses(*link_, addresses);
    }
    if (done.ok()) {
        done = kernel_.makeRoutes(*link_, routes, true);
    }
    if (done.ok() && plan.method != IPv4Method::dhcp) {
        done = bringNameServers(interface_, plan.rank, {plan.nameServers, plan.searchDomains});
    }
    // Behind the settings, which stand whether the card gets onto the network or not.
    if (done.ok() && joinsNetwork(plan)) {
        done = joinNetwork(interface_, *plan.wireless, mayStay, steady_clock::now() + joinTime);
    }
    const auto deadline = steady_clock::now() + leaseTime;
    if (done.ok()) {
        done = awaitCarrier();
    }
    return done.ok() && plan.method == IPv4Method::dhcp ? lease(plan, deadline) : done;
}

Outcome Way::lease(const InterfacePlan& plan, steady_clock::time_point deadline) {
    bool running = false;
    Outcome done = isDhcpClientRunning(interface_, running);
    if (done.ok() && !running) {
        done = stopDhcpClient(interface_);  // what one that died left behind
    }
    const NameService own{plan.nameServers, plan.searchDomains};
    if (done.ok() && (!running || !own.servers.empty())) {
        done = bringNameServers(interface_, plan.rank, own);
    }
    if (done.ok() && !running) {
        done = startDhcpClient(dhcpSettings(plan));
    }
    return done.ok() ? waitForLease(interface_, deadline) : done;
}

Outcome Way::isTakenOver(const Notes& notes, const Snapshot& before, bool& taken) {
    InterfaceState now;
    Outcome done = kernel_.read(*link_, now);
    const bool isForeign =
        std::any_of(now.addresses.begin(), now.addresses.end(), [&](const Address& address) {
            // Link-local ones are taken by daemons that watch for cards without an address, and stand for
            // nobody.
            return address.family() == AF_INET && address.scope() < RT_SCOPE_LINK &&
                   !contains(notes.addresses, address) && !contains(before.state.addresses, address);
        });
    // Half-way there or back it may be on by our own doing.
    const bool isOn = notes.phase == Notes::Phase::made && notes.off && link_->up;
    taken = done.ok() && (isForeign || isOn);
    return done;
}

Outcome Way::removeOurs(const Notes& notes, const Snapshot& before) {
    InterfaceState now;
    Steps steps;
    if (steps.take(kernel_.read(*link_, now))) {
        for (const Route& route : now.routes) {
            if (route.protocol() == ourRouteProtocol) {
                steps.take(kernel_.removeRoute(*link_, route));
            }
        }
        for (const Address& address : now.addresses) {
            if (contains(notes.addresses, address) && !contains(before.state.addresses, address)) {
                steps.take(kernel_.removeAddress(*link_, address));
            }
        }
    }
    steps.take(setIPv6Disabled(before.ipv6Disabled));
    return steps.first();
}

Outcome Way::restore(const Snapshot& before) {
    std::vector<Address> addresses = before.state.addresses;
    const std::int64_t elapsed = std::max<std::int64_t>(secondsSinceStart() - before.takenAt, 0);
    for (Address& address : addresses) {
        const auto left = [elapsed](std::uint32_t life) {
            return life == forever
                       ? forever
                       : static_cast<std::uint32_t>(std::max<std::int64_t>(life - elapsed, shortestLife));
        };
        address.valid = left(address.valid);
        address.preferred = left(address.preferred);
    }
    // IPv6 before the link, so that the kernel makes its own addresses when the link comes up.
    Outcome done = setIPv6Disabled(before.ipv6Disabled);
    if (done.ok()) {
        done = setUp(before.up);
    }
    if (done.ok()) {
        done = kernel_.makeAddresses(*link_, addresses);
    }
    if (done.ok()) {
        done = kernel_.makeRoutes(*link_, before.state.routes, false);
    }
    return done.ok() ? compare(before) : done;
}

Outcome Way::compare(const Snapshot& before) {
    InterfaceState now;
    Outcome done = kernel_.findLink(interface_, link_);
    if (done.ok() && link_) {
        done = kernel_.read(*link_, now);
    }
    if (!done.ok() || !link_) {
        return done;
    }
    const auto lasting = [](const auto& list, bool isStrict) {
        auto result = list;
        std::erase_if(result, [isStrict](const auto& one) {
            if constexpr (requires { one.isShared; }) {
                return one.comesByItself || (one.isShared && !isStrict);
            }
            return one.comesByItself;
        });
        std::sort(result.begin(), result.end(),
                  [](const auto& lhs, const auto& rhs) { return lhs.key < rhs.key; });
        return result;
    };
    if (link_->up != before.up || isIPv6Disabled(interface_) != before.ipv6Disabled) {
        return {kSCStatusFailed, "the link is not as it was before"};
    }
    if (lasting(now.addresses, false) != lasting(before.state.addresses, false)) {
        return {kSCStatusFailed, "the addresses are not as they were before"};
    }
    if (lasting(now.routes, false) != lasting(before.state.routes, false)) {
        return {kSCStatusFailed, "the routes are not as they were before"};
    }
    return {};
}

Outcome DirectAgent::takeOver(const InterfacePlan& plan, const Captured& before) {
    Way way(plan.name);
    Outcome done = way.open();
    if (!done.ok()) {
        return done;
    }
    if (!way.isThere()) {
        return isOff(plan) ? Outcome() : Outcome(kSCStatusFailed, "there is no such interface");
    }
    std::optional<Notes> found;
    done = readNotes(plan.name, found);
    if (!done.ok()) {
        return done;
    }
    const Notes earlier = found.value_or(Notes{});
    const bool mayStay = joinsNetwork(plan) && earlier.joined && earlier.phase == Notes::Phase::made &&
                         isSameNetwork(*earlier.joined, *plan.wireless);
    Notes made{Notes::Phase::made, isOff(plan), {}, {}};
    if (!isOff(plan)) {
        made.addresses = manualAddresses(plan);
    }
    if (joinsNetwork(plan)) {
        made.joined = mayStay ? earlier.joined : makeJoinedNetwork(*plan.wireless);
    }
    // On the way everything counts as ours that is to be, or that an earlier run may have left.
    Notes going = made;
    going.phase = Notes::Phase::going;
    going.joined = made.joined ? made.joined : earlier.joined;
    for (const Address& address : earlier.addresses) {
        if (!contains(going.addresses, address)) {
            going.addresses.push_back(address);
        }
    }
    done = writeNotes(plan.name, going);
    std::optional<DhcpSettings> client;
    if (done.ok()) {
        done = readDhcpSettings(plan.name, client);
    }
    const bool wantsClient = !isOff(plan) && plan.method == IPv4Method::dhcp;
    if (done.ok() && client && !(wantsClient && *client == dhcpSettings(plan))) {
        // While the address is still there, so that the server hears of it.
        done = stopDhcpClient(plan.name);
    }
    if (done.ok() && earlier.joined && !joinsNetwork(plan)) {
        const std::optional<Snapshot> snapshot = decodeSnapshot(before.state.get());
        done = leaveNetwork(plan.name, snapshot ? snapshot->networks : std::nullopt);
    }
    if (done.ok()) {
        done = isOff(plan) ? way.switchOff() : way.switchOn(plan, mayStay);
    }
    return done.ok() ? writeNotes(plan.name, made) : done;
}

Outcome DirectAgent::giveBack(const Captured& before) {
    const std::string& interface = before.interface;
    std::optional<Notes> notes;
    Outcome read = readNotes(interface, notes);
    if (!read.ok() || !notes) {
        return read;
    }
    const std::optional<Snapshot> snapshot = decodeSnapshot(before.state.get());
    if (!snapshot) {
        return {kSCStatusFailed, "what the record says of the time before cannot be understood"};
    }
    Steps steps;
    steps.take(stopDhcpClient(interface));
    steps.take(bringNameServers(interface, 0, {}));
    if (notes->joined) {
        steps.take(leaveNetwork(interface, snapshot->networks));
    }
    Way way(interface);
    if (steps.take(way.open()) && way.isThere()) {
        bool taken = false;
        if (!steps.take(way.isTakenOver(*notes, *snapshot, taken))) {
            return steps.first();
        }
        if (taken) {
            logLine(LogLevel::notice,
                    interface + ": configured by somebody else meanwhile, and left to them");
            steps.take(way.removeOurs(*notes, *snapshot));
        } else {
            notes->phase = Notes::Phase::returning;
            if (steps.take(writeNotes(interface, *notes))) {
                steps.take(way.restore(*snapshot));
            }
        }
    }
    return steps.ok() ? removeNotes(interface) : steps.first();
}

}  // namespace

std::shared_ptr<Agent> makeDirectAgent() {
    return std::make_shared<DirectAgent>();
}

}  // namespace platform::apply
