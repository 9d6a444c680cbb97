#include "platform/apply/direct/NameServers.h"

#include <arpa/inet.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <optional>
#include <tuple>

#include "platform/apply/StateFile.h"
#include "platform/base/FileLock.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"

namespace platform::apply {
namespace {

constexpr std::chrono::seconds lockBound{10};

// What stands under the name of the file: nothing, a file, or a link.
struct FileState {
    enum class Kind { absent, file, link, last = link };
    Kind kind = Kind::absent;
    std::string content;  // of a file, or the target of a link
    FileOwnership ownership;

    template <class Self, class Fields>
    static void listFields(Self& self, Fields& fields) {
        fields("Kind", self.kind);
        fields("Content", self.content);
        fields("Mode", self.ownership.mode);
        fields("User", self.ownership.user);
        fields("Group", self.ownership.group);
    }

    bool operator==(const FileState&) const = default;
};

// What one interface brings.
struct Contribution {
    std::string interface;
    unsigned rank = 0;
    NameService service;
    bool operator==(const Contribution&) const = default;

    template <class Self, class Fields>
    static void listFields(Self& self, Fields& fields) {
        fields("Interface", self.interface);
        fields("Rank", self.rank);
        fields("Service", self.service);
    }
};

struct State {
    FileState before;
    // What the file was last replaced by and what it was to be replaced by: after a crash it is one of them,
    // or, where it is a mount and was written in place, the beginning of one of them.
    std::vector<std::string> written;
    std::vector<Contribution> contributions;

    template <class Self, class Fields>
    static void listFields(Self& self, Fields& fields) {
        fields("Before", self.before);
        fields("Written", self.written);
        fields("Contributions", self.contributions);
    }
};

Outcome readFileState(const std::string& path, FileState& state) {
    state = {};
    struct stat status {};
    if (::lstat(path.c_str(), &status) != 0) {
        return errno == ENOENT ? Outcome() : Outcome::fromErrno("cannot look at " + path);
    }
    if (S_ISLNK(status.st_mode)) {
        std::error_code error;
        state.kind = FileState::Kind::link;
        state.content = std::filesystem::read_symlink(path, error).string();
        return error ? Outcome::fromErrno("cannot read the link " + path, error.value()) : Outcome();
    }
    state.kind = FileState::Kind::file;
    state.ownership = {status.st_mode & 07777U, status.st_uid, status.st_gid};
    return readWholeFile(path, state.content);
}

Outcome makeFileState(const std::string& path, const FileState& state) {
    switch (state.kind) {
        case FileState::Kind::absent:
            return removeFile(path);
        case FileState::Kind::file:
            return replaceFileOrMount(path, state.content, state.ownership);
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
    return syncDirectory(parentOf(path));
}

std::string statePath() {
    return runtimePath("name-servers.plist");
}

std::string contentFor(const std::vector<Contribution>& contributions) {
    std::string servers;
    std::string domains;
    std::size_t serverCount = 0;
    std::size_t domainCount = 0;
    for (const Contribution& one : contributions) {
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

void keepFirst(std::string& trouble, const Outcome& outcome) {
    trouble = trouble.empty() ? outcome.reason() : trouble;
}

bool isOurs(const FileState& now, const State& state) {
    return now.kind == FileState::Kind::file &&
           std::ranges::any_of(state.written,
                               [&now](const std::string& text) { return text.starts_with(now.content); });
}

Outcome giveFileBack(const std::string& path, const FileState& now, State& state, std::string& trouble) {
    (void)::unlink(temporaryFor(path).c_str());
    if (!isOurs(now, state) && !(now == state.before)) {
        logLine(LogLevel::notice, path + " was written by somebody else meanwhile and stays as it is");
    } else if (!(now == state.before)) {
        // Written in place it may be cut short. A runtime directory that is full does not stop the way back.
        state.written.push_back(state.before.content);
        (void)writeState(statePath(), state).ok();
        if (const Outcome made = makeFileState(path, state.before); !made.ok()) {
            // The state stays, for the next try.
            keepFirst(trouble, made);
            return {};
        }
    }
    return removeFile(statePath());
}

}  // namespace

Outcome setInterfaceNameServers(const std::string& interface, unsigned rank, const NameService& service,
                                std::string& trouble) {
    FileDescriptor lock;
    RETURN_IF_FAILED(takeFileLock(runtimePath("name-servers.lock"), lockBound, lock));
    std::optional<State> known;
    RETURN_IF_FAILED(readState(statePath(), known));
    if (!known && service.empty()) {
        return {};
    }
    const std::string& path = currentHost().resolverFile;
    FileState now;
    if (const Outcome read = readFileState(path, now); !read.ok()) {
        keepFirst(trouble, read);
        return {};
    }
    State state = known.value_or(State{now, {}, {}});
    const std::vector<Contribution> earlier = state.contributions;
    std::erase_if(state.contributions,
                  [&interface](const Contribution& one) { return one.interface == interface; });
    if (!service.empty()) {
        state.contributions.push_back({interface, rank, service});
    }
    if (state.contributions.empty()) {
        return giveFileBack(path, now, state, trouble);
    }
    std::ranges::sort(state.contributions, [](const Contribution& lhs, const Contribution& rhs) {
        return std::tie(lhs.rank, lhs.interface) < std::tie(rhs.rank, rhs.interface);
    });
    const std::string content = contentFor(state.contributions);
    const bool isWritten = std::ranges::count(state.written, now.content) != 0;
    if (isWritten && now.content == content && state.contributions == earlier) {
        return {};
    }
    if (known && !isOurs(now, state) && !(now == state.before)) {
        // They know of nothing that we keep, so there is nothing to give back either, except to ourselves
        // later.
        logLine(LogLevel::warning, path + " was written by somebody else meanwhile and stays as it is");
        return writeState(statePath(), state);
    }
    std::erase_if(state.written, [&now](const std::string& old) { return !old.starts_with(now.content); });
    state.written.push_back(content);
    RETURN_IF_FAILED(writeState(statePath(), state));
    keepFirst(trouble, replaceFileOrMount(path, content, {0644, ::geteuid(), ::getegid()}));
    return {};
}

}  // namespace platform::apply
