#include "app/Turn.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>

#include "platform/CoreServices.h"

namespace {

constexpr const char* kTurnFile = "/run/location-assistant.lock";
constexpr const char* kWithoutTurn = "this run cannot take its turn, and goes on without";
constexpr unsigned kLongestRun = 120;  // seconds

// Of the turn that this process has; -1 for none.
int gTurnDescriptor = -1;

int SetLock(int command, int type) {
    struct flock whole = {};
    whole.l_type = static_cast<short>(type);
    whole.l_whence = SEEK_SET;
    return fcntl(gTurnDescriptor, command, &whole);
}

void Interrupt(int) {}

void WaitForTurn() {
    if (gTurnDescriptor < 0 || SetLock(F_SETLK, F_WRLCK) == 0) {
        return;
    }
    // The alarm ends the wait: its handler does nothing, and nothing is restarted behind it. A caller that
    // blocks alarms may have left one waiting, so the handler comes first.
    struct sigaction interrupt = {};
    struct sigaction before = {};
    interrupt.sa_handler = Interrupt;
    sigaction(SIGALRM, &interrupt, &before);
    sigset_t alarms;
    sigemptyset(&alarms);
    sigaddset(&alarms, SIGALRM);
    sigprocmask(SIG_UNBLOCK, &alarms, nullptr);
    alarm(kLongestRun);
    if (SetLock(F_SETLKW, F_WRLCK) != 0) {
        SystemLog(errno == EINTR
                      ? "another run has kept its turn for two minutes; this one does not wait longer"
                      : kWithoutTurn);
    }
    alarm(0);
    sigaction(SIGALRM, &before, nullptr);
}

}  // namespace

Turn::Turn() {
    descriptor = open(kTurnFile, O_RDWR | O_CREAT | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC, S_IRUSR | S_IWUSR);
    gTurnDescriptor = descriptor;
    if (descriptor < 0 && errno != EACCES && errno != EPERM) {
        SystemLog(kWithoutTurn);
    }
    WaitForTurn();
}

Turn::~Turn() {
    gTurnDescriptor = -1;
    if (descriptor >= 0) {
        close(descriptor);
    }
}

TurnPause::TurnPause() {
    if (gTurnDescriptor >= 0) {
        SetLock(F_SETLK, F_UNLCK);
    }
}

TurnPause::~TurnPause() {
    WaitForTurn();
}
