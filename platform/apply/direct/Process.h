// A process that another run has to find again, told from a later one with the same number.
#pragma once

#include <sys/types.h>

#include <cstdint>

#include "platform/base/FileDescriptor.h"

namespace platform::apply {

struct Process {
    pid_t number = 0;
    std::int64_t started = 0;  // in clock ticks since the machine's start

    template <class Self, class Fields>
    static void listFields(Self& self, Fields& fields) {
        fields("Number", self.number);
        fields("Started", self.started);
    }
};

// started is 0 when there is no such process, or it has ended and waits for its parent to notice.
[[nodiscard]] Process processOf(pid_t number);
[[nodiscard]] bool isAlive(const Process& process);
// A handle (pidfd) that stays with the process even when its number is used again; closed when it is not
// alive.
[[nodiscard]] FileDescriptor handleOf(const Process& process);
// Nothing happens to one that has ended.
void sendSignal(const Process& process, int signal);

}  // namespace platform::apply
