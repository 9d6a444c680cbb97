#include <gtest/gtest.h>
#include <poll.h>
#include <unistd.h>

#include <memory>
#include <optional>
#include <string>

#include "app/NetworkWatcher.h"
#include "morecfq/MoreCFQ.h"
#include "platform/base/Host.h"
#include "platform/values/RunLoop.h"
#include "tests/unit/live/Fixture.h"
#include "tests/unit/support/Notation.h"
#include "tests/unit/support/TemporaryDirectory.h"
#include "tests/unit/support/Transcript.h"

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

    template <class Work>
    static void record(testing_support::Transcript& transcript, const char* what, Work work) {
        testing::internal::CaptureStdout();
        work();
        transcript.add(std::string("=== ") + what + "\n" + testing::internal::GetCapturedStdout());
    }
    static void recordOneRun(testing_support::Transcript& transcript, const char* what) {
        record(transcript, what, [] { CFRunLoopRunInMode(kCFRunLoopDefaultMode, 2, true); });
    }

    testing_support::TemporaryDirectory directory_;
    std::shared_ptr<live_test::FakeNetworkState> network_ = std::make_shared<live_test::FakeNetworkState>();
    std::unique_ptr<HostOverride> override_;
};

TEST_F(NetworkWatcher, TracesWhatComesAndWhatGoes) {
    testing_support::Transcript transcript("watcher");
    watchForNetworkChanges();
    network_->change(live::PrimaryRoute{"eth7", in_addr{htonl(0xC0A80001)}});
    recordOneRun(transcript, "a default route");
    EXPECT_TRUE(gIsNetworkReady);
    network_->change(std::nullopt);
    recordOneRun(transcript, "none");
    EXPECT_FALSE(gIsNetworkReady);

    // Stopped from within the run, it ends the run and hears nothing more.
    const values::Owned<CFRunLoopSourceRef> always =
        values::makeRunLoopSource(STDOUT_FILENO, POLLOUT, [](short) { stopWatchingForNetworkChanges(); });
    CFRunLoopAddSource(CFRunLoopGetCurrent(), always.get(), kCFRunLoopDefaultMode);
    EXPECT_EQ(CFRunLoopRunInMode(kCFRunLoopDefaultMode, 10, false), kCFRunLoopRunStopped);
    CFRunLoopRemoveSource(CFRunLoopGetCurrent(), always.get(), kCFRunLoopDefaultMode);
    network_->change(live::PrimaryRoute{"eth7", std::nullopt});
    recordOneRun(transcript, "stopped");

    // Strings are traced as they are; a key without a value leaves it not ready for all keys behind.
    directory_.write(
        "preferences/preferences.plist",
        "<plist version=\"1.0\"><dict><key>CurrentSet</key><string>/Sets/0</string><key>Sets</key>"
        "<dict><key>0</key><dict><key>Network</key><dict><key>Global</key><dict><key>DNS</key>"
        "<dict><key>a\nb</key><string>c\n\"d\"</string><key>e</key><array><string>f\ng</string>"
        "</array></dict></dict></dict></dict></dict></dict></plist>");
    const SCDynamicStoreRef session = SCDynamicStoreCreate(nullptr, CFSTR("test"), nullptr, nullptr);
    const testing_support::Value keys = testing_support::read(
        "(Setup:/Network/Global/DNS, State:/Network/Global/None, State:/Network/Global/IPv4)");
    record(transcript, "three keys",
           [&] { networkChanged(session, static_cast<CFArrayRef>(keys.get()), nullptr); });
    CFQRelease(session);
}

TEST_F(NetworkWatcher, AFailureToStartIsReportedInTwoLines) {
    network_->isFailing = true;
    testing::internal::CaptureStderr();
    watchForNetworkChanges();
    EXPECT_EQ(testing::internal::GetCapturedStderr(),
              "could not register notification keys\nerror = Failed; the reason is in the system log\n");
    EXPECT_EQ(CFRunLoopRunInMode(kCFRunLoopDefaultMode, 0, true), kCFRunLoopRunFinished);
}

}  // namespace
