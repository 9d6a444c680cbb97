// The live state next to the system's own tools: a reachability query beside "ip route get" as a process, and
// the processor time (user and system) that a watcher takes for ten thousand address changes beside "ip
// monitor" printing the same ones. All of it happens in a network namespace of its own.
#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <sched.h>
#include <spawn.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <functional>
#include <string>
#include <thread>
#include <vector>

#include "platform/SystemConfiguration.h"
#include "platform/base/Host.h"
#include "platform/values/Values.h"
#include "tests/unit/support/TemporaryDirectory.h"

namespace {

using platform::values::Owned;

constexpr int changes = 10000;

bool writeFile(const char* path, const std::string& content) {
    std::ofstream file(path);
    file << content;
    return static_cast<bool>(file.flush());
}

bool enterPrivateNetwork() {
    const std::string user = std::to_string(geteuid());
    const std::string group = std::to_string(getegid());
    return unshare(CLONE_NEWUSER | CLONE_NEWNET) == 0 && writeFile("/proc/self/setgroups", "deny") &&
           writeFile("/proc/self/uid_map", "0 " + user + " 1") &&
           writeFile("/proc/self/gid_map", "0 " + group + " 1");
}

pid_t start(std::vector<std::string> command, const char* output) {
    std::vector<char*> arguments;
    for (std::string& word : command) {
        arguments.push_back(word.data());
    }
    arguments.push_back(nullptr);
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, output, O_WRONLY | O_CREAT | O_TRUNC, 0600);
    pid_t process = -1;
    const int error = posix_spawnp(&process, arguments[0], &actions, nullptr, arguments.data(), environ);
    posix_spawn_file_actions_destroy(&actions);
    return error == 0 ? process : -1;
}

// The processor time of a child that has ended, or is about to.
double processorTimeOf(pid_t process) {
    rusage usage{};
    int status = 0;
    wait4(process, &status, 0, &usage);
    const auto seconds = [](const timeval& time) {
        return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_usec) / 1e6;
    };
    return seconds(usage.ru_utime) + seconds(usage.ru_stime);
}

bool run(const std::vector<std::string>& command) {
    const pid_t process = start(command, "/dev/null");
    int status = 1;
    return process > 0 && waitpid(process, &status, 0) == process && status == 0;
}

void reachability(benchmark::State& state) {
    for (auto _ : state) {
        SCNetworkConnectionFlags flags = 0;
        if (SCNetworkCheckReachabilityByName("192.0.0.192", &flags) == 0 || flags != 0x20002) {
            state.SkipWithError("not reachable");
        }
    }
}

void ipRouteGet(benchmark::State& state) {
    for (auto _ : state) {
        if (!run({"ip", "route", "get", "192.0.0.192"})) {
            state.SkipWithError("ip route get failed");
        }
    }
}

// Addresses that come and go, and at the end another default route.
class Burst {
  public:
    Burst() {
        std::ofstream batch(directory_.at("batch"));
        for (int i = 0; i < changes / 2; ++i) {
            const std::string address =
                "10.7." + std::to_string(i / 200) + "." + std::to_string(i % 200 + 1) + "/24 dev card\n";
            batch << "address add " << address << "address del " << address;
        }
        batch << "route replace default via 192.0.0.9\n";
    }
    [[nodiscard]] bool make() const {
        return run({"ip", "route", "replace", "default", "via", "192.0.0.1"}) &&
               run({"ip", "-batch", directory_.at("batch")});
    }
    [[nodiscard]] std::string at(std::string_view name) const { return directory_.at(name); }

  private:
    testing_support::TemporaryDirectory directory_;
};

int looksDone = 0;

// Ends the run loop at the last state of the burst.
void changed(SCDynamicStoreRef store, CFArrayRef /*keys*/, void* /*info*/) {
    ++looksDone;
    const auto value =
        Owned<CFPropertyListRef>::adopt(SCDynamicStoreCopyValue(store, CFSTR("State:/Network/Global/IPv4")));
    if (platform::values::descriptionOf(value.get()).find("192.0.0.9") != std::string::npos) {
        CFRunLoopStop(CFRunLoopGetCurrent());
    }
}

