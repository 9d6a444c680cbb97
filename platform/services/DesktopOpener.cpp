// Opening a page in the browser of the user who sits at the computer: the active graphical session of the
// first seat, as the login manager keeps it under /run/systemd.
//
// The desktop's opening program runs in it as the session's user, never as root, with an environment made
// anew (the user's name, home and buses, a fixed path, and what the user's own service manager says about the
// display), without descriptors of ours, in a process session of its own.
//
// Nobody waits for the program, and nothing is left to reap. Handing over takes at most 1.5 seconds.
#include <grp.h>
#include <poll.h>
#include <pwd.h>
#include <strings.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <string>
#include <string_view>
#include <vector>

#include "platform/CoreServices.h"
#include "platform/base/ChildProcess.h"
#include "platform/base/FileDescriptor.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"
#include "platform/services/DesktopSession.h"
#include "platform/values/Values.h"

namespace platform::services {
namespace {

using Clock = std::chrono::steady_clock;

// Asking the user's service manager is a part of it.
constexpr std::chrono::milliseconds handOverBound{1500};
// The end of a child that hangs on its way to the program, in seconds.
constexpr unsigned lifetimeBeforeProgram = 10;

// What a program has to know to show itself on the display and to find the user's choice of a browser.
bool belongsToDisplay(std::string_view name) {
    constexpr std::array<std::string_view, 14> names = {
        "DISPLAY",
        "WAYLAND_DISPLAY",
        "XAUTHORITY",
        "XDG_SESSION_TYPE",
        "XDG_CURRENT_DESKTOP",
        "XDG_SESSION_DESKTOP",
        "XDG_DATA_DIRS",
        "XDG_CONFIG_DIRS",
        "DESKTOP_SESSION",
        "GNOME_DESKTOP_SESSION_ID",
        "KDE_FULL_SESSION",
        "KDE_SESSION_VERSION",
        "LANG",
        "LANGUAGE",
    };
    return std::find(names.begin(), names.end(), name) != names.end();
}

std::vector<std::string> environmentFor(const passwd& user, const DesktopSession& session) {
    const std::string runtime = currentHost().userRuntimeRoot + "/" + std::to_string(user.pw_uid);
    std::vector<std::string> environment = managerEnvironment(runtime + "/bus");
    std::erase_if(environment, [](const std::string& entry) {
        return !belongsToDisplay(std::string_view(entry).substr(0, entry.find('=')));
    });
    const auto isSet = [&environment](std::string_view start) {
        return std::ranges::any_of(environment,
                                   [start](const std::string& entry) { return entry.starts_with(start); });
    };
    if (!isSet("DISPLAY=") && !isSet("WAYLAND_DISPLAY=") && !session.display.empty()) {
        environment.push_back("DISPLAY=" + session.display);
    }
    if (!isSet("XDG_SESSION_TYPE=")) {
        environment.push_back("XDG_SESSION_TYPE=" + session.type);
    }
    environment.push_back(std::string("HOME=") + user.pw_dir);
    environment.push_back(std::string("USER=") + user.pw_name);
    environment.push_back(std::string("LOGNAME=") + user.pw_name);
    environment.push_back(std::string("SHELL=") + user.pw_shell);
    environment.emplace_back("PATH=/usr/local/bin:/usr/bin:/bin");
    environment.push_back("XDG_RUNTIME_DIR=" + runtime);
    environment.push_back("DBUS_SESSION_BUS_ADDRESS=unix:path=" + runtime + "/bus");
    return environment;
}

// Becomes the user for good.
bool become(const passwd& user) {
    if (geteuid() == 0 && (initgroups(user.pw_name, user.pw_gid) != 0 ||
                           setresgid(user.pw_gid, user.pw_gid, user.pw_gid) != 0 ||
                           setresuid(user.pw_uid, user.pw_uid, user.pw_uid) != 0)) {
        return false;
    }
    uid_t real = 0;
    uid_t effective = 0;
    uid_t saved = 0;
    return getresuid(&real, &effective, &saved) == 0 && real == user.pw_uid && effective == user.pw_uid &&
           saved == user.pw_uid && setuid(0) != 0;
}

// In the child; tells each status on the way to the program: noErr right before it, so that an end without a
// word is a failure.
void runProgram(const passwd& user, const DesktopSession& session, const std::string& url, int channel) {
    const auto report = [channel](OSStatus status) {
        static_cast<void>(!write(channel, &status, sizeof status));
    };
    alarm(lifetimeBeforeProgram);
    if (!become(user)) {
        report(permErr);
        return;
    }
    const std::vector<std::string> environment = environmentFor(user, session);
    if (chdir(user.pw_dir) != 0 && chdir("/") != 0) {
        return;
    }
    umask(022);
    alarm(0);
    report(noErr);
    int error = ENOENT;
    for (std::vector<std::string> arguments : currentHost().openingPrograms) {
        arguments.push_back(url);
        const int failure = becomeProgram(arguments.front(), arguments, environment);
        error = error == ENOENT ? failure : error;
    }
    report(error == ENOENT ? fnfErr : error == EACCES ? permErr : ioErr);
}

// What the child said last before it became the program, or ended.
OSStatus lastReport(int reports) {
    const Clock::time_point deadline = Clock::now() + handOverBound;
    OSStatus last = ioErr;
    for (;;) {
        const auto left =
            std::chrono::duration_cast<std::chrono::milliseconds>(deadline - Clock::now()).count();
        pollfd waiting{reports, POLLIN, 0};
        const int ready = left <= 0 ? 0 : poll(&waiting, 1, static_cast<int>(left));
        if (ready < 0 && errno == EINTR) {
            continue;
        }
        OSStatus status = noErr;
        if (ready <= 0) {
            return ioErr;
        }
        if (read(reports, &status, sizeof status) != static_cast<ssize_t>(sizeof status)) {
            return last;
        }
        last = status;
    }
}

OSStatus handOver(const passwd& user, const DesktopSession& session, const std::string& url) {
    FileDescriptor channel;
    const Outcome started =
        startDetached([&](int reports) { runProgram(user, session, url, reports); }, channel);
    return started.ok() ? lastReport(channel.get()) : ioErr;
}

OSStatus failed(OSStatus status, const std::string& reason) {
    logLine(LogLevel::notice, "opening a page: " + reason);
    return status;
}

OSStatus openPage(const std::string& url) {
    std::string reason;
    const auto session = findDesktopSession(reason);
    if (!session) {
        return failed(fnfErr, reason);
    }
    if (session->user == 0) {
        return failed(permErr, "root sits at the computer, and no browser runs as root");
    }
    if (geteuid() != 0 && geteuid() != session->user) {
        return failed(permErr, "another user sits at the computer");
    }
    const passwd* const user = getpwuid(session->user);
    if (user == nullptr) {
        return failed(fnfErr, "there is no user " + std::to_string(session->user));
    }
    const OSStatus err = handOver(*user, *session, url);
    return err == noErr
               ? noErr
               : failed(err, "the desktop's opening program could not be run (" + std::to_string(err) + ")");
}

}  // namespace
}  // namespace platform::services

OSStatus LSOpenCFURLRef(CFURLRef url, CFURLRef* openedURL) noexcept {
    if (url == nullptr || openedURL != nullptr) {
        return paramErr;
    }
    const std::string text(platform::values::descriptionOf(url));
    // A page, never a file or whatever else the desktop would know how to run.
    if (strncasecmp(text.c_str(), "http://", 7) != 0 && strncasecmp(text.c_str(), "https://", 8) != 0) {
        return paramErr;
    }
    return platform::services::openPage(text);
}
