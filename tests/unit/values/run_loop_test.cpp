#include <gtest/gtest.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <csignal>
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
    EXPECT_EQ(runFor(0, true), kCFRunLoopRunTimedOut);
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
    static const CFRunLoopRef signalled = loop;
    const auto previous = std::signal(SIGALRM, [](int) { CFRunLoopStop(signalled); });
    ::ualarm(20'000, 0);
    EXPECT_EQ(runFor(10), kCFRunLoopRunStopped);
    std::signal(SIGALRM, previous);
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
