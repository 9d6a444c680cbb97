#include "morescf/MoreSCFHelpers.h"

#include "tests/unit/morescf/Fixture.h"

namespace morescf_test {
namespace {

class HelpersTest : public MoreSCFTest {
  protected:
    HelpersTest() { setTree(twoSets); }
};

TEST_F(HelpersTest, ReleaseIsTwoCommitsAndTwoApplies) {
    EXPECT_EQ(0, MoreSCSetEntity(nullptr, Str("5"), CFSTR("DNS"), dictionary(read("{}"))));
    const std::size_t soFar = agent->changes.size();
    EXPECT_EQ(0, MoreSCDHCPRelease(Str("5")));
    ASSERT_EQ(soFar + 2, agent->changes.size());
    EXPECT_EQ("eth0: ours: dhcp 0 -> ours: none 0", agent->changes[soFar]);
    EXPECT_EQ("eth0: ours: none 0 -> ours: dhcp 0", agent->changes[soFar + 1]);
    EXPECT_EQ(std::string::npos, tree().find("__INACTIVE__"));

    agent->failing.insert("takeOver eth0");
    EXPECT_EQ(kSCStatusFailed, MoreSCDHCPRelease(Str("5")));
    EXPECT_NE(std::string::npos, tree().find("__INACTIVE__")) << "not switched on again after a failure";
    EXPECT_EQ(-50, MoreSCDHCPRelease(nullptr));
}

TEST_F(HelpersTest, MakesADialupLocation) {
    sysfs.addPciEthernet("eth0", "0000:03:00.0");
    sysfs.addSerial("ttyS0");
    sysfs.addUsbSerial("ttyACM0", "1-2", "");
    const MoreSCPPPDigest ppp = {1, nullptr, CFSTR("guest"), nullptr, CFSTR("555"), nullptr, nullptr};
    const MoreSCModemDigest modem = {CFSTR("script"), 0, 0, 1, 0};
    MoreSCIPv4Digest ipv4 = {};
    ipv4.configMethod = CFSTR("Manual");
    const MoreSCDNSDigest dns = {};
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
    EXPECT_EQ(0U, at("/NetworkServices/7/PPP").find("{DialOnDemand"));
    EXPECT_NE(std::string::npos, at("/NetworkServices/7/PPP").find("AuthName = guest"));
    MoreSCClose(&err, false);

    // A digest that cannot be used leaves nothing behind.
    const std::string before = tree();
    ipv4.configMethod = nullptr;
    EXPECT_EQ(-50, MoreSCMakeNewDialupSet(nullptr, CFSTR("none"), nullptr, &ppp, &ipv4, nullptr, &id));
    EXPECT_EQ("null", id.shown());
    EXPECT_EQ(before, tree());
}

}  // namespace
}  // namespace morescf_test
