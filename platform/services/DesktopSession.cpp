#include "platform/services/DesktopSession.h"

#include <systemd/sd-login.h>

#include <chrono>
#include <cstdlib>
#include <memory>

#include "platform/bus/Bus.h"

namespace platform::services {
namespace {

struct Freer {
    void operator()(char* text) const noexcept { std::free(text); }
};

// What one of sd-login's questions is answered with; empty without an answer.
std::string textOf(int (*ask)(const char*, char**), const std::string& session) {
    char* text = nullptr;
    const int result = ask(session.c_str(), &text);
    const std::unique_ptr<char, Freer> owned(text);
    return result >= 0 && text != nullptr ? text : "";
}

}  // namespace

std::optional<DesktopSession> findDesktopSession(std::string& reason) {
    char* active = nullptr;
    DesktopSession session;
    if (sd_seat_get_active("seat0", &active, nullptr) < 0) {
        reason = "nobody sits at the computer";
        return std::nullopt;
    }
    const std::string id = std::unique_ptr<char, Freer>(active).get();
    const std::string kind = textOf(sd_session_get_class, id);
    const std::string state = textOf(sd_session_get_state, id);
    session.type = textOf(sd_session_get_type, id);
    session.display = textOf(sd_session_get_display, id);
    if (sd_session_get_uid(id.c_str(), &session.user) < 0 || kind != "user" || state != "active" ||
        (session.type != "x11" && session.type != "wayland")) {
        reason = "the active session is no user's desktop (class " + kind + ", state " + state + ", type " +
                 session.type + ")";
        return std::nullopt;
    }
    return session;
}

std::vector<std::string> managerEnvironment(const std::string& busSocket) {
    bus::Bus bus(busSocket, bus::Clock::now() + std::chrono::seconds(1));
    bool owned = false;
    bus::Value environment;
    const bool isRead = bus.connect("org.freedesktop.systemd1", owned).ok() && owned &&
                        bus.readProperty("/org/freedesktop/systemd1", "org.freedesktop.systemd1.Manager",
                                         "Environment", environment)
                            .ok();
    const auto* const entries = std::get_if<bus::Texts>(&environment.content);
    return isRead && entries != nullptr ? *entries : bus::Texts();
}

}  // namespace platform::services
