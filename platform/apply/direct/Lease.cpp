#include "platform/apply/direct/Lease.h"

#include <arpa/inet.h>

#include <algorithm>
#include <bit>
#include <charconv>
#include <optional>
#include <string_view>

#include "platform/apply/StateFile.h"
#include "platform/apply/direct/Kernel.h"
#include "platform/base/Log.h"

namespace platform::apply {
namespace {

constexpr std::size_t mostServers = 3;
constexpr std::size_t mostDomains = 6;

std::string leasePath(const std::string& interface) {
    return runtimePath("lease-" + interface + ".plist");
}

std::string_view textFor(const Environment& environment, std::string_view name) {
    const auto found = environment.find(name);
    return found == environment.end() ? std::string_view() : std::string_view(found->second);
}

std::optional<std::uint32_t> parseNumber(std::string_view text) {
    std::uint32_t number = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    return error == std::errc() && end == text.data() + text.size() ? std::optional(number) : std::nullopt;
}

// An address that one machine in a network can have.
std::optional<IPv4Address> parseHost(std::string_view text) {
    in_addr address{};
    if (::inet_pton(AF_INET, std::string(text).c_str(), &address) != 1) {
        return std::nullopt;
    }
    const std::uint32_t number = ntohl(address.s_addr);
    const bool usable = (number >> 24U) != 0 && (number >> 24U) != 127 && number < 0xE0000000U;
    return usable ? std::optional(address.s_addr) : std::nullopt;
}

bool isDomain(std::string_view text) {
    return !text.empty() && text.size() <= 253 && text.front() != '.' && text.front() != '-' &&
           std::all_of(text.begin(), text.end(), [](char c) {
               return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') ||
                      c == '.' || c == '-' || c == '_';
           });
}

template <class Each>
void forEachWord(std::string_view text, const Each& each) {
    while (!text.empty()) {
        const std::size_t end = std::min(text.find(' '), text.size());
        if (end != 0) {
            each(text.substr(0, end));
        }
        text.remove_prefix(std::min(end + 1, text.size()));
    }
}

std::optional<unsigned> parsePrefixLength(const Environment& environment, IPv4Address address) {
    const std::string_view text = textFor(environment, "mask");
    if (text.empty()) {
        const std::uint32_t number = ntohl(address);
        return number < 0x80000000U ? 8U : number < 0xC0000000U ? 16U : 24U;
    }
    const std::optional<std::uint32_t> length = parseNumber(text);
    return length && *length >= 1 && *length <= 32 ? length : std::nullopt;
}

// A name servers' file that cannot be written keeps no address from standing.
Outcome setServers(const DhcpSettings& settings, const NameService& service) {
    std::string trouble;
    RETURN_IF_FAILED(setInterfaceNameServers(settings.interface, settings.rank, service, trouble));
    if (!trouble.empty()) {
        logLine(LogLevel::warning, settings.interface + ": " + trouble);
    }
    return {};
}

Outcome writeLease(const std::string& interface, const LeaseState& state) {
    return writeState(leasePath(interface), state);
}

}  // namespace

Outcome leaseFromEnvironment(const Environment& environment, Lease& lease) {
    lease = {};
    const std::optional<IPv4Address> address = parseHost(textFor(environment, "ip"));
    if (!address) {
        return {kSCStatusFailed, "the DHCP server offered no address that a machine can have"};
    }
    const std::optional<unsigned> length = parsePrefixLength(environment, *address);
    if (!length) {
        return {kSCStatusFailed, "the DHCP server offered no usable subnet mask"};
    }
    lease.address = {*address, *length};
    forEachWord(textFor(environment, "router"), [&lease](std::string_view word) {
        const std::optional<IPv4Address> router = parseHost(word);
        if (lease.router == 0 && router && *router != lease.address.address) {
            lease.router = *router;
        }
    });
    forEachWord(textFor(environment, "dns"), [&lease](std::string_view word) {
        const std::optional<IPv4Address> server = parseHost(word);
        if (server && lease.nameService.servers.size() < mostServers) {
            lease.nameService.servers.push_back(*server);
        }
    });
    for (const std::string_view name : {"search", "domain"}) {
        forEachWord(textFor(environment, name), [&lease](std::string_view word) {
            auto& domains = lease.nameService.domains;
            if (isDomain(word) && domains.size() < mostDomains &&
                std::find(domains.begin(), domains.end(), word) == domains.end()) {
                domains.emplace_back(word);
            }
        });
    }
    lease.seconds = parseNumber(textFor(environment, "lease")).value_or(0);
    if (lease.seconds == 0) {
        lease.seconds = forever;
    }
    return {};
}

Address addressOf(const std::string& interface, const Lease& lease) {
    Address address = makeAddress(interface, lease.address);
    address.valid = lease.seconds;
    address.preferred = lease.seconds;
    return address;
}

std::vector<Route> routesOf(const Lease& lease, unsigned rank) {
    return makeDefaultRoute(lease.router, rank, {lease.address});
}

Outcome readLease(const std::string& interface, LeaseState& state) {
    std::optional<LeaseState> file;
    RETURN_IF_FAILED(readState(leasePath(interface), file));
    state = file.value_or(LeaseState());
    return {};
}

Outcome takeLease(const DhcpSettings& settings, const Lease& lease) {
    LeaseState earlier;
    RETURN_IF_FAILED(readLease(settings.interface, earlier));
    Kernel kernel;
    RETURN_IF_FAILED(kernel.open());
    std::optional<Link> link;
    RETURN_IF_FAILED(kernel.findLink(settings.interface, link));
    if (!link) {
        return {kSCStatusFailed, "the interface is gone"};
    }
    if (earlier.lease && !(earlier.lease->address == lease.address)) {
        RETURN_IF_FAILED(dropLease(settings));
    }
    // A lease that is only renewed stays taken meanwhile.
    const bool isRenewed = earlier.isTaken && earlier.lease && earlier.lease->address == lease.address;
    RETURN_IF_FAILED(writeLease(settings.interface, {isRenewed, lease, ""}));
    RETURN_IF_FAILED(kernel.addAddress(*link, addressOf(settings.interface, lease)));
    if (earlier.lease && earlier.lease->router != lease.router) {
        for (const Route& route : routesOf(*earlier.lease, settings.rank)) {
            RETURN_IF_FAILED(kernel.removeRoute(*link, route));
        }
    }
    for (const Route& route : routesOf(lease, settings.rank)) {
        RETURN_IF_FAILED(kernel.addRoute(*link, route));
    }
    if (!settings.ignoresServers) {
        NameService service = lease.nameService;
        if (!settings.domains.empty()) {
            service.domains = settings.domains;
        }
        RETURN_IF_FAILED(setServers(settings, service));
    }
    return writeLease(settings.interface, {true, lease, ""});
}

Outcome refuseLease(const std::string& interface, const std::string& reason) {
    LeaseState state;
    RETURN_IF_FAILED(readLease(interface, state));
    state.refusal = reason;
    return writeLease(interface, state);
}

Outcome forgetRefusal(const std::string& interface) {
    LeaseState state;
    RETURN_IF_FAILED(readLease(interface, state));
    if (state.refusal.empty()) {
        return {};
    }
    state.refusal.clear();
    return writeLease(interface, state);
}

Outcome dropLease(const DhcpSettings& settings) {
    LeaseState state;
    RETURN_IF_FAILED(readLease(settings.interface, state));
    if (state.lease) {
        Kernel kernel;
        RETURN_IF_FAILED(kernel.open());
        std::optional<Link> link;
        RETURN_IF_FAILED(kernel.findLink(settings.interface, link));
        if (link) {
            for (const Route& route : routesOf(*state.lease, settings.rank)) {
                RETURN_IF_FAILED(kernel.removeRoute(*link, route));
            }
            RETURN_IF_FAILED(kernel.removeAddress(*link, addressOf(settings.interface, *state.lease)));
        }
        if (!settings.ignoresServers) {
            RETURN_IF_FAILED(setServers(settings, {}));
        }
    }
    return removeFile(leasePath(settings.interface));
}

}  // namespace platform::apply
