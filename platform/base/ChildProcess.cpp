#include "platform/base/ChildProcess.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <csignal>

namespace platform {
namespace {

constexpr int channelPlace = 3;

void restoreSignals() {
    for (int signal = 1; signal < NSIG; ++signal) {
        // Those that cannot be changed, or belong to the C library, stay as they are.
        static_cast<void>(std::signal(signal, SIG_DFL));
    }
    sigset_t none;
    sigemptyset(&none);
    sigprocmask(SIG_SETMASK, &none, nullptr);
}

bool arrangeDescriptors(int channel) {
    // Out of the way first: in a process without standard streams it may be one of 0 to 2.
    const int aside = fcntl(channel, F_DUPFD_CLOEXEC, channelPlace + 1);
    const int nowhere = open("/dev/null", O_RDWR);
    return aside >= 0 && nowhere >= 0 && dup2(nowhere, 0) >= 0 && dup2(nowhere, 1) >= 0 &&
           dup2(nowhere, 2) >= 0 && dup3(aside, channelPlace, O_CLOEXEC) >= 0 &&
           close_range(channelPlace + 1, ~0U, 0) == 0;
}

[[noreturn]] void runChild(const std::function<void(int)>& work, int channel) {
    // Whoever ends this run from its terminal does not mean this one.
    setsid();
    restoreSignals();
    try {
        if (arrangeDescriptors(channel)) {
            work(channelPlace);
        }
    } catch (...) {
        // The closed channel tells.
    }
    _exit(127);
}

std::vector<char*> pointersTo(std::vector<std::string>& texts) {
    std::vector<char*> pointers;
    for (std::string& text : texts) {
        pointers.push_back(text.data());
    }
    pointers.push_back(nullptr);
    return pointers;
}

}  // namespace

Outcome startDetached(const std::function<void(int channel)>& work, FileDescriptor& channel) {
    std::array<int, 2> ends{};
    if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends.data()) != 0) {
        return Outcome::fromErrno("cannot make a pair of sockets");
    }
    channel.reset(ends[0]);
    const FileDescriptor childsEnd(ends[1]);
    // Twice: the system's first process sees to its end, and nobody here has to.
    const pid_t between = fork();
    if (between < 0) {
        return Outcome::fromErrno("cannot start a process");
    }
    if (between == 0) {
        // A failure to fork shows as a channel that is closed at once.
        if (fork() == 0) {
            runChild(work, childsEnd.get());
        }
        _exit(0);
    }
    while (waitpid(between, nullptr, 0) < 0 && errno == EINTR) {
    }
    return {};
}

int becomeProgram(const std::string& program, std::vector<std::string> arguments,
                  std::vector<std::string> environment) {
    execve(program.c_str(), pointersTo(arguments).data(), pointersTo(environment).data());
    return errno;
}

}  // namespace platform
