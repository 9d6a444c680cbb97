#include "platform/apply/direct/Lease.h"

#include <arpa/inet.h>

#include <algorithm>
#include <bit>
#include <charconv>
#include <optional>
#include <string_view>

#include "platform/apply/Properties.h"
#include "platform/apply/StateFile.h"

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

Outcome writeLease(const std::string& interface, const LeaseState& state) {
    DictionaryBuilder file;
    file.setBoolean(CFSTR("Taken"), state.isTaken).setText(CFSTR("Refusal"), state.refusal);
    if (state.isKnown) {
        ArrayBuilder domains;
        for (const std::string& domain : state.lease.nameService.domains) {
            domains.addText(domain);
        }
        file.setInteger(CFSTR("Address"), state.lease.address.address)
            .setInteger(CFSTR("PrefixLength"), state.lease.address.prefixLength)
            .setInteger(CFSTR("Router"), state.lease.router)
            .setInteger(CFSTR("Seconds"), state.lease.seconds)
            .setData(CFSTR("Servers"), std::as_bytes(std::span(state.lease.nameService.servers)))
            .set(CFSTR("Domains"), domains.get());
    }
    return writeStateFile(leasePath(interface), file.take().get());
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
    state = {};
    values::Owned<CFDictionaryRef> file;
    Outcome read = readStateFile(leasePath(interface), file);
    if (!read.ok() || !file) {
        return read;
    }
    state.isTaken = booleanIn(file.get(), CFSTR("Taken")).value_or(false);
    state.refusal = textIn(file.get(), CFSTR("Refusal")).value_or("");
    const auto address = integerIn(file.get(), CFSTR("Address"));
    state.isKnown = address.has_value();
    if (!state.isKnown) {
        return {};
    }
    const auto numberIn = [&file](CFStringRef key) {
        return static_cast<std::uint32_t>(integerIn(file.get(), key).value_or(0));
    };
    Lease& lease = state.lease;
    lease.address = {static_cast<IPv4Address>(*address), numberIn(CFSTR("PrefixLength"))};
    lease.router = numberIn(CFSTR("Router"));
    lease.seconds = numberIn(CFSTR("Seconds"));
    if (const auto servers = dataIn(file.get(), CFSTR("Servers"))) {
        lease.nameService.servers.resize(servers->size() / sizeof(IPv4Address));
        std::copy_n(servers->begin(), lease.nameService.servers.size() * sizeof(IPv4Address),
                    std::as_writable_bytes(std::span(lease.nameService.servers)).begin());
    }
    CFArrayRef const domains = arrayIn(file.get(), CFSTR("Domains"));
    for (CFIndex i = 0; domains != nullptr && i < CFArrayGetCount(domains); ++i) {
        lease.nameService.domains.push_back(asText(CFArrayGetValueAtIndex(domains, i)).value_or(""));
    }
    return {};
}

Outcome takeLease(const DhcpSettings& settings, const Lease& lease) {
    LeaseState earlier;
    Outcome done = readLease(settings.interface, earlier);
    Kernel kernel;
    std::optional<Link> link;
    if (done.ok()) {
        done = kernel.open();
    }
    if (done.ok()) {
        done = kernel.findLink(settings.interface, link);
    }
    if (done.ok() && !link) {
        done = {kSCStatusFailed, "there is no such interface"};
    }
    if (done.ok() && earlier.isKnown && !(earlier.lease.address == lease.address)) {
        done = dropLease(settings);
    }
    if (done.ok()) {
        done = writeLease(settings.interface, {false, lease, true, ""});
    }
    if (done.ok()) {
        done = kernel.addAddress(*link, addressOf(settings.interface, lease));
    }
    if (done.ok() && earlier.isKnown && earlier.lease.router != lease.router) {
        for (const Route& route : routesOf(earlier.lease, settings.rank)) {
            done = done.ok() ? kernel.removeRoute(*link, route) : done;
        }
    }
    for (const Route& route : routesOf(lease, settings.rank)) {
        done = done.ok() ? kernel.addRoute(*link, route) : done;
    }
    if (done.ok() && !settings.ignoresServers) {
        NameService service = lease.nameService;
        if (!settings.domains.empty()) {
            service.domains = settings.domains;
        }
        done = bringNameServers(settings.interface, settings.rank, service);
    }
    return done.ok() ? writeLease(settings.interface, {true, lease, true, ""}) : done;
}

Outcome refuseLease(const std::string& interface, const std::string& reason) {
    LeaseState state;
    Outcome done = readLease(interface, state);
    state.refusal = reason;
    return done.ok() ? writeLease(interface, state) : done;
}

Outcome dropLease(const DhcpSettings& settings) {
    LeaseState state;
    Outcome done = readLease(settings.interface, state);
    Kernel kernel;
    std::optional<Link> link;
    if (done.ok() && state.isKnown) {
        done = kernel.open();
        if (done.ok()) {
            done = kernel.findLink(settings.interface, link);
        }
        for (const Route& route : routesOf(state.lease, settings.rank)) {
            done = done.ok() && link ? kernel.removeRoute(*link, route) : done;
        }
        if (done.ok() && link) {
            done = kernel.removeAddress(*link, addressOf(settings.interface, state.lease));
        }
        if (done.ok() && !settings.ignoresServers) {
            done = bringNameServers(settings.interface, settings.rank, {});
        }
    }
    return done.ok() ? removeStateFile(leasePath(settings.interface)) : done;
}

}  // namespace platform::apply
