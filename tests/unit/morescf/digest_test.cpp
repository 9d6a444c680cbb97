#include "morescf/MoreSCFDigest.h"

#include <arpa/inet.h>

#include <cstring>

#include "tests/unit/morescf/Fixture.h"

namespace morescf_test {
namespace {

class DigestTest : public MoreSCFTest {
  protected:
    template <class Fill>
    static std::string made(CFStringRef protocol, Fill fill) {
        MoreSCDigest digest;
        std::memset(&digest, 0, sizeof(digest));
        fill(digest);
        Output<CFMutableDictionaryRef> entity;
        const OSStatus err = MoreSCCreateEntity(protocol, &digest, &entity);
        EXPECT_EQ(err != 0, entity.shown() == "null" || entity.shown() == "untouched");
        return err == 0 ? entity.shown() : std::to_string(err);
    }
};

TEST_F(DigestTest, EveryMemberHasItsKeyAndPlace) {
    EXPECT_EQ(
        "{DeviceName = d; UserDefinedName = u; Hardware = h; Type = t; SubType = s; HardwareVariant = v}",
        made(CFSTR("Interface"), [](MoreSCDigest& digest) {
            digest.interface = {CFSTR("d"), CFSTR("h"), CFSTR("v"), CFSTR("t"), CFSTR("s"), CFSTR("u")};
        }));
    const Value exceptions = read("(*.local)");
    EXPECT_EQ(
        "{ExceptionsList = (*.local); FTPPassive = #1; FTPEnable = #0; FTPProxy = f; GopherEnable = #1; "
        "GopherPort = #70; HTTPEnable = #1; HTTPProxy = h; HTTPPort = #65535; HTTPSEnable = #0; HTTPSProxy = "
        "hs; HTTPSPort = #443; RTSPEnable = #0; RTSPProxy = r; RTSPPort = #554; SOCKSEnable = #1; SOCKSProxy "
        "= s; SOCKSPort = #1080}",
        made(CFSTR("Proxies"), [&](MoreSCDigest& digest) {
            digest.proxies = {array(exceptions), 1,     0, CFSTR("f"),  0,   1, nullptr,    70,  1,
                              CFSTR("h"),        65535, 0, CFSTR("hs"), 443, 0, CFSTR("r"), 554, 1,
                              CFSTR("s"),        1080};
        }));
    EXPECT_EQ("{ConfigMethod = Node; DefaultZone = z; NetworkID = #65280; NodeID = #255}",
              made(CFSTR("AppleTalk"), [](MoreSCDigest& digest) {
                  digest.appleTalk = {1, CFSTR("Node"), 1, 65280, 255, CFSTR("z")};
              }));
    in_addr servers[2];
    inet_aton("192.0.0.1", &servers[0]);
    inet_aton("255.255.255.255", &servers[1]);
    const CFStringRef domains[] = {CFSTR("example.org"), CFSTR("")};
    EXPECT_EQ("{ServerAddresses = (192.0.0.1, 255.255.255.255); SearchDomains = (example.org, )}",
              made(CFSTR("DNS"), [&](MoreSCDigest& digest) {
                  digest.dns = {2, servers, 2, domains};
              }));
    EXPECT_EQ("{ServerAddresses = (192.0.0.1); SearchDomains = (example.org)}",
              made(CFSTR("DNS"), [&](MoreSCDigest& digest) {
                  digest.dns = {1, servers, 1, domains};
              }));
    EXPECT_EQ("-50", made(CFSTR("DNS"), [](MoreSCDigest& digest) { digest.dns = {1, nullptr, 0, nullptr}; }));
    EXPECT_EQ("{ConfigMethod = Manual; DHCPClientID = c; Addresses = (192.0.0.1); Router = 255.255.255.255}",
              made(CFSTR("IPv4"), [&](MoreSCDigest& digest) {
                  digest.ipv4 = {CFSTR("Manual"), servers[0], {}, servers[1], CFSTR("c")};
              }));
    EXPECT_EQ("{MACAddress = 00:0a:95:9d:68:16; PreferredNetwork = net}",
              made(CFSTR("AirPort"), [](MoreSCDigest& digest) {
                  digest.airPort = {{0x00, 0x0A, 0x95, 0x9D, 0x68, 0x16}, CFSTR("net")};
              }));
    EXPECT_EQ(
        "{ConnectionScript = s; DataCompression = #0; DialMode = IgnoreDialTone; ErrorCorrection = #0; "
        "PulseDial "
        "= #1; Speaker = #1}",
        made(CFSTR("Modem"), [](MoreSCDigest& digest) {
            digest.modem = {CFSTR("s"), 0, 1, 1, 0};
        }));
}

TEST_F(DigestTest, PPPTakesTheOptionsOfTheCallerOrOfTheSystem) {
    const MoreSCPPPOptions options = {1, 1, 11, 1, 12, 0, 0, 13, 14, 0, 0, 1, 1};
    const MoreSCPPPDigest full = {
        1, CFSTR("u"), CFSTR("guest"), CFSTR("aé"), CFSTR("555"), CFSTR("556"), &options};
    const auto ppp = [](const MoreSCPPPDigest& digest) {
        Output<CFMutableDictionaryRef> entity;
        EXPECT_EQ(0, MoreSCCreatePPPEntity(&digest, &entity));
        return entity.shown();
    };
    EXPECT_EQ(
        "{UserDefinedName = u; DialOnDemand = #1; DisconnectOnIdle = #1; DisconnectOnIdleTimer = #12; "
        "DisconnectOnLogout = #0; IdleReminder = #1; IdleReminderTimer = #11; Logfile = /tmp/ppp.log; "
        "VerboseLogging = #1; AuthName = guest; AuthPassword = <006100e9>; CommAlternateRemoteAddress = 556; "
        "CommDisplayTerminalWindow = #1; CommRedialCount = #13; CommRedialEnabled = #0; CommRedialInterval = "
        "#14; "
        "CommRemoteAddress = 555; CommUseTerminalScript = #0; IPCPCompressionVJ = #0; LCPEchoEnabled = #0; "
        "LCPEchoFailure = #4; LCPEchoInterval = #10}",
        ppp(full));
    // The version is asked for on every build, also when the caller brings the options.
    platform::Host old = host;
    old.systemVersion = 0x101F;
    const platform::HostOverride scope(old);
    const std::string before = ppp(full);
    EXPECT_EQ(std::string::npos, before.find("CommUseTerminalScript"));
    EXPECT_NE(std::string::npos, before.find("LCPEchoFailure = #3"));
    EXPECT_EQ(
        "{__INACTIVE__ = #1; DialOnDemand = #0; DisconnectOnIdle = #1; DisconnectOnIdleTimer = #900; "
        "DisconnectOnLogout = #1; IdleReminder = #0; IdleReminderTimer = #1800; Logfile = /tmp/ppp.log; "
        "VerboseLogging = #0; CommDisplayTerminalWindow = #0; CommRedialCount = #1; CommRedialEnabled = #1; "
        "CommRedialInterval = #30; IPCPCompressionVJ = #1; LCPEchoEnabled = #1; LCPEchoFailure = #3; "
        "LCPEchoInterval = #10}",
        ppp({}));
    EXPECT_EQ(&kMoreSCPPPOptionsDefaultTenOne, MoreSCGetDefaultPPPOptions(true));
}

TEST_F(DigestTest, DispatchersAndMissingDigests) {
    const MoreSCDigest digest = {};
    const MoreSCGlobalDigest globals = {};
    const struct {
        CFStringRef protocol;
        const char* built;   // without a digest
        const char* global;  // with and without
    } rows[] = {
        {CFSTR("IPv4"), "-50 null", "0 {PPPOverridePrimary = #0; ServiceOrder = ()}"},
        {CFSTR("NetInfo"), "-1 untouched", "0 {}"},
        {CFSTR("Modem"), "-50 null", "-1 untouched"},
        {CFSTR("Modem "), "-1 untouched", "-1 untouched"},
        {nullptr, "-50 null", "-50 null"},
    };
    const auto built = [](auto create, CFStringRef protocol, auto* from) {
        Output<CFMutableDictionaryRef> entity;
        const OSStatus err = create(protocol, from, &entity);
        EXPECT_EQ(err, create(protocol, from, nullptr)) << "an output that is not wanted";
        return std::to_string(err) + " " + entity.shown();
    };
    const MoreSCDigest* none = nullptr;
    const MoreSCGlobalDigest* noGlobals = nullptr;
    for (const auto& row : rows) {
        EXPECT_EQ(row.built, built(MoreSCCreateEntity, row.protocol, none));
        if (std::string(row.built) == "-1 untouched") {
            EXPECT_EQ(row.built, built(MoreSCCreateEntity, row.protocol, &digest));
        }
        EXPECT_EQ(row.global, built(MoreSCCreateGlobalEntity, row.protocol, &globals));
        EXPECT_EQ(row.global, built(MoreSCCreateGlobalEntity, row.protocol, noGlobals));
    }
}

TEST_F(DigestTest, MacAddressesAndPasswords) {
    const struct {
        const char* text;
        OSStatus err;
        const char* again;
    } addresses[] = {
        {"00:0A:95:9d:68:16", 0, "00:0a:95:9d:68:16"},
        {"0:a:95:9D:68:ff", 0, "00:0a:95:9d:68:ff"},
        {"00:0a:95:9d:68:16 ", -4960, nullptr},
        {"00:0a:95:9d:68", -1, nullptr},
        {"00:0a:95:9d:68:", -1, nullptr},
        {"00-0a-95-9d-68-16", -1, nullptr},
        {"00:0a:95:9d:6é", -4960, nullptr},
        {"", -1, nullptr},
    };
    for (const auto& row : addresses) {
        UInt8 bytes[6] = {1, 2, 3, 4, 5, 6};
        EXPECT_EQ(row.err, MoreSCFStringToMacAddress(Str(row.text), bytes)) << row.text;
        Output<CFStringRef> again;
        EXPECT_EQ(0, MoreSCFCreateStringWithMacAddress(bytes, &again));
        EXPECT_EQ(row.err == 0 ? row.again : "01:02:03:04:05:06", again.shown());
    }
    const std::pair<const char*, const char*> passwords[] = {
        {"", "<>"}, {"x", "<0078>"}, {"aé", "<006100e9>"}, {"\U0001F512", "<d83ddd12>"}};
    for (const auto& [password, stored] : passwords) {
        Output<CFDataRef> data;
        EXPECT_EQ(0, MoreSCFCopyEncodedPPPPassword(Str(password), &data));
        EXPECT_EQ(stored, data.shown());
    }
}

}  // namespace
}  // namespace morescf_test
