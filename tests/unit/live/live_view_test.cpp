#include <arpa/inet.h>
#include <netinet/in.h>

#include <cstring>

#include "tests/unit/live/Fixture.h"

namespace live_test {
namespace {

// Two locations; the current one links to six services, of which some lead nowhere or are switched off.
constexpr std::string_view preferences = R"(<plist version="1.0"><dict>
<key>CurrentSet</key><string>/Sets/1</string>
<key>NetworkServices</key><dict>
  <key>5</key><dict>
    <key>UserDefinedName</key><string>Wired</string>
    <key>Interface</key><dict><key>DeviceName</key><string>eth0</string></dict>
    <key>IPv4</key><dict><key>ConfigMethod</key><string>DHCP</string></dict>
    <key>DNS</key><dict/>
    <key>PPP</key><dict><key>__INACTIVE__</key><integer>1</integer></dict></dict>
  <key>6</key><dict>
    <key>Interface</key><dict><key>DeviceName</key><string>wlan0</string></dict>
    <key>IPv4</key><dict><key>ConfigMethod</key><string>Manual</string></dict></dict>
  <key>7</key><dict>
    <key>__INACTIVE__</key><integer>1</integer>
    <key>Interface</key><dict><key>DeviceName</key><string>eth1</string></dict>
    <key>IPv4</key><dict/></dict>
  <key>8</key><string>no dictionary</string>
  <key>9</key><dict>
    <key>Interface</key><dict><key>DeviceName</key><string>eth0</string></dict></dict>
  <key>20</key><dict>
    <key>Interface</key><dict><key>DeviceName</key><string>eth9</string></dict>
    <key>IPv4</key><dict/></dict>
</dict>
<key>Sets</key><dict>
  <key>1</key><dict><key>Network</key><dict>
    <key>Global</key><dict>
      <key>IPv4</key><dict><key>ServiceOrder</key><array>
        <integer>3</integer><string>9</string><string>5</string></array></dict>
      <key>NetInfo</key><dict><key>__INACTIVE__</key><integer>1</integer></dict></dict>
    <key>Service</key><dict>
      <key>5</key><dict><key>__LINK__</key><string>/NetworkServices/5</string></dict>
      <key>local</key><dict><key>__LINK__</key><string>/NetworkServices/6</string></dict>
      <key>7</key><dict><key>__LINK__</key><string>/NetworkServices/7</string></dict>
      <key>8</key><dict><key>__LINK__</key><string>/NetworkServices/8</string></dict>
      <key>9</key><dict><key>__LINK__</key><string>/NetworkServices/9</string></dict>
      <key>10</key><dict><key>__LINK__</key><string>/NetworkServices/10</string></dict>
      <key>11</key><dict><key>__LINK__</key><integer>5</integer></dict>
      <key>12</key><string>/NetworkServices/5</string></dict></dict></dict>
  <key>2</key><dict><key>Network</key><dict><key>Service</key><dict>
    <key>20</key><dict><key>__LINK__</key><string>/NetworkServices/20</string></dict></dict></dict></dict>
</dict></dict></plist>)";

class LiveViewTest : public LiveTest {
  protected:
    LiveViewTest() { writePreferences(preferences); }

    [[nodiscard]] std::string keys(std::string_view pattern) const {
        const auto list =
            Owned<CFArrayRef>::adopt(SCDynamicStoreCopyKeyList(store.get(), text(pattern).get()));
        return list ? platform::values::descriptionOf(list.get()) : "status " + std::to_string(SCError());
    }

