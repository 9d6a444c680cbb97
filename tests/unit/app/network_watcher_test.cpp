#include <gtest/gtest.h>
#include <poll.h>
#include <unistd.h>

#include <memory>
#include <optional>
#include <string>

#include "app/NetworkWatcher.h"
#include "morecfq/MoreCFQ.h"
#include "platform/values/RunLoop.h"
#include "tests/unit/live/Fixture.h"

namespace {

using namespace platform;

class NetworkWatcher : public testing::Test {
  protected:
    NetworkWatcher() {
        Host host;
        host.preferencesDirectory = directory_.at("preferences");
        host.networkState = network_;
        override_ = std::make_unique<HostOverride>(host);
    }

    std::string traceOfOneRun() {
        testing::internal::CaptureStdout();
        CFRunLoopRunInMode(kCFRunLoopDefaultMode, 2, true);
        return testing::internal::GetCapturedStdout();
    }

    testing_support::TemporaryDirectory directory_;
    std::shared_ptr<live_test::FakeNetworkState> network_ = std::make_shared<live_test::FakeNetworkState>();
    std::unique_ptr<HostOverride> override_;
};

TEST_F(NetworkWatcher, TellsWhatComesAndWhatGoes) {
    watchForNetworkChanges();
    network_->change(live::PrimaryRoute{"eth7", in_addr{htonl(0xC0A80001)}});
    EXPECT_EQ(traceOfOneRun(),
              "the network configuration changed!\n"
              "Main Key 0=\"State:/Network/Global/IPv4\"\n"
              "setting gIsNetworkReady to TRUE\n"
              "Main Key Dict:\n"
              "key=\"PrimaryInterface\", value=\"eth7\"\n"
              "key=\"Router\", value=\"192.168.0.1\"\n"
              "\n");
    EXPECT_TRUE(gIsNetworkReady);

    network_->change(std::nullopt);
    EXPECT_EQ(traceOfOneRun(),
              "the network configuration changed!\n"
              "Main Key 0=\"State:/Network/Global/IPv4\"\n"
              "Main Key Dict is nil\n"
              "setting gIsNetworkReady to FALSE\n"
              "\n");
    EXPECT_FALSE(gIsNetworkReady);

    // Stopped from within the run, it ends the run and hears nothing more.
    const values::Owned<CFRunLoopSourceRef> always =
        values::makeRunLoopSource(STDOUT_FILENO, POLLOUT, [](short) { stopWatchingForNetworkChanges(); });
    CFRunLoopAddSource(CFRunLoopGetCurrent(), always.get(), kCFRunLoopDefaultMode);
    EXPECT_EQ(CFRunLoopRunInMode(kCFRunLoopDefaultMode, 10, false), kCFRunLoopRunStopped);
    CFRunLoopRemoveSource(CFRunLoopGetCurrent(), always.get(), kCFRunLoopDefaultMode);
    network_->change(live::PrimaryRoute{"eth7", std::nullopt});
    EXPECT_EQ(traceOfOneRun(), "");
}

TEST_F(NetworkWatcher, TracesStringsAsTheyAreAndReportsNotReadyBehindAMissingValue) {
    directory_.write(
        "preferences/preferences.plist",
        "<plist version=\"1.0\"><dict><key>CurrentSet</key><string>/Sets/0</string><key>Sets</key>"
        "<dict><key>0</key><dict><key>Network</key><dict><key>Global</key><dict><key>DNS</key>"
        "<dict><key>a\nb</key><string>c\n\"d\"</string><key>e</key><array><string>f\ng</string>"
        "</array></dict></dict></dict></dict></dict></dict></plist>");
    network_->change(live::PrimaryRoute{"eth7", std::nullopt});
    const SCDynamicStoreRef session = SCDynamicStoreCreate(nullptr, CFSTR("test"), nullptr, nullptr);
    CFMutableArrayRef keys = nullptr;
    ASSERT_EQ(CFQArrayCreateMutable(&keys), 0);
    CFArrayAppendValue(keys, CFSTR("Setup:/Network/Global/DNS"));
    CFArrayAppendValue(keys, CFSTR("State:/Network/Global/None"));
    CFArrayAppendValue(keys, CFSTR("State:/Network/Global/IPv4"));
    testing::internal::CaptureStdout();
    networkChanged(session, keys, nullptr);
    EXPECT_EQ(testing::internal::GetCapturedStdout(),
              "the network configuration changed!\n"
              "Main Key 0=\"Setup:/Network/Global/DNS\"\n"
              "setting gIsNetworkReady to TRUE\n"
              "Main Key Dict:\n"
              "key=\"a\nb\", value=\"c\n\"d\"\"\n"
              "key=\"e\", value=\"(f g)\"\n"
              "Main Key 1=\"State:/Network/Global/None\"\n"
              "Main Key Dict is nil\n"
              "setting gIsNetworkReady to FALSE\n"
              "Main Key 2=\"State:/Network/Global/IPv4\"\n"
              "setting gIsNetworkReady to FALSE\n"
              "\n");
    CFQRelease(keys);
    CFQRelease(session);
}

TEST_F(NetworkWatcher, FailureToStartIsToldInTwoLines) {
    network_->isFailing = true;
    testing::internal::CaptureStderr();
    watchForNetworkChanges();
    const std::string told = testing::internal::GetCapturedStderr();
    EXPECT_EQ(told,
              "could not register notification keys\nerror = Failed; the reason is in the system log\n");
    EXPECT_EQ(CFRunLoopRunInMode(kCFRunLoopDefaultMode, 0, true), kCFRunLoopRunFinished);
}

}  // namespace
