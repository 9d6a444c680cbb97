#include "platform/services/DesktopSession.h"

#include <cstdint>

namespace platform::services {
namespace {

constexpr const char* loginManager = "org.freedesktop.login1";

}  // namespace

std::optional<DesktopSession> findDesktopSession(const std::string& busSocket, Clock::time_point deadline,
                                                 std::string& reason) {
    const auto bus = Bus::connect(busSocket, deadline, reason);
    if (!bus) {
        return std::nullopt;
    }
    const Message seat = bus->read({loginManager, "/org/freedesktop/login1/seat/seat0",
                                    "org.freedesktop.login1.Seat", "ActiveSession", "(so)"},
                                   reason);
    if (!seat) {
        return std::nullopt;
    }
    const char* id = nullptr;
    const char* path = nullptr;
    if (sd_bus_message_read(seat.get(), "(so)", &id, &path) <= 0 || *id == '\0') {
        reason = "nobody sits at the computer";
        return std::nullopt;
    }
    const auto property = [&path](const char* name, const char* signature) {
        return Bus::Property{loginManager, path, "org.freedesktop.login1.Session", name, signature};
    };
    const auto sessionClass = bus->readText(property("Class", "s"), reason);
    const auto state = sessionClass ? bus->readText(property("State", "s"), reason) : std::nullopt;
    const auto type = state ? bus->readText(property("Type", "s"), reason) : std::nullopt;
    const auto display = type ? bus->readText(property("Display", "s"), reason) : std::nullopt;
    const Message user = display ? bus->read(property("User", "(uo)"), reason) : nullptr;
    std::uint32_t number = 0;
    if (!user || sd_bus_message_read(user.get(), "(uo)", &number, nullptr) <= 0) {
        return std::nullopt;
    }
    if (*sessionClass != "user" || *state != "active" || (*type != "x11" && *type != "wayland")) {
        reason = "the active session is no user's desktop (class " + *sessionClass + ", state " + *state +
                 ", type " + *type + ")";
        return std::nullopt;
    }
    return DesktopSession{number, *type, *display};
}

}  // namespace platform::services
