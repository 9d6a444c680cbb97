// Run-loop sources that wait for a file descriptor.
#pragma once

#include <functional>

#include "platform/CoreFoundation.h"
#include "platform/values/Object.h"

namespace platform::values {

// A source that a run loop watches with poll(2). When one of the events (POLLIN, POLLOUT; POLLERR and POLLHUP
// always count) is there, the loop calls perform with what poll reported, on the loop's own thread.
//
// perform may add and remove sources, itself included, stop the loop, and run it again. It must take away the
// cause of the event, or it is called again at once; it must not throw. Its captures are the source's context
// and live as long as the source, which may be longer than its stay in a loop; the descriptor must stay open
// that long, so whoever captures it owns it there. A source whose descriptor is found closed is removed.
[[nodiscard]] Owned<CFRunLoopSourceRef> makeRunLoopSource(int descriptor, short events,
                                                          std::function<void(short)> perform);

}  // namespace platform::values
