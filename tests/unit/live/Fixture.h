// A network that the test makes up, in place of the kernel's.
#pragma once

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

#include <memory>
#include <optional>
#include <utility>
#include <vector>

#include "platform/live/NetworkState.h"

namespace live_test {

class FakeNetworkState : public platform::live::NetworkState {
  public:
    std::optional<platform::live::PrimaryRoute> primary;
    bool isFailing = false;
    int looks = 0;
    std::vector<platform::live::Destination> asked;

    FakeNetworkState() { EXPECT_EQ(socketpair(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0, ends_), 0); }
    ~FakeNetworkState() override {
        close(ends_[0]);
        close(ends_[1]);
    }

    void change(std::optional<platform::live::PrimaryRoute> route) {
        primary = std::move(route);
        EXPECT_EQ(send(ends_[0], "", 1, 0), 1);
    }

    platform::Outcome primaryRoute(std::optional<platform::live::PrimaryRoute>& route) override {
        ++looks;
        route = primary;
        return outcome();
    }
    platform::Outcome reach(const platform::live::Destination& destination,
                            platform::live::Reach& reach) override {
        asked.push_back(destination);
        reach = {};
        return outcome();
    }
    platform::Outcome subscribe(platform::FileDescriptor& news) override {
        news.reset(dup(ends_[1]));
        return outcome();
    }

  private:
    [[nodiscard]] platform::Outcome outcome() const {
        return isFailing ? platform::Outcome(kSCStatusFailed, "told to fail") : platform::Outcome();
    }

    int ends_[2];
};

}  // namespace live_test
