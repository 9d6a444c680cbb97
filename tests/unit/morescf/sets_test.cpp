#include "morescf/MoreSCFPortScanner.h"
#include "morescf/MoreSCFTree.h"
#include "tests/unit/morescf/Fixture.h"

namespace morescf_test {
namespace {

class SetsTest : public MoreSCFTest {
  protected:
    SetsTest() { setTree(twoSets); }
    ~SetsTest() override { MoreSCFSetPortNameCallback(nullptr); }

    // The keys of a top-level dictionary on disk.
    [[nodiscard]] static std::string keysOf(CFStringRef topLevel) {
        Output<CFArrayRef> keys;
        OSStatus err = MoreSCOpen(false, false);
        const auto dict =
            static_cast<CFDictionaryRef>(SCPreferencesGetValue(MoreSCGetSCPreferencesRef(), topLevel));
        EXPECT_EQ(0, CFQArrayCreateWithDictionaryKeys(dict, &keys));
        MoreSCClose(&err, false);
        return keys.shown();
    }
};

TEST_F(SetsTest, ListsAndNames) {
    Output<CFArrayRef> ids;
    Output<CFStringRef> text;
    CFIndex index = 77;
    EXPECT_EQ(0, MoreSCCopySetIDs(&ids, &index));
    EXPECT_EQ("(1, 2) 0", ids.shown() + " " + std::to_string(index));
    EXPECT_EQ(0, MoreSCCopyCurrentSet(&text));
    EXPECT_EQ("1", text.shown());
    EXPECT_EQ(0, MoreSCCopyUserVisibleNameOfSet(Str("2"), &text));
    EXPECT_EQ("Away", text.shown());

    // Whether it exists is for the apply to find out.
    EXPECT_EQ(kSCStatusNoKey, MoreSCSetCurrentSet(Str("gone")));
    index = 77;
    EXPECT_EQ(0, MoreSCCopySetIDs(&ids, &index));
    EXPECT_EQ(77, index);
    EXPECT_EQ(kSCStatusNoKey, MoreSCCopyUserVisibleNameOfSet(nullptr, &text));
    EXPECT_EQ("untouched", text.shown());
    EXPECT_NE(std::string::npos, tree().find("CurrentSet = /Sets/gone"));

    setTree("{Sets = {1 = {}}}");
    OSStatus err = MoreSCOpen(false, false);
    EXPECT_EQ(kSCStatusNoKey, MoreSCCopySetIDs(&ids, &index));
    EXPECT_EQ("null", ids.shown());
    EXPECT_EQ(0, MoreSCCopySetIDs(&ids, nullptr));
    EXPECT_EQ(0, MoreSCSetSetsDict(dictionary(read("{9 = {}}"))));
    EXPECT_EQ(0, MoreSCSetCurrentSet(Str("gone")));
    EXPECT_EQ("{Sets = {9 = {}}; CurrentSet = /Sets/gone}", at("/"));
    MoreSCClose(&err, false);
}

TEST_F(SetsTest, NullIsRefusedAndChangesNothing) {
    // Something that any sweep would remove.
    setTree(
        "{Sets = {1 = {Network = {Global = {IPv4 = {ServiceOrder = ()}}}}}; NetworkServices = {9 = {}}; "
        "CurrentSet = /Sets/1}");
    const std::string before = tree();
    Output<CFStringRef> id;
    OSStatus err = MoreSCOpen(false, false);
    EXPECT_EQ(-50, MoreSCSetCurrentSet(nullptr));
    EXPECT_EQ(-50, MoreSCDeleteSet(nullptr));
    EXPECT_EQ(-50, MoreSCDeleteService(nullptr, nullptr));
    EXPECT_EQ(-50, MoreSCRenameSet(nullptr, nullptr));
    EXPECT_EQ(-50, MoreSCSetSetsDict(nullptr));
    EXPECT_EQ(-50, MoreSCNewSet(nullptr, &id));
    EXPECT_EQ(-50, MoreSCNewService(nullptr, nullptr, &id));
    EXPECT_EQ("untouched", id.shown());
    EXPECT_EQ(0, MoreSCRenameSet(nullptr, CFSTR("marks the session")));
    MoreSCClose(&err, false);
    EXPECT_EQ(
        "{Sets = {1 = {Network = {Global = {IPv4 = {ServiceOrder = ()}}}; UserDefinedName = marks the "
        "session}}; NetworkServices = {9 = {}}; CurrentSet = /Sets/1}",
        tree());
}

// Dirty first runs included: without a file the store holds a location of its own.
TEST_F(SetsTest, MakesALocationFromThePorts) {
    (void)std::remove(directory.at("store/preferences.plist").c_str());
    Output<CFStringRef> id;
    EXPECT_EQ(0, MoreSCNewSet(CFSTR("bare"), &id));
    EXPECT_EQ("1", id.shown());
    OSStatus err = MoreSCOpen(false, false);
    EXPECT_EQ(
        "{Network = {Service = {}; Global = {IPv4 = {PPPOverridePrimary = #0; ServiceOrder = ()}; NetInfo = "
        "{}}}; UserDefinedName = bare}",
        at("/Sets/1"));
    MoreSCClose(&err, false);

    sysfs.addPciEthernet("eth0", "0000:03:00.0");
    sysfs.addPciWireless("wlan0", "0000:04:00.0");
    sysfs.addUsbSerial("ttyACM0", "1-2", "Modem of 1994");
    EXPECT_EQ(0, MoreSCNewSet(CFSTR("full"), &id));
    EXPECT_EQ("2", id.shown());
    EXPECT_EQ(0, MoreSCOpen(false, false));
    EXPECT_EQ(
        "{Network = {Service = {1 = {__LINK__ = /NetworkServices/1}; 2 = {__LINK__ = /NetworkServices/2}; 3 "
        "= "
        "{__LINK__ = /NetworkServices/3}}; Global = {IPv4 = {PPPOverridePrimary = #0; ServiceOrder = (1, 2, "
        "3)}; NetInfo = {}}}; UserDefinedName = full}",
        at("/Sets/2"));
    EXPECT_EQ(
        "{DeviceName = ttyACM0; UserDefinedName = Modem of 1994; Hardware = Modem; Type = PPP; SubType = "
        "PPPSerial}",
        at("/NetworkServices/1/Interface"));
    EXPECT_EQ(
        "{DeviceName = eth0; UserDefinedName = PCI Ethernet Slot 0000:03:00.0; Hardware = Ethernet; Type = "
        "Ethernet}",
        at("/NetworkServices/2/Interface"));
    EXPECT_EQ("{MACAddress = 02:00:00:00:00:03}", at("/NetworkServices/3/AirPort"));
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
    MoreSCFSetPortNameCallback(
        [](io_object_t, CFMutableDictionaryRef, CFStringRef, CFStringRef*) { return OSStatus{-77}; });
    EXPECT_EQ(-77, MoreSCNewSet(CFSTR("none"), nullptr));
    EXPECT_EQ(before, tree());
}

TEST_F(SetsTest, DuplicatesWithServicesOfItsOwn) {
    Output<CFStringRef> id;
    EXPECT_EQ(0, MoreSCDuplicateSet(Str("1"), nullptr, &id));
    EXPECT_EQ("3", id.shown());
    EXPECT_EQ(0, MoreSCDuplicateSet(nullptr, CFSTR("Third"), nullptr));
    OSStatus err = MoreSCOpen(false, false);
    EXPECT_EQ(
        "{UserDefinedName = Home; Network = {Service = {7 = {__LINK__ = /NetworkServices/7}; 8 = {__LINK__ = "
        "/NetworkServices/8}}; Global = {IPv4 = {PPPOverridePrimary = #0; ServiceOrder = (7, 8)}; NetInfo = "
        "{}}}}",
        at("/Sets/3"));
    EXPECT_EQ(at("/NetworkServices/6"), at("/NetworkServices/7"));
    EXPECT_EQ(at("/NetworkServices/5"), at("/NetworkServices/8"));
    EXPECT_EQ(0, MoreSCRenameService(Str("3"), Str("7"), CFSTR("Other")));
    EXPECT_NE(at("/NetworkServices/6"), at("/NetworkServices/7"));
    MoreSCClose(&err, false);
    EXPECT_EQ("(1, 2, 3, 4) (5, 6, 7, 8, 9, 10)",
              keysOf(CFSTR("Sets")) + " " + keysOf(CFSTR("NetworkServices")));

    // Service 5 of location 1 is gone: the copy of 6 has to go too.
    setTree(twoSets);
    err = MoreSCOpen(false, false);
    EXPECT_TRUE(SCPreferencesPathRemoveValue(MoreSCGetSCPreferencesRef(), CFSTR("/NetworkServices/5")));
    EXPECT_EQ(kSCStatusNoKey, MoreSCDuplicateSet(Str("1"), nullptr, &id));
    EXPECT_EQ("untouched", id.shown());
    EXPECT_EQ("null", at("/Sets/3"));
    EXPECT_EQ("null", at("/NetworkServices/7"));
    MoreSCClose(&err, false);
}

TEST_F(SetsTest, DeletesWithTheServicesThatNobodyListsAnyMore) {
    EXPECT_EQ(0, MoreSCSetCurrentSet(Str("2")));
    EXPECT_EQ(0, MoreSCDeleteSet(Str("1")));
    EXPECT_EQ("(2) (6)", keysOf(CFSTR("Sets")) + " " + keysOf(CFSTR("NetworkServices")));

    const std::string before = tree();
    EXPECT_EQ(-50, MoreSCDeleteSet(Str("2"))) << "the current one";
    EXPECT_EQ(kSCStatusNoKey, MoreSCDeleteSet(Str("1")));
    EXPECT_EQ(before, tree());
}

TEST_F(SetsTest, SweepsInAnyCaseButCommitsOnlyWithAnother) {
    setTree(
        "{Sets = {1 = {Network = {Service = {7 = {__LINK__ = /NetworkServices/7}}; Global = {IPv4 = "
        "{ServiceOrder = ()}}}}}; NetworkServices = {7 = {}; 8 = {}}; CurrentSet = /Sets/1}");
    const std::string before = tree();
    EXPECT_EQ(-50, MoreSCDeleteSet(Str("1")));
    EXPECT_EQ(before, tree());
    OSStatus err = MoreSCOpen(false, false);
    EXPECT_EQ(-50, MoreSCDeleteSet(Str("1")));
    EXPECT_EQ(0, MoreSCSetCurrentSet(Str("1")));
    MoreSCClose(&err, false);
    EXPECT_EQ("()", keysOf(CFSTR("NetworkServices"))) << "a service that is only linked goes too";
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
        {"{Sets = {1 = {UserDefinedName = {}; Network = ()}}; CurrentSet = /Sets/1}", 0, missing, 1001, 1004},
        {"{Sets = {1 = {Network = {Global = {IPv4 = (x)}}}; 2 = {}}; CurrentSet = /Sets/1}", 0, missing, 1001,
         1001},
        {"{Sets = {1 = {Network = {Global = {IPv4 = {ServiceOrder = 5}}}}; 2 = {}}; CurrentSet = /Sets/1}", 0,
         missing, missing, missing},
        {"{Sets = {1 = {Network = {Global = {IPv4 = {ServiceOrder = (#5)}}}}; 2 = {}}; CurrentSet = /Sets/1}",
         0, missing, missing, missing},
        {"{Sets = {1 = {Network = {Global = {IPv4 = {ServiceOrder = (5)}}; Service = {5 = {__LINK__ = "
         "abc}}}}; 2 = "
         "{}}; CurrentSet = /Sets/1}",
         0, missing, missing, missing},
        {"{Sets = {1 = {Network = {Global = {IPv4 = {ServiceOrder = ()}}}}; 2 = {}}; NetworkServices = (); "
         "CurrentSet = /Sets/1}",
         0, missing, 0, missing},
        {"{Sets = {1 = {Network = {Global = {IPv4 = {ServiceOrder = ()}}}}; 2 = {}}; CurrentSet = /Sets/1}",
         0, missing, 0, 1004},
        {"{Sets = {1 = {UserDefinedName = x; Network = {Global = {IPv4 = {ServiceOrder = ()}}}}; 2 = {}}; "
         "NetworkServices = {}; CurrentSet = #1}",
         missing, 0, 0, missing},
        {"{Sets = {1 = {UserDefinedName = x; Network = {Global = {IPv4 = {ServiceOrder = ()}}}}; 2 = {}}; "
         "NetworkServices = {}; CurrentSet = abc}",
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
