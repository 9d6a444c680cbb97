#include "platform/apply/direct/Process.h"

#include <sys/syscall.h>
#include <unistd.h>

#include <charconv>
#include <string>

#include "platform/apply/StateFile.h"

namespace platform::apply {

Process processOf(pid_t number) {
    std::string text;
    if (!readWholeFile("/proc/" + std::to_string(number) + "/stat", text).ok()) {
        return {number, 0};
    }
    // The program's name, in parentheses, may hold anything; the fields (proc(5)) are counted behind it.
    std::size_t position = text.rfind(')');
    constexpr int stateField = 3;
    constexpr int startField = 22;
    for (int field = stateField; position != std::string::npos && field <= startField; ++field) {
        position = text.find(' ', position + 1);
        if (field == stateField && position != std::string::npos && text[position + 1] == 'Z') {
            return {number, 0};
        }
    }
    Process process{number, 0};
    if (position != std::string::npos) {
        std::from_chars(text.data() + position + 1, text.data() + text.size(), process.started);
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
