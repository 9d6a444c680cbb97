// Prints what changes in the computer's primary IPv4 state until it is interrupted.
//
//     watch_network [SECONDS]
//
// The watcher traces on standard output by itself; a program of your own starts it and runs the run loop of
// the thread that did.
#include <csignal>
#include <cstdio>
#include <cstdlib>

#include "app/NetworkWatcher.h"
#include "platform/CoreFoundation.h"

namespace {

CFRunLoopRef gLoop = nullptr;

void Interrupted(int /*signal*/) {
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
    if (seconds > 0) {
        CFRunLoopRunInMode(kCFRunLoopDefaultMode, seconds, false);
    } else {
        CFRunLoopRun();
    }
    stopWatchingForNetworkChanges();
    std::printf("the network is %s\n", gIsNetworkReady ? "ready" : "not ready, or nothing changed");
    return 0;
}
