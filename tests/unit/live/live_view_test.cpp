#include <arpa/inet.h>

#include "tests/unit/live/Fixture.h"
#include "tests/unit/support/Transcript.h"

namespace live_test {
namespace {

// Two locations; the current one links to six services, of which some lead nowhere or are switched off.
constexpr std::string_view preferences =
    "{CurrentSet = /Sets/1; NetworkServices = {"
    "5 = {UserDefinedName = Wired; Interface = {DeviceName = eth0}; IPv4 = {ConfigMethod = DHCP}; DNS = {}; "
    "     PPP = {__INACTIVE__ = #1}};"
    "6 = {Interface = {DeviceName = wlan0}; IPv4 = {ConfigMethod = Manual}};"
    "7 = {__INACTIVE__ = #1; Interface = {DeviceName = eth1}; IPv4 = {}};"
    "8 = no dictionary;"
    "9 = {Interface = {DeviceName = eth0}};"
    "20 = {Interface = {DeviceName = eth9}; IPv4 = {}}};"
    "Sets = {1 = {Network = {Global = {IPv4 = {ServiceOrder = (#3, 9, 5)}; NetInfo = {__INACTIVE__ = #1}};"
    "                        Service = {5 = {__LINK__ = /NetworkServices/5};"
    "                                   local = {__LINK__ = /NetworkServices/6};"
    "                                   7 = {__LINK__ = /NetworkServices/7};"
    "                                   8 = {__LINK__ = /NetworkServices/8};"
    "                                   9 = {__LINK__ = /NetworkServices/9};"
    "                                   10 = {__LINK__ = /NetworkServices/10};"
    "                                   11 = {__LINK__ = #5};"
    "                                   12 = /NetworkServices/5}}};"
    "        2 = {Network = {Service = {20 = {__LINK__ = /NetworkServices/20}}}}}}";

using Inputs = testing_support::Transcript::Inputs;

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

TEST_F(LiveViewTest, ShowsWhatIsSwitchedOnInTheCurrentLocation) {
    testing_support::Transcript transcript("live_view");
    transcript.replay("stored entities", [this](const Inputs& key) { return valueAt(store.get(), key[0]); });
    transcript.replay("primary interfaces and routers", [this](const Inputs& route) {
        network->primary = routeOver(route[0], route.size() > 1 ? ntohl(inet_addr(route[1].c_str())) : 0);
        return valueAt(store.get(), globalKey);
    });
    transcript.replay("keys that match a pattern as a whole",
                      [this](const Inputs& pattern) { return keys(pattern[0]); });
}

TEST_F(LiveViewTest, PreferencesThatAreNoneHideTheSetupKeysOnly) {
    network->primary = routeOver("eth0");
    writePreferences("{CurrentSet = /Sets/4}");
    EXPECT_EQ(keys(".*"), "(State:/Network/Global/IPv4)");
    writePreferences("garbage");
    EXPECT_EQ(valueAt(store.get(), globalKey), "{PrimaryInterface = eth0}");
    EXPECT_EQ(valueAt(store.get(), "Setup:/Network/Global/IPv4"), "status 1001");
    EXPECT_EQ(keys(".*"), "status 1001");
    network->isFailing = true;
    EXPECT_EQ(valueAt(store.get(), globalKey), "status 1001");
    EXPECT_EQ(log.back(), "tester: told to fail");
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
    SCNetworkConnectionFlags flags = 77;
    network->isFailing = true;
    EXPECT_FALSE(SCNetworkCheckReachabilityByName("192.0.0.192", &flags));
    EXPECT_EQ(SCError(), 1001);
    EXPECT_EQ(flags, 77U);
}

}  // namespace
}  // namespace live_test
