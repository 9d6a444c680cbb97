#include "platform/apply/direct/NameServers.h"

#include <arpa/inet.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <optional>
#include <tuple>

#include "platform/Host.h"
#include "platform/Log.h"
#include "platform/apply/Properties.h"
#include "platform/apply/StateFile.h"

namespace platform::apply {
namespace {

constexpr std::chrono::seconds lockBound{10};
// What the C library's resolver reads.
constexpr std::size_t mostServers = 3;
constexpr std::size_t mostDomains = 6;

// What stands under the name of the file: nothing, a file, or a link.
struct FileState {
    enum class Kind { absent, file, link };
    Kind kind = Kind::absent;
    std::string content;  // of a file, or the target of a link
    FileOwnership ownership;

    bool operator==(const FileState& other) const {
        return kind == other.kind && content == other.content &&
               (kind != Kind::file ||
                (ownership.mode == other.ownership.mode && ownership.user == other.ownership.user &&
                 ownership.group == other.ownership.group));
    }
};

struct Brought {
    std::string interface;
    unsigned rank = 0;
    NameService service;
    bool operator==(const Brought&) const = default;
};

struct State {
    std::optional<FileState> before;
    // What the file was last replaced by and what it was to be replaced by: after a crash it is one of them.
    std::vector<std::string> written;
    std::vector<Brought> brought;
};

Outcome readFileState(const std::string& path, FileState& state) {
    state = {};
    struct stat status {};
    if (::lstat(path.c_str(), &status) != 0) {
        return errno == ENOENT ? Outcome() : Outcome::fromErrno("cannot look at " + path);
    }
    if (S_ISLNK(status.st_mode)) {
        std::string target(4096, '\0');
        const ssize_t size = ::readlink(path.c_str(), target.data(), target.size());
        if (size < 0 || static_cast<std::size_t>(size) == target.size()) {
            return Outcome::fromErrno("cannot read the link " + path);
        }
        target.resize(static_cast<std::size_t>(size));
        state.kind = FileState::Kind::link;
        state.content = std::move(target);
        return {};
    }
    state.kind = FileState::Kind::file;
    state.ownership = {status.st_mode & 07777U, status.st_uid, status.st_gid};
    return readWholeFile(path, state.content);
}

Outcome makeFileState(const std::string& path, const FileState& state) {
    switch (state.kind) {
        case FileState::Kind::absent:
            return removeStateFile(path);
        case FileState::Kind::file:
            return replaceFile(path, state.content, state.ownership);
        case FileState::Kind::link:
            break;
    }
    // By way of a second link, because making a link does not replace a file.
    const std::string temporary = temporaryFor(path);
    (void)::unlink(temporary.c_str());
    if (::symlink(state.content.c_str(), temporary.c_str()) != 0 ||
        ::rename(temporary.c_str(), path.c_str()) != 0) {
        return Outcome::fromErrno("cannot make the link " + path);
    }
    return syncDirectoryOf(path);
}

std::string statePath() {
    return runtimePath("name-servers.plist");
}

std::span<const std::byte> bytesOf(const std::string& text) {
    return std::as_bytes(std::span(text));
}

std::string textOf(std::span<const std::byte> bytes) {
    return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
}

bool decodeBefore(CFDictionaryRef dictionary, State& state) {
    const auto kind = integerIn(dictionary, CFSTR("Kind"));
    const auto content = dataIn(dictionary, CFSTR("Content"));
    if (!kind || *kind < 0 || *kind > static_cast<int>(FileState::Kind::link) || !content) {
        return false;
    }
    FileState& before = state.before.emplace();
    before.kind = static_cast<FileState::Kind>(*kind);
    before.content = textOf(*content);
    before.ownership = {static_cast<unsigned>(integerIn(dictionary, CFSTR("Mode")).value_or(0644)),
                        static_cast<unsigned>(integerIn(dictionary, CFSTR("User")).value_or(0)),
                        static_cast<unsigned>(integerIn(dictionary, CFSTR("Group")).value_or(0))};
    return true;
}

bool decodeBrought(CFDictionaryRef dictionary, State& state) {
    const auto interface = textIn(dictionary, CFSTR("Interface"));
    const auto rank = integerIn(dictionary, CFSTR("Rank"));
    const auto servers = dataIn(dictionary, CFSTR("Servers"));
    CFArrayRef const domains = arrayIn(dictionary, CFSTR("Domains"));
    if (!interface || !rank || !servers || domains == nullptr) {
        return false;
    }
    Brought brought{*interface, static_cast<unsigned>(*rank), {}};
    brought.service.servers.resize(servers->size() / sizeof(IPv4Address));
    std::copy_n(servers->begin(), brought.service.servers.size() * sizeof(IPv4Address),
                std::as_writable_bytes(std::span(brought.service.servers)).begin());
    for (CFIndex i = 0; i < CFArrayGetCount(domains); ++i) {
        brought.service.domains.push_back(asText(CFArrayGetValueAtIndex(domains, i)).value_or(""));
    }
    state.brought.push_back(std::move(brought));
    return true;
}

Outcome readState(State& state) {
    values::Owned<CFDictionaryRef> file;
    Outcome read = readStateFile(statePath(), file);
    if (!read.ok() || !file) {
        return read;
    }
    CFArrayRef const written = arrayIn(file.get(), CFSTR("Written"));
    CFArrayRef const brought = arrayIn(file.get(), CFSTR("Brought"));
    bool good = decodeBefore(dictionaryIn(file.get(), CFSTR("Before")), state) && written != nullptr &&
                brought != nullptr;
    for (CFIndex i = 0; good && i < CFArrayGetCount(written); ++i) {
        const auto content = asData(CFArrayGetValueAtIndex(written, i));
        good = content.has_value();
        state.written.push_back(good ? textOf(*content) : "");
    }
    for (CFIndex i = 0; good && i < CFArrayGetCount(brought); ++i) {
        good = decodeBrought(asDictionary(CFArrayGetValueAtIndex(brought, i)), state);
    }
    return good ? Outcome() : Outcome(kSCStatusFailed, statePath() + " is not what this system wrote");
}

Outcome writeState(const State& state) {
    DictionaryBuilder before;
    before.setInteger(CFSTR("Kind"), static_cast<int>(state.before->kind))
        .setData(CFSTR("Content"), bytesOf(state.before->content))
        .setInteger(CFSTR("Mode"), state.before->ownership.mode)
        .setInteger(CFSTR("User"), state.before->ownership.user)
        .setInteger(CFSTR("Group"), state.before->ownership.group);
    ArrayBuilder written;
    for (const std::string& content : state.written) {
        written.addData(bytesOf(content));
    }
    ArrayBuilder brought;
    for (const Brought& one : state.brought) {
        ArrayBuilder domains;
        for (const std::string& domain : one.service.domains) {
            domains.addText(domain);
        }
        DictionaryBuilder dictionary;
        dictionary.setText(CFSTR("Interface"), one.interface)
            .setInteger(CFSTR("Rank"), one.rank)
            .setData(CFSTR("Servers"), std::as_bytes(std::span(one.service.servers)))
            .set(CFSTR("Domains"), domains.get());
        brought.add(dictionary.take().get());
    }
    DictionaryBuilder file;
    file.set(CFSTR("Before"), before.take().get())
        .set(CFSTR("Written"), written.get())
        .set(CFSTR("Brought"), brought.get());
    return writeStateFile(statePath(), file.take().get());
}

std::string contentFor(const std::vector<Brought>& brought) {
    std::string servers;
    std::string domains;
    std::size_t serverCount = 0;
    std::size_t domainCount = 0;
    for (const Brought& one : brought) {
        for (const IPv4Address server : one.service.servers) {
            char text[INET_ADDRSTRLEN] = "";
            ::inet_ntop(AF_INET, &server, text, sizeof text);
            const std::string line = "nameserver " + std::string(text) + "\n";
            if (serverCount < mostServers && servers.find(line) == std::string::npos) {
                servers += line;
                ++serverCount;
            }
        }
        for (const std::string& domain : one.service.domains) {
            if (domainCount < mostDomains) {
                domains += " " + domain;
                ++domainCount;
            }
        }
    }
    return "# From the Location Assistant, for the current network location. The file of before comes back "
           "with\n"
           "# the location of before.\n" +
           (domains.empty() ? "" : "search" + domains + "\n") + servers;
}

bool isOurs(const FileState& now, const State& state) {
    return now.kind == FileState::Kind::file &&
           std::find(state.written.begin(), state.written.end(), now.content) != state.written.end();
}

Outcome giveFileBack(const std::string& path, const FileState& now, const State& state) {
    (void)::unlink(temporaryFor(path).c_str());
    if (!isOurs(now, state) && !(now == *state.before)) {
        logLine(LogLevel::notice, path + " was written by somebody else meanwhile and stays as it is");
    } else if (!(now == *state.before)) {
        Outcome made = makeFileState(path, *state.before);
        if (!made.ok()) {
            return made;
        }
    }
    return removeStateFile(statePath());
}

}  // namespace

Outcome bringNameServers(const std::string& interface, unsigned rank, const NameService& service) {
    StateLock lock;
    Outcome done = lock.acquire(runtimePath("name-servers.lock"), lockBound);
    State state;
    if (done.ok()) {
        done = readState(state);
    }
    if (!done.ok() || (!state.before && service.empty())) {
        return done;
    }
    const std::string& path = currentHost().resolverFile;
    FileState now;
    done = readFileState(path, now);
    if (!done.ok()) {
        return done;
    }
    if (!state.before) {
        state.before = now;
    }
    const std::vector<Brought> earlier = state.brought;
    std::erase_if(state.brought, [&interface](const Brought& one) { return one.interface == interface; });
    if (!service.empty()) {
        state.brought.push_back({interface, rank, service});
    }
    if (state.brought.empty()) {
        return giveFileBack(path, now, state);
    }
    std::sort(state.brought.begin(), state.brought.end(), [](const Brought& lhs, const Brought& rhs) {
        return std::tie(lhs.rank, lhs.interface) < std::tie(rhs.rank, rhs.interface);
    });
    const std::string content = contentFor(state.brought);
    if (isOurs(now, state) && now.content == content && state.brought == earlier) {
        return {};
    }
    if (!isOurs(now, state) && !(now == *state.before)) {
        // They know of nothing that we keep, so there is nothing to give back either, except to ourselves
        // later.
        logLine(LogLevel::warning, path + " was written by somebody else meanwhile and stays as it is");
        return writeState(state);
    }
    std::erase_if(state.written, [&now](const std::string& old) { return old != now.content; });
    state.written.push_back(content);
    done = writeState(state);
    if (done.ok()) {
        done = replaceFile(path, content, {0644, ::geteuid(), ::getegid()});
    }
    return done;
}

}  // namespace platform::apply
