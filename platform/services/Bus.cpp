#include "platform/services/Bus.h"

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <string_view>
#include <system_error>

namespace platform::services {
namespace {

std::uint64_t microsecondsUntil(Clock::time_point deadline) {
    const auto left = std::chrono::duration_cast<std::chrono::microseconds>(deadline - Clock::now()).count();
    // At least one: 0 would stand for the library's own 25 seconds.
    return static_cast<std::uint64_t>(std::max<std::int64_t>(left, 1));
}

std::string textOf(int result) {
    return std::generic_category().message(-result);
}

// What an address may not hold as it is, is written as %XX.
std::string addressOf(const std::string& path) {
    constexpr std::string_view plain = "-_/.\\*";
    constexpr std::string_view digits = "0123456789abcdef";
    std::string address = "unix:path=";
    for (const char c : path) {
        const auto byte = static_cast<unsigned char>(c);
        const bool isAlphanumeric =
            (c >= '0' && c <= '9') || (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z');
        if (isAlphanumeric || plain.find(c) != std::string_view::npos) {
            address += c;
        } else {
            address += {'%', digits[byte >> 4U], digits[byte & 15U]};
        }
    }
    return address;
}

// The negative errno, or 0 once the bus has said hello.
int waitUntilReady(sd_bus* bus, Clock::time_point deadline) {
    for (;;) {
        int result = sd_bus_is_ready(bus);
        if (result != 0) {
            return std::min(result, 0);
        }
        result = sd_bus_process(bus, nullptr);
        if (result == 0) {
            if (Clock::now() >= deadline) {
                return -ETIMEDOUT;
            }
            result = sd_bus_wait(bus, microsecondsUntil(deadline));
        }
        if (result < 0 && result != -EINTR) {
            return result;
        }
    }
}

}  // namespace

std::optional<Bus> Bus::connect(const std::string& socketPath, Clock::time_point deadline,
                                std::string& reason) {
    Bus connection;
    connection.deadline_ = deadline;
    sd_bus* made = nullptr;
    int result = sd_bus_new(&made);
    connection.bus_.reset(made);
    if (result >= 0) {
        result = sd_bus_set_address(made, addressOf(socketPath).c_str());
    }
    if (result >= 0) {
        result = sd_bus_set_bus_client(made, 1);
    }
    if (result >= 0) {
        result = sd_bus_start(made);
    }
    if (result >= 0) {
        result = waitUntilReady(made, deadline);
    }
    if (result < 0) {
        reason = "connecting to the bus: " + textOf(result);
        return std::nullopt;
    }
    return connection;
}

Message Bus::read(const Property& property, std::string& reason) const {
    sd_bus_message* made = nullptr;
    int result = sd_bus_message_new_method_call(bus_.get(), &made, property.service, property.path,
                                                "org.freedesktop.DBus.Properties", "Get");
    const Message call(made);
    if (result >= 0) {
        result = sd_bus_message_append(call.get(), "ss", property.interface, property.name);
    }
    if (result >= 0) {
        result = sd_bus_message_set_auto_start(call.get(), 0);
    }
    Message reply;
    if (result >= 0) {
        made = nullptr;
        result = sd_bus_call(bus_.get(), call.get(), microsecondsUntil(deadline_), nullptr, &made);
        reply.reset(made);
    }
    if (result >= 0) {
        result = sd_bus_message_enter_container(reply.get(), SD_BUS_TYPE_VARIANT, property.signature);
        // Any other type, or nothing at all, is no answer to this question.
        result = result == 0 ? -EBADMSG : result;
    }
    if (result < 0) {
        reason = std::string("reading ") + property.name + " of " + property.service + ": " + textOf(result);
        return nullptr;
    }
    return reply;
}

std::optional<std::string> Bus::readText(Property property, std::string& reason) const {
    property.signature = "s";
    const Message answer = read(property, reason);
    const char* text = nullptr;
    if (!answer || sd_bus_message_read(answer.get(), "s", &text) <= 0) {
        return std::nullopt;
    }
    return std::string(text);
}

}  // namespace platform::services
