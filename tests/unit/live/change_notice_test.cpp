#include <algorithm>
#include <filesystem>

#include "tests/unit/live/Fixture.h"

namespace live_test {
namespace {

using ChangeNoticeTest = LiveTest;
using Notices = std::vector<std::string>;

TEST_F(ChangeNoticeTest, NewsThatComeFastCostFewLooks) {
    Watcher watcher(onlyGlobal);
    network->looks = 0;
    for (int i = 0; i < 90; ++i) {
        network->change(routeOver("eth" + std::to_string(i)));
        CFRunLoopRunInMode(kCFRunLoopDefaultMode, 0.001, 0);
    }
    watcher.waitFor(1000, 0.1);
    EXPECT_EQ(watcher.notices.back(), global + "{PrimaryInterface = eth89}");
    EXPECT_LT(network->looks, 60);
}

TEST_F(ChangeNoticeTest, ACommitOfThePreferencesIsNews) {
    network->primary = routeOver("eth0");
    Watcher watcher(onlyGlobal, "(Setup:/Network/Service/[^/]+/IPv4)");
    const std::string setup = "Setup:/Network/Service/0/IPv4";
    ASSERT_FALSE(std::filesystem::exists(directory.at("store"))) << "the folder has still to come";
    const auto watchStep = [&](const std::string& method, std::size_t expected) {
        watcher.notices.clear();
        writePreferences(
            "{CurrentSet = /Sets/0; NetworkServices = {0 = {Interface = {DeviceName = eth0}; IPv4 = "
            "{ConfigMethod = " +
            method + "}}}; Sets = {0 = {Network = {Service = {0 = {__LINK__ = /NetworkServices/0}}}}}}");
        watcher.waitFor(expected);
        std::ranges::sort(watcher.notices);
        return watcher.notices;
    };
    // The first-run tree's own service names no interface of this machine, so both change.
    EXPECT_EQ(watchStep("DHCP", 2), (Notices{setup + " = {ConfigMethod = DHCP}",
                                             global + "{PrimaryInterface = eth0; PrimaryService = 0}"}));
    EXPECT_EQ(watchStep("Manual", 1), Notices{setup + " = {ConfigMethod = Manual}"});
    EXPECT_EQ(watchStep("Manual", 0), Notices{});
    std::filesystem::remove_all(directory.at("store"));
    watcher.notices.clear();
    watcher.waitFor(2);
    EXPECT_EQ(watcher.notices.size(), 2U);
    EXPECT_EQ(watchStep("DHCP", 2).size(), 2U) << "the folder came anew";
}

TEST_F(ChangeNoticeTest, ALookThatFailsIsTakenAgain) {
    Watcher watcher(onlyGlobal);
    network->isFailing = true;
    network->change(routeOver("eth0"));
    watcher.waitFor(1, 0.1);
    EXPECT_TRUE(watcher.notices.empty());
    EXPECT_EQ(log, Notices{"watcher: told to fail"});
    network->isFailing = false;
    watcher.waitFor(1);
    EXPECT_EQ(watcher.notices, Notices{global + "{PrimaryInterface = eth0}"});
}

TEST_F(ChangeNoticeTest, NewKeysReplaceTheOldOnes) {
    Watcher watcher(onlyGlobal);
    const auto watch = [&](CFArrayRef keys, CFArrayRef patterns) {
        return SCDynamicStoreSetNotificationKeys(watcher.store.get(), keys, patterns) != 0 ? 0 : SCError();
    };
    network->primary = routeOver("eth0");
    EXPECT_EQ(watch(nullptr, nullptr), 0);
    network->change(routeOver("eth1"));
    watcher.waitFor(1, 0.1);
    EXPECT_TRUE(watcher.notices.empty());
    EXPECT_EQ(watch(arrayOf(onlyGlobal).get(), nullptr), 0);
    EXPECT_EQ(watch(nullptr, arrayOf("([)").get()), 1002);
    EXPECT_EQ(watch(arrayOf("(#1)").get(), nullptr), 1002);
    network->isFailing = true;
    EXPECT_EQ(watch(nullptr, arrayOf("(Setup:.*)").get()), 1001) << "the old keys stay";
    network->isFailing = false;
    network->change(routeOver("eth2"));
    watcher.waitFor(1);
    EXPECT_EQ(watcher.notices, Notices{global + "{PrimaryInterface = eth2}"});
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
