#include "platform/apply/Plan.h"

#include <arpa/inet.h>
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "platform/apply/Digest.h"
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
    Plan plan;
    EXPECT_TRUE(makePlan(makeTree({air, off, dhcp, several, quiet, released, pppoe}).get(), plan).ok());
    EXPECT_EQ(
        "wlan0 on 0 manual 10.0.0.2/24 via 192.0.0.192 wireless power 'näh' key 'aä\xF0\x9F\x98\x80'\n"
        "eth0 off\n"
        "eth1 on 1 dhcp id me dns 10.0.0.53 dns 10.0.0.54 in example.org\n"
        "eth2 on 2 manual 10.1.0.1/32 172.16.0.1/16 192.168.0.1/24\n"
        "eth3 on 3 manual\neth4 on 4 none\neth5 on 5 none wireless no-power\n",
        describe(plan));
}

TEST(Plan, LeavesOutWhatAsksForNothing) {
    const Service eth = fixedService("eth0", "10.0.0.2");
    Service modem = fixedService("ttyS0");
    modem.interfaceEntries = text("Type", "PPP");
    Service unordered = fixedService("eth1");
    unordered.isOrdered = false;
    Service unlinked = fixedService("eth2");
    unlinked.isLinked = false;
    Service noPort = fixedService("eth3");
    noPort.interfaceEntries = switchedOff;
    Plan plan;
    EXPECT_TRUE(
        makePlan(makeTree({fixedService("*"), modem, unordered, unlinked, noPort, eth}).get(), plan).ok());
    EXPECT_EQ("eth0 on 0 manual 10.0.0.2/24 via 192.0.0.192\n", describe(plan));

    // The first active service of an interface counts, wherever it stands.
    const Service off{"eth0", switchedOff};
    EXPECT_TRUE(makePlan(makeTree({off, {"eth1", ""}, eth, fixedService("eth0"), off}).get(), plan).ok());
    EXPECT_EQ("eth1 on 0 none\neth0 on 1 manual 10.0.0.2/24 via 192.0.0.192\n", describe(plan));
}

TEST(Plan, FailsForSettingsThatCannotBeUsed) {
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
        {"three numbers", manual(list("Addresses", {"10.0.1"}))},
        {"a number too large", manual(list("Addresses", {"10.0.0.256"}))},
        {"a word behind it", manual(list("Addresses", {"10.0.0.1 x"}))},
        {"the empty address", manual(list("Addresses", {"0.0.0.0"}))},
        {"a group's address", manual(list("Addresses", {"224.0.0.1"}))},
        {"a string for the array", manual(text("Addresses", "10.0.0.1"))},
        {"a mask with a hole",
         manual(list("Addresses", {"10.0.0.1"}) + list("SubnetMasks", {"255.0.255.0"}))},
        {"a router that is an array", manual(list("Router", {"10.0.0.1"}))},
        {"a client ID of 255 bytes",
         {"bad0",
          entity("IPv4", text("ConfigMethod", "DHCP") + text("DHCPClientID", std::string(255, 'x')))}},
        {"a server by name", dns(list("ServerAddresses", {"dns.example.org"}))},
        {"a domain with a line break", dns(list("SearchDomains", {"a&#10;nameserver 6.6.6.6"}))},
        {"an empty network name", air(text("PreferredNetwork", ""))},
        {"a network name of 33 bytes", air(text("PreferredNetwork", "&#228;" + std::string(31, 'x')))},
        {"a password as text", air(text("AuthPassword", "secret"))},
        {"half a character", air("<key>AuthPassword</key><data>AGE9</data>")},
        {"half a surrogate pair", air("<key>AuthPassword</key><data>2D0AYQ==</data>")},
        {"a switch that is a word", air(text("PowerEnabled", "yes"))},
        {"a name of 16 bytes", {"abcdefghijklmnop", ""}},
        {"a name with a slash", {"../eth0", ""}},
        {"the loopback", {"lo", switchedOff}},
    };
    for (const Row& row : rows) {
        SCOPED_TRACE(row.wrong);
        Plan plan;
        const Outcome made =
            makePlan(makeTree({fixedService("a0"), row.service, {"b0", switchedOff}}).get(), plan);
        EXPECT_EQ(kSCStatusFailed, made.status());
        EXPECT_NE(std::string::npos, made.reason().find(row.service.device)) << made.reason();
        EXPECT_EQ("a0 on 0 manual 192.0.0.199/24 via 192.0.0.192\nb0 off\n", describe(plan));
    }
}

