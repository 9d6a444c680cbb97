// The status behind SCError.
#pragma once

#include <string_view>

#include "platform/base/Outcome.h"

namespace platform::preferences {

// Sets this thread's status and tells whether it is success.
bool setStatus(int status) noexcept;
// The same for an outcome; the reason of a failed one goes to the system log as "<who>: <reason>".
bool setStatus(const Outcome& outcome, std::string_view who);

}  // namespace platform::preferences
