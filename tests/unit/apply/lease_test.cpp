#include "platform/apply/direct/Lease.h"

#include <gtest/gtest.h>

#include "tests/unit/apply/Trees.h"

namespace platform::apply {
namespace {

// The lease in one line, or why there is none.
std::string read(const Environment& environment) {
    Lease lease;
    const Outcome outcome = leaseFromEnvironment(environment, lease);
    if (!outcome.ok()) {
        return outcome.reason();
    }
    std::string text = quad(lease.address.address) + "/" + std::to_string(lease.address.prefixLength);
    text += lease.router != 0 ? " via " + quad(lease.router) : "";
    text += quads(" dns ", lease.nameService.servers);
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
        {{{"mask", "24"},
          {"router", "10.0.0.1 10.0.0.2"},
          {"dns", "10.0.0.53 10.0.0.54"},
          {"domain", "example.org"},
          {"search", "a.example.org example.org"},
          {"lease", "3600"}},
         "10.0.0.7/24 via 10.0.0.1 dns 10.0.0.53 dns 10.0.0.54 in a.example.org in example.org for 3600"},
        {{}, "10.0.0.7/8"},
        {{{"ip", "172.16.0.7"}}, "172.16.0.7/16"},
        {{{"ip", "192.168.0.7"}}, "192.168.0.7/24"},
        {{{"lease", "4294967295"}, {"mask", "32"}}, "10.0.0.7/32"},
        {{{"ip", ""}}, noAddress},
        {{{"ip", "127.0.0.1"}}, noAddress},
        {{{"ip", "224.0.0.1"}}, noAddress},
        {{{"ip", "10.0.0.7 10.0.0.8"}}, noAddress},
        {{{"mask", "0"}}, noMask},
        {{{"mask", "24;reboot"}}, noMask},
        {{{"router", "10.0.0.7 x 0.0.0.0 10.0.0.9"}}, "10.0.0.7/8 via 10.0.0.9"},
        {{{"dns", "nope 10.0.0.1  10.0.0.2\n6.6.6.6 10.0.0.3 10.0.0.4 10.0.0.5"}},
         "10.0.0.7/8 dns 10.0.0.1 dns 10.0.0.3 dns 10.0.0.4"},
        {{{"domain", "a\nnameserver"}}, "10.0.0.7/8"},
        {{{"search", "$(reboot) .x -n good.example " + std::string(254, 'y')}}, "10.0.0.7/8 in good.example"},
    };
    for (const auto& row : rows) {
        Environment environment = row.environment;
        environment.emplace("ip", "10.0.0.7");
        EXPECT_EQ(row.lease, read(environment));
    }
}

}  // namespace
}  // namespace platform::apply
