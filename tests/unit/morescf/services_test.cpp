#include "tests/unit/morescf/Fixture.h"

namespace morescf_test {
namespace {

class ServicesTest : public MoreSCFTest {
  protected:
    ServicesTest() { setTree(twoSets); }

    // The new service's dictionary, or the status.
    [[nodiscard]] static std::string makeService(const char* port) {
        Output<CFStringRef> id;
        Output<CFDictionaryRef> service;
        const OSStatus err = MoreSCNewService(nullptr, dictionary(read(port)), &id);
        if (err != 0) {
            return std::to_string(err);
        }
        EXPECT_EQ("7", id.shown());
        EXPECT_EQ(0, MoreSCCopyEntitiesDict(nullptr, id, &service));
        return service.shown();
    }
};

constexpr const char* airPort =
    "{UserDefinedName = AirPort; DeviceName = wlan0; Hardware = AirPort; Type = Ethernet; SubType = unused; "
    "MACAddress = 00:0A:95:9D:68:16}";

TEST_F(ServicesTest, MakesWhatAPortNeeds) {
    EXPECT_EQ(
        "{UserDefinedName = AirPort; Interface = {DeviceName = wlan0; UserDefinedName = AirPort; Hardware = "
        "AirPort; "
        "Type = Ethernet}; Proxies = {FTPPassive = #1; FTPEnable = #0; GopherEnable = #0; HTTPEnable = #0; "
        "HTTPSEnable = #0; RTSPEnable = #0; SOCKSEnable = #0}; AppleTalk = {ConfigMethod = Node; "
        "__INACTIVE__ = #1}; "
        "DNS = {}; IPv4 = {ConfigMethod = Manual}; PPP = {__INACTIVE__ = #1; DialOnDemand = #0; "
        "DisconnectOnIdle = #0; "
        "DisconnectOnIdleTimer = #1800; DisconnectOnLogout = #1; IdleReminder = #0; IdleReminderTimer = "
        "#1800; Logfile "
        "= /tmp/ppp.log; VerboseLogging = #0; CommDisplayTerminalWindow = #0; CommRedialCount = #1; "
        "CommRedialEnabled "
        "= #1; CommRedialInterval = #5; CommUseTerminalScript = #0; IPCPCompressionVJ = #1; LCPEchoEnabled = "
        "#1; "
        "LCPEchoFailure = #4; LCPEchoInterval = #10}; AirPort = {MACAddress = 00:0a:95:9d:68:16}}",
        makeService(airPort));
    Output<CFDictionaryRef> links;
    Output<CFArrayRef> order;
    EXPECT_EQ(0, MoreSCCopyServicesDict(nullptr, &links, &order));
    EXPECT_EQ("(6, 5, 7)", order.shown());
    EXPECT_NE(std::string::npos, links.shown().find("7 = {__LINK__ = /NetworkServices/7}"));
}

TEST_F(ServicesTest, MakesAModemWithTheDefaultScript) {
    (void)directory.write("scripts/system/Another Modem", "");
    (void)directory.write("scripts/user/Apple Internal 56K Modem (v.90)", "");
    const std::string made = makeService(
        "{UserDefinedName = x; DeviceName = modem; Hardware = Modem; Type = PPP; SubType = PPPSerial; "
        "HardwareVariant = IrDA-IrCOMM}");
    for (const char* part :
         {"Type = PPP; SubType = PPPSerial; HardwareVariant = IrDA-IrCOMM}; Proxies = {",
          "}; DNS = {}; IPv4 = {ConfigMethod = PPP}; PPP = {DialOnDemand", "DisconnectOnIdleTimer = #600",
          "}; Modem = {ConnectionScript = Apple Internal 56K Modem (v.90); DataCompression = #1; DialMode = "
          "WaitForDialTone; ErrorCorrection = #1; PulseDial = #0; Speaker = #1}}"}) {
        EXPECT_NE(std::string::npos, made.find(part)) << part << " in " << made;
    }
}

TEST_F(ServicesTest, DefaultsFollowTheSystemVersion) {
    const struct {
        std::optional<std::int32_t> version;
        const char* method;
        const char* ftpPassive;
        const char* echoFailure;
    } rows[] = {
        {std::nullopt, "DHCP", "#0", "#3"}, {0x1012, "DHCP", "#0", "#3"},   {0x1013, "Manual", "#0", "#3"},
        {0x101F, "Manual", "#0", "#3"},     {0x1020, "Manual", "#1", "#4"},
    };
    for (const auto& row : rows) {
        setTree(twoSets);
        platform::Host old = host;
        old.systemVersion = row.version;
        const platform::HostOverride scope(old);
        const std::string made = makeService(
            "{UserDefinedName = x; DeviceName = eth9; Hardware = Ethernet; Type = Ethernet; MACAddress = "
            "00:0a:95:9d:68:16}");
        for (const std::string& part : {"IPv4 = {ConfigMethod = " + std::string(row.method) + "}",
                                        "FTPPassive = " + std::string(row.ftpPassive),
                                        "LCPEchoFailure = " + std::string(row.echoFailure),
                                        std::string("Ethernet = {MACAddress = 00:0a:95:9d:68:16}")}) {
            EXPECT_NE(std::string::npos, made.find(part)) << part << " in " << made;
        }
    }
}

TEST_F(ServicesTest, APortThatCannotBeUsedLeavesNothing) {
    const std::string before = tree();
    EXPECT_EQ("-50", makeService("{}"));
    EXPECT_EQ("-50", makeService("{UserDefinedName = x; DeviceName = eth0; Hardware = Ethernet}"));
    EXPECT_EQ("-50", makeService(
                         "{UserDefinedName = (x); DeviceName = eth0; Hardware = Ethernet; Type = Ethernet}"));
    EXPECT_EQ("-1",
              makeService("{UserDefinedName = x; DeviceName = eth0; Hardware = Ethernet; Type = Ethernet; "
                          "MACAddress = 00:0a}"));
    EXPECT_EQ("-4960",
              makeService("{UserDefinedName = x; DeviceName = eth0; Hardware = AirPort; Type = Ethernet; "
                          "MACAddress = 00:0a:95:9d:68:16:00}"));
    EXPECT_EQ(before, tree());
}

TEST_F(ServicesTest, ReadsByTheLocalID) {
    Output<CFArrayRef> local;
    Output<CFArrayRef> resolved;
    Output<CFStringRef> text;
    Boolean active = 0;
    EXPECT_EQ(0, MoreSCCopyServiceIDs(nullptr, &local, nullptr));
    EXPECT_EQ("(6, 5)", local.shown());
    EXPECT_EQ(0, MoreSCCopyServiceIDs(Str("2"), &local, &resolved));
    EXPECT_EQ("(60) (6)", local.shown() + " " + resolved.shown());
    EXPECT_EQ(0, MoreSCCopyServiceIDs(nullptr, nullptr, nullptr));
    EXPECT_EQ(0, MoreSCCopyUserVisibleNameOfService(Str("2"), Str("60"), &text));
    EXPECT_EQ("Dial", text.shown());
    EXPECT_EQ(0, MoreSCCopyBSDNameOfService(Str("2"), Str("60"), &text));
    EXPECT_EQ("ttyS0", text.shown());
    EXPECT_EQ(kSCStatusNoKey, MoreSCCopyBSDNameOfService(Str("2"), Str("6"), &text));

    EXPECT_EQ(0, MoreSCSetServiceActive(Str("2"), Str("60"), false));
    EXPECT_EQ(0, MoreSCIsServiceActive(Str("1"), Str("6"), &active));
    EXPECT_FALSE(active) << "shared by both locations";
    const std::string before = fileIdentity();
    EXPECT_EQ(0, MoreSCSetServiceActive(Str("1"), Str("6"), false));
    EXPECT_EQ(before, fileIdentity());
    EXPECT_EQ(0, MoreSCSetServiceActive(Str("1"), Str("6"), true));
    EXPECT_EQ(show(read(twoSets).get()), tree());
}

TEST_F(ServicesTest, ReplacesLinksAndOrderEachAlone) {
    Output<CFMutableDictionaryRef> links;
    Output<CFMutableArrayRef> order;
    EXPECT_EQ(0, MoreSCCopyServicesDictMutable(nullptr, &links, nullptr));
    CFDictionaryRemoveValue(links, CFSTR("5"));
    EXPECT_EQ(0, MoreSCSetServicesDict(nullptr, links, nullptr));
    EXPECT_EQ(0, MoreSCSetServicesDict(nullptr, nullptr, array(read("(6)"))));
    EXPECT_EQ(0, MoreSCCopyServicesDictMutable(nullptr, &links, &order));
    EXPECT_EQ("{6 = {__LINK__ = /NetworkServices/6}} (6)", links.shown() + " " + order.shown());
    setTree("{CurrentSet = /Sets/1; Sets = {1 = {Network = {Service = {}; Global = {IPv4 = {}}}}}}");
    Output<CFDictionaryRef> kept;
    EXPECT_EQ(0, MoreSCCopyServicesDict(nullptr, &kept, nullptr));
    EXPECT_EQ(-4960, MoreSCCopyServicesDictMutable(nullptr, &links, nullptr)) << "the order has to be there";
    EXPECT_EQ("null", links.shown());
}

TEST_F(ServicesTest, DuplicatesAndDeletes) {
    Output<CFStringRef> id;
    Output<CFArrayRef> order;
    EXPECT_EQ(0, MoreSCDuplicateService(nullptr, Str("5"), CFSTR("Twin"), &id));
    EXPECT_EQ("7", id.shown());
    EXPECT_EQ(0, MoreSCCopyServiceIDs(nullptr, &order, nullptr));
    EXPECT_EQ("(6, 5, 7)", order.shown());
    OSStatus err = MoreSCOpen(false, false);
    EXPECT_EQ(
        "{UserDefinedName = Twin; Interface = {DeviceName = eth0; Type = Ethernet}; IPv4 = {ConfigMethod = "
        "DHCP}}",
        at("/NetworkServices/7"));
    MoreSCClose(&err, false);
    EXPECT_EQ(kSCStatusNoKey, MoreSCDuplicateService(nullptr, Str("60"), nullptr, &id))
        << "the ID is a resolved one";
    EXPECT_EQ("untouched", id.shown());

    EXPECT_EQ(0, MoreSCDeleteService(nullptr, Str("7")));
    EXPECT_EQ(show(read(twoSets).get()), tree());
    EXPECT_EQ(0, MoreSCDeleteService(nullptr, Str("6")));
    EXPECT_NE(std::string::npos, tree().find("6 = {UserDefinedName = Dial")) << "location 2 lists it";
    EXPECT_EQ(0, MoreSCDeleteService(Str("2"), Str("60")));
    EXPECT_EQ(std::string::npos, tree().find("Dial"));
}

TEST_F(ServicesTest, DeletingOneThatIsLinkedButNotListedLeavesTheOrder) {
    EXPECT_EQ(0, MoreSCSetServicesDict(nullptr, nullptr, array(read("(5, 5)"))));
    EXPECT_EQ(0, MoreSCDeleteService(nullptr, Str("6")));
    Output<CFDictionaryRef> links;
    Output<CFArrayRef> order;
    EXPECT_EQ(0, MoreSCCopyServicesDict(nullptr, &links, &order));
    EXPECT_EQ("{5 = {__LINK__ = /NetworkServices/5}} (5, 5)", links.shown() + " " + order.shown());
}

}  // namespace
}  // namespace morescf_test
