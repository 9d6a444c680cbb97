// Runs code in a process of its own and ends that process right before one of its steps that change
// something.
#pragma once

#include <gtest/gtest.h>
#include <sys/ptrace.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <functional>
#include <initializer_list>

namespace testing_support {

// The system calls by which a process changes files, links, addresses and routes.
inline bool isChange(unsigned long long call) {
    for (const long one : {SYS_sendto, SYS_write, SYS_rename, SYS_unlink, SYS_symlink, SYS_fsync}) {
        if (call == static_cast<unsigned long long>(one)) {
            return true;
        }
    }
    return false;
}

// True when the process was ended before its step of that number (from 0); false when it came to its end.
inline bool endBeforeStep(int step, const std::function<void()>& body) {
    const pid_t child = fork();
    if (child == 0) {
        ptrace(PTRACE_TRACEME, 0, nullptr, nullptr);
        raise(SIGSTOP);
        body();
        _exit(0);
    }
    int status = 0;
    waitpid(child, &status, 0);
    ptrace(PTRACE_SETOPTIONS, child, nullptr, PTRACE_O_TRACESYSGOOD | PTRACE_O_EXITKILL);
    for (;;) {
        ptrace(PTRACE_SYSCALL, child, nullptr, nullptr);
        if (waitpid(child, &status, 0) != child || WIFEXITED(status)) {
            EXPECT_EQ(0, status);
            return false;
        }
        __ptrace_syscall_info info{};
        if (!WIFSTOPPED(status) || WSTOPSIG(status) != (SIGTRAP | 0x80) ||
            ptrace(PTRACE_GET_SYSCALL_INFO, child, sizeof info, &info) <= 0 ||
            info.op != PTRACE_SYSCALL_INFO_ENTRY || !isChange(info.entry.nr)) {
            continue;
        }
        if (step-- == 0) {
            kill(child, SIGKILL);
            waitpid(child, &status, 0);
            return true;
        }
    }
}

}  // namespace testing_support
