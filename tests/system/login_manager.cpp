// A stand-in for the login manager: one user sits at the computer, in a graphical session.
//
//     login_manager BUS-SOCKET UID
#include <systemd/sd-bus.h>

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <string_view>

namespace {

constexpr const char* sessionPath = "/org/freedesktop/login1/session/one";
std::uint32_t user = 0;

int getSession(sd_bus*, const char*, const char*, const char*, sd_bus_message* reply, void*, sd_bus_error*) {
    return sd_bus_message_append(reply, "(so)", "one", sessionPath);
}

int getText(sd_bus*, const char*, const char*, const char* property, sd_bus_message* reply, void*,
            sd_bus_error*) {
    const std::string_view name = property;
    return sd_bus_message_append(reply, "s",
                                 name == "Class"   ? "user"
                                 : name == "State" ? "active"
                                 : name == "Type"  ? "x11"
                                                   : ":0");
}

int getUser(sd_bus*, const char*, const char*, const char*, sd_bus_message* reply, void*, sd_bus_error*) {
    return sd_bus_message_append(reply, "(uo)", user, "/org/freedesktop/login1/user/one");
}

const sd_bus_vtable seatTable[] = {
    SD_BUS_VTABLE_START(0),
    SD_BUS_PROPERTY("ActiveSession", "(so)", getSession, 0, 0),
    SD_BUS_VTABLE_END,
};

const sd_bus_vtable sessionTable[] = {
    SD_BUS_VTABLE_START(0),
    SD_BUS_PROPERTY("Class", "s", getText, 0, 0),
    SD_BUS_PROPERTY("State", "s", getText, 0, 0),
    SD_BUS_PROPERTY("Type", "s", getText, 0, 0),
    SD_BUS_PROPERTY("Display", "s", getText, 0, 0),
    SD_BUS_PROPERTY("User", "(uo)", getUser, 0, 0),
    SD_BUS_VTABLE_END,
};

}  // namespace

int main(int argc, char** argv) {
    if (argc != 3) {
        return 2;
    }
    user = static_cast<std::uint32_t>(std::strtoul(argv[2], nullptr, 10));
    sd_bus* bus = nullptr;
    int result = sd_bus_new(&bus);
    const auto step = [&result](int next) { result = result < 0 ? result : next; };
    step(sd_bus_set_address(bus, ("unix:path=" + std::string(argv[1])).c_str()));
    step(sd_bus_set_bus_client(bus, 1));
    step(sd_bus_start(bus));
    step(sd_bus_add_object_vtable(bus, nullptr, "/org/freedesktop/login1/seat/seat0",
                                  "org.freedesktop.login1.Seat", seatTable, nullptr));
    step(sd_bus_add_object_vtable(bus, nullptr, sessionPath, "org.freedesktop.login1.Session", sessionTable,
                                  nullptr));
    step(sd_bus_request_name(bus, "org.freedesktop.login1", 0));
    if (result >= 0) {
        std::puts("ready");
        std::fflush(stdout);
    }
    while (result >= 0) {
        step(sd_bus_process(bus, nullptr));
        if (result == 0) {
            step(sd_bus_wait(bus, UINT64_MAX));
        }
    }
    sd_bus_unref(bus);
    return 1;
}
