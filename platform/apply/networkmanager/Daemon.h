// NetworkManager as this system uses it: cards, profiles, and which profile a card is on.
#pragma once

#include <chrono>
#include <cstdint>
#include <map>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "platform/apply/WirelessChoice.h"
#include "platform/apply/networkmanager/Iwd.h"
#include "platform/apply/networkmanager/Profile.h"
#include "platform/base/Outcome.h"
#include "platform/bus/Bus.h"
#include "platform/bus/Value.h"

namespace platform::apply {

using bus::Arguments;
using bus::arguments;
using bus::Bus;
using bus::Clock;
using bus::MessageRef;
using bus::Path;
using bus::readValue;

// Of NetworkManager's states of a card: unmanaged 10, unavailable 20, disconnected 30, then activating,
// activated 100, deactivating 110, failed 120.
inline constexpr std::uint32_t deviceDisconnected = 30;
inline constexpr std::uint32_t deviceGetsAddresses = 70;
inline constexpr std::uint32_t deviceActivated = 100;
inline constexpr std::uint32_t deviceDeactivating = 110;
inline constexpr std::uint32_t deviceFailed = 120;

// And of an active profile's: activating 1, activated 2, deactivating 3, deactivated 4.
inline constexpr std::uint32_t activeActivated = 2;
inline constexpr std::uint32_t activeDeactivated = 4;

struct Device {
    enum class Kind { wired, wireless, other };

    std::string path;
    Kind kind = Kind::other;
    bool managed = false;
    bool autoconnect = false;
    std::string active;     // the path of what is active on it; empty for nothing
    std::string addresses;  // the path of its IPv4 settings; empty for none
};

// A profile in use on a card, or on its way there.
struct Active {
    std::string path;
    std::string profile;  // the path of the profile
    std::string uuid;
    bool complete = false;  // up, with its addresses
    bool external = false;  // somebody else made it so in the kernel and NetworkManager only shows it
};

struct Profile {
    std::string path;
    Sections sections;  // without secrets
};

// How a profile is added. Ours stays in memory. heldBack: the daemon does not activate it of its own accord
// before somebody has asked for it once.
enum class Adding { heldBack, atOnce };

// Every call is bounded (Bus.h); nothing here waits for a card or a network, except connect for a daemon that
// has just been started. What goes on is told by signals, which handleSignals takes in.
class Daemon {
  public:
    // Whether NetworkManager owns its name on the host's system bus. No bus socket, or no owner, is a no;
    // everything else that goes wrong is a failure. It never starts the daemon.
    Outcome open(bool& running);
    // Fails when NetworkManager does not run. Waits for a daemon that is starting, whose cards are not yet
    // what they will be, for at most ten seconds. Connected already, it only looks at the radio again.
    Outcome connect();

    // Nothing, and success, when there is none of that name, path or UUID.
    Outcome findDevice(const std::string& interface, std::optional<Device>& device);
    Outcome findActive(const Device& device, std::optional<Active>& active);
    Outcome findProfile(const std::string& uuid, std::optional<Profile>& profile);

    // Whether the profile is gone once nothing uses it.
    Outcome isVolatile(const std::string& profile, bool& result);
    // Adds the secrets of the sections that have some. Those that only the desktop's key ring has may be
    // missing.
    Outcome readSecrets(const std::string& profile, Sections& sections);
    // The secret is kept out of reasons.
    Outcome addProfile(const Sections& sections, Adding adding, std::string_view secret, std::string& path);
    Outcome updateProfile(const std::string& path, const Sections& sections, std::string_view secret);
    // One that is gone is a success.
    Outcome deleteProfile(const std::string& path);

    // Asks for the profile to be activated on the card. `active` is the path to follow it by.
    Outcome activate(const std::string& profile, const Device& device, std::string& active);
    // Asks for nothing to be active on the card; one that has nothing active is a success. The daemon leaves
    // it alone until somebody activates a profile on it.
    Outcome disconnect(const Device& device);
    Outcome setManaged(const Device& device, bool managed);
    Outcome setAutoconnect(const Device& device, bool autoconnect);

    // The best metric of the card's default routes, or, when it has none, of its routes; 0 without routes.
    Outcome readMetric(const Device& device, std::uint32_t& metric);

    // The radio of all wireless cards.
    [[nodiscard]] bool isRadioOn() const noexcept { return radio_; }
    [[nodiscard]] bool isRadioBlocked() const noexcept { return !radioHardware_; }
    Outcome setRadio(bool on);
    // The networks of this name that the card hears, with their ages.
    Outcome readHeard(const Device& device, const std::string& network, std::vector<HeardNetwork>& heard);
    // When the card's last scan ended, in ms since the computer's start; -1 when it has made none.
    Outcome readLastScan(const Device& device, std::int64_t& time);
    // Has the card look for the network by its name, which one that does not announce itself answers to.
    // Success when the daemon does not look now.
    Outcome scanFor(const Device& device, const std::string& network);

    // Whom it may have left the radio to.
    [[nodiscard]] Iwd& iwd() noexcept { return iwd_; }

    // From here on the signals of cards and profiles are taken in, and those about the networks on the air.
    Outcome listen();
    Outcome listenToAir();
    // Waits for a signal at most until the time; fails when the daemon left the bus.
    Outcome handleSignals(Clock::time_point until) { return bus_.handleSignals(until); }
    // The state of a card or of an active profile (activeDeactivated when it is gone), read once and then
    // kept up to date by signals.
    Outcome deviceState(const std::string& path, std::uint32_t& state);
    Outcome activeState(const std::string& path, std::uint32_t& state);
    // Why the card last failed or was switched off, since it last began anything; 0 for no reason.
    [[nodiscard]] std::uint32_t failureOf(const std::string& device) const;
    // Counts what changed about the networks on the air since listenToAir.
    [[nodiscard]] unsigned changesOnAir() const noexcept { return changesOnAir_; }

  private:
    // Names of errors that are answers too: a success without a reply.
    using Answers = std::span<const std::string_view>;
    Outcome call(const std::string& path, const char* interface, const char* member, Arguments arguments,
                 MessageRef& reply, Answers answers = {}, std::string_view secret = {});
    Outcome readManager();
    Outcome awaitStartup();
    // Nothing, and success, when the object is gone.
    Outcome readObject(const std::string& path, const char* interface, std::optional<Dictionary>& properties);
    // The path that a look-up by name gives; empty, and success, when it ends in such an error.
    Outcome findPath(const std::string& object, const char* interface, const char* member,
                     const std::string& name, Answers unknown, std::string& path);
    using States = std::map<std::string, std::uint32_t, std::less<>>;
    // `gone` is the state of an object that is not there.
    Outcome readState(States& known, const std::string& path, const char* interface, std::uint32_t gone,
                      std::uint32_t& state);
    void noteDevice(const char* path, std::uint32_t state, std::uint32_t reason);

    Bus bus_;
    Iwd iwd_;
    bool isConnected_ = false;
    bool isListening_ = false;
    bool isListeningToAir_ = false;
    bool starting_ = false;
    bool radio_ = true;
    bool radioHardware_ = true;
    bool managerChanged_ = false;
    unsigned changesOnAir_ = 0;
    std::map<std::string, std::string> paths_;  // of the cards, by interface
    States devices_;
    States actives_;
    States failures_;
};

// What a card's reason for failing means to a person.
[[nodiscard]] std::string describeFailure(std::uint32_t reason);

}  // namespace platform::apply
