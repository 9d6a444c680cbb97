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

TEST_F(ServicesTest, AModemGetsTheDefaultScript) {
    const char* modem =
        "{UserDefinedName = Fax; DeviceName = ttyS9; Hardware = Modem; Type = PPP; SubType = PPPSerial; "
        "HardwareVariant = IrDA-IrCOMM}";
    const std::string start =
        "{UserDefinedName = Fax; Interface = {DeviceName = ttyS9; UserDefinedName = Fax; Hardware = Modem; "
        "Type = "
        "PPP; SubType = PPPSerial; HardwareVariant = IrDA-IrCOMM}; Proxies";
    const std::string middle =
        "DNS = {}; IPv4 = {ConfigMethod = PPP}; PPP = {DialOnDemand = #0; DisconnectOnIdle = #1; "
        "DisconnectOnIdleTimer = #600; ";
    for (const std::string script : {"", "Speedy"}) {
        setTree(twoSets);
        if (!script.empty()) {
            (void)directory.write("scripts/local/" + script, "");
        }
        const std::string made = makeService(modem);
        EXPECT_TRUE(made.starts_with(start)) << made;
        EXPECT_NE(std::string::npos, made.find(middle)) << made;
        EXPECT_TRUE(
            made.ends_with("Modem = {ConnectionScript = " + script +
                           "; DataCompression = #1; DialMode = WaitForDialTone; ErrorCorrection = #1; "
                           "PulseDial = #0; Speaker = #1}}"))
            << made;
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

}  // namespace
}  // namespace morescf_test
