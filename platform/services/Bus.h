// Reading properties over D-Bus, all within one deadline.
#pragma once

#include <systemd/sd-bus.h>

#include <chrono>
#include <memory>
#include <optional>
#include <string>

namespace platform::services {

using Clock = std::chrono::steady_clock;

struct MessageUnref {
    void operator()(sd_bus_message* message) const noexcept { sd_bus_message_unref(message); }
};
using Message = std::unique_ptr<sd_bus_message, MessageUnref>;

// A connection to the bus behind a socket, whatever the environment says. A bus that accepts and is mute, or
// a service that does not answer, costs the time until the deadline and no more. Services are not started.
class Bus {
  public:
    // Nothing, with the reason, when the bus cannot be had.
    [[nodiscard]] static std::optional<Bus> connect(const std::string& socketPath, Clock::time_point deadline,
                                                    std::string& reason);

    struct Property {
        const char* service;
        const char* path;
        const char* interface;
        const char* name;
        const char* signature;
    };
    // The answer, ready to be read as the signature says; null, with the reason, without one.
    [[nodiscard]] Message read(const Property& property, std::string& reason) const;
    // The same for a property that is a string.
    [[nodiscard]] std::optional<std::string> readText(Property property, std::string& reason) const;

  private:
    struct Closer {
        void operator()(sd_bus* bus) const noexcept {
            // Not flushed: that could wait for a bus that reads nothing.
            sd_bus_close(bus);
            sd_bus_unref(bus);
        }
    };

    std::unique_ptr<sd_bus, Closer> bus_;
    Clock::time_point deadline_;
};

}  // namespace platform::services
