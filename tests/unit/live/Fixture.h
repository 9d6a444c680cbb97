// A live state made of a store in a temporary directory and a network that the test makes up.
#pragma once

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

#include <filesystem>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/SystemConfiguration.h"
#include "platform/base/FileDescriptor.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"
#include "platform/live/NetworkState.h"
#include "platform/values/PropertyListXML.h"
#include "tests/unit/support/Notation.h"
#include "tests/unit/support/TemporaryDirectory.h"

namespace live_test {

using platform::Outcome;
using platform::live::Destination;
using platform::live::PrimaryRoute;
using platform::live::Reach;
using platform::values::Owned;

inline PrimaryRoute routeOver(std::string interface, std::uint32_t router = 0) {
    PrimaryRoute route{std::move(interface), std::nullopt};
    if (router != 0) {
        route.router = in_addr{htonl(router)};
    }
    return route;
}

class FakeNetworkState : public platform::live::NetworkState {
  public:
    std::optional<PrimaryRoute> primary;
    bool isFailing = false;
    int looks = 0;
    std::vector<Destination> asked;

    FakeNetworkState() { EXPECT_EQ(socketpair(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0, ends_), 0); }
    ~FakeNetworkState() override {
        close(ends_[0]);
        close(ends_[1]);
    }

    void change(std::optional<PrimaryRoute> route) {
        primary = std::move(route);
        EXPECT_EQ(send(ends_[0], "", 1, 0), 1);
    }

    Outcome primaryRoute(std::optional<PrimaryRoute>& route) override {
        ++looks;
        route = primary;
        return outcome();
    }
    Outcome reach(const Destination& destination, Reach& reach) override {
        asked.push_back(destination);
        reach = Reach();
        return outcome();
    }
    Outcome subscribe(platform::FileDescriptor& news) override {
        news.reset(dup(ends_[1]));
        return outcome();
    }

  private:
    [[nodiscard]] Outcome outcome() const {
        return isFailing ? Outcome(kSCStatusFailed, "told to fail") : Outcome();
    }

    int ends_[2];
};

using StoreRef = Owned<SCDynamicStoreRef>;

inline Owned<CFStringRef> text(std::string_view bytes) {
    return platform::values::makeString(bytes);
}

// "(a, b)" as an array.
inline Owned<CFArrayRef> arrayOf(std::string_view notation) {
    return Owned<CFArrayRef>::retained(
        platform::values::as<CFArrayRef>(testing_support::read(notation).get()));
}

// The value at a key as one line, or "status <n>".
inline std::string valueAt(SCDynamicStoreRef store, std::string_view key) {
    const auto value = Owned<CFPropertyListRef>::adopt(SCDynamicStoreCopyValue(store, text(key).get()));
    return value ? platform::values::descriptionOf(value.get()) : "status " + std::to_string(SCError());
}

constexpr std::string_view globalKey = "State:/Network/Global/IPv4";
const std::string global = std::string(globalKey) + " = ";
constexpr std::string_view onlyGlobal = "(State:/Network/Global/IPv4)";

// Records what a session's callback is told: "<key> = <value>".
class Watcher {
  public:
    explicit Watcher(std::string_view keys, std::string_view patterns = "()") {
        SCDynamicStoreContext context{0, this, nullptr, nullptr, nullptr};
        store = StoreRef::adopt(SCDynamicStoreCreate(nullptr, CFSTR("watcher"), &Watcher::changed, &context));
        EXPECT_TRUE(
            SCDynamicStoreSetNotificationKeys(store.get(), arrayOf(keys).get(), arrayOf(patterns).get()));
        source_ =
            Owned<CFRunLoopSourceRef>::adopt(SCDynamicStoreCreateRunLoopSource(nullptr, store.get(), 0));
        EXPECT_TRUE(source_);
        CFRunLoopAddSource(CFRunLoopGetCurrent(), source_.get(), kCFRunLoopDefaultMode);
    }
    ~Watcher() { CFRunLoopRemoveSource(CFRunLoopGetCurrent(), source_.get(), kCFRunLoopDefaultMode); }
    Watcher(const Watcher&) = delete;
    Watcher& operator=(const Watcher&) = delete;

    // Runs the loop until this many notices have come; then, for a moment, to see whether more do.
    void waitFor(std::size_t count, double seconds = 10) {
        for (double waited = 0; notices.size() < count && waited < seconds; waited += 0.01) {
            CFRunLoopRunInMode(kCFRunLoopDefaultMode, 0.01, 0);
        }
        CFRunLoopRunInMode(kCFRunLoopDefaultMode, 0.1, 0);
    }

    StoreRef store;
    std::vector<std::string> notices;
    std::size_t calls = 0;

  private:
    static void changed(SCDynamicStoreRef store, CFArrayRef keys, void* info) {
        Watcher& self = *static_cast<Watcher*>(info);
        ++self.calls;
        for (const CFTypeRef key : platform::values::itemsOf(keys)) {
            const std::string name = platform::values::descriptionOf(key);
            self.notices.push_back(name + " = " + valueAt(store, name));
        }
    }

    Owned<CFRunLoopSourceRef> source_;
};

inline StoreRef openStore() {
    return StoreRef::adopt(SCDynamicStoreCreate(nullptr, CFSTR("tester"), nullptr, nullptr));
}

class LiveTest : public testing::Test {
  protected:
    [[nodiscard]] platform::Host makeHost() const {
        platform::Host made;
        made.preferencesDirectory = directory.at("store");
        made.networkState = network;
        return made;
    }
    // Commits a tree, or something else.
    void writePreferences(std::string_view notation) const {
        (void)directory.write("store/new.plist", notation.starts_with('{')
                                                     ? *platform::values::writePropertyListXML(
                                                           testing_support::read(notation).get())
                                                     : std::string(notation));
        std::filesystem::rename(directory.at("store/new.plist"), directory.at("store/preferences.plist"));
    }

    testing_support::TemporaryDirectory directory;
    std::shared_ptr<FakeNetworkState> network = std::make_shared<FakeNetworkState>();
    std::vector<std::string> log;
    platform::HostOverride host{makeHost()};
    platform::LogCapture capture{
        [this](platform::LogLevel /*level*/, std::string_view line) { log.emplace_back(line); }};
};

}  // namespace live_test
