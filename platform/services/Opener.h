// Opening a page in the browser of the user who sits at the computer.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include "platform/CoreServices.h"

namespace platform::services {

class Opener {
  public:
    virtual ~Opener() = default;

    // The contract of LSOpenCFURLRef. The URL begins with "http://" or "https://" and holds no blank and no
    // control character.
    virtual OSStatus open(const std::string& url) = 0;
};

// Where a desktop keeps things.
struct Desktop {
    // Holds one folder for each user with a session, with the user's own bus in it.
    std::string runtimeRoot = "/run/user";
    // What opens a URL the way the user wants it, with the arguments before the URL. The first one that is
    // installed is taken.
    std::vector<std::vector<std::string>> programs = {{"/usr/bin/xdg-open"}, {"/usr/bin/gio", "open"}};
};

// An opener that finds the active graphical session of the first seat as the login manager keeps it under
// /run/systemd, and runs the desktop's opening program in it: as the session's user, never as root, with an
// environment made anew (the user's name, home and buses, a fixed path, and what the user's own service
// manager says about the display), without descriptors of ours, in a process session of its own.
//
// Nobody waits for the program, and nothing is left to reap. Handing over takes at most 1.5 seconds.
[[nodiscard]] std::shared_ptr<Opener> makeDesktopOpener(Desktop desktop = {});

}  // namespace platform::services
