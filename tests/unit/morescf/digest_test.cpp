#include "morescf/MoreSCFDigest.h"

#include <arpa/inet.h>

#include <cstring>

#include "tests/unit/morescf/Fixture.h"
#include "tests/unit/support/Transcript.h"

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

}  // namespace
}  // namespace morescf_test
