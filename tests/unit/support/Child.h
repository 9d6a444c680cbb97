// Work done in a process of its own.
#pragma once

#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <exception>
#include <functional>

namespace testing_support {

class Child {
  public:
    // The child runs the function and exits with what it returns; 99 when it throws.
    explicit Child(const std::function<int()>& work) {
        std::fflush(nullptr);
        process_ = fork();
        if (process_ == 0) {
            int result = 99;
            try {
                result = work();
            } catch (const std::exception& error) {
                std::fprintf(stderr, "child: %s\n", error.what());
            }
            std::fflush(nullptr);
            _exit(result);
        }
    }
    ~Child() { wait(); }
    Child(const Child&) = delete;
    Child& operator=(const Child&) = delete;

    // 0 once it was waited for.
    [[nodiscard]] pid_t number() const noexcept { return process_; }

    // Its exit status, or -1 when it ended otherwise.
    int wait() {
        if (process_ > 0) {
            int status = 0;
            while (waitpid(process_, &status, 0) < 0 && errno == EINTR) {
            }
            process_ = 0;
            result_ = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
        }
        return result_;
    }

  private:
    pid_t process_ = 0;
    int result_ = -1;
};

}  // namespace testing_support
