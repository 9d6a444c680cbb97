#include "platform/apply/direct/Lease.h"

#include <arpa/inet.h>
#include <gtest/gtest.h>

#include <string>

namespace platform::apply {
namespace {

std::string quad(IPv4Address address) {
    char text[INET_ADDRSTRLEN] = "";
    inet_ntop(AF_INET, &address, text, sizeof text);
    return text;
}

// The lease in one line, or why there is none.
std::string read(const Environment& environment) {
    Lease lease;
    const Outcome outcome = leaseFromEnvironment(environment, lease);
    if (!outcome.ok()) {
        return outcome.reason();
    }
    std::string text = quad(lease.address.address) + "/" + std::to_string(lease.address.prefixLength);
    text += lease.router != 0 ? " via " + quad(lease.router) : "";
    for (const IPv4Address server : lease.nameService.servers) {
        text += " dns " + quad(server);
    }
    for (const std::string& domain : lease.nameService.domains) {
        text += " in " + domain;
    }
    return text + (lease.seconds == forever ? "" : " for " + std::to_string(lease.seconds));
}

TEST(Lease, TrustsNothingThatTheServerSays) {
    const std::string noAddress = "the DHCP server offered no address that a machine can have";
    const std::string noMask = "the DHCP server offered no usable subnet mask";
    const struct {
        Environment environment;
        std::string lease;
    } rows[] = {
        {{{"ip", "10.0.0.7"},
          {"mask", "24"},
          {"router", "10.0.0.1 10.0.0.2"},
          {"dns", "10.0.0.53 10.0.0.54"},
          {"domain", "example.org"},
          {"search", "a.example.org example.org"},
          {"lease", "3600"}},
         "10.0.0.7/24 via 10.0.0.1 dns 10.0.0.53 dns 10.0.0.54 in a.example.org in example.org for 3600"},
        {{{"ip", "10.0.0.7"}}, "10.0.0.7/8"},
        {{{"ip", "10.0.0.7"}, {"lease", "4294967295"}, {"mask", "32"}}, "10.0.0.7/32"},
        {{}, noAddress},
        {{{"ip", "127.0.0.1"}}, noAddress},
        {{{"ip", "224.0.0.1"}}, noAddress},
        {{{"ip", "10.0.0.7 10.0.0.8"}}, noAddress},
        {{{"ip", "10.0.0.7"}, {"mask", "0"}}, noMask},
        {{{"ip", "10.0.0.7"}, {"mask", "24;reboot"}}, noMask},
        {{{"ip", "10.0.0.7"}, {"router", "10.0.0.7 x 0.0.0.0 10.0.0.9"}}, "10.0.0.7/8 via 10.0.0.9"},
        {{{"ip", "10.0.0.7"}, {"dns", "nope 10.0.0.1  10.0.0.2\n6.6.6.6 10.0.0.3 10.0.0.4 10.0.0.5"}},
         "10.0.0.7/8 dns 10.0.0.1 dns 10.0.0.3 dns 10.0.0.4"},
        {{{"ip", "10.0.0.7"}, {"domain", "a\nnameserver"}}, "10.0.0.7/8"},
        {{{"ip", "10.0.0.7"}, {"search", "$(reboot) .x -n good.example " + std::string(254, 'y')}},
         "10.0.0.7/8 in good.example"},
    };
    for (const auto& row : rows) {
        EXPECT_EQ(row.lease, read(row.environment));
    }
}

}  // namespace
}  // namespace platform::apply
