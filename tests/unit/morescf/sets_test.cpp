#include "morescf/MoreSCFPortScanner.h"
#include "tests/unit/morescf/Fixture.h"

namespace morescf_test {
namespace {

class SetsTest : public MoreSCFTest {
  protected:
    SetsTest() { setTree(twoSets); }
    ~SetsTest() override { MoreSCFSetPortNameCallback(nullptr); }
};

TEST_F(SetsTest, MakesALocationFromThePorts) {
    Output<CFStringRef> id;
    sysfs.addPciEthernet("eth0", "0000:03:00.0");
    sysfs.addPciWireless("wlan0", "0000:04:00.0");
    sysfs.addUsbSerial("ttyACM0", "1-2", "Modem of 1994");
    EXPECT_EQ(0, MoreSCNewSet(CFSTR("full"), &id));
    EXPECT_EQ("3", id.shown());
    OSStatus err = MoreSCOpen(false, false);
    EXPECT_EQ(
        "{Network = {Service = {7 = {__LINK__ = /NetworkServices/7}; 8 = {__LINK__ = /NetworkServices/8}; 9 "
        "= "
        "{__LINK__ = /NetworkServices/9}}; Global = {IPv4 = {PPPOverridePrimary = #0; ServiceOrder = (7, 8, "
        "9)}; NetInfo = {}}}; UserDefinedName = full}",
        at("/Sets/3"));
    EXPECT_EQ(
        "{DeviceName = ttyACM0; UserDefinedName = Modem of 1994; Hardware = Modem; Type = PPP; SubType = "
        "PPPSerial}",
        at("/NetworkServices/7/Interface"));
    EXPECT_EQ(
        "{DeviceName = eth0; UserDefinedName = PCI Ethernet Slot 0000:03:00.0; Hardware = Ethernet; Type = "
        "Ethernet}",
        at("/NetworkServices/8/Interface"));
    EXPECT_EQ("{MACAddress = 02:00:00:00:00:03}", at("/NetworkServices/9/AirPort"));
    MoreSCClose(&err, false);
}

TEST_F(SetsTest, AFailedPortLeavesNothingBehind) {
    sysfs.addPciEthernet("en0", "0000:03:00.0");
    sysfs.addPciEthernet("eth1", "0000:04:00.0");
    sysfs.addPciEthernet("eth2", "0000:05:00.0");
    const std::string before = tree();
    // A port that can be listed, but not be described: it has no type.
    MoreSCFSetPortNameCallback(
        [](io_object_t, CFMutableDictionaryRef port, CFStringRef name, CFStringRef* base) {
            if (CFEqual(CFDictionaryGetValue(port, CFSTR("DeviceName")), CFSTR("eth2"))) {
                CFDictionaryRemoveValue(port, CFSTR("Type"));
            }
            *base = CFStringCreateCopy(nullptr, name);
            return OSStatus{0};
        });
    Output<CFStringRef> id;
    EXPECT_EQ(-50, MoreSCNewSet(CFSTR("half"), &id));
    EXPECT_EQ("untouched", id.shown());
    EXPECT_EQ(before, tree());
}

// What somebody else may have written: a status for each, and the file stays.
TEST_F(SetsTest, WrongTypesAreMissingValues) {
    constexpr OSStatus missing = -4960;
    const struct {
        const char* tree;
        OSStatus listed;    // MoreSCCopySetIDs with the index
        OSStatus named;     // MoreSCCopyUserVisibleNameOfSet("1")
        OSStatus services;  // MoreSCCopyServiceIDs("1")
        OSStatus deleted;   // MoreSCDeleteSet("2")
    } rows[] = {
        {"{Sets = text; CurrentSet = /Sets/1}", missing, 1001, 1001, 1001},
        {"{Sets = {1 = text}; CurrentSet = /Sets/1}", 0, 1001, 1001, 1004},
        {"{Sets = {1 = {Network = {Global = {IPv4 = {ServiceOrder = (#5)}}}}; 2 = {}}; CurrentSet = /Sets/1}",
         0, missing, missing, missing},
        {"{Sets = {1 = {Network = {Global = {IPv4 = {ServiceOrder = (5)}}; Service = {5 = {__LINK__ = "
         "abc}}}}; 2 = "
         "{}}; CurrentSet = /Sets/1}",
         0, missing, missing, missing},
        {"{Sets = {1 = {Network = {Global = {IPv4 = {ServiceOrder = ()}}}}; 2 = {}}; NetworkServices = (); "
         "CurrentSet = /Sets/1}",
         0, missing, 0, missing},
        {"{Sets = {1 = {UserDefinedName = x; Network = {Global = {IPv4 = {ServiceOrder = ()}}}}; 2 = {}}; "
         "NetworkServices = {}; CurrentSet = #1}",
         missing, 0, 0, missing},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.tree);
        setTree(row.tree);
        Output<CFArrayRef> ids;
        Output<CFArrayRef> resolved;
        Output<CFStringRef> name;
        CFIndex index = -1;
        EXPECT_EQ(row.listed, MoreSCCopySetIDs(&ids, &index));
        EXPECT_EQ(row.named, MoreSCCopyUserVisibleNameOfSet(Str("1"), &name));
        EXPECT_EQ(row.services, MoreSCCopyServiceIDs(Str("1"), &ids, &resolved));
        EXPECT_EQ(row.deleted, MoreSCDeleteSet(Str("2")));
        EXPECT_EQ(row.tree, tree());
    }
}

}  // namespace
}  // namespace morescf_test
