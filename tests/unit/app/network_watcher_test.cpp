#include <gtest/gtest.h>
#include <poll.h>
#include <unistd.h>

#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "app/NetworkWatcher.h"
#include "morecfq/MoreCFQ.h"
#include "platform/base/Host.h"
#include "platform/values/PropertyListXML.h"
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

    // What comes out of the work, or of one turn of the run loop.
    void record(
        const char* what,
        const std::function<void()>& work = [] { CFRunLoopRunInMode(kCFRunLoopDefaultMode, 2, true); }) {
        testing::internal::CaptureStdout();
        work();
        transcript_.add(std::string("=== ") + what + "\n" + testing::internal::GetCapturedStdout());
    }

    testing_support::Transcript transcript_{"watcher"};
    testing_support::TemporaryDirectory directory_;
    std::shared_ptr<live_test::FakeNetworkState> network_ = std::make_shared<live_test::FakeNetworkState>();
    std::unique_ptr<HostOverride> override_;
};

TEST_F(NetworkWatcher, TracesWhatComesAndWhatGoes) {
    network_->isFailing = true;
    testing::internal::CaptureStderr();
    watchForNetworkChanges();
    transcript_.add("=== a failure to start\n" + testing::internal::GetCapturedStderr());
    EXPECT_EQ(CFRunLoopRunInMode(kCFRunLoopDefaultMode, 0, true), kCFRunLoopRunFinished);
    network_->isFailing = false;
    watchForNetworkChanges();
    network_->change(live::PrimaryRoute{"eth7", in_addr{htonl(0xC0A80001)}});
    record("a default route");
    EXPECT_TRUE(gIsNetworkReady);
    network_->change(std::nullopt);
    record("none");
    EXPECT_FALSE(gIsNetworkReady);

    // Stopped from within the run, it ends the run and hears nothing more.
    const values::Owned<CFRunLoopSourceRef> always =
        values::makeRunLoopSource(STDOUT_FILENO, POLLOUT, [](short) { stopWatchingForNetworkChanges(); });
    CFRunLoopAddSource(CFRunLoopGetCurrent(), always.get(), kCFRunLoopDefaultMode);
    EXPECT_EQ(CFRunLoopRunInMode(kCFRunLoopDefaultMode, 10, false), kCFRunLoopRunStopped);
    CFRunLoopRemoveSource(CFRunLoopGetCurrent(), always.get(), kCFRunLoopDefaultMode);
    network_->change(live::PrimaryRoute{"eth7", std::nullopt});
    record("stopped");

    // Strings are traced as they are; a key without a value leaves it not ready for all keys behind.
    const testing_support::Value tree = testing_support::read(
        "{CurrentSet = /Sets/0; Sets = {0 = {Network = {Global = {DNS = {a\nb = c\n\"d\"; e = (f\ng)}}}}}}");
    directory_.write("preferences/preferences.plist", *values::writePropertyListXML(tree.get()));
    const SCDynamicStoreRef session = SCDynamicStoreCreate(nullptr, CFSTR("test"), nullptr, nullptr);
    const testing_support::Value keys = testing_support::read(
        "(Setup:/Network/Global/DNS, State:/Network/Global/None, State:/Network/Global/IPv4)");
    record("three keys", [&] { networkChanged(session, static_cast<CFArrayRef>(keys.get()), nullptr); });
    CFQRelease(session);
}

}  // namespace
