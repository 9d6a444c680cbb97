// The live state on a network that the test makes up, and on a real kernel in a network namespace of its own.
#include <arpa/inet.h>

#include <array>
#include <cstdio>
#include <filesystem>
#include <map>
#include <sstream>

#include "platform/SystemConfiguration.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"
#include "platform/values/PropertyListXML.h"
#include "tests/unit/live/Fixture.h"
#include "tests/unit/support/Notation.h"
#include "tests/unit/support/PrivateNetwork.h"
#include "tests/unit/support/TemporaryDirectory.h"
#include "tests/unit/support/Transcript.h"

namespace live_test {
namespace {

using platform::values::Owned;
using testing_support::shell;
using StoreRef = Owned<SCDynamicStoreRef>;

// A store in a temporary directory, a session, and what is asked of it step by step.
class Scene {
  public:
    explicit Scene(std::shared_ptr<FakeNetworkState> network) : network_(std::move(network)) {
        SCDynamicStoreContext context{0, this,
                                      [](const void* info) {
                                          ++held_;
                                          return info;
                                      },
                                      [](const void* /*info*/) { --held_; }, nullptr};
        store_ = StoreRef::adopt(SCDynamicStoreCreate(nullptr, CFSTR("tester"), &Scene::changed, &context));
        source_ =
            Owned<CFRunLoopSourceRef>::adopt(SCDynamicStoreCreateRunLoopSource(nullptr, store_.get(), 0));
        CFRunLoopAddSource(CFRunLoopGetCurrent(), source_.get(), kCFRunLoopDefaultMode);
    }
    ~Scene() { close(); }

