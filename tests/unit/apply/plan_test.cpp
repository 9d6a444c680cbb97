#include "platform/apply/Plan.h"

#include <arpa/inet.h>
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "tests/unit/apply/Trees.h"

namespace platform::apply {
namespace {

std::string quad(IPv4Address address) {
    char text[INET_ADDRSTRLEN] = "";
    inet_ntop(AF_INET, &address, text, sizeof text);
    return text;
}

// The plan in one line an interface.
std::string describe(const Plan& plan) {
    std::string text;
    for (const InterfacePlan& one : plan) {
        text += one.name + (one.active ? " on " + std::to_string(one.rank) : " off");
        if (one.active) {
            text += one.method == IPv4Method::manual ? " manual"
                    : one.method == IPv4Method::dhcp ? " dhcp"
                                                     : " none";
        }
        for (const ManualAddress& address : one.addresses) {
            text += " " + quad(address.address) + "/" + std::to_string(address.prefixLength);
        }
        text += one.router != 0 ? " via " + quad(one.router) : "";
        text += one.dhcpClientID.empty() ? "" : " id " + one.dhcpClientID;
        for (const IPv4Address server : one.nameServers) {
            text += " dns " + quad(server);
        }
        for (const std::string& domain : one.searchDomains) {
            text += " in " + domain;
        }
        if (one.wireless) {
            text += " wireless";
            text += one.wireless->powerEnabled ? (*one.wireless->powerEnabled ? " power" : " no-power") : "";
            text += one.wireless->network ? " '" + *one.wireless->network + "'" : "";
            text += one.wireless->key ? " key '" + *one.wireless->key + "'" : "";
        }
        text += "\n";
    }
    return text;
}

std::string entity(const std::string& protocol, const std::string& entries) {
    return "<key>" + protocol + "</key><dict>" + entries + "</dict>";
}
std::string text(const std::string& key, const std::string& value) {
    return "<key>" + key + "</key><string>" + value + "</string>";
}
std::string list(const std::string& key, const std::vector<std::string>& values) {
    std::string array = "<key>" + key + "</key><array>";
    for (const std::string& value : values) {
        array += "<string>" + value + "</string>";
    }
    return array + "</array>";
}

TEST(Plan, ReadsEveryKindOfService) {
    const Service air{"wlan0",
                      entity("AirPort", "<key>PowerEnabled</key><true/>" + text("PreferredNetwork", "näh") +
                                            "<key>AuthPassword</key><data>AGEA5Ng93gA=</data>") +
                          fixedService("", "10.0.0.2").entries};
    const Service off{"eth0", switchedOff + fixedService("").entries};
    const Service dhcp{"eth1", entity("IPv4", text("ConfigMethod", "DHCP") + text("DHCPClientID", "me")) +
                                   entity("DNS", list("ServerAddresses", {"10.0.0.53", "10.0.0.54"}) +
                                                     list("SearchDomains", {"example.org"}))};
    const Service several{"eth2",
                          entity("IPv4", text("ConfigMethod", "Manual") +
                                             list("Addresses", {"10.1.0.1", "172.16.0.1", "192.168.0.1"}) +
                                             list("SubnetMasks", {"255.255.255.255"}))};
    const Service quiet{"eth3", entity("IPv4", text("ConfigMethod", "Manual"))};
    const Service released{"eth4", entity("IPv4", text("ConfigMethod", "DHCP") + switchedOff)};
    const Service pppoe{"eth5", entity("IPv4", text("ConfigMethod", "PPP")) +
                                    entity("AirPort", "<key>PowerEnabled</key><integer>0</integer>")};
    std::vector<Trouble> troubles;
    const Plan plan = makePlan(makeTree({air, off, dhcp, several, quiet, released, pppoe}).get(), troubles);
    EXPECT_TRUE(troubles.empty());
    EXPECT_EQ(
        "wlan0 on 0 manual 10.0.0.2/24 via 192.0.0.192 wireless power 'näh' key 'aä\xF0\x9F\x98\x80'\n"
        "eth0 off\n"
        "eth1 on 1 dhcp id me dns 10.0.0.53 dns 10.0.0.54 in example.org\n"
        "eth2 on 2 manual 10.1.0.1/32 172.16.0.1/16 192.168.0.1/24\n"
        "eth3 on 3 manual\neth4 on 4 none\neth5 on 5 none wireless no-power\n",
        describe(plan));
}

TEST(Plan, TakesTheFirstActiveServiceOfAnInterface) {
    const Service eth = fixedService("eth0", "10.0.0.2");
    const Service off{"eth0", switchedOff};
    std::vector<Trouble> troubles;
    const Plan plan = makePlan(makeTree({off, {"eth1", ""}, eth, fixedService("eth0"), off}).get(), troubles);
    EXPECT_EQ("eth1 on 0 none\neth0 on 1 manual 10.0.0.2/24 via 192.0.0.192\n", describe(plan));
}

TEST(Plan, LeavesAnInterfaceWithUnusableSettingsToTheSystem) {
    struct Row {
        const char* wrong;
        Service service;
    };
    const auto manual = [](const std::string& entries) {
        return Service{"bad0", entity("IPv4", text("ConfigMethod", "Manual") + entries)};
    };
    const auto air = [](const std::string& entries) { return Service{"bad0", entity("AirPort", entries)}; };
    const auto dns = [](const std::string& entries) { return Service{"bad0", entity("DNS", entries)}; };
    const Row rows[] = {
        {"a method that is no string",
         {"bad0", entity("IPv4", "<key>ConfigMethod</key><integer>1</integer>")}},
        {"a number too large", manual(list("Addresses", {"10.0.0.256"}))},
        {"a string for the array", manual(text("Addresses", "10.0.0.1"))},
        {"a mask with a hole",
         manual(list("Addresses", {"10.0.0.1"}) + list("SubnetMasks", {"255.0.255.0"}))},
        {"a client ID of 255 bytes",
         {"bad0",
          entity("IPv4", text("ConfigMethod", "DHCP") + text("DHCPClientID", std::string(255, 'x')))}},
        {"a server by name", dns(list("ServerAddresses", {"dns.example.org"}))},
        {"a domain with a line break", dns(list("SearchDomains", {"a&#10;nameserver 6.6.6.6"}))},
        {"a network name of 33 bytes", air(text("PreferredNetwork", "&#228;" + std::string(31, 'x')))},
        {"a password as text", air(text("AuthPassword", "secret"))},
        {"half a surrogate pair", air("<key>AuthPassword</key><data>2D0AYQ==</data>")},
        {"a switch that is a word", air(text("PowerEnabled", "yes"))},
        {"a name with a slash", {"../eth0", ""}},
        {"the loopback", {"lo", switchedOff}},
    };
    for (const Row& row : rows) {
        SCOPED_TRACE(row.wrong);
        std::vector<Trouble> troubles;
        const Plan plan =
            makePlan(makeTree({fixedService("a0"), row.service, {"b0", switchedOff}}).get(), troubles);
        ASSERT_EQ(1U, troubles.size());
        EXPECT_EQ(row.service.device, troubles[0].interface);
        EXPECT_EQ("a0 on 0 manual 192.0.0.199/24 via 192.0.0.192\nb0 off\n", describe(plan));
    }
}

}  // namespace
}  // namespace platform::apply
