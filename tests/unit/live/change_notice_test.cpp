#include <algorithm>
#include <filesystem>

#include "tests/unit/live/Fixture.h"

namespace live_test {
namespace {

using ChangeNoticeTest = LiveTest;

constexpr std::string_view noLocation = "<plist version=\"1.0\"><dict/></plist>";

std::string locationWith(std::string_view method) {
    return "<plist version=\"1.0\"><dict><key>CurrentSet</key><string>/Sets/0</string>"
           "<key>NetworkServices</key><dict><key>0</key><dict>"
           "<key>Interface</key><dict><key>DeviceName</key><string>eth0</string></dict>"
           "<key>IPv4</key><dict><key>ConfigMethod</key><string>" +
           std::string(method) +
           "</string></dict></dict></dict>"
           "<key>Sets</key><dict><key>0</key><dict><key>Network</key><dict><key>Service</key><dict>"
           "<key>0</key><dict><key>__LINK__</key><string>/NetworkServices/0</string></dict>"
           "</dict></dict></dict></dict></dict></plist>";
}

const std::string global(globalKey);

TEST_F(ChangeNoticeTest, AWatchedValueIsReportedWhenItChanged) {
    writePreferences(noLocation);
    network->primary = routeOver("eth0");
    Watcher watcher({globalKey, "State:/Network/Other"});
    watcher.waitFor(1, 0.05);
    EXPECT_TRUE(watcher.notices.empty()) << "nothing changed since it began to watch";
    network->change(routeOver("eth1", 0x0A000001));
    watcher.waitFor(1);
    network->change(network->primary);
    watcher.waitFor(2, 0.05);
    network->change(std::nullopt);
    watcher.waitFor(2);
    const std::vector<std::string> expected = {global + " = {PrimaryInterface = eth1; Router = 10.0.0.1}",
                                               global + " = status 1004"};
    EXPECT_EQ(watcher.notices, expected);
}

TEST_F(ChangeNoticeTest, ACommitOfThePreferencesIsNews) {
    network->primary = routeOver("eth0");
    Watcher watcher({globalKey}, {"Setup:/Network/Service/[^/]+/IPv4"});
    const std::string setup = "Setup:/Network/Service/0/IPv4";
    ASSERT_FALSE(std::filesystem::exists(directory.at("store"))) << "the folder has still to come";
    const auto watchStep = [&](std::string_view method, std::size_t expected) {
        watcher.notices.clear();
        writePreferences(locationWith(method));
        watcher.waitFor(expected);
        return watcher.notices;
    };
    const std::vector<std::string> appeared = {
        setup + " = {ConfigMethod = DHCP}",
        global + " = {PrimaryInterface = eth0; PrimaryService = 0}",
    };
    // The first-run tree's own service names no interface of this machine, so both change.
    std::vector<std::string> seen = watchStep("DHCP", 2);
    std::ranges::sort(seen);
    EXPECT_EQ(seen, appeared);
    EXPECT_EQ(watchStep("Manual", 1), std::vector<std::string>{setup + " = {ConfigMethod = Manual}"});
    EXPECT_EQ(watchStep("Manual", 0), std::vector<std::string>{});
    std::filesystem::remove_all(directory.at("store"));
    watcher.notices.clear();
    watcher.waitFor(2);
    EXPECT_EQ(watcher.notices.size(), 2U);
    EXPECT_EQ(watchStep("DHCP", 2).size(), 2U) << "the folder came anew";
}

TEST_F(ChangeNoticeTest, ALookThatFailsIsTakenAgain) {
    writePreferences(noLocation);
    Watcher watcher({globalKey});
    network->isFailing = true;
    network->change(routeOver("eth0"));
    watcher.waitFor(1, 0.1);
    EXPECT_TRUE(watcher.notices.empty());
    EXPECT_EQ(log, std::vector<std::string>{"watcher: told to fail"});
    network->isFailing = false;
    watcher.waitFor(1);
    EXPECT_EQ(watcher.notices, std::vector<std::string>{global + " = {PrimaryInterface = eth0}"});
}

TEST_F(ChangeNoticeTest, NewKeysReplaceTheOldOnes) {
    writePreferences(noLocation);
    Watcher watcher({globalKey});
    network->primary = routeOver("eth0");
    ASSERT_TRUE(SCDynamicStoreSetNotificationKeys(watcher.store.get(), nullptr, nullptr));
    network->change(routeOver("eth1"));
    watcher.waitFor(1, 0.1);
    EXPECT_TRUE(watcher.notices.empty());
    ASSERT_TRUE(SCDynamicStoreSetNotificationKeys(watcher.store.get(), arrayOf({globalKey}).get(), nullptr));
    EXPECT_FALSE(SCDynamicStoreSetNotificationKeys(watcher.store.get(), nullptr, arrayOf({"("}).get()));
    EXPECT_EQ(SCError(), 1002);
    network->change(routeOver("eth2"));
    watcher.waitFor(1);
    EXPECT_EQ(watcher.notices, std::vector<std::string>{global + " = {PrimaryInterface = eth2}"});
}

TEST_F(ChangeNoticeTest, TheContextLivesAsLongAsTheSession) {
    static int held = 0;
    SCDynamicStoreContext context{0, &held,
                                  [](const void* info) {
                                      ++held;
                                      return info;
                                  },
                                  [](const void* /*info*/) { --held; }, nullptr};
    StoreRef store = StoreRef::adopt(SCDynamicStoreCreate(nullptr, nullptr, nullptr, &context));
    auto source =
        Owned<CFRunLoopSourceRef>::adopt(SCDynamicStoreCreateRunLoopSource(nullptr, store.get(), 0));
    EXPECT_EQ(held, 1);
    store = {};
    EXPECT_EQ(held, 1) << "the source holds the session";
    source = {};
    EXPECT_EQ(held, 0);
}

}  // namespace
}  // namespace live_test
