// A program that outlives whoever starts it: a child of nobody in particular, so that nobody has to reap it,
// with nothing of the process that it came from.
#pragma once

#include <functional>
#include <string>
#include <vector>

#include "platform/base/FileDescriptor.h"
#include "platform/base/Outcome.h"

namespace platform {

// Runs the work in a process of its own: it leads a session and a group, its signals are as a program finds
// them, standard input and output lead nowhere, and there are no descriptors but its end of the channel,
// which closes when it becomes a program. The work ends the process by returning. The other end of the
// channel is this process's; without a reader the work's write ends the process.
Outcome startDetached(const std::function<void(int channel)>& work, FileDescriptor& channel);

// Becomes the program; returns errno when that fails.
int becomeProgram(const std::string& program, std::vector<std::string> arguments,
                  std::vector<std::string> environment);

}  // namespace platform