TEST(Plan, SurvivesTreesOfEveryShape) {
    const struct {
        const char* tree;
        int status;
    } rows[] = {
        {"", kSCStatusNoKey},
        {"<key>CurrentSet</key><string>/Sets/7</string>", kSCStatusNoKey},
        {"<key>CurrentSet</key><integer>7</integer>", kSCStatusNoKey},
        {"<key>CurrentSet</key><string>Sets/7</string><key>Sets</key><dict><key>7</key><dict/></dict>",
         kSCStatusNoKey},
        {"<key>CurrentSet</key><string>/Sets/7/Network</string><key>Sets</key><dict><key>7</key><dict/></"
         "dict>",
         kSCStatusNoKey},
        {"<key>CurrentSet</key><string>/Sets/7</string><key>Sets</key><string>7</string>", kSCStatusNoKey},
        {"<key>CurrentSet</key><string>/Sets/7</string><key>Sets</key><dict><key>7</key><array/></dict>",
         kSCStatusNoKey},
        {"<key>CurrentSet</key><string>/Sets/7</string><key>Sets</key><dict><key>7</key><dict/></dict>",
         kSCStatusOK},
        {"<key>CurrentSet</key><string>/Sets/7</string><key>Sets</key><dict><key>7</key><dict><key>Network</"
         "key><dict>"
         "<key>Service</key><integer>1</integer><key>Global</key><dict><key>IPv4</"
         "key><dict><key>ServiceOrder</key>"
         "<array><integer>1</integer><string></string><string>1</string><dict/></array></dict></dict></"
         "dict></dict>"
         "</dict><key>NetworkServices</key><array/>",
         kSCStatusOK},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.tree);
        Plan plan{InterfacePlan{}};
        EXPECT_EQ(row.status, makePlan(parseTree(row.tree).get(), plan).status());
        EXPECT_TRUE(plan.empty());
    }
}

TEST(Plan, AsAPropertyListTellsPlansApartWithoutTheKey) {
    const Salt salt{1, 2, 3};
    InterfacePlan plan;
    plan.name = "wlan0";
    plan.active = true;
    plan.wireless = WirelessSettings{true, "net", "a canary"};
    const auto same = [&salt](const InterfacePlan& lhs, const InterfacePlan& rhs, const Salt& other) {
        const auto left = values::Owned<CFDictionaryRef>::adopt(copyPlanAsPropertyList(lhs, salt));
        const auto right = values::Owned<CFDictionaryRef>::adopt(copyPlanAsPropertyList(rhs, other));
        return CFEqual(left.get(), right.get()) != 0;
    };
    EXPECT_TRUE(same(plan, plan, salt));
    EXPECT_FALSE(same(plan, plan, Salt{9}));
    InterfacePlan other = plan;
    other.wireless->key = "a canarz";
    EXPECT_FALSE(same(plan, other, salt));
    other = plan;
    other.rank = 1;
    EXPECT_FALSE(same(plan, other, salt));
    const auto written = values::writePropertyListXML(
        values::Owned<CFDictionaryRef>::adopt(copyPlanAsPropertyList(plan, salt)).get());
    ASSERT_TRUE(written);
    EXPECT_EQ(std::string::npos, written->find("canary"));
}

// The first of the published vectors, and one with a length beyond a word.
TEST(Digest, IsSipHash) {
    std::array<std::uint8_t, 16> key{};
    std::string text;
    for (std::uint8_t i = 0; i < 16; ++i) {
        key[i] = i;
    }
    EXPECT_EQ(0x726FDB47DD0E0E31U, sipHash(key, ""));
    for (char c = 0; c < 15; ++c) {
        text += c;
    }
    EXPECT_EQ(0xA129CA6149BE45E5U, sipHash(key, text));
}

}  // namespace
}  // namespace platform::apply
