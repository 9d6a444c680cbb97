#include "platform/apply/Plan.h"

#include <gtest/gtest.h>

#include "tests/unit/apply/Trees.h"

namespace platform::apply {
namespace {

// The plan in one line an interface.
std::string describe(const Plan& plan) {
    std::string text;
    for (const InterfacePlan& one : plan) {
        static constexpr const char* methods[] = {" none", " manual", " dhcp"};
        text += one.name + (one.active ? " on " + std::to_string(one.rank) : " off");
        text += one.active ? methods[static_cast<int>(one.method)] : "";
        for (const ManualAddress& address : one.addresses) {
            text += " " + quad(address.address) + "/" + std::to_string(address.prefixLength);
        }
        text += one.router != 0 ? " via " + quad(one.router) : "";
        text += one.dhcpClientID.empty() ? "" : " id " + one.dhcpClientID;
        text += quads(" dns ", one.nameServers);
        for (const std::string& domain : one.searchDomains) {
            text += " in " + domain;
        }
        if (const auto& wireless = one.wireless) {
            text += wireless->powerEnabled ? (*wireless->powerEnabled ? " power" : " no-power") : " wireless";
            text += wireless->network ? " '" + *wireless->network + "'" : "";
            text += wireless->key ? " key '" + *wireless->key + "'" : "";
        }
        text += "\n";
    }
    return text;
}

TEST(Plan, ReadsEveryKindOfService) {
    std::vector<Trouble> troubles;
    const Plan plan = makePlan(
        makeTree(
            {{"wlan0",
              "AirPort = {PowerEnabled = #true; PreferredNetwork = näh; AuthPassword = <006100E4D83DDE00>};"
              "IPv4 = {ConfigMethod = Manual; Addresses = (10.0.0.2); SubnetMasks = (255.255.255.0)};"},
             {"eth0", switchedOff + fixedService("").entries},
             {"eth1",
              "IPv4 = {ConfigMethod = DHCP; DHCPClientID = me};"
              "DNS = {ServerAddresses = (10.0.0.53, 10.0.0.54); SearchDomains = (example.org)};"},
             {"eth2",
              "IPv4 = {ConfigMethod = Manual; Addresses = (10.1.0.1, 172.16.0.1, 192.168.0.1);"
              "SubnetMasks = (255.255.255.255); Router = 10.1.0.9};"},
             {"eth3",
              "IPv4 = {ConfigMethod = Manual}; DNS = {ServerAddresses = (10.0.0.53); " + switchedOff + "};"},
             {"eth4", "IPv4 = {ConfigMethod = DHCP; " + switchedOff + "};"},
             {"eth5", "IPv4 = {ConfigMethod = PPP}; AirPort = {PowerEnabled = #0; AuthPassword = <>};"},
             // The first active service of an interface counts, wherever one that is off stands.
             {"eth6", switchedOff},
             {"eth6", ""},
             fixedService("eth6"),
             {"eth6", switchedOff},
             {"eth7", switchedOff},
             fixedService("*"),
             {"", "Interface = {DeviceName = modem; Type = PPP};"},
             {"abcdefghijklmno", switchedOff},
             {"eth7", switchedOff}})
            .get(),
        troubles);
    EXPECT_TRUE(troubles.empty());
    EXPECT_EQ(
        "wlan0 on 0 manual 10.0.0.2/24 power 'näh' key 'aä\xF0\x9F\x98\x80'\n"
        "eth0 off\n"
        "eth1 on 1 dhcp id me dns 10.0.0.53 dns 10.0.0.54 in example.org\n"
        "eth2 on 2 manual 10.1.0.1/32 172.16.0.1/16 192.168.0.1/24 via 10.1.0.9\n"
        "eth3 on 3 manual\neth4 on 4 none\neth5 on 5 none no-power\neth6 on 6 none\neth7 "
        "off\nabcdefghijklmno off\n",
        describe(plan));
}

TEST(Plan, LeavesAnInterfaceWithUnusableSettingsToTheSystem) {
    const auto manual = [](const std::string& entries) {
        return Service{"bad0", "IPv4 = {ConfigMethod = Manual; " + entries + "};"};
    };
    const auto air = [](const std::string& entries) {
        return Service{"bad0", "AirPort = {" + entries + "};"};
    };
    const struct {
        const char* wrong;
        Service service;
    } rows[] = {
        {"a method that is no string", {"bad0", "IPv4 = {ConfigMethod = #1};"}},
        {"a number too large", manual("Addresses = (10.0.0.256)")},
        {"an address of everybody", manual("Addresses = (0.0.0.0)")},
        {"an address of a group", manual("Addresses = (224.0.0.1)")},
        {"a string for the array", manual("Addresses = 10.0.0.1")},
        {"a mask with a hole", manual("Addresses = (10.0.0.1); SubnetMasks = (255.0.255.0)")},
        {"a router that is none", manual("Addresses = (10.0.0.1); Router = 255.255.255.255")},
        {"a client ID of 255 bytes",
         {"bad0", "IPv4 = {ConfigMethod = DHCP; DHCPClientID = " + std::string(255, 'x') + "};"}},
        {"a server by name", {"bad0", "DNS = {ServerAddresses = (dns.example.org)};"}},
        {"a domain with a line break", {"bad0", "DNS = {SearchDomains = (a\nnameserver 6.6.6.6)};"}},
        {"a domain of 254 bytes", {"bad0", "DNS = {SearchDomains = (" + std::string(254, 'x') + ")};"}},
        {"a network name of 33 bytes", air("PreferredNetwork = ä" + std::string(31, 'x'))},
        {"a network without a name", air("PreferredNetwork = ")},
        {"a password as text", air("AuthPassword = secret")},
        {"half a surrogate pair", air("AuthPassword = <D83D0061>")},
        {"the other half", air("AuthPassword = <DE00>")},
        {"half a pair at the end", air("AuthPassword = <0061D83D>")},
        {"a switch that is a word", air("PowerEnabled = yes")},
        {"a name with a slash", {"../eth0", ""}},
        {"a name of 16 bytes", {"abcdefghijklmnop", ""}},
        {"the loopback", {"lo", switchedOff}},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.wrong);
        std::vector<Trouble> troubles;
        // A later service of the interface does not get it instead.
        const Plan plan = makePlan(
            makeTree({fixedService("a0"), row.service, fixedService("bad0"), {"b0", switchedOff}}).get(),
            troubles);
        ASSERT_EQ(1U, troubles.size());
        EXPECT_EQ(row.service.device, troubles[0].interface);
        const std::string later =
            row.service.device == "bad0" ? "" : "bad0 on 1 manual 192.0.0.199/24 via 192.0.0.192\n";
        EXPECT_EQ("a0 on 0 manual 192.0.0.199/24 via 192.0.0.192\n" + later + "b0 off\n", describe(plan));
    }
}

}  // namespace
}  // namespace platform::apply
