#include "platform/live/ChangeWatch.h"

#include <sys/epoll.h>
#include <sys/inotify.h>
#include <sys/socket.h>
#include <sys/timerfd.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>

namespace platform::live {
namespace {

constexpr std::uint32_t fileEvents =
    IN_MOVED_TO | IN_MOVED_FROM | IN_CLOSE_WRITE | IN_CREATE | IN_DELETE | IN_DELETE_SELF | IN_MOVE_SELF;

// More than a path has folders that could come one after the other meanwhile.
constexpr int mostWatchTries = 64;
constexpr int mostReads = 1000;
constexpr int mostNotices = 10000;

bool addTo(int poll, int descriptor) {
    epoll_event event{};
    event.events = EPOLLIN;
    event.data.fd = descriptor;
    return ::epoll_ctl(poll, EPOLL_CTL_ADD, descriptor, &event) == 0 || errno == EEXIST;
}

// What a notice says does not matter: the kernel drops some when they come too fast, and takes routes away
// without one when a link goes down. So every notice is thrown away unread, and so is the report of an
// overrun.
bool drainKernel(int socket) {
    bool any = false;
    for (int i = 0; i < mostNotices; ++i) {
        char nothing = 0;
        const ssize_t size = ::recv(socket, &nothing, sizeof nothing, MSG_DONTWAIT | MSG_TRUNC);
        if (size < 0 && errno != ENOBUFS && errno != EINTR) {
            break;
        }
        any = true;
    }
    return any;
}

bool drainFiles(int watch) {
    bool any = false;
    alignas(inotify_event) char events[4096];
    for (int i = 0; i<mostReads&& ::read(watch, events, sizeof events)> 0; ++i) {
        any = true;
    }
    return any;
}

}  // namespace

Outcome ChangeWatch::open(NetworkState& state, const std::string& preferencesDirectory) {
    RETURN_IF_FAILED(state.subscribe(kernel_));
    directory_ = preferencesDirectory;
    poll_.reset(::epoll_create1(EPOLL_CLOEXEC));
    timer_.reset(::timerfd_create(CLOCK_MONOTONIC, TFD_NONBLOCK | TFD_CLOEXEC));
    files_.reset(::inotify_init1(IN_NONBLOCK | IN_CLOEXEC));
    if (!poll_.isOpen() || !timer_.isOpen() || !files_.isOpen() || !addTo(poll_.get(), timer_.get()) ||
        !addTo(poll_.get(), kernel_.get()) || !addTo(poll_.get(), files_.get())) {
        return Outcome::fromErrno("cannot watch for changes");
    }
    watchPreferences();
    return {};
}

// Watches the directory or, while it is missing, the nearest one above it. False when the one below that has
// come meanwhile, which nothing would report.
bool ChangeWatch::watchNearest() {
    std::string path = directory_;
    std::string missing;
    while (::inotify_add_watch(files_.get(), path.c_str(), fileEvents | IN_ONLYDIR) < 0) {
        const std::size_t slash = path.find_last_of('/');
        if (errno != ENOENT || slash == std::string::npos || path == "/") {
            return true;
        }
        missing = path;
        path = slash == 0 ? "/" : path.substr(0, slash);
    }
    return missing.empty() || ::access(missing.c_str(), F_OK) != 0;
}

// Watching a directory again is nothing new to the kernel, so this may be called whenever it may have come or
// gone.
void ChangeWatch::watchPreferences() {
    for (int tries = 0; tries < mostWatchTries && !watchNearest(); ++tries) {
    }
}

// Takes the sources of news out of the poll set instead of masking them: an overrun is reported all the same.
void ChangeWatch::listen(bool on) {
    for (const int source : {kernel_.get(), files_.get()}) {
        if (on) {
            (void)addTo(poll_.get(), source);
        } else {
            (void)::epoll_ctl(poll_.get(), EPOLL_CTL_DEL, source, nullptr);
        }
    }
}

void ChangeWatch::pauseFor(std::chrono::milliseconds time) {
    listen(false);
    itimerspec setting{};
    setting.it_value.tv_sec = time.count() / 1000;
    setting.it_value.tv_nsec = time.count() % 1000 * 1'000'000;
    (void)::timerfd_settime(timer_.get(), 0, &setting, nullptr);
}

bool ChangeWatch::take() {
    std::uint64_t expirations = 0;
    const bool isPauseOver = ::read(timer_.get(), &expirations, sizeof expirations) == sizeof expirations;
    const bool kernelNews = drainKernel(kernel_.get());
    const bool fileNews = drainFiles(files_.get());
    if (fileNews) {
        watchPreferences();
    }
    if (kernelNews || fileNews) {
        pauseFor(pause);
    } else {
        listen(true);
    }
    return kernelNews || fileNews || isPauseOver;
}

void ChangeWatch::retryLater() {
    pauseFor(longPause);
}

}  // namespace platform::live
