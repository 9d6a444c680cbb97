// Prints what changes in the computer's primary IPv4 state until it is interrupted.
//
//     watch_network [SECONDS]
//
// The watcher traces on standard output by itself; a program of your own starts it and runs the run loop of
// the thread that did.
#include <algorithm>
#include <csignal>
#include <cstdio>
#include <cstdlib>

#include "app/NetworkWatcher.h"
#include "platform/CoreFoundation.h"

namespace {

CFRunLoopRef gLoop = nullptr;
volatile std::sig_atomic_t gIsInterrupted = 0;

void Interrupted(int /*signal*/) {
    gIsInterrupted = 1;
    CFRunLoopStop(gLoop);
}

}  // namespace

int main(int argc, char** argv) {
    double seconds = 0;
    if (argc > 2 || (argc == 2 && (seconds = std::strtod(argv[1], nullptr)) <= 0)) {
        std::fprintf(stderr, "Usage: %s [SECONDS]\n", argv[0]);
        return 1;
    }

    gLoop = CFRunLoopGetCurrent();
    std::signal(SIGINT, Interrupted);
    std::signal(SIGTERM, Interrupted);

    watchForNetworkChanges();
    std::puts("watching");
    std::fflush(stdout);
    // A loop that does not run yet cannot be stopped, so it is left once a second to see whether it was.
    SInt32 ended = kCFRunLoopRunTimedOut;
    for (double waited = 0;
         gIsInterrupted == 0 && ended == kCFRunLoopRunTimedOut && (seconds == 0 || waited < seconds);
         ++waited) {
        ended = CFRunLoopRunInMode(kCFRunLoopDefaultMode, seconds == 0 ? 1 : std::min(1.0, seconds - waited),
                                   false);
    }
    stopWatchingForNetworkChanges();
    std::printf("the network is %s\n", gIsNetworkReady ? "ready" : "not ready, or nothing changed");
    return 0;
}
