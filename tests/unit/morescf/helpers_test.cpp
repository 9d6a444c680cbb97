#include "morescf/MoreSCFHelpers.h"

#include "tests/unit/morescf/Calls.h"

namespace morescf_test {
namespace {

using HelpersTest = CallsTest;

// The current location with services 5, 6, ... of these dictionaries.
std::string treeOf(const std::vector<const char*>& services) {
    std::string links, order, all;
    int id = 5;
    for (const char* service : services) {
        const std::string key = std::to_string(id++);
        links += key + " = {__LINK__ = /NetworkServices/" + key + "};";
        order += key + ",";
        all += key + " = " + service + ";";
    }
    return "{CurrentSet = /Sets/1; Sets = {1 = {Network = {Service = {" + links +
           "}; Global = {IPv4 = {ServiceOrder = (" + order + ")}}}}}; NetworkServices = {" + all + "}}";
}

TEST_F(HelpersTest, AppleTalkAndNames) {
    transcript = std::make_unique<testing_support::Transcript>("helpers");
    const Str s1("1"), home("Home");
    const std::vector<std::vector<const char*>> rows = {
        {},
        {"{AppleTalk = {}}"},
        {"{AppleTalk = {__INACTIVE__ = #1}}", "{AppleTalk = {}}", "{}"},
        {"{__INACTIVE__ = #1; AppleTalk = {}}", "{AppleTalk = {__INACTIVE__ = #1}}"},
        {"{}", "{AppleTalk = {}}"},
        {"{__INACTIVE__ = #1; AppleTalk = {__INACTIVE__ = #1}}", "{AppleTalk = {}}", "{}"}};
    for (const auto& services : rows) {
        const std::string tree = treeOf(services);
        on(tree.c_str(), tree.c_str());
        CALL(MoreSCIsAppleTalkActive(nullptr, &flag));
        CALL(MoreSCSetAppleTalkActive(nullptr, true));
        CALL(MoreSCSetAppleTalkActive(s1, false));
    }
    for (const char* tree :
         {"{Sets = {4 = {UserDefinedName = home}; 3 = {UserDefinedName = Home}; 1 = {UserDefinedName = "
          "Home}; 2 = "
          "{}}}",
          "{Sets = {2 = {}; 1 = {UserDefinedName = Home}}}", "{Sets = {4 = {UserDefinedName = home}}}"}) {
        on(tree, tree);
        CALL(MoreSCFindSetByUserVisibleNameAndCopyID(home, &string));
    }
    CALL(MoreSCFindSetByUserVisibleNameAndCopyID(nullptr, &string));
}

TEST_F(HelpersTest, DialupLocations) {
    transcript = std::make_unique<testing_support::Transcript>("dialup");
    const Str name("dial"), port("ttyS0");
    const MoreSCPPPDigest ppp = {1, nullptr, CFSTR("guest"), nullptr, CFSTR("555"), nullptr, nullptr};
    const MoreSCModemDigest modem = {CFSTR("script"), 0, 0, 1, 0};
    const MoreSCIPv4Digest ipv4 = {CFSTR("Manual"), {}, {}, {}, nullptr}, unusable = {};
    const CFStringRef domain = CFSTR("example.org");
    const MoreSCDNSDigest dns = {0, nullptr, 1, &domain};
    sysfs.addPciEthernet("eth0", "0000:03:00.0");
    on("no modem", "{Sets = {}; NetworkServices = {1 = {}}; CurrentSet = /Sets/1}");
    CALL(MoreSCMakeNewDialupSet(nullptr, name, nullptr, nullptr, nullptr, nullptr, &string));
    sysfs.addSerial("ttyS0");
    sysfs.addUsbSerial("ttyACM0", "1-2", "");
    on("two modems", twoSets);
    CALL(MoreSCMakeNewDialupSet(nullptr, name, &modem, &ppp, &ipv4, &dns, &string));
    CALL(MoreSCMakeNewDialupSet(port, name, nullptr, nullptr, nullptr, nullptr, nullptr));
    CALL(MoreSCMakeNewDialupSet(nullptr, name, nullptr, &ppp, &unusable, nullptr, &string));
}

TEST_F(HelpersTest, ListsTheServicesThatUseDHCP) {
    const auto listed = [this](const std::vector<const char*>& services) {
        setTree(treeOf(services));
        const OSStatus err = MoreSCCreateActiveDHCPServicesArray(&array);
        return std::to_string(err) + " " + array.shown();
    };
    EXPECT_EQ("0 ()", listed({"{Interface = {DeviceName = eth0}; IPv4 = {ConfigMethod = PPP}}"}));
    EXPECT_EQ("0 (5, 7)", listed({"{IPv4 = {ConfigMethod = DHCP}}", "{IPv4 = {ConfigMethod = Manual}}",
                                  "{IPv4 = {ConfigMethod = DHCP}}", "{DNS = {ConfigMethod = DHCP}}",
                                  "{__INACTIVE__ = #1; IPv4 = {ConfigMethod = DHCP}}"}));
    EXPECT_EQ("-2 null", listed({"{IPv4 = {ConfigMethod = DHCP}}", "{IPv4 = {}}"}));
    EXPECT_EQ("-2 null", listed({"{IPv4 = {ConfigMethod = (DHCP)}}"}));
}

TEST_F(HelpersTest, ReleaseIsTwoCommitsAndTwoApplies) {
    setTree(twoSets);
    EXPECT_EQ(0, MoreSCDHCPRelease(Str("5")));
    EXPECT_EQ((std::vector<std::string>{"eth0: idle -> ours: none 0", "eth0: ours: none 0 -> ours: dhcp 0"}),
              agent->changes);
    EXPECT_EQ(std::string::npos, tree().find("__INACTIVE__"));
    agent->failing.insert("takeOver eth0");
    EXPECT_EQ(kSCStatusFailed, MoreSCDHCPRelease(Str("5")));
    EXPECT_NE(std::string::npos, tree().find("__INACTIVE__")) << "not switched on again after a failure";
    EXPECT_EQ(-50, MoreSCDHCPRelease(nullptr));
}

}  // namespace
}  // namespace morescf_test
