// A lock between processes, in a file of its own beside what it guards, never in one that is replaced.
#pragma once

#include <chrono>
#include <string>

#include "platform/base/FileDescriptor.h"
#include "platform/base/Outcome.h"

namespace platform {

// Takes the lock, which goes with the descriptor. The file is made, mode 0600, when it is missing; one that
// is not a regular file, or that others could change, is refused. `busy` is the status when another process
// keeps the lock for the whole wait.
Outcome takeFileLock(const std::string& path, std::chrono::milliseconds wait, FileDescriptor& lock,
                     int busy = kSCStatusFailed);

}  // namespace platform
