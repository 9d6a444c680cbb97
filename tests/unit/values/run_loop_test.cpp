#include <gtest/gtest.h>
#include <poll.h>
#include <signal.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <chrono>
#include <thread>
#include <vector>

#include "platform/base/FileDescriptor.h"
#include "platform/values/RunLoop.h"
#include "tests/unit/values/Values.h"

using namespace values_test;
using platform::FileDescriptor;

namespace {

// A descriptor that is watched, and can be read once for each time that something was sent.
class Bell {
  public:
    void send() const { EXPECT_EQ(::eventfd_write(descriptor.get(), 1), 0); }
    void receive() const {
        eventfd_t once = 0;
        EXPECT_EQ(::eventfd_read(descriptor.get(), &once), 0);
    }
    Owned<CFRunLoopSourceRef> source(std::function<void()> perform) const {
        return makeRunLoopSource(descriptor.get(), POLLIN,
                                 [perform = std::move(perform)](short) { perform(); });
    }

    FileDescriptor descriptor{::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK | EFD_SEMAPHORE)};
};

class RunLoop : public testing::Test {
  protected:
    void add(const Owned<CFRunLoopSourceRef>& source) {
        CFRunLoopAddSource(loop, source.get(), kCFRunLoopDefaultMode);
    }
    void remove(const Owned<CFRunLoopSourceRef>& source) {
        CFRunLoopRemoveSource(loop, source.get(), kCFRunLoopDefaultMode);
    }
    static SInt32 runFor(double seconds, bool onlyOne = false) {
        return CFRunLoopRunInMode(kCFRunLoopDefaultMode, seconds, onlyOne ? 1 : 0);
    }

    const CFRunLoopRef loop = CFRunLoopGetCurrent();
    Bell bell;
    int calls = 0;
};

TEST_F(RunLoop, ReturnsForEachOfItsReasons) {
    EXPECT_EQ(runFor(10), kCFRunLoopRunFinished);
    const auto source = bell.source([&] {
        bell.receive();
        ++calls;
    });
    add(source);
    add(source);
    EXPECT_EQ(CFGetRetainCount(source.get()), 2);
    EXPECT_EQ(runFor(0), kCFRunLoopRunTimedOut);
    bell.send();
    bell.send();
    EXPECT_EQ(runFor(10, true), kCFRunLoopRunHandledSource);
    EXPECT_EQ(calls, 1);
    EXPECT_EQ(runFor(0), kCFRunLoopRunTimedOut);
    EXPECT_EQ(calls, 2);
    CFRunLoopStop(loop);
    EXPECT_EQ(runFor(0), kCFRunLoopRunTimedOut) << "it was stopped before it ran";
    remove(source);
    remove(source);
    EXPECT_EQ(CFGetRetainCount(source.get()), 1);
    EXPECT_EQ(runFor(10), kCFRunLoopRunFinished);
}

TEST_F(RunLoop, LetsACallbackChangeTheSources) {
    Bell other;
    int otherCalls = 0;
    Owned<CFRunLoopSourceRef> second = other.source([&] { ++otherCalls; });
    Owned<CFRunLoopSourceRef> first = bell.source([&] {
        ++calls;
        remove(first);
        first = {};
        remove(second);
        second = {};
    });
    add(first);
    add(second);
    bell.send();
    other.send();
    CFRunLoopRun();
    EXPECT_EQ(calls, 1);
    EXPECT_EQ(otherCalls, 0);
}

TEST_F(RunLoop, StopsFromACallbackAndASignalHandler) {
    const auto source = bell.source([&] {
        bell.receive();
        CFRunLoopStop(loop);
        EXPECT_EQ(runFor(0), kCFRunLoopRunTimedOut) << "the outer run is the one that was stopped";
    });
    add(source);
    bell.send();
    EXPECT_EQ(runFor(10), kCFRunLoopRunStopped);
    remove(source);
    Bell other;
    std::vector<Owned<CFRunLoopSourceRef>> stoppers;
    for (const Bell* rung : {&bell, &other}) {
        stoppers.push_back(rung->source([this, rung] {
            rung->receive();
            ++calls;
            CFRunLoopStop(loop);
        }));
        add(stoppers.back());
        rung->send();
    }
    for (const int stops : {1, 2}) {
        EXPECT_EQ(runFor(10), kCFRunLoopRunStopped);
        EXPECT_EQ(calls, stops);
    }
    static CFRunLoopRef signalled;
    signalled = loop;
    struct sigaction action {};
    struct sigaction previous {};
    action.sa_handler = [](int) { CFRunLoopStop(signalled); };
    ASSERT_EQ(::sigaction(SIGUSR1, &action, &previous), 0);
    std::thread sender([thread = ::pthread_self()] {
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
        ::pthread_kill(thread, SIGUSR1);
    });
    EXPECT_EQ(runFor(10), kCFRunLoopRunStopped);
    sender.join();
    ::sigaction(SIGUSR1, &previous, nullptr);
    for (const auto& stopper : stoppers) {
        remove(stopper);
    }
}

TEST_F(RunLoop, DropsASourceWhoseDescriptorIsClosed) {
    const auto source = bell.source([&] { ++calls; });
    add(source);
    bell.descriptor.reset();
    EXPECT_EQ(runFor(10), kCFRunLoopRunFinished);
    EXPECT_EQ(calls, 0);
}

}  // namespace