    StoreRef store = openStore();
};

TEST_F(LiveViewTest, KeysAreWhatIsSwitchedOnInTheCurrentLocation) {
    network->primary = routeOver("eth0");
    EXPECT_EQ(keys(".*"),
              "(Setup:/Network/Global/IPv4, Setup:/Network/Service/5/DNS, Setup:/Network/Service/5/IPv4, "
              "Setup:/Network/Service/5/Interface, Setup:/Network/Service/9/Interface, "
              "Setup:/Network/Service/local/IPv4, Setup:/Network/Service/local/Interface, "
              "State:/Network/Global/IPv4)");
    EXPECT_EQ(keys("Setup:/Network/Service/[^/]+/IPv4"),
              "(Setup:/Network/Service/5/IPv4, Setup:/Network/Service/local/IPv4)");
}

TEST_F(LiveViewTest, PatternsMatchTheWholeKey) {
    network->primary = routeOver("eth0");
    const struct {
        std::string_view pattern;
        std::string_view keys;
    } rows[] = {
        {"State:/Network/Global/IPv4", "(State:/Network/Global/IPv4)"},
        {"State:/Network/Global/IPv", "()"},
        {"State:/Network|State:/Network/Global/IPv4", "(State:/Network/Global/IPv4)"},
        {"State:/Network/(Glob)?.*/IPv[0-9]{1}", "(State:/Network/Global/IPv4)"},
        {"", "()"},
        {"(", "status 1002"},
    };
    for (const auto& row : rows) {
        EXPECT_EQ(keys(row.pattern), row.keys) << row.pattern;
    }
}

TEST_F(LiveViewTest, SetupValuesAreTheStoredEntities) {
    const struct {
        std::string_view key;
        std::string_view value;
    } rows[] = {
        {"Setup:/Network/Service/5/IPv4", "{ConfigMethod = DHCP}"},
        {"Setup:/Network/Service/local/IPv4", "{ConfigMethod = Manual}"},
        {"Setup:/Network/Service/6/IPv4", "status 1004"},   // another name for it
        {"Setup:/Network/Service/5/PPP", "status 1004"},    // switched off
        {"Setup:/Network/Service/7/IPv4", "status 1004"},   // its service is switched off
        {"Setup:/Network/Service/10/IPv4", "status 1004"},  // its link leads nowhere
        {"Setup:/Network/Service/11/IPv4", "status 1004"},
        {"Setup:/Network/Service/20/IPv4", "status 1004"},  // of the other location
        {"Setup:/Network/Service/5", "status 1004"},
        {"Setup:/Network/Global/IPv4", "{ServiceOrder = (3, 9, 5)}"},
        {"State:/Network/Global/IPv4", "status 1004"},
        {"", "status 1004"},
    };
    for (const auto& row : rows) {
        EXPECT_EQ(valueAt(store.get(), row.key), row.value) << row.key;
    }
}

TEST_F(LiveViewTest, ThePrimaryServiceIsTheFirstInOrderThatNamesTheInterface) {
    const struct {
        PrimaryRoute route;
        std::string_view value;
    } rows[] = {
        {routeOver("eth0", 0xC00000C0),
         "{PrimaryInterface = eth0; Router = 192.0.0.192; PrimaryService = 9}"},
        {routeOver("wlan0"), "{PrimaryInterface = wlan0; PrimaryService = local}"},
        {routeOver("eth1", 0x0A000001), "{PrimaryInterface = eth1; Router = 10.0.0.1}"},  // switched off
        {routeOver("ppp0"), "{PrimaryInterface = ppp0}"},
        {routeOver("ppp\x1b[1m"), "{PrimaryInterface = ppp?[1m}"},
    };
    for (const auto& row : rows) {
        network->primary = row.route;
        EXPECT_EQ(valueAt(store.get(), globalKey), row.value);
    }
}

TEST_F(LiveViewTest, PreferencesThatAreNoneHideTheSetupKeysOnly) {
    network->primary = routeOver("eth0");
    writePreferences(
        "<plist version=\"1.0\"><dict><key>CurrentSet</key><string>/Sets/4</string></dict></plist>");
    EXPECT_EQ(keys(".*"), "(State:/Network/Global/IPv4)");
    writePreferences("garbage");
    EXPECT_EQ(valueAt(store.get(), globalKey), "{PrimaryInterface = eth0}");
    EXPECT_EQ(valueAt(store.get(), "Setup:/Network/Global/IPv4"), "status 1001");
    EXPECT_EQ(keys(".*"), "status 1001");
    network->isFailing = true;
    EXPECT_EQ(valueAt(store.get(), globalKey), "status 1001");
    EXPECT_EQ(log.back(), "tester: told to fail");
}

TEST_F(LiveViewTest, ReachabilityIsAskedOfTheNetwork) {
    SCNetworkConnectionFlags flags = 77;
    EXPECT_TRUE(SCNetworkCheckReachabilityByName("192.0.0.192", &flags));
    EXPECT_EQ(std::memcmp(network->asked.back().address.data(), "\xC0\0\0\xC0", 4), 0);
    EXPECT_TRUE(SCNetworkCheckReachabilityByName("fe80::1%1", &flags));
    EXPECT_EQ(network->asked.back().interfaceIndex, 1U);
    EXPECT_EQ(flags, 0U);
    network->isFailing = true;
    EXPECT_FALSE(SCNetworkCheckReachabilityByName("192.0.0.192", &flags));
    EXPECT_EQ(SCError(), 1001);
}

TEST_F(LiveViewTest, AnAddressOfTheWrongSizeOrKindIsNoQuestion) {
    sockaddr_in6 address{};
    address.sin6_family = AF_INET6;
    const auto* const any = reinterpret_cast<const sockaddr*>(&address);
    const struct {
        sa_family_t family;
        int length;
        bool isAsked;
    } rows[] = {{AF_INET, 16, true},  {AF_INET, 15, false},  {AF_INET, 0, false},  {AF_INET, -1, false},
                {AF_INET6, 28, true}, {AF_INET6, 16, false}, {AF_UNIX, 28, false}, {AF_UNSPEC, 16, false}};
    for (const auto& row : rows) {
        address.sin6_family = row.family;
        network->asked.clear();
        SCNetworkConnectionFlags flags = 77;
        EXPECT_EQ(SCNetworkCheckReachabilityByAddress(any, row.length, &flags) != 0, row.isAsked);
        EXPECT_EQ(SCError(), row.isAsked ? 0 : 1002);
        EXPECT_EQ(flags == 77, !row.isAsked);
        EXPECT_EQ(network->asked.size(), row.isAsked ? 1U : 0U);
    }
}

}  // namespace
}  // namespace live_test
