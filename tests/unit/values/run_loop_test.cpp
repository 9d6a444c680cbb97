#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <signal.h>
#include <unistd.h>

#include <chrono>
#include <thread>

#include "platform/FileDescriptor.h"
#include "platform/values/RunLoop.h"
#include "tests/unit/values/Values.h"

using namespace values_test;
using platform::FileDescriptor;

namespace {

// A pipe whose reading end is watched.
class Pipe {
  public:
    Pipe() {
        int ends[2] = {};
        EXPECT_EQ(::pipe2(ends, O_CLOEXEC | O_NONBLOCK), 0);
        reading.reset(ends[0]);
        writing.reset(ends[1]);
    }
    void send() const { EXPECT_EQ(::write(writing.get(), "x", 1), 1); }
    void receive() const {
        char byte = 0;
        EXPECT_EQ(::read(reading.get(), &byte, 1), 1);
    }
    Owned<CFRunLoopSourceRef> source(std::function<void()> perform) const {
        return makeRunLoopSource(reading.get(), POLLIN, [perform = std::move(perform)](short) { perform(); });
    }

    FileDescriptor reading;
    FileDescriptor writing;
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
    Pipe pipe;
    int calls = 0;
};

TEST_F(RunLoop, ReturnsForEachOfItsReasons) {
    EXPECT_EQ(runFor(10), kCFRunLoopRunFinished);
    const auto source = pipe.source([&] {
        pipe.receive();
        ++calls;
    });
    add(source);
    add(source);
    EXPECT_EQ(CFGetRetainCount(source.get()), 2);
    EXPECT_EQ(runFor(0), kCFRunLoopRunTimedOut);
    pipe.send();
    pipe.send();
    EXPECT_EQ(runFor(10, true), kCFRunLoopRunHandledSource);
    EXPECT_EQ(calls, 1);
    EXPECT_EQ(runFor(0), kCFRunLoopRunTimedOut);
    EXPECT_EQ(calls, 2);
    CFRunLoopStop(loop);
    EXPECT_EQ(runFor(10), kCFRunLoopRunStopped);
    EXPECT_EQ(runFor(0), kCFRunLoopRunTimedOut);
    remove(source);
    remove(source);
    EXPECT_EQ(CFGetRetainCount(source.get()), 1);
    EXPECT_EQ(runFor(10), kCFRunLoopRunFinished);
}

TEST_F(RunLoop, LetsACallbackChangeTheSources) {
    Pipe other;
    int otherCalls = 0;
    Owned<CFRunLoopSourceRef> second = other.source([&] { ++otherCalls; });
    Owned<CFRunLoopSourceRef> first = pipe.source([&] {
        ++calls;
        remove(first);
        first = {};
        remove(second);
        second = {};
    });
    add(first);
    add(second);
    pipe.send();
    other.send();
    CFRunLoopRun();
    EXPECT_EQ(calls, 1);
    EXPECT_EQ(otherCalls, 0);
}

TEST_F(RunLoop, StopsFromACallbackAndASignalHandler) {
    const auto source = pipe.source([&] {
        pipe.receive();
        CFRunLoopStop(loop);
    });
    add(source);
    pipe.send();
    CFRunLoopRun();
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
    remove(source);
}

TEST_F(RunLoop, DropsASourceWhoseDescriptorIsClosed) {
    const auto source = pipe.source([&] { ++calls; });
    add(source);
    pipe.reading.reset();
    EXPECT_EQ(runFor(10), kCFRunLoopRunFinished);
    EXPECT_EQ(calls, 0);
}

}  // namespace
