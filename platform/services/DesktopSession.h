// Who sits at the computer.
#pragma once

#include <sys/types.h>

#include <optional>
#include <string>

#include "platform/services/Bus.h"

namespace platform::services {

struct DesktopSession {
    uid_t user = 0;
    std::string type;     // "x11" or "wayland"
    std::string display;  // of X11, as in ":0"; may be empty
};

// The session that is active on the first seat, when it is the graphical one of a user (a log-in screen and a
// text console are not). Nothing, with the reason, when there is none.
[[nodiscard]] std::optional<DesktopSession> findDesktopSession(const std::string& busSocket,
                                                               Clock::time_point deadline,
                                                               std::string& reason);

}  // namespace platform::services
