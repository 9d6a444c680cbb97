// Property lists as XML: reading, writing and the memory that a tree takes, each next to libplist on the same
// document.
//
// The documents are those of so many locations of eight services: "repeating" as preferences files are, where
// the services share most of their values, and "distinct", where no value is there twice but the keys.
//
// "peak_kB" is by how much the process grows while it reads, at its highest.
#include <benchmark/benchmark.h>
#include <malloc.h>
#include <plist/plist.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cstdlib>
#include <fstream>
#include <string>
#include <string_view>

#include "platform/values/PropertyListXML.h"
#include "platform/values/Values.h"

namespace {

using namespace platform::values;

constexpr std::array<std::string_view, 24> keys = {
    "UserDefinedName",    "DeviceName",       "Hardware",        "Type",
    "MACAddress",         "FTPPassive",       "FTPEnable",       "GopherEnable",
    "HTTPEnable",         "HTTPSEnable",      "RTSPEnable",      "SOCKSEnable",
    "DialOnDemand",       "IdleReminder",     "VerboseLogging",  "DisconnectOnIdleTimer",
    "IdleReminderTimer",  "DisconnectOnIdle", "CommRedialCount", "CommRedialEnabled",
    "CommRedialInterval", "LCPEchoEnabled",   "LCPEchoFailure",  "LCPEchoInterval"};

std::string dictionary(std::string_view content) {
    return "<dict>\n" + std::string(content) + "</dict>\n";
}

// Four entities of a few strings and numbers.
std::string service(int number, bool distinct) {
    std::string entities;
    for (std::size_t entity = 0; entity < 4; ++entity) {
        std::string entries;
        for (std::size_t i = entity * 6; i < keys.size() && i < entity * 6 + 6; ++i) {
            const std::string value =
                std::to_string(distinct ? static_cast<std::size_t>(number) * keys.size() + i : i % 3);
            entries += "<key>" + std::string(keys.at(i)) + "</key>\n";
            entries +=
                i < 5 ? "<string>value " + value + "</string>\n" : "<integer>" + value + "</integer>\n";
        }
        entities += "<key>Entity" + std::to_string(entity) + "</key>\n" + dictionary(entries);
    }
    return dictionary(entities);
}

std::string document(int locations, bool distinct) {
    std::string services;
    for (int i = 0; i < locations * 8; ++i) {
        services += "<key>" + std::to_string(i) + "</key>\n" + service(i, distinct);
    }
    return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n" + dictionary(services) +
           "</plist>\n";
}

Owned<CFPropertyListRef> readOurs(const std::string& text) {
    ParseError error;
    return parsePropertyListXML(text, error);
}

plist_t readTheirs(const std::string& text) {
    plist_t value = nullptr;
    plist_from_xml(text.data(), static_cast<std::uint32_t>(text.size()), &value);
    return value;
}

double statusLine(std::string_view name) {
    std::ifstream status("/proc/self/status");
    for (std::string line; std::getline(status, line);) {
        if (line.starts_with(name)) {
            return std::strtod(line.c_str() + name.size() + 1, nullptr);
        }
    }
    return 0;
}

// In a process of its own that gives back what was freed before, so that none of it is used again.
template <class Action>
double peakOf(Action action) {
    std::array<int, 2> ends{};
    if (::pipe(ends.data()) != 0) {
        return 0;
    }
    const pid_t child = ::fork();
    if (child == 0) {
        ::malloc_trim(0);
        std::ofstream("/proc/self/clear_refs") << 5;
        const double before = statusLine("VmRSS");
        action();
        const double grown = statusLine("VmHWM") - before;
        ::_exit(::write(ends[1], &grown, sizeof grown) == sizeof grown ? 0 : 1);
    }
    double grown = 0;
    const bool got = ::read(ends[0], &grown, sizeof grown) == sizeof grown;
    ::close(ends[0]);
    ::close(ends[1]);
    ::waitpid(child, nullptr, 0);
    return got ? grown : 0;
}

std::string documentOf(const benchmark::State& state) {
    return document(static_cast<int>(state.range(0)), state.range(1) != 0);
}

void read(benchmark::State& state) {
    const std::string text = documentOf(state);
    for (auto _ : state) {
        const auto value = readOurs(text);
        if (!value) {
            state.SkipWithError("not read");
        }
    }
    state.SetBytesProcessed(state.iterations() * static_cast<std::int64_t>(text.size()));
    state.counters["peak_kB"] = peakOf([&] { (void)readOurs(text).take(); });
}

void readWithLibplist(benchmark::State& state) {
    const std::string text = documentOf(state);
    for (auto _ : state) {
        const plist_t value = readTheirs(text);
        if (value == nullptr) {
            state.SkipWithError("not read");
        }
        plist_free(value);
    }
    state.SetBytesProcessed(state.iterations() * static_cast<std::int64_t>(text.size()));
    state.counters["peak_kB"] = peakOf([&] { benchmark::DoNotOptimize(readTheirs(text)); });
}

void write(benchmark::State& state) {
    const auto value = readOurs(documentOf(state));
    std::int64_t size = 0;
    for (auto _ : state) {
        const auto text = writePropertyListXML(value.get());
        size = static_cast<std::int64_t>(text.has_value() ? text->size() : 0);
    }
    state.SetBytesProcessed(state.iterations() * size);
}

void writeWithLibplist(benchmark::State& state) {
    const plist_t value = readTheirs(documentOf(state));
    std::uint32_t size = 0;
    for (auto _ : state) {
        char* text = nullptr;
        plist_to_xml(value, &text, &size);
        plist_to_xml_free(text);
    }
    state.SetBytesProcessed(state.iterations() * static_cast<std::int64_t>(size));
    plist_free(value);
}

void sizes(benchmark::internal::Benchmark* measured) {
    measured->ArgNames({"locations", "distinct"})->ArgsProduct({{10, 1000}, {0, 1}});
    measured->Unit(benchmark::kMillisecond);
}

BENCHMARK(read)->Apply(sizes);
BENCHMARK(readWithLibplist)->Apply(sizes);
BENCHMARK(write)->Apply(sizes);
BENCHMARK(writeWithLibplist)->Apply(sizes);

}  // namespace

BENCHMARK_MAIN();
