// A NetworkManager without cards: on a bus of its own it keeps profiles, judges them as the real one does,
// plays activations and their failures, and records what it is asked to change.
#pragma once

#include <sys/types.h>
#include <systemd/sd-bus.h>

#include <atomic>
#include <chrono>
#include <cstdint>
#include <functional>
#include <map>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "platform/apply/Agents.h"
#include "platform/bus/Value.h"
#include "tests/unit/support/TemporaryDirectory.h"

namespace testing_support {

// A message bus that ends with its scope.
class PrivateBus {
  public:
    PrivateBus();
    ~PrivateBus();
    PrivateBus(const PrivateBus&) = delete;
    PrivateBus& operator=(const PrivateBus&) = delete;
    [[nodiscard]] std::string socket() const { return directory_.at("bus"); }

  private:
    TemporaryDirectory directory_;
    pid_t process_ = 0;
};

class StandInDaemon {
  public:
    struct Point {
        std::string network;
        bool adHoc = false;
        bool privacy = false;
        std::uint32_t protection = 0;
        bool announced = true;  // false: heard only once it is looked for
        int age = 0;            // seconds since it was heard
    };
    struct Card {
        std::string name;
        std::uint32_t type = 20;
        std::uint32_t state = 30;
        bool managed = true;
        bool autoconnect = true;
        std::uint32_t capabilities = 0;
        std::vector<Point> points = {};
        std::uint32_t failure = 0;  // the reason for which activations fail; 0: they succeed
        bool external = false;
        bool hangs = false;       // activations get no address
        std::string active = {};  // a path
        unsigned metric = 0;
    };

    // Somebody on the same bus who keeps sending that every activation has succeeded.
    class Forger {
      public:
        explicit Forger(const std::string& socket);
        ~Forger();
        Forger(const Forger&) = delete;
        Forger& operator=(const Forger&) = delete;

      private:
        sd_bus* bus_ = nullptr;
        std::atomic<bool> stop_ = false;
        std::thread thread_;
    };

    StandInDaemon(const std::string& socket, std::vector<Card> cards);
    ~StandInDaemon();
    StandInDaemon(const StandInDaemon&) = delete;
    StandInDaemon& operator=(const StandInDaemon&) = delete;

    // What the next requests meet. Set these between requests.
    bool radio = true;
    bool radioHardware = true;
    bool forbidsChanges = false;
    bool leavesAtActivation = false;
    std::uint32_t profileFlags = 0;
    std::vector<Card> cards;
    // Every request that changes something, in order, as "Member what".
    std::vector<std::string> changes;
    // By UUID, with secrets.
    [[nodiscard]] platform::bus::Sections profile(const std::string& uuid) const;

  private:
    struct Profile {
        std::string uuid;
        platform::bus::Sections sections;
    };
    struct Active {
        std::size_t card = 0;
        std::string profile;
        std::uint32_t state = 1;
    };
    using Answer = std::function<int(sd_bus_message*)>;

    static int handle(sd_bus_message* call, void* self, sd_bus_error* error);
    int answer(sd_bus_message* call);
    int manager(sd_bus_message* call, const std::string& member);
    int settings(sd_bus_message* call, const std::string& member);
    int profileCall(sd_bus_message* call, const std::string& member, Profile& profile);
    int cardCall(sd_bus_message* call, const std::string& member, std::size_t card);
    int properties(sd_bus_message* call, const std::string& path);
    int setProperty(sd_bus_message* call, const std::string& path);
    int activate(sd_bus_message* call);
    void finish(const std::string& active);
    void leave(std::size_t card, std::uint32_t reason);
    void signalCard(std::size_t card, std::uint32_t state, std::uint32_t reason);
    void signalActive(const std::string& path, std::uint32_t state);
    static int reply(sd_bus_message* call, const Answer& append = {});
    [[nodiscard]] platform::bus::Dictionary describe(const std::string& path, const std::string& interface);

    mutable std::mutex mutex_;
    sd_bus* bus_ = nullptr;
    std::map<std::string, Profile> profiles_;
    std::map<std::string, Active> actives_;
    std::vector<std::function<void()>> later_;
    unsigned next_ = 0;
    std::atomic<bool> stop_ = false;
    std::thread thread_;
};

// Gives the agent one task and waits for its end, or for as long as it may take.
platform::apply::Task run(platform::apply::Agent& agent, const platform::apply::Captured& before,
                          const platform::apply::InterfacePlan* plan,
                          std::chrono::milliseconds bound = std::chrono::seconds(10));

}  // namespace testing_support
