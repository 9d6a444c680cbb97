#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <unistd.h>

#include <memory>
#include <optional>
#include <string>

#include "app/NetworkWatcher.h"
#include "morecfq/MoreCFQ.h"
#include "platform/Host.h"
#include "platform/live/NetworkState.h"
#include "platform/values/RunLoop.h"
#include "tests/unit/support/TemporaryDirectory.h"

namespace {

using namespace platform;

// A network whose primary route the test sets, with news on a pipe.
class Network : public live::NetworkState {
  public:
    Network() { EXPECT_EQ(pipe2(pipe_, O_NONBLOCK | O_CLOEXEC), 0); }
    ~Network() override {
        close(pipe_[0]);
        close(pipe_[1]);
    }
    void become(std::optional<live::PrimaryRoute> route) {
        route_ = std::move(route);
        EXPECT_EQ(write(pipe_[1], "!", 1), 1);
    }
    Outcome primaryRoute(std::optional<live::PrimaryRoute>& route) override {
        route = route_;
        return {};
    }
    Outcome routeTo(const live::Destination&, live::Route&) override { return {}; }
    Outcome subscribe(std::unique_ptr<live::Notices>& notices) override {
        if (refuses) {
            return {kSCStatusFailed, "no news today"};
        }
        notices = std::make_unique<News>(pipe_[0]);
        return {};
    }

    bool refuses = false;

  private:
    struct News : live::Notices {
        explicit News(int descriptor) : end(descriptor) {}
        [[nodiscard]] int descriptor() const noexcept override { return end; }
        bool drain() override {
            char byte = 0;
            return read(end, &byte, 1) == 1;
        }
        int end;
    };

    int pipe_[2] = {-1, -1};
    std::optional<live::PrimaryRoute> route_;
};

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
    std::shared_ptr<Network> network_ = std::make_shared<Network>();
    std::unique_ptr<HostOverride> override_;
};

TEST_F(NetworkWatcher, TellsWhatComesAndWhatGoes) {
    watchForNetworkChanges();
    network_->become(live::PrimaryRoute{"eth7", in_addr{htonl(0xC0A80001)}});
    EXPECT_EQ(traceOfOneRun(),
              "the network configuration changed!\n"
              "Main Key 0=\"State:/Network/Global/IPv4\"\n"
              "setting gIsNetworkReady to TRUE\n"
              "Main Key Dict:\n"
              "key=\"PrimaryInterface\", value=\"eth7\"\n"
              "key=\"Router\", value=\"192.168.0.1\"\n"
              "\n");
    EXPECT_TRUE(gIsNetworkReady);

    network_->become(std::nullopt);
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
    network_->become(live::PrimaryRoute{"eth7", std::nullopt});
    EXPECT_EQ(traceOfOneRun(), "");
    watchForNetworkChanges();
    network_->become(std::nullopt);
    EXPECT_NE(traceOfOneRun(), "") << "it watches again";
    stopWatchingForNetworkChanges();
}

TEST_F(NetworkWatcher, TracesStringsAsTheyAreAndReportsNotReadyBehindAMissingValue) {
    directory_.write(
        "preferences/preferences.plist",
        "<plist version=\"1.0\"><dict><key>CurrentSet</key><string>/Sets/0</string><key>Sets</key>"
        "<dict><key>0</key><dict><key>Network</key><dict><key>Global</key><dict><key>DNS</key>"
        "<dict><key>a\nb</key><string>c\n\"d\"</string><key>e</key><array><string>f\ng</string>"
        "</array></dict></dict></dict></dict></dict></dict></plist>");
    network_->become(live::PrimaryRoute{"eth7", std::nullopt});
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
    network_->refuses = true;
    testing::internal::CaptureStderr();
    watchForNetworkChanges();
    const std::string told = testing::internal::GetCapturedStderr();
    EXPECT_EQ(told,
              "could not register notification keys\nerror = Failed; the reason is in the system log\n");
    EXPECT_EQ(CFRunLoopRunInMode(kCFRunLoopDefaultMode, 0, true), kCFRunLoopRunFinished);
}

}  // namespace
