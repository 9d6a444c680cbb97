// Who sits at the computer, and on what display.
#pragma once

#include <sys/types.h>

#include <optional>
#include <string>
#include <vector>

namespace platform::services {

struct DesktopSession {
    uid_t user = 0;
    std::string type;     // "x11" or "wayland"
    std::string display;  // of X11, as in ":0"; may be empty
};

// The session that is active on the first seat, when it is the graphical one of a user (a log-in screen and a
// text console are not). Nothing, with the reason, when there is none.
[[nodiscard]] std::optional<DesktopSession> findDesktopSession(std::string& reason);

// The environment of the service manager that answers on a user's bus, entries as in "DISPLAY=:0"; empty when
// none answers within a second.
[[nodiscard]] std::vector<std::string> managerEnvironment(const std::string& busSocket);

}  // namespace platform::services
