#include "platform/services/DesktopSession.h"

#include <systemd/sd-bus.h>
#include <systemd/sd-login.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdint>
#include <cstdlib>
#include <memory>

namespace platform::services {
namespace {

using Clock = std::chrono::steady_clock;

struct Freer {
    void operator()(char* text) const noexcept { std::free(text); }
};
struct Closer {
    void operator()(sd_bus* bus) const noexcept {
        // Not flushed: that could wait for a bus that reads nothing.
        sd_bus_close(bus);
        sd_bus_unref(bus);
    }
};

// What one of sd-login's questions is answered with; empty without an answer.
std::string textOf(int (*ask)(const char*, char**), const std::string& session) {
    char* text = nullptr;
    const int result = ask(session.c_str(), &text);
    const std::unique_ptr<char, Freer> owned(text);
    return result >= 0 && text != nullptr ? text : "";
}

std::uint64_t microsecondsUntil(Clock::time_point deadline) {
    const auto left = std::chrono::duration_cast<std::chrono::microseconds>(deadline - Clock::now()).count();
    // At least one: 0 would stand for the library's own 25 seconds.
    return static_cast<std::uint64_t>(std::max<std::int64_t>(left, 1));
}

// Whether the bus has said hello. A call would wait for that without an end.
bool isReady(sd_bus* bus, Clock::time_point deadline) {
    int result = sd_bus_is_ready(bus);
    while (result == 0 && Clock::now() < deadline) {
        result = sd_bus_process(bus, nullptr);
        if (result == 0) {
            result = sd_bus_wait(bus, microsecondsUntil(deadline));
        }
        result = result < 0 && result != -EINTR ? result : sd_bus_is_ready(bus);
    }
    return result > 0;
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
    const Clock::time_point deadline = Clock::now() + std::chrono::seconds(1);
    sd_bus* made = nullptr;
    const int result = sd_bus_new(&made);
    const std::unique_ptr<sd_bus, Closer> bus(made);
    char** entries = nullptr;
    std::vector<std::string> environment;
    if (result < 0 || sd_bus_set_address(made, ("unix:path=" + busSocket).c_str()) < 0 ||
        sd_bus_set_bus_client(made, 1) < 0 || sd_bus_start(made) < 0 || !isReady(made, deadline) ||
        sd_bus_set_method_call_timeout(made, microsecondsUntil(deadline)) < 0 ||
        sd_bus_get_property_strv(made, "org.freedesktop.systemd1", "/org/freedesktop/systemd1",
                                 "org.freedesktop.systemd1.Manager", "Environment", nullptr, &entries) < 0) {
        return environment;
    }
    for (char** entry = entries; entry != nullptr && *entry != nullptr; ++entry) {
        environment.emplace_back(std::unique_ptr<char, Freer>(*entry).get());
    }
    std::free(entries);
    return environment;
}

}  // namespace platform::services
