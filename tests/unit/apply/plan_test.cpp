// What a location asks of the interfaces, and a lease of the one that has it.
#include "platform/apply/Plan.h"

#include <gtest/gtest.h>

#include <numeric>

#include "platform/apply/Digest.h"
#include "platform/apply/direct/Lease.h"
#include "tests/unit/apply/Trees.h"
#include "tests/unit/support/Transcript.h"

namespace platform::apply {
namespace {

using Inputs = testing_support::Transcript::Inputs;

std::string describe(const std::vector<ManualAddress>& addresses, IPv4Address router,
                     const std::vector<IPv4Address>& servers, const std::vector<std::string>& domains) {
    std::string text;
    for (const ManualAddress& each : addresses) {
        text += " " + quad(each.address) + "/" + std::to_string(each.prefixLength);
    }
    text += router != 0 ? " via " + quad(router) : "";
    for (const IPv4Address server : servers) {
        text += " dns " + quad(server);
    }
    for (const std::string& domain : domains) {
        text += " in " + domain;
    }
    return text;
}

// Services, "device entries", or a whole tree: what each interface is to be, and what is wrong with the
// location.
std::string planOf(const Inputs& inputs) {
    const auto tree = inputs[0][0] == '{' ? readTree(inputs[0]) : makeTree(inputs);
    std::vector<Trouble> troubles;
    std::string text;
    for (const InterfacePlan& one : makePlan(tree.get(), troubles)) {
        static constexpr const char* methods[] = {" none", " manual", " dhcp"};
        text += (text.empty() ? "" : ", ") + one.name;
        text +=
            one.active ? " on " + std::to_string(one.rank) + methods[static_cast<int>(one.method)] : " off";
        text += describe(one.addresses, one.router, one.nameServers, one.searchDomains);
        text += one.dhcpClientID.empty() ? "" : " id " + std::to_string(one.dhcpClientID.size());
        if (const auto& wireless = one.wireless) {
            text += !wireless->powerEnabled ? " wireless" : *wireless->powerEnabled ? " power" : " no-power";
            text += wireless->network ? " '" + *wireless->network + "'" : "";
            text += wireless->key ? " key '" + testing_support::escaped(*wireless->key) + "'" : "";
        }
    }
    for (const Trouble& trouble : troubles) {
        text += " (" + trouble.interface + ": " + trouble.reason + ")";
    }
    return text;
}

// The environment of the DHCP client's program, "name=value": the lease, or why there is none.
std::string leaseOf(const Inputs& inputs) {
    Lease lease;
    for (const std::string& each : inputs) {
        setenv(each.substr(0, each.find('=')).c_str(), each.substr(each.find('=') + 1).c_str(), 1);
    }
    const Outcome outcome = leaseFromEnvironment(lease);
    for (const std::string& each : inputs) {
        unsetenv(each.substr(0, each.find('=')).c_str());
    }
    return outcome.ok() ? "lease" +
                              describe({lease.address}, lease.router, lease.nameService.servers,
                                       lease.nameService.domains) +
                              (lease.seconds == forever ? "" : " for " + std::to_string(lease.seconds))
                        : outcome.reason();
}

TEST(Digest, IsThatOfTheAlgorithmsAuthors) {
    std::array<std::uint8_t, 16> key{};
    std::string text(63, '\0');
    std::iota(key.begin(), key.end(), std::uint8_t{0});
    std::iota(text.begin(), text.end(), '\0');
    EXPECT_EQ(0x958a324ceb064572U, sipHash(key, text));
}

TEST(Plan, TrustsNoStoreAndNoServer) {
    testing_support::Transcript transcript("plans");
    transcript.replay("services in their order", planOf);
    transcript.replay("settings that cannot be used, and later services of the interface", planOf);
    transcript.replay("what a DHCP server says", leaseOf);
}

}  // namespace
}  // namespace platform::apply
