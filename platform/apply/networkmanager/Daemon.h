// NetworkManager as this system uses it: cards, profiles, and which profile a card is on.
#pragma once

#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "platform/Outcome.h"
#include "platform/apply/networkmanager/Bus.h"
#include "platform/apply/networkmanager/Profile.h"
#include "platform/apply/networkmanager/Value.h"

namespace platform::apply {

// How long an activation, or a card that is being switched off, is waited for.
inline constexpr std::chrono::seconds activationBound{45};

// Of NetworkManager's states of a card: unmanaged 10, unavailable 20, disconnected 30, then activating,
// activated 100, deactivating 110, failed 120.
inline constexpr std::uint32_t deviceDisconnected = 30;
inline constexpr std::uint32_t deviceDeactivating = 110;
inline constexpr std::uint32_t deviceFailed = 120;

struct Device {
    enum class Kind { wired, wireless, other };

    std::string path;
    Kind kind = Kind::other;
    std::uint32_t state = 0;
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

class Daemon {
  public:
    // Fails when NetworkManager does not run. Waits for a daemon that is starting, whose cards are not yet
    // what they will be, for at most ten seconds.
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
    // In memory only, and not activated by the daemon of its own accord. The secret is kept out of reasons.
    Outcome addProfile(const Sections& sections, std::string_view secret, std::string& path);
    Outcome updateProfile(const std::string& path, const Sections& sections, std::string_view secret);
    // One that is gone is a success.
    Outcome deleteProfile(const std::string& path);

    // Return when the profile is active on the card, with its addresses; the reason says what went wrong.
    Outcome activate(const std::string& profile, const Device& device);
    Outcome awaitActive(const Active& active, const Device& device);
    // Returns when nothing is active on the card. The daemon leaves it alone until somebody activates a
    // profile on it.
    Outcome disconnect(const Device& device);
    Outcome setManaged(const Device& device, bool managed);
    Outcome setAutoconnect(const Device& device, bool autoconnect);
    // Waits for a card that was just handed to the daemon until a profile can be activated on it; after five
    // seconds it cannot. The state is brought up to date.
    Outcome settle(Device& device);

    // The best metric of the card's default routes, or, when it has none, of its routes; 0 without routes.
    Outcome readMetric(const Device& device, std::uint32_t& metric);

    // The radio of all wireless cards.
    [[nodiscard]] bool isRadioOn() const noexcept { return radio_; }
    [[nodiscard]] bool isRadioBlocked() const noexcept { return !radioHardware_; }
    Outcome setRadio(bool on);
    // What the card can do and sees of a network. A network that it does not see is looked for, for ten
    // seconds at most. An empty name looks for nothing.
    Outcome look(const Device& device, const std::string& network, WirelessFacts& facts);

  private:
    struct Progress;

    Outcome call(const std::string& path, const char* interface, const char* member, Arguments arguments,
                 Message& reply, std::string* error = nullptr, std::string_view secret = {});
    Outcome readManager();
    Outcome awaitStartup();
    Outcome readProfile(const std::string& path, std::optional<Profile>& profile);
    Outcome follow(Progress& progress, const Device& device);
    Outcome await(Progress& progress);
    Outcome awaitState(Device& device, std::uint32_t lowest, std::uint32_t highest,
                       std::chrono::seconds bound, const char* late);
    Outcome readAccessPoints(const Device& device, const std::string& network,
                             std::vector<AccessPoint>& seen);

    Bus bus_;
    bool starting_ = false;
    bool radio_ = true;
    bool radioHardware_ = true;
};

// What a card's reason for failing means to a person.
[[nodiscard]] std::string describeFailure(std::uint32_t reason);

}  // namespace platform::apply
