#include "platform/apply/direct/Lease.h"

#include <arpa/inet.h>

#include <algorithm>
#include <bit>
#include <charconv>
#include <cstdlib>
#include <optional>
#include <sstream>
#include <string_view>

#include "platform/apply/StateFile.h"
#include "platform/apply/direct/Kernel.h"
#include "platform/base/Log.h"

namespace platform::apply {
namespace {

std::string leasePath(const std::string& interface) {
    return runtimePath("lease-" + interface + ".plist");
}

std::string textOf(const char* variable) {
    const char* const text = std::getenv(variable);
    return text == nullptr ? "" : text;
}

std::vector<std::string> wordsOf(const char* variable) {
    std::istringstream text(textOf(variable));
    std::vector<std::string> words;
    for (std::string word; std::getline(text, word, ' ');) {
        words.push_back(word);
    }
    return words;
}

std::optional<std::uint32_t> parseNumber(std::string_view text) {
    std::uint32_t number = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    return error == std::errc() && end == text.data() + text.size() ? std::optional(number) : std::nullopt;
}

// An address that one machine in a network can have.
std::optional<IPv4Address> parseHost(const std::string& text) {
    in_addr address{};
    if (::inet_pton(AF_INET, text.c_str(), &address) != 1) {
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

std::optional<unsigned> parsePrefixLength(IPv4Address address) {
    const std::string text = textOf("mask");
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

Outcome leaseFromEnvironment(Lease& lease) {
    lease = {};
    const std::optional<IPv4Address> address = parseHost(textOf("ip"));
    if (!address) {
        return {kSCStatusFailed, "the DHCP server offered no address that a machine can have"};
    }
    const std::optional<unsigned> length = parsePrefixLength(*address);
    if (!length) {
        return {kSCStatusFailed, "the DHCP server offered no usable subnet mask"};
    }
    lease.address = {*address, *length};
    for (const std::string& word : wordsOf("router")) {
        const IPv4Address router = parseHost(word).value_or(0);
        if (lease.router == 0 && router != *address) {
            lease.router = router;
        }
    }
    auto& [servers, domains] = lease.nameService;
    for (const std::string& word : wordsOf("dns")) {
        const std::optional<IPv4Address> server = parseHost(word);
        if (server && servers.size() < mostServers) {
            servers.push_back(*server);
        }
    }
    for (const char* const variable : {"search", "domain"}) {
        for (const std::string& word : wordsOf(variable)) {
            if (isDomain(word) && domains.size() < mostDomains && std::ranges::count(domains, word) == 0) {
                domains.push_back(word);
            }
        }
    }
    lease.seconds = parseNumber(textOf("lease")).value_or(0);
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
    RETURN_IF_FAILED(kernel.open(settings.interface));
    if (!kernel.link()) {
        return {kSCStatusFailed, "the interface is gone"};
    }
    if (earlier.lease && !(earlier.lease->address == lease.address)) {
        RETURN_IF_FAILED(dropLease(settings));
    }
    // A lease that is only renewed stays taken meanwhile.
    const bool isRenewed = earlier.isTaken && earlier.lease && earlier.lease->address == lease.address;
    RETURN_IF_FAILED(writeLease(settings.interface, {isRenewed, lease, ""}));
    RETURN_IF_FAILED(kernel.addAddress(addressOf(settings.interface, lease)));
    if (earlier.lease && earlier.lease->router != lease.router) {
        for (const Route& route : routesOf(*earlier.lease, settings.rank)) {
            RETURN_IF_FAILED(kernel.removeRoute(route));
        }
    }
    for (const Route& route : routesOf(lease, settings.rank)) {
        RETURN_IF_FAILED(kernel.addRoute(route));
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
        RETURN_IF_FAILED(kernel.open(settings.interface));
        if (kernel.link()) {
            for (const Route& route : routesOf(*state.lease, settings.rank)) {
                RETURN_IF_FAILED(kernel.removeRoute(route));
            }
            RETURN_IF_FAILED(kernel.removeAddress(addressOf(settings.interface, *state.lease)));
        }
        if (!settings.ignoresServers) {
            RETURN_IF_FAILED(setServers(settings, {}));
        }
    }
    return removeFile(leasePath(settings.interface));
}

}  // namespace platform::apply
