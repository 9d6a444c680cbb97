// The preferences store: opening a session, reading, writing in the tree, committing, and a clean-up of many
// locations, each next to what libplist takes for the same file where there is such a thing.
//
// "user" is the processor time in user mode for one iteration, which leaves out what the disk costs.
#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <plist/plist.h>
#include <sys/resource.h>
#include <unistd.h>

#include <cstdlib>
#include <fstream>
#include <iterator>
#include <string>

#include "platform/SystemConfiguration.h"
#include "platform/base/Host.h"
#include "platform/preferences/Store.h"
#include "platform/values/Values.h"
#include "tests/unit/support/TemporaryDirectory.h"

namespace {

using platform::preferences::Snapshot;
using platform::preferences::StoreFile;
using platform::values::makeString;
using platform::values::Owned;

constexpr int servicesPerLocation = 8;

std::string keyed(const std::string& key, const std::string& value) {
    return "<key>" + key + "</key>" + value + "\n";
}
std::string text(const std::string& value) {
    return "<string>" + value + "</string>";
}
std::string dictionary(const std::string& entries) {
    return "<dict>\n" + entries + "</dict>";
}
std::string numbers(std::initializer_list<const char*> keys) {
    std::string entries;
    for (const char* key : keys) {
        entries += keyed(key, "<integer>0</integer>");
    }
    return entries;
}

// What a location's builder makes for a wired port.
std::string service(int number) {
    const std::string device = std::to_string(number % servicesPerLocation);
    return dictionary(
        keyed("UserDefinedName", text("Ethernet " + device)) +
        keyed("Interface", dictionary(keyed("DeviceName", text("eth" + device)) +
                                      keyed("Hardware", text("Ethernet")) + keyed("Type", text("Ethernet")) +
                                      keyed("UserDefinedName", text("Ethernet " + device)))) +
        keyed("Proxies", dictionary(numbers({"FTPPassive", "FTPEnable", "GopherEnable", "HTTPEnable",
                                             "HTTPSEnable", "RTSPEnable", "SOCKSEnable"}))) +
        keyed("AppleTalk", dictionary(keyed("ConfigMethod", text("Node")) + numbers({"__INACTIVE__"}))) +
        keyed("DNS", "<dict/>") + keyed("IPv4", dictionary(keyed("ConfigMethod", text("Manual")))) +
        keyed("PPP",
              dictionary(numbers({"__INACTIVE__", "DialOnDemand", "DisconnectOnIdle", "DisconnectOnIdleTimer",
                                  "DisconnectOnLogout", "IdleReminder", "IdleReminderTimer", "VerboseLogging",
                                  "CommDisplayTerminalWindow", "CommRedialCount", "CommRedialEnabled",
                                  "CommRedialInterval", "CommUseTerminalScript", "IPCPCompressionVJ",
                                  "LCPEchoEnabled", "LCPEchoFailure", "LCPEchoInterval"}) +
                         keyed("Logfile", text("/tmp/ppp.log")))) +
        keyed("Ethernet", dictionary(keyed("MACAddress", text("00:0a:95:9d:00:0" + device)))));
}

std::string tree(int locations) {
    std::string sets;
    std::string services;
    for (int location = 0; location < locations; ++location) {
        std::string links;
        std::string order;
        for (int i = 0; i < servicesPerLocation; ++i) {
            const int number = location * servicesPerLocation + i;
            const std::string id = std::to_string(number);
            links += keyed(id, dictionary(keyed("__LINK__", text("/NetworkServices/" + id))));
            order += text(id);
            services += keyed(id, service(number));
        }
        const std::string globals =
            keyed("IPv4", dictionary(keyed("PPPOverridePrimary", "<integer>0</integer>") +
                                     keyed("ServiceOrder", "<array>" + order + "</array>"))) +
            keyed("NetInfo", "<dict/>");
        sets += keyed(std::to_string(location),
                      dictionary(keyed("UserDefinedName", text("Location " + std::to_string(location))) +
                                 keyed("Network", dictionary(keyed("Service", dictionary(links)) +
                                                             keyed("Global", dictionary(globals))))));
    }
    return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">" +
           dictionary(keyed("CurrentSet", text("/Sets/0")) + keyed("Sets", dictionary(sets)) +
                      keyed("NetworkServices", dictionary(services))) +
           "</plist>\n";
}

// A store with so many locations, in force for one benchmark.
class BenchmarkStore {
  public:
    explicit BenchmarkStore(int locations) { (void)directory_.write("preferences.plist", tree(locations)); }
    [[nodiscard]] std::string directory() const { return directory_.path().string(); }
    [[nodiscard]] std::string file() const { return directory_.at("preferences.plist"); }

  private:
    platform::Host host() const {
        platform::Host host;
        host.preferencesDirectory = directory();
        return host;
    }

    testing_support::TemporaryDirectory directory_;
    platform::HostOverride inForce_{host()};
};

class UserTime {
  public:
    explicit UserTime(benchmark::State& state) : state_(&state), start_(now()) {}
    ~UserTime() {
        state_->counters["user"] = benchmark::Counter(now() - start_, benchmark::Counter::kAvgIterations);
    }
    UserTime(const UserTime&) = delete;
    UserTime& operator=(const UserTime&) = delete;

