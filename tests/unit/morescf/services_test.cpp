#include "tests/unit/morescf/Fixture.h"

namespace morescf_test {
namespace {

class ServicesTest : public MoreSCFTest {
  protected:
    ServicesTest() { setTree(twoSets); }

    // The new service's dictionary.
    [[nodiscard]] static std::string makeService(const char* port) {
        Output<CFStringRef> id;
        Output<CFDictionaryRef> service;
        EXPECT_EQ(0, MoreSCNewService(nullptr, dictionary(read(port)), &id));
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

TEST_F(ServicesTest, DeletingKeepsWhatAnotherLocationLists) {
    EXPECT_EQ(0, MoreSCDeleteService(nullptr, Str("6")));
    EXPECT_NE(std::string::npos, tree().find("6 = {UserDefinedName = Dial")) << "location 2 lists it";
    EXPECT_EQ(0, MoreSCDeleteService(Str("2"), Str("60")));
    EXPECT_EQ(std::string::npos, tree().find("Dial"));
}

TEST_F(ServicesTest, SwitchingAnEntityWritesOnlyAChange) {
    const struct {
        const char* protocol;
        Boolean active;
        OSStatus err;
        bool commits;
    } rows[] = {
        {"IPv4", true, 0, false}, {"IPv4", false, 0, true},      {"IPv4", false, 0, false},
        {"IPv4", true, 0, true},  {"Modem", false, 1004, false},
    };
    for (const auto& row : rows) {
        const std::string before = fileIdentity();
        EXPECT_EQ(row.err, MoreSCSetEntityActive(nullptr, Str("5"), Str(row.protocol), row.active));
        EXPECT_EQ(row.commits, before != fileIdentity()) << row.protocol;
        Boolean active = 9;
        EXPECT_EQ(row.err, MoreSCIsEntityActive(nullptr, Str("5"), Str(row.protocol), &active));
        EXPECT_EQ(row.err == 0 ? row.active : 9, active);
    }
}

}  // namespace
}  // namespace morescf_test