[[noreturn]] void watch(int ready) {
    const auto store =
        Owned<SCDynamicStoreRef>::adopt(SCDynamicStoreCreate(nullptr, CFSTR("benchmark"), &changed, nullptr));
    const void* key = CFSTR("State:/Network/Global/IPv4");
    const auto keys = Owned<CFArrayRef>::adopt(CFArrayCreate(nullptr, &key, 1, &kCFTypeArrayCallBacks));
    SCDynamicStoreSetNotificationKeys(store.get(), keys.get(), nullptr);
    const auto source =
        Owned<CFRunLoopSourceRef>::adopt(SCDynamicStoreCreateRunLoopSource(nullptr, store.get(), 0));
    CFRunLoopAddSource(CFRunLoopGetCurrent(), source.get(), kCFRunLoopDefaultMode);
    close(ready);
    const SInt32 result = CFRunLoopRunInMode(kCFRunLoopDefaultMode, 60, 0);
    rusage usage{};
    getrusage(RUSAGE_SELF, &usage);
    std::fprintf(stderr, "watcher: %d notices, %ld kB at most\n", looksDone, usage.ru_maxrss);
    _exit(result == kCFRunLoopRunStopped ? 0 : 1);
}

void watcher(benchmark::State& state) {
    const Burst burst;
    for (auto _ : state) {
        run({"ip", "route", "replace", "default", "via", "192.0.0.1"});
        std::array<int, 2> ready{};
        if (pipe(ready.data()) != 0) {
            state.SkipWithError("no pipe");
            return;
        }
        const pid_t process = fork();
        if (process == 0) {
            close(ready[0]);
            watch(ready[1]);
        }
        close(ready[1]);
        char nothing = 0;
        (void)!read(ready[0], &nothing, 1);
        close(ready[0]);
        if (!burst.make()) {
            state.SkipWithError("the burst failed");
        }
        state.SetIterationTime(processorTimeOf(process));
    }
}

void ipMonitor(benchmark::State& state) {
    const Burst burst;
    for (auto _ : state) {
        const pid_t process =
            start({"ip", "-4", "monitor", "link", "address", "route"}, burst.at("out").c_str());
        std::this_thread::sleep_for(std::chrono::milliseconds(200));
        if (!burst.make()) {
            state.SkipWithError("the burst failed");
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(500));
        kill(process, SIGTERM);
        state.SetIterationTime(processorTimeOf(process));
    }
}

BENCHMARK(reachability)->Unit(benchmark::kMicrosecond);
BENCHMARK(ipRouteGet)->Unit(benchmark::kMicrosecond)->UseRealTime();
BENCHMARK(watcher)->Unit(benchmark::kMillisecond)->UseManualTime()->Iterations(5);
BENCHMARK(ipMonitor)->Unit(benchmark::kMillisecond)->UseManualTime()->Iterations(5);

}  // namespace

int main(int argc, char** argv) {
    const testing_support::TemporaryDirectory directory;
    platform::Host host;
    host.preferencesDirectory = directory.at("store");
    const platform::HostOverride inForce(host);
    if (!enterPrivateNetwork() ||
        !run({"ip", "link", "add", "card", "type", "veth", "peer", "name", "other"}) ||
        !run({"ip", "link", "set", "card", "up"}) || !run({"ip", "link", "set", "other", "up"}) ||
        !run({"ip", "address", "add", "192.0.0.199/24", "dev", "card"})) {
        std::fprintf(stderr, "needs user and network namespaces, and ip\n");
        return 1;
    }
    benchmark::Initialize(&argc, argv);
    benchmark::RunSpecifiedBenchmarks();
    return 0;
}