  private:
    static double now() {
        rusage usage{};
        getrusage(RUSAGE_SELF, &usage);
        return static_cast<double>(usage.ru_utime.tv_sec) + static_cast<double>(usage.ru_utime.tv_usec) / 1e6;
    }
    benchmark::State* state_;
    double start_;
};

using Session = Owned<SCPreferencesRef>;

Session open(benchmark::State& state) {
    Session session = Session::adopt(SCPreferencesCreate(nullptr, CFSTR("benchmark"), nullptr));
    if (!session) {
        state.SkipWithError("no session");
    }
    return session;
}

void check(benchmark::State& state, bool done) {
    if (!done) {
        state.SkipWithError(SCErrorString(SCError()));
    }
}

std::string contentOf(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

int locations(const benchmark::State& state) {
    return static_cast<int>(state.range(0));
}

void openUnchanged(benchmark::State& state) {
    const BenchmarkStore store(locations(state));
    Session first = open(state);
    for (auto _ : state) {
        benchmark::DoNotOptimize(open(state));
    }
}

void readFile(benchmark::State& state) {
    const BenchmarkStore store(locations(state));
    const StoreFile file(store.directory());
    const UserTime user(state);
    for (auto _ : state) {
        platform::preferences::remember({});
        Snapshot snapshot;
        check(state, load(file, snapshot).ok());
    }
}

void readFileWithLibplist(benchmark::State& state) {
    const BenchmarkStore store(locations(state));
    const UserTime user(state);
    for (auto _ : state) {
        const std::string content = contentOf(store.file());
        plist_t list = nullptr;
        plist_from_xml(content.data(), static_cast<std::uint32_t>(content.size()), &list);
        check(state, list != nullptr);
        plist_free(list);
    }
}

void commitOneChange(benchmark::State& state) {
    const BenchmarkStore store(locations(state));
    const Session session = open(state);
    const UserTime user(state);
    int round = 0;
    for (auto _ : state) {
        check(state, SCPreferencesSetValue(session.get(), CFSTR("Round"),
                                           platform::values::makeNumber(++round).get()) != 0);
        check(state, SCPreferencesCommitChanges(session.get()) != 0);
    }
}

// The same steps on the disk, with libplist's writer.
void commitWithLibplist(benchmark::State& state) {
    const BenchmarkStore store(locations(state));
    const std::string content = contentOf(store.file());
    const std::string temporary = store.file() + ".new";
    plist_t list = nullptr;
    plist_from_xml(content.data(), static_cast<std::uint32_t>(content.size()), &list);
    const int directory = ::open(store.directory().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    {
        const UserTime user(state);
        std::uint64_t round = 0;
        for (auto _ : state) {
            plist_dict_set_item(list, "Round", plist_new_uint(++round));
            char* xml = nullptr;
            std::uint32_t length = 0;
            plist_to_xml(list, &xml, &length);
            const int file = ::open(temporary.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
            check(state, ::write(file, xml, length) == static_cast<ssize_t>(length) && ::fsync(file) == 0 &&
                             ::close(file) == 0 && ::rename(temporary.c_str(), store.file().c_str()) == 0 &&
                             ::fsync(directory) == 0);
            std::free(xml);
        }
    }
    ::close(directory);
    plist_free(list);
}

// One entity of one service, as the library's edits do it: the whole dictionary is put back.
void writePath(benchmark::State& state) {
    const BenchmarkStore store(locations(state));
    const Session session = open(state);
    const auto path = makeString("/NetworkServices/3/IPv4");
    const auto value = Owned<CFMutableDictionaryRef>::adopt(CFDictionaryCreateMutable(
        nullptr, 0, &kCFTypeDictionaryKeyCallBacks, &kCFTypeDictionaryValueCallBacks));
    CFDictionarySetValue(value.get(), CFSTR("ConfigMethod"), CFSTR("DHCP"));
    for (auto _ : state) {
        check(state, SCPreferencesPathSetValue(session.get(), path.get(), value.get()) != 0);
    }
}

void readPath(benchmark::State& state) {
    const BenchmarkStore store(locations(state));
    const Session session = open(state);
    const auto path = makeString("/NetworkServices/3/IPv4");
    for (auto _ : state) {
        benchmark::DoNotOptimize(SCPreferencesPathGetValue(session.get(), path.get()));
    }
}

// Every location but the first, each with its services in a session and a commit of its own.
void removeLocations(benchmark::State& state) {
    for (auto _ : state) {
        state.PauseTiming();
        const BenchmarkStore store(locations(state) + 1);
        state.ResumeTiming();
        for (int location = 1; location <= locations(state); ++location) {
            const Session session = open(state);
            const auto removePath = [&](const std::string& path) {
                check(state, SCPreferencesPathRemoveValue(session.get(), makeString(path).get()) != 0);
            };
            removePath("/Sets/" + std::to_string(location));
            for (int i = 0; i < servicesPerLocation; ++i) {
                removePath("/NetworkServices/" + std::to_string(location * servicesPerLocation + i));
            }
            check(state, SCPreferencesCommitChanges(session.get()) != 0);
        }
    }
}

BENCHMARK(openUnchanged)->Arg(10)->Arg(1000)->Unit(benchmark::kMicrosecond);
BENCHMARK(readFile)->Arg(10)->Arg(1000)->Unit(benchmark::kMillisecond);
BENCHMARK(readFileWithLibplist)->Arg(10)->Arg(1000)->Unit(benchmark::kMillisecond);
BENCHMARK(commitOneChange)->Arg(10)->Arg(1000)->Unit(benchmark::kMillisecond);
BENCHMARK(commitWithLibplist)->Arg(10)->Arg(1000)->Unit(benchmark::kMillisecond);
BENCHMARK(readPath)->Arg(10)->Arg(1000)->Unit(benchmark::kMicrosecond);
BENCHMARK(writePath)->Arg(10)->Arg(1000)->Unit(benchmark::kMicrosecond);
BENCHMARK(removeLocations)->Arg(10)->Arg(100)->Arg(300)->Unit(benchmark::kMillisecond);

}  // namespace

BENCHMARK_MAIN();
