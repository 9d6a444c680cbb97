// A message bus, with a bound on every wait.
//
// The bus may be mute, the daemon may be stopped, and either may be killed while we wait. Client libraries
// then hang for minutes; here every step ends within its own bound: connecting one second, a call five.
#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/base/Outcome.h"
#include "platform/bus/Value.h"

namespace platform::bus {

using Clock = std::chrono::steady_clock;

inline constexpr std::chrono::seconds connectBound{1};
inline constexpr std::chrono::seconds callBound{5};

struct SlotUnref {
    void operator()(sd_bus_slot* slot) const noexcept { sd_bus_slot_unref(slot); }
};
using Slot = std::unique_ptr<sd_bus_slot, SlotUnref>;

// Writes a call's arguments; returns what sd-bus returned.
using Arguments = std::function<int(sd_bus_message*)>;
// These values, one after the other.
template <class... Values>
[[nodiscard]] Arguments arguments(const Values&... values) {
    return [values...](sd_bus_message* message) {
        int result = 0;
        ((result = result < 0 ? result : appendValue(message, values)), ...);
        return result;
    };
}

class Bus {
  public:
    // Nothing is open: every operation fails until connect has succeeded.
    Bus() = default;
    // On another bus than the host's system bus, by the path of its socket. No call or connecting goes on
    // after the end.
    Bus(std::string socket, Clock::time_point end) : socket_(std::move(socket)), end_(end) {}
    ~Bus();
    Bus(const Bus&) = delete;
    Bus& operator=(const Bus&) = delete;

    // Connects to the bus, whatever the environment says. owned tells whether anybody owns the
    // service's name, whom calls go to from then on; it is false, and the outcome success, without a bus
    // socket too. Never starts the service.
    Outcome connect(const std::string& service, bool& owned);

    // One method call. A secret that the arguments hold never comes back in the reason. error, when given,
    // gets the name of a D-Bus error, or becomes empty.
    struct Call {
        std::string path;
        std::string interface;
        const char* member = nullptr;
        Arguments arguments;
        std::string_view secret;
    };
    Outcome call(const Call& call, MessageRef& reply, std::string* error = nullptr);

    // All properties of an interface of an object; of a type that Value does not know: left out.
    Outcome readProperties(const std::string& path, const char* interface, Dictionary& properties,
                           std::string* error = nullptr);
    // One of them, which is left as it is when its type is none that Value knows.
    Outcome readProperty(const std::string& path, const char* interface, const char* property, Value& value);
    Outcome setProperty(const std::string& path, const char* interface, const char* property,
                        const Value& value);

    // Hands the service's signals of this name to the function as long as the bus is open. The message is
    // read from its start. What is sent after a call that is made later is not missed. A signal counts only
    // when the owner of the service's name sent it: anybody can send one under the name itself. With `about`
    // only those whose first argument it is: the others do not even wake this program.
    using Handler = std::function<void(const char* path, sd_bus_message* message)>;
    Outcome watch(const std::string& interface, const std::string& member, Handler handler,
                  const std::string& about = "");

    // Handles the signals that have come; when there are none, waits for one until the time. Fails when the
    // service left the bus.
    Outcome handleSignals(Clock::time_point until);

  private:
    struct Watch {
        Bus* bus;
        Handler handler;
        Slot slot;
    };
    static int forwardSignal(sd_bus_message* message, void* watch, sd_bus_error* error);
    Outcome readOwner(bool& owned);
    [[nodiscard]] std::uint64_t timeout() const;  // of a call, in microseconds
    Outcome process(Clock::time_point deadline, bool& inTime);

    struct BusUnref {
        void operator()(sd_bus* bus) const noexcept {
            // Without a flush, which could wait for a bus that reads nothing.
            sd_bus_close(bus);
            sd_bus_unref(bus);
        }
    };
    std::string socket_;  // empty for the system bus
    Clock::time_point end_ = Clock::time_point::max();
    std::string service_;
    std::unique_ptr<sd_bus, BusUnref> bus_;
    std::string owner_;  // the unique name of the service's owner; empty when there is none
    Slot ownerSlot_;
    bool ownerLeft_ = false;
    std::vector<std::unique_ptr<Watch>> watches_;
};

// What sd-bus or the other side says, as an outcome: "<what>: <the error's name>: <its message>". The rights
// that are missing give 1003, everything else 1001.
[[nodiscard]] Outcome fromBus(const std::string& what, int result, const sd_bus_error& error,
                              std::string_view secret);

}  // namespace platform::bus
