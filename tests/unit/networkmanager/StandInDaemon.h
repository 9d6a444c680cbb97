// A NetworkManager that meets what the real one only meets by chance: switches that nobody can turn, cards
// that fail or hang, cells that are heard late, refusals. One card on a bus of its own; what it is asked to
// change is recorded.
#pragma once

#include <csignal>
#include <map>
#include <string>
#include <thread>
#include <vector>

#include "platform/apply/networkmanager/Daemon.h"
#include "tests/unit/support/Child.h"
#include "tests/unit/support/TemporaryDirectory.h"

namespace testing_support {

// A message bus that ends with its scope.
class PrivateBus {
  public:
    ~PrivateBus() { kill(process_.number(), SIGKILL); }
    [[nodiscard]] std::string socket() const { return directory_.at("bus"); }
    // A connection, once the bus takes some.
    [[nodiscard]] sd_bus* connect() const;

  private:
    TemporaryDirectory directory_;
    Child process_{[this] {
        (void)!freopen("/dev/null", "w", stderr);
        const std::string address = "--address=unix:path=" + socket();
        return execl("/usr/bin/dbus-daemon", "dbus-daemon", "--session", "--nofork", "--nopidfile",
                     "--nosyslog", address.c_str(), nullptr);
    }};
};

class StandInDaemon {
  public:
    explicit StandInDaemon(const PrivateBus& bus);
    ~StandInDaemon();
    StandInDaemon(const StandInDaemon&) = delete;
    StandInDaemon& operator=(const StandInDaemon&) = delete;

    // The properties of each object, of all its interfaces together.
    std::map<std::string, platform::apply::Dictionary> objects;
    std::map<std::string, platform::apply::Sections> profiles;  // by path, with secrets
    // A network on the air; one that keeps quiet is told of once a profile was activated, and joined when
    // asked again.
    void offer(const std::string& network, std::uint32_t mode, std::uint32_t privacy,
               std::uint32_t protection, bool isQuiet = false);
    // What the next requests meet. Set these between requests.
    std::uint32_t failure = 0;  // the reason for which activations fail
    bool hangs = false;         // activations get no address
    std::string refusal;        // why nothing may be changed
    // Every request that changes something, in order.
    std::vector<std::string> changes;

    static inline const std::string manager = "/org/freedesktop/NetworkManager";
    static inline const std::string card = manager + "/Devices/1";

  private:
    static int handle(sd_bus_message* call, void* self, sd_bus_error* error);
    // The name of the error, behind the daemon's own, or nothing.
    std::string answer(sd_bus_message* call, sd_bus_message* reply);
    std::string change(const std::string& member, const std::string& path, sd_bus_message* call,
                       sd_bus_message* reply);
    void activate(const std::string& profile, sd_bus_message* reply);
    void leave(std::uint32_t reason);
    void tell(const std::string& path, const char* interface, const char* types, std::uint32_t state,
              std::uint32_t reason);
    void moveCard(std::uint32_t state, std::uint32_t reason = 0) {
        tell(card, ".Device", "uuu", state, reason);
    }
    void moveActive(const std::string& path, std::uint32_t state) {
        tell(path, ".Connection.Active", "uu", state, 0);
    }

    sd_bus* bus_;
    platform::apply::Texts points_;
    platform::apply::Texts quietPoints_;
    std::vector<platform::apply::Message> signals_;  // behind the answer
    unsigned next_ = 0;
    std::atomic<bool> isOver_ = false;
    std::thread thread_;
};

}  // namespace testing_support
