// What an operation of the platform layer came to: done, or a status of the store's table with a reason for
// the log.
#pragma once

#include <cerrno>
#include <optional>
#include <string>
#include <system_error>
#include <utility>

#include "platform/SystemConfiguration.h"

namespace platform {

class [[nodiscard]] Outcome {
  public:
    // Done.
    Outcome() = default;
    // Failed with a status other than 0. The reason is one English phrase without a final full stop or line
    // break, and holds no secret.
    Outcome(int status, std::string reason) : status_(status), reason_(std::move(reason)) {}

    // For a failed system call: 1003 for EACCES, EPERM and EROFS, 1001 for the rest; "<what>: <errno's
    // text>".
    static Outcome fromErrno(const std::string& what, int error = errno) {
        const bool noRights = error == EACCES || error == EPERM || error == EROFS;
        return {noRights ? kSCStatusAccessError : kSCStatusFailed,
                what + ": " + std::generic_category().message(error)};
    }

    [[nodiscard]] bool ok() const noexcept { return status_ == kSCStatusOK; }
    [[nodiscard]] int status() const noexcept { return status_; }
    [[nodiscard]] const std::string& reason() const noexcept { return reason_; }

  private:
    int status_ = kSCStatusOK;
    std::string reason_;
};

}  // namespace platform

// Leaves the function with the outcome when it is a failure.
#define RETURN_IF_FAILED(step)                                     \
    do {                                                           \
        if (platform::Outcome stepDone = (step); !stepDone.ok()) { \
            return stepDone;                                       \
        }                                                          \
    } while (false)
