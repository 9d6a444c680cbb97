#include "platform/apply/direct/Process.h"

#include <sys/syscall.h>
#include <unistd.h>

#include <sstream>
#include <string>

#include "platform/apply/StateFile.h"

namespace platform::apply {
namespace {

constexpr int startField = 22;

}  // namespace

Process processOf(pid_t number) {
    std::string text;
    if (!readWholeFile("/proc/" + std::to_string(number) + "/stat", text).ok()) {
        return {number, 0};
    }
    // The program's name, in parentheses, may hold anything; the fields (proc(5)) are counted behind it.
    std::istringstream fields(text.substr(text.rfind(')') + 1));
    std::string state;
    std::string skipped;
    fields >> state;
    for (int field = 4; field < startField; ++field) {
        fields >> skipped;
    }
    Process process{number, 0};
    if (state != "Z") {
        fields >> process.started;
    }
    return process;
}

bool isAlive(const Process& process) {
    return process.number > 1 && process.started != 0 && processOf(process.number).started == process.started;
}

FileDescriptor handleOf(const Process& process) {
    FileDescriptor handle(static_cast<int>(::syscall(SYS_pidfd_open, process.number, 0)));
    if (handle.isOpen() && !isAlive(process)) {
        handle.reset();
    }
    return handle;
}

void sendSignal(const Process& process, int signal) {
    if (const FileDescriptor handle = handleOf(process); handle.isOpen()) {
        (void)::syscall(SYS_pidfd_send_signal, handle.get(), signal, nullptr, 0);
    }
}

}  // namespace platform::apply
