#include "morescf/MoreSCFDigest.h"

#include <arpa/inet.h>

#include <cstring>

#include "tests/unit/morescf/Calls.h"

// NOLINTNEXTLINE(bugprone-macro-parentheses): an initializer.
#define BUILD(protocol, member, ...)                  \
    build(protocol " " #__VA_ARGS__, CFSTR(protocol), \
          [&](MoreSCDigest& digest) { digest.member = __VA_ARGS__; })

namespace morescf_test {
namespace {

class DigestTest : public MoreSCFTest {
  protected:
    template <class Fill>
    void build(const char* text, CFStringRef protocol, Fill fill) {
        MoreSCDigest digest;
        std::memset(&digest, 0, sizeof(digest));
        fill(digest);
        record(text, MoreSCCreateEntity, protocol, &digest);
    }
    template <class Create, class Union>
    void record(const std::string& text, Create create, CFStringRef protocol, const Union* from) {
        Output<CFMutableDictionaryRef> entity;
        const OSStatus err = create(protocol, from, &entity);
        EXPECT_EQ(err, create(protocol, from, nullptr)) << "an output that is not wanted";
        transcript.add(text + ": " + std::to_string(err) + "\n    " + entity.shown());
    }
    testing_support::Transcript transcript{"digests"};
};

TEST_F(DigestTest, EveryMemberHasItsKeyAndPlace) {
    const Value exceptions = read("(*.local)");
    const in_addr one = {inet_addr("192.0.0.1")}, two = {inet_addr("255.255.255.255")},
                  servers[] = {one, two};
    const CFStringRef domains[] = {CFSTR("example.org"), CFSTR("")}, lost[] = {CFSTR("example.org"), nullptr};
    const MoreSCPPPOptions options = {1, 1, 11, 1, 12, 0, 0, 13, 14, 0, 0, 1, 1};
    BUILD("Interface", interface, {CFSTR("d"), CFSTR("h"), CFSTR("v"), CFSTR("t"), CFSTR("s"), CFSTR("u")});
    BUILD("Interface", interface, {CFSTR("d"), CFSTR("h"), nullptr, nullptr, nullptr, CFSTR("u")});
    BUILD("Proxies", proxies,
          {arrayOf(exceptions), 1,   0, CFSTR("f"), 0,   1, nullptr,    70,  1, CFSTR("h"), 65535, 0,
           CFSTR("hs"),         443, 0, CFSTR("r"), 554, 1, CFSTR("s"), 1080});
    BUILD("AppleTalk", appleTalk, {1, CFSTR("Node"), 1, 65280, 255, CFSTR("z")});
    BUILD("AppleTalk", appleTalk, {0, CFSTR("Node"), 0, 1, 2, nullptr});
    BUILD("DNS", dns, {});
    BUILD("DNS", dns, {1, servers, 1, domains});
    BUILD("DNS", dns, {2, servers, 2, domains});
    BUILD("DNS", dns, {1, nullptr, 0, nullptr});
    BUILD("DNS", dns, {0, nullptr, 2, lost});
    BUILD("IPv4", ipv4, {CFSTR("Manual"), one, {}, two, CFSTR("c")});
    BUILD("IPv4", ipv4, {CFSTR("Manual"), {}, two, {}, nullptr});
    BUILD("IPv4", ipv4, {});
    BUILD("AirPort", airPort, {{0x00, 0x0A, 0x95, 0x9D, 0x68, 0x16}, CFSTR("net")});
    BUILD("Ethernet", ethernet, {{0x00, 0x0A, 0x95, 0x9D, 0x68, 0x16}});
    BUILD("Modem", modem, {CFSTR("s"), 0, 1, 1, 0});
    // The version is asked for on every build, also when the caller brings the options.
    for (const std::int32_t version : {0x1020, 0x101F}) {
        platform::Host old = host;
        old.systemVersion = version;
        const platform::HostOverride scope(old);
        BUILD("PPP", ppp, {1, CFSTR("u"), CFSTR("guest"), CFSTR("aé"), CFSTR("555"), CFSTR("556"), &options});
        BUILD("PPP", ppp, {});
    }
    const MoreSCDigest zeros = {}, *none = nullptr;
    const MoreSCGlobalDigest globalZeros = {}, *noGlobals = nullptr;
    for (const char* protocol : {"IPv4", "NetInfo", "Modem", "Modem ", ""}) {
        const Str name(protocol);
        record(std::string(protocol) + " of none", MoreSCCreateEntity, name, none);
        record(std::string(protocol) + " global", MoreSCCreateGlobalEntity, name, &globalZeros);
        record(std::string(protocol) + " global of none", MoreSCCreateGlobalEntity, name, noGlobals);
    }
    record("unknown", MoreSCCreateEntity, CFSTR("NetInfo"), &zeros);
    record("null", MoreSCCreateEntity, nullptr, &zeros);
    record("null global", MoreSCCreateGlobalEntity, nullptr, &globalZeros);
}

TEST(DigestConversions, MacAddressesAndPasswords) {
    const struct {
        const char* text;
        OSStatus err;
        const char* again;
    } addresses[] = {
        {"00:0A:95:9d:68:16", 0, "00:0a:95:9d:68:16"},
        {"0:a:95:9D:68:ff", 0, "00:0a:95:9d:68:ff"},
        {"00:0a:95:9d:68:16 ", -4960, nullptr},
        {"00:0a:95:9d:68", -1, nullptr},
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
    for (const auto& [password, stored] :
         {std::pair("", "<>"), {"x", "<0078>"}, {"\U0001F512", "<d83ddd12>"}}) {
        Output<CFDataRef> data;
        EXPECT_EQ(0, MoreSCFCopyEncodedPPPPassword(Str(password), &data));
        EXPECT_EQ(stored, data.shown());
    }
}

}  // namespace
}  // namespace morescf_test
