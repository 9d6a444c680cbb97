#include "morescf/MoreSCFHelpers.h"

#include "tests/unit/morescf/Fixture.h"

namespace morescf_test {
namespace {

class HelpersTest : public MoreSCFTest {
  protected:
    HelpersTest() { setTree(twoSets); }

    // The current location with services 5, 6, ... of these dictionaries.
    void setServices(const std::vector<const char*>& services) const {
        std::string links;
        std::string order;
        std::string all;
        int id = 5;
        for (const char* service : services) {
            const std::string key = std::to_string(id++);
            links += key + " = {__LINK__ = /NetworkServices/" + key + "};";
            order += key + ",";
            all += key + " = " + service + ";";
        }
        setTree("{CurrentSet = /Sets/1; Sets = {1 = {UserDefinedName = Home; Network = {Service = {" + links +
                "}; Global = {IPv4 = {ServiceOrder = (" + order + ")}}}}}; NetworkServices = {" + all + "}}");
    }
};

TEST_F(HelpersTest, AppleTalkIsOnWhereServiceAndEntityAre) {
    const struct {
        std::vector<const char*> services;
        OSStatus err;
        Boolean active;
    } rows[] = {
        {{}, 0, false},
        {{"{AppleTalk = {}}"}, 0, true},
        {{"{AppleTalk = {__INACTIVE__ = #1}}", "{AppleTalk = {}}", "{}"}, 0, true},
        {{"{__INACTIVE__ = #1; AppleTalk = {}}", "{AppleTalk = {__INACTIVE__ = #1}}"}, 0, false},
        {{"{}", "{AppleTalk = {}}"}, kSCStatusNoKey, false},
    };
    for (const auto& row : rows) {
        setServices(row.services);
        Boolean active = 7;
        EXPECT_EQ(row.err, MoreSCIsAppleTalkActive(nullptr, &active));
        EXPECT_EQ(row.active, active);
    }
}

TEST_F(HelpersTest, ListsTheServicesThatUseDHCP) {
    Output<CFArrayRef> ids;
    setServices({"{Interface = {DeviceName = eth0}; IPv4 = {ConfigMethod = PPP}}"});
    EXPECT_EQ(0, MoreSCCreateActiveDHCPServicesArray(&ids));
    EXPECT_EQ("()", ids.shown());
    setServices({"{IPv4 = {ConfigMethod = DHCP}}", "{IPv4 = {ConfigMethod = Manual}}",
                 "{IPv4 = {ConfigMethod = DHCP}}", "{DNS = {ConfigMethod = DHCP}}",
                 "{__INACTIVE__ = #1; IPv4 = {ConfigMethod = DHCP}}"});
    EXPECT_EQ(0, MoreSCCreateActiveDHCPServicesArray(&ids));
    EXPECT_EQ("(5, 7)", ids.shown());
    for (const char* method : {"{IPv4 = {}}", "{IPv4 = {ConfigMethod = (DHCP)}}"}) {
        setServices({"{IPv4 = {ConfigMethod = DHCP}}", method});
        EXPECT_EQ(-2, MoreSCCreateActiveDHCPServicesArray(&ids));
        EXPECT_EQ("null", ids.shown());
    }
}

TEST_F(HelpersTest, ReleaseIsTwoCommitsAndTwoApplies) {
    EXPECT_EQ(0, MoreSCDHCPRelease(Str("5")));
    EXPECT_EQ((std::vector<std::string>{"eth0: idle -> ours: none 0", "eth0: ours: none 0 -> ours: dhcp 0"}),
              agent->changes);
    EXPECT_EQ(std::string::npos, tree().find("__INACTIVE__"));

    agent->failing.insert("takeOver eth0");
    EXPECT_EQ(kSCStatusFailed, MoreSCDHCPRelease(Str("5")));
    EXPECT_NE(std::string::npos, tree().find("__INACTIVE__")) << "not switched on again after a failure";
    EXPECT_EQ(-50, MoreSCDHCPRelease(nullptr));
}

TEST_F(HelpersTest, FindsTheFirstLocationOfAName) {
    setTree(
        "{Sets = {4 = {UserDefinedName = home}; 3 = {UserDefinedName = Home}; 1 = {UserDefinedName = Home}; "
        "2 = {}}}");
    Output<CFStringRef> id;
    EXPECT_EQ(0, MoreSCFindSetByUserVisibleNameAndCopyID(CFSTR("Home"), &id));
    EXPECT_EQ("3", id.shown()) << "a nameless one behind it does not matter";
    EXPECT_EQ(-4960, MoreSCFindSetByUserVisibleNameAndCopyID(CFSTR("Away"), &id));
    setTree("{Sets = {4 = {UserDefinedName = home}}}");
    EXPECT_EQ(0, MoreSCFindSetByUserVisibleNameAndCopyID(CFSTR("Away"), &id));
    EXPECT_EQ("untouched", id.shown());
}

TEST_F(HelpersTest, WithoutAModemADialupLocationHasNothingOn) {
    sysfs.addPciEthernet("eth0", "0000:03:00.0");
    Output<CFStringRef> id;
    Boolean active = 7;
    EXPECT_EQ(0, MoreSCMakeNewDialupSet(nullptr, CFSTR("dial"), nullptr, nullptr, nullptr, nullptr, &id));
    EXPECT_EQ(0, MoreSCIsServiceActive(id, Str("7"), &active));
    EXPECT_FALSE(active);
}

TEST_F(HelpersTest, MakesADialupLocation) {
    sysfs.addPciEthernet("eth0", "0000:03:00.0");
    sysfs.addSerial("ttyS0");
    sysfs.addUsbSerial("ttyACM0", "1-2", "");
    const MoreSCPPPDigest ppp = {1, nullptr, CFSTR("guest"), nullptr, CFSTR("555"), nullptr, nullptr};
    const MoreSCModemDigest modem = {CFSTR("script"), 0, 0, 1, 0};
    MoreSCIPv4Digest ipv4 = {};
    ipv4.configMethod = CFSTR("Manual");
    const CFStringRef domain = CFSTR("example.org");
    const MoreSCDNSDigest dns = {0, nullptr, 1, &domain};
    const auto active = [](CFStringRef setID, const char* serviceID) {
        Boolean isActive = 7;
        EXPECT_EQ(0, MoreSCIsServiceActive(setID, Str(serviceID), &isActive));
        return isActive != 0;
    };

    Output<CFStringRef> id;
    EXPECT_EQ(0, MoreSCMakeNewDialupSet(nullptr, CFSTR("dial"), &modem, &ppp, &ipv4, &dns, &id));
    EXPECT_EQ("3", id.shown());
    EXPECT_TRUE(active(id, "7")) << "ttyACM0, the first modem";
    EXPECT_FALSE(active(id, "8"));
    EXPECT_FALSE(active(id, "9"));
    OSStatus err = MoreSCOpen(false, false);
    EXPECT_EQ(
        "{ConnectionScript = script; DataCompression = #0; DialMode = IgnoreDialTone; ErrorCorrection = #0; "
        "PulseDial = #1; Speaker = #0}",
        at("/NetworkServices/7/Modem"));
    EXPECT_EQ("{ConfigMethod = Manual}", at("/NetworkServices/7/IPv4"));
    EXPECT_EQ("{SearchDomains = (example.org)}", at("/NetworkServices/7/DNS"));
    EXPECT_EQ(0U, at("/NetworkServices/7/PPP").find("{DialOnDemand"));
    EXPECT_NE(std::string::npos, at("/NetworkServices/7/PPP").find("AuthName = guest"));
    MoreSCClose(&err, false);

    // By name, whatever comes first.
    setTree(twoSets);
    EXPECT_EQ(0, MoreSCMakeNewDialupSet(CFSTR("ttyS0"), CFSTR("dial"), nullptr, &ppp, nullptr, nullptr, &id));
    EXPECT_FALSE(active(id, "7"));
    EXPECT_TRUE(active(id, "8"));

    // A digest that cannot be used leaves nothing behind.
    const std::string before = tree();
    ipv4.configMethod = nullptr;
    EXPECT_EQ(-50, MoreSCMakeNewDialupSet(nullptr, CFSTR("none"), nullptr, &ppp, &ipv4, nullptr, &id));
    EXPECT_EQ("null", id.shown());
    EXPECT_EQ(before, tree());
}

}  // namespace
}  // namespace morescf_test
