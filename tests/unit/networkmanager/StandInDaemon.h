// A NetworkManager that meets what the real one only meets by chance: switches that nobody can turn, cards
// that fail or hang, cells that are heard late, refusals. One card on a bus of its own; what it is asked to
// change is recorded.
#pragma once

#include <map>
#include <string>
#include <vector>

#include "platform/apply/networkmanager/Daemon.h"
#include "tests/unit/support/StandInService.h"

namespace testing_support {

class StandInDaemon {
  public:
    explicit StandInDaemon(const StandInBus& bus);
    ~StandInDaemon() { sd_bus_flush_close_unref(forger); }
    StandInDaemon(const StandInDaemon&) = delete;
    StandInDaemon& operator=(const StandInDaemon&) = delete;

    std::map<std::string, platform::apply::Sections> profiles;  // by path, with secrets
    // A network on the air; of those that keep quiet one is told of whenever a profile is activated, and the
    // network is joined when it is asked for once more than that.
    void offer(const std::string& network, std::uint32_t mode, std::uint32_t privacy,
               std::uint32_t protection, bool isQuiet = false);
    // What the next requests meet. Set these between requests.
    std::uint32_t failure = 0;  // the reason for which activations fail
    bool hangs = false;         // activations get no address
    sd_bus* forger = nullptr;   // somebody else, who says that they do
    void starts();              // it is not what it will be, once
    // Every request that changes something, in order.
    std::vector<std::string> changes;

    static inline const std::string manager = "/org/freedesktop/NetworkManager";
    static inline const std::string card = manager + "/Devices/1";

  private:
    std::string answer(sd_bus_message* call, sd_bus_message* reply);
    std::string change(const std::string& member, const std::string& path, sd_bus_message* call,
                       sd_bus_message* reply);
    void activate(const std::string& profile, sd_bus_message* reply);
    void leave(std::uint32_t reason);
    void moveCard(std::uint32_t state, std::uint32_t reason = 0);
    void moveActive(const std::string& path, std::uint32_t state);

    platform::apply::Texts points_;
    platform::apply::Texts quietPoints_;
    unsigned next_ = 0;

  public:
    StandInService service;  // which refuses to change anything, or one call, or all about one object
};

}  // namespace testing_support
