#include "platform/values/RunLoop.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <chrono>
#include <cmath>
#include <memory>
#include <vector>

#include "platform/base/FileDescriptor.h"
#include "platform/values/Scalars.h"

using namespace platform::values;
using platform::FileDescriptor;

struct OpaqueCFRunLoopSource final : Object {
    OpaqueCFRunLoopSource(int watched, short wanted, std::function<void(short)> callback)
        : Object(Type::runLoopSource), descriptor(watched), events(wanted), perform(std::move(callback)) {}

    const int descriptor;
    const short events;
    const std::function<void(short)> perform;
};

struct OpaqueCFRunLoop final : Object {
    using Clock = std::chrono::steady_clock;
    using Source = Owned<CFRunLoopSourceRef>;

    // Without a descriptor to be had, stopping from another thread takes effect a moment later.
    OpaqueCFRunLoop() : Object(Type::runLoop), wake_(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {}

    void add(CFRunLoopSourceRef source) {
        if (!holds(source)) {
            sources_.push_back(Source::retained(source));
        }
    }
    void remove(CFRunLoopSourceRef source) {
        std::erase_if(sources_, [source](const Source& held) { return held.get() == source; });
    }
    // Stops the innermost run that is under way. Only an atomic flag and a write, so that a signal handler
    // may call it.
    void stop() noexcept {
        const int error = errno;
        isStopped_.store(true);
        const std::uint64_t one = 1;
        // A counter that is full wakes the loop just as well.
        [[maybe_unused]] const ssize_t written = ::write(wake_.get(), &one, sizeof one);
        errno = error;
    }
    SInt32 run(Clock::time_point deadline, bool returnAfterSourceHandled);

  private:
    [[nodiscard]] bool holds(CFRunLoopSourceRef source) const {
        return std::ranges::any_of(sources_, [source](const Source& held) { return held.get() == source; });
    }
    [[nodiscard]] int waitingTime(Clock::time_point deadline) const;
    bool handleReady(Clock::time_point deadline, bool onlyOne);

    std::vector<Source> sources_;
    FileDescriptor wake_;
    std::atomic<bool> isStopped_{false};
    static_assert(std::atomic<bool>::is_always_lock_free);
};

namespace {

Owned<CFRunLoopRef> makeRunLoop() {
    return Owned<CFRunLoopRef>::adopt(new OpaqueCFRunLoop);
}

constinit Immortal<OpaqueCFString> defaultMode(std::string_view("kCFRunLoopDefaultMode"));

bool isDefaultMode(CFStringRef mode) {
    return mode != nullptr && mode->equals(*kCFRunLoopDefaultMode);
}

}  // namespace

const CFStringRef kCFRunLoopDefaultMode = &defaultMode.value;

// poll's, rounded up so that the loop does not spin through the last millisecond.
int OpaqueCFRunLoop::waitingTime(Clock::time_point deadline) const {
    using std::chrono::milliseconds;
    const milliseconds longest(wake_.isOpen() ? 3'600'000 : 100);
    const auto left = std::chrono::ceil<milliseconds>(deadline - Clock::now());
    return static_cast<int>(std::clamp(left, milliseconds(0), longest).count());
}

// Waits, and calls the sources that are ready; whether there was one.
bool OpaqueCFRunLoop::handleReady(Clock::time_point deadline, bool onlyOne) {
    // The callbacks may change the list of sources and drop their own.
    const std::vector<Source> watched = sources_;
    std::vector<pollfd> polled;
    polled.reserve(watched.size() + 1);
    for (const Source& source : watched) {
        polled.push_back({source.get()->descriptor, source.get()->events, 0});
    }
    polled.push_back({wake_.get(), POLLIN, 0});
    if (::poll(polled.data(), polled.size(), waitingTime(deadline)) <= 0) {
        return false;
    }
    if (polled.back().revents != 0) {
        std::uint64_t count = 0;
        [[maybe_unused]] const ssize_t got = ::read(wake_.get(), &count, sizeof count);
    }
    bool handled = false;
    for (std::size_t i = 0; i < watched.size() && !isStopped_.load() && !(handled && onlyOne); ++i) {
        const CFRunLoopSourceRef source = watched[i].get();
        if (polled[i].revents == 0 || !holds(source)) {
            continue;
        }
        if ((polled[i].revents & POLLNVAL) != 0) {
            remove(source);
            continue;
        }
        source->perform(polled[i].revents);
        handled = true;
    }
    return handled;
}

SInt32 OpaqueCFRunLoop::run(Clock::time_point deadline, bool returnAfterSourceHandled) {
    // What was stopped before this run began is an outer run, which learns of it when this one has ended.
    struct Outer {
        std::atomic<bool>& flag;
        bool isStopped = flag.exchange(false);
        ~Outer() { flag.store(isStopped); }
    } const outer{isStopped_};
    while (true) {
        if (sources_.empty()) {
            return kCFRunLoopRunFinished;
        }
        const bool handled = handleReady(deadline, returnAfterSourceHandled);
        if (isStopped_.exchange(false)) {
            return kCFRunLoopRunStopped;
        }
        if (handled && returnAfterSourceHandled) {
            return kCFRunLoopRunHandledSource;
        }
        if (Clock::now() >= deadline) {
            return kCFRunLoopRunTimedOut;
        }
    }
}

Owned<CFRunLoopSourceRef> platform::values::makeRunLoopSource(int descriptor, short events,
                                                              std::function<void(short)> perform) {
    return Owned<CFRunLoopSourceRef>::adopt(
        new OpaqueCFRunLoopSource(descriptor, events, std::move(perform)));
}

CFRunLoopRef CFRunLoopGetCurrent() noexcept {
    thread_local const Owned<CFRunLoopRef> loop = makeRunLoop();
    return loop.get();
}

void CFRunLoopAddSource(CFRunLoopRef loop, CFRunLoopSourceRef source, CFStringRef mode) noexcept {
    if (isDefaultMode(mode)) {
        loop->add(source);
    }
}

void CFRunLoopRemoveSource(CFRunLoopRef loop, CFRunLoopSourceRef source, CFStringRef mode) noexcept {
    if (isDefaultMode(mode)) {
        loop->remove(source);
    }
}

void CFRunLoopRun() noexcept {
    (void)CFRunLoopRunInMode(kCFRunLoopDefaultMode, 1e9, false);
}

SInt32 CFRunLoopRunInMode(CFStringRef mode, CFTimeInterval seconds,
                          Boolean returnAfterSourceHandled) noexcept {
    if (!isDefaultMode(mode)) {
        return kCFRunLoopRunFinished;
    }
    // Thirty years are for ever, and fit the clock. What is no number is no time.
    const std::chrono::duration<double> time(std::max(0.0, std::min(seconds, 1e9)));
    using Clock = OpaqueCFRunLoop::Clock;
    return CFRunLoopGetCurrent()->run(Clock::now() + std::chrono::duration_cast<Clock::duration>(time),
                                      returnAfterSourceHandled != 0);
}

void CFRunLoopStop(CFRunLoopRef loop) noexcept {
    loop->stop();
}
