// Runs code in a process of its own and ends that process right before one of its steps that change
// something.
#pragma once

#include <gtest/gtest.h>
#include <sys/ptrace.h>
#include <sys/syscall.h>

#include <algorithm>
#include <csignal>
#include <functional>

#include "tests/unit/support/Child.h"

namespace testing_support {

// True when the process was ended before its step of that number (from 0); false when it came to its end.
inline bool endBeforeStep(int step, const std::function<void()>& body) {
    // The system calls by which a process changes files, links, addresses and routes.
    static constexpr auto changes = {SYS_sendto, SYS_write, SYS_rename, SYS_unlink, SYS_symlink, SYS_fsync};
    const Child child([&body] {
        ptrace(PTRACE_TRACEME, 0, nullptr, nullptr);
        raise(SIGSTOP);
        body();
        return 0;
    });
    const pid_t number = child.number();
    int status = 0;
    waitpid(number, &status, 0);
    ptrace(PTRACE_SETOPTIONS, number, nullptr, PTRACE_O_TRACESYSGOOD | PTRACE_O_EXITKILL);
    for (;;) {
        ptrace(PTRACE_SYSCALL, number, nullptr, nullptr);
        if (waitpid(number, &status, 0) != number || WIFEXITED(status)) {
            EXPECT_EQ(0, status);
            return false;
        }
        __ptrace_syscall_info info{};
        if (WIFSTOPPED(status) && WSTOPSIG(status) == (SIGTRAP | 0x80) &&
            ptrace(PTRACE_GET_SYSCALL_INFO, number, sizeof info, &info) > 0 &&
            info.op == PTRACE_SYSCALL_INFO_ENTRY &&
            std::ranges::count(changes, static_cast<long>(info.entry.nr)) != 0 && step-- == 0) {
            kill(number, SIGKILL);
            return true;
        }
    }
}

}  // namespace testing_support