    // A step, and what came of it.
    std::string play(const std::string& step) {
        const std::string name = step.substr(0, step.find(' '));
        const std::string rest = step.substr(std::min(name.size() + 1, step.size()));
        std::istringstream words(rest);
        if (name == "route") {
            platform::live::PrimaryRoute route;
            std::string router;
            words >> route.interface >> router;
            route.interface = testing_support::unescaped(route.interface);
            in_addr address{};
            route.router = inet_aton(router.c_str(), &address) != 0 ? std::optional(address) : std::nullopt;
            network_->change(route);
        } else if (name == "flood") {
            network_->looks = 0;
            for (int i = 0; i < 90; ++i) {
                network_->change(platform::live::PrimaryRoute{"eth" + std::to_string(i), {}});
                CFRunLoopRunInMode(kCFRunLoopDefaultMode, 0.001, 0);
            }
            const std::string last = news(1000, 0.1);
            EXPECT_LT(network_->looks, 60);
            return last.substr(last.rfind('\n', last.size() - 2) + 1);
        } else if (name == "fail" || name == "work") {
            network_->isFailing = name == "fail";
        } else if (name == "commit") {
            const bool isTree = rest.starts_with('{');
            const std::string file = directory_.write(
                "elsewhere/new.plist",
                isTree ? *platform::values::writePropertyListXML(testing_support::read(rest).get()) : rest);
            std::filesystem::create_directories(directory_.at("store"));
            std::filesystem::rename(file, directory_.at("store/preferences.plist"));
        } else if (name == "remove") {
            std::filesystem::remove_all(directory_.at("store"));
        } else if (name == "value") {
            return valueAt(rest);
        } else if (name == "keys") {
            return told(SCDynamicStoreCopyKeyList(store_.get(), text(rest).get()));
        } else if (name == "watch") {
            const std::size_t bar = rest.find(" | ");
            return SCDynamicStoreSetNotificationKeys(store_.get(), arrayIn(rest.substr(0, bar)).get(),
                                                     arrayIn(rest.substr(bar + 3)).get()) != 0
                       ? ""
                       : "status " + std::to_string(SCError());
        } else if (name == "key") {
            return told(SCDynamicStoreKeyCreateNetworkServiceEntity(nullptr, text(rest).get(), CFSTR("id"),
                                                                    CFSTR("IPv4")));
        } else if (name == "source") {
            return told(SCDynamicStoreCreateRunLoopSource(nullptr, store_.get(), 0));
        } else if (name == "held") {
            return std::to_string(held_);
        } else if (name == "close") {
            store_ = {};
        } else if (name == "stop") {
            close();
        } else if (name == "news") {
            return news(std::stoul(rest), 10);
        } else if (name == "none") {
            return news(1, 0.1);
        } else if (name == "log") {
            return std::exchange(log_, "");
        } else if (name == "reach") {
            if (network_) {
                network_->asked.clear();
            }
            SCNetworkConnectionFlags flags = 77;
            const bool isDone = SCNetworkCheckReachabilityByName(rest.c_str(), &flags) != 0;
            return reached(isDone, flags) + (network_ && !network_->asked.empty() ? ", asked" : "");
        } else if (name == "ask") {
            return ask(words);
        } else if (name == "sh") {
            return shell(rest);
        } else if (name == "until") {
            // For what the kernel does a moment later.
            for (int i = 0; i < 500 && shell(rest).empty(); ++i) {
                usleep(10'000);
            }
        } else {
            ADD_FAILURE() << step;
        }
        return "";
    }

  private:
    void close() {
        CFRunLoopRemoveSource(CFRunLoopGetCurrent(), source_.get(), kCFRunLoopDefaultMode);
        source_ = {};
    }
    static Owned<CFStringRef> text(std::string_view bytes) {
        return platform::values::makeString(testing_support::unescaped(bytes));
    }
    static Owned<CFArrayRef> arrayIn(std::string_view notation) {
        return Owned<CFArrayRef>::retained(
            platform::values::as<CFArrayRef>(testing_support::read(notation).get()));
    }
    // An object that is the caller's as one line, or the status.
    static std::string told(CFTypeRef object) {
        const auto held = Owned<CFTypeRef>::adopt(object);
        return held ? platform::values::descriptionOf(held.get()) : "status " + std::to_string(SCError());
    }
    [[nodiscard]] std::string valueAt(const std::string& key) const {
        return told(SCDynamicStoreCopyValue(store_.get(), text(key).get()));
    }
    static void changed(SCDynamicStoreRef /*store*/, CFArrayRef keys, void* info) {
        Scene& self = *static_cast<Scene*>(info);
        self.news_ += self.calls_++ == 0 ? "" : "again\n";
        for (const CFTypeRef key : platform::values::itemsOf(keys)) {
            const std::string name = platform::values::descriptionOf(key);
            self.news_ += name + " = " + self.valueAt(name) + "\n";
            ++self.count_;
        }
    }
    // The changes that are told of, once there are so many; a moment shows whether more are.
    std::string news(std::size_t count, double seconds) {
        for (double waited = 0; count_ < count && waited < seconds; waited += 0.01) {
            CFRunLoopRunInMode(kCFRunLoopDefaultMode, 0.01, 0);
        }
        CFRunLoopRunInMode(kCFRunLoopDefaultMode, 0.1, 0);
        count_ = 0;
        calls_ = 0;
        return std::exchange(news_, "");
    }
    std::string reached(bool isDone, SCNetworkConnectionFlags flags) const {
        EXPECT_EQ(isDone, flags != 77);
        std::array<char, 16> bits{};
        std::snprintf(bits.data(), bits.size(), "%#x", flags);
        return isDone ? bits.data() : "status " + std::to_string(SCError());
    }
    // A question for an address of a family and a length.
    std::string ask(std::istringstream& words) {
        int length = 0;
        sockaddr_in6 address{};
        words >> address.sin6_family >> length;
        network_->asked.clear();
        SCNetworkConnectionFlags flags = 77;
        const bool isDone = SCNetworkCheckReachabilityByAddress(reinterpret_cast<const sockaddr*>(&address),
                                                                length, &flags) != 0;
        return reached(isDone, flags) + ", asked " + std::to_string(network_->asked.size());
    }
    [[nodiscard]] platform::Host makeHost() const {
        platform::Host made;
        made.preferencesDirectory = directory_.at("store");
        made.networkState = network_;
        return made;
    }

    const testing_support::TemporaryDirectory directory_;
    const std::shared_ptr<FakeNetworkState> network_;  // null for the kernel
    const platform::HostOverride host_{makeHost()};
    std::string log_;
    const platform::LogCapture capture_{[this](platform::LogLevel, std::string_view line) {
        log_ += std::string(line.substr(0, line.find(directory_.path().native()))) + "\n";
    }};
    StoreRef store_;
    Owned<CFRunLoopSourceRef> source_;
    std::string news_;
    std::size_t count_ = 0;
    int calls_ = 0;
    static inline int held_ = 0;  // by those who may call back
};

void playTranscript(const std::string& name, const std::shared_ptr<FakeNetworkState>& network) {
    Scene scene(network);
    testing_support::Transcript(name).playItself([&scene](const std::string& step) {
        const std::string text = scene.play(step);
        return text.substr(0, text.find_last_not_of('\n') + 1);
    });
}

TEST(Live, TellsAndWatchesAStoreAndANetwork) {
    playTranscript("live", std::make_shared<FakeNetworkState>());
}

class KernelNetworkTest : public testing_support::PrivateNetworkTest {};

TEST_F(KernelNetworkTest, FollowsTheKernel) {
    testing_support::PrivateNetwork::run([] {
        EXPECT_EQ(unshare(CLONE_NEWNET), 0);
        playTranscript("live_kernel", nullptr);
    });
}

}  // namespace
}  // namespace live_test
