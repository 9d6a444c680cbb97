// The agent that leads interfaces through NetworkManager.
//
// Neither checkpoints nor volatile profiles, which look made for this: a checkpoint is lost when the daemon
// restarts and takes back what the user changed meanwhile; a volatile profile is dropped with the first
// pulled cable, and the daemon then brings the best profile instead of the one before. An ordinary profile in
// memory, and a note of what was active, survive all of that.
#include <algorithm>
#include <memory>
#include <utility>

#include "platform/Log.h"
#include "platform/apply/Agents.h"
#include "platform/apply/Properties.h"
#include "platform/apply/networkmanager/Daemon.h"
#include "platform/apply/networkmanager/Profile.h"

namespace platform::apply {
namespace {

// Who leads the interface.
enum class Leader { daemon, nobody, other };

// An interface as it was captured.
struct Earlier {
    Leader leader = Leader::daemon;
    // With the daemon: what was active, and its switches; and by name the interfaces that are given back
    // later, with what was active on them.
    ProfileNote note;
    TextMap following;
    // With nobody: what the direct agent captured.
    values::Owned<CFDictionaryRef> direct;
    // With another: why it is not touched.
    std::string refusal;
};

values::Owned<CFDictionaryRef> encode(const Earlier& earlier) {
    DictionaryBuilder state;
    switch (earlier.leader) {
        case Leader::daemon: {
            DictionaryBuilder following;
            for (const auto& [interface, uuid] : earlier.following) {
                following.setText(makeString(interface).get(), uuid);
            }
            state.setText(CFSTR("UUID"), earlier.note.earlier)
                .setBoolean(CFSTR("Autoconnect"), earlier.note.autoconnect)
                .setBoolean(CFSTR("Radio"), earlier.note.radio)
                .set(CFSTR("Following"), following.take().get());
            break;
        }
        case Leader::nobody:
            state.set(CFSTR("Direct"), earlier.direct.get());
            break;
        case Leader::other:
            state.setText(CFSTR("Refusal"), earlier.refusal);
            break;
    }
    return state.take();
}

Outcome decode(CFDictionaryRef state, Earlier& earlier) {
    if (CFDictionaryRef const direct = dictionaryIn(state, CFSTR("Direct")); direct != nullptr) {
        earlier.leader = Leader::nobody;
        earlier.direct = values::Owned<CFDictionaryRef>::retained(direct);
        return {};
    }
    if (const auto refusal = textIn(state, CFSTR("Refusal"))) {
        earlier.leader = Leader::other;
        earlier.refusal = *refusal;
        return {};
    }
    const auto uuid = textIn(state, CFSTR("UUID"));
    const auto autoconnect = booleanIn(state, CFSTR("Autoconnect"));
    const auto radio = booleanIn(state, CFSTR("Radio"));
    CFDictionaryRef const following = dictionaryIn(state, CFSTR("Following"));
    if (!uuid || !autoconnect || !radio || following == nullptr) {
        return {kSCStatusFailed, "the note of how the interface was cannot be read"};
    }
    earlier.note = {*uuid, *autoconnect, *radio};
    std::vector<const void*> names(static_cast<std::size_t>(CFDictionaryGetCount(following)));
    std::vector<const void*> uuids(names.size());
    CFDictionaryGetKeysAndValues(following, names.data(), uuids.data());
    for (std::size_t i = 0; i < names.size(); ++i) {
        earlier.following[asText(names[i]).value_or("")] = asText(uuids[i]).value_or("");
    }
    return {};
}

class NetworkManagerAgent final : public Agent {
  public:
    [[nodiscard]] std::string_view name() const noexcept override { return "networkmanager"; }
    Outcome capture(std::span<const std::string> interfaces, std::vector<Captured>& captured) override;
    Outcome takeOver(const InterfacePlan& plan, const Captured& before) override;
    Outcome giveBack(const Captured& before) override;

  private:
    Outcome captureOne(Daemon& daemon, const Device& device, const std::string& interface, Earlier& earlier);
    const std::shared_ptr<Agent> direct_ = makeDirectAgent();
};

// Our profile for the interface; nothing when there is none. Fails when somebody else's has its UUID.
Outcome findOurProfile(Daemon& daemon, const std::string& interface, std::optional<Profile>& profile) {
    Outcome outcome = daemon.findProfile(profileUUID(interface), profile);
    if (outcome.ok() && profile && !isOurs(profile->sections)) {
        profile.reset();
        return {kSCStatusFailed, "another program has a profile under this system's UUID"};
    }
    return outcome;
}

Outcome findExisting(Daemon& daemon, const std::string& interface, Device& device) {
    std::optional<Device> found;
    Outcome outcome = daemon.findDevice(interface, found);
    if (outcome.ok() && !found) {
        return {kSCStatusFailed, "the card is gone"};
    }
    if (outcome.ok()) {
        device = std::move(*found);
    }
    return outcome;
}

// One interface on its way to what a plan says.
class Going {
  public:
    Going(Daemon& daemon, const InterfacePlan& plan, const ProfileNote& note, Device device)
        : daemon_(daemon), plan_(plan), note_(note), device_(std::move(device)) {}

    Outcome switchOff() {
        Outcome outcome = daemon_.disconnect(device_);
        // Only after it has come to rest: it then stays unmanaged through a restart of the daemon.
        if (outcome.ok() && device_.managed) {
            outcome = daemon_.setManaged(device_, false);
        }
        return outcome.ok() ? removeProfile() : outcome;
    }

    Outcome bringUp() {
        Outcome outcome;
        if (!device_.managed) {
            outcome = daemon_.setManaged(device_, true);
            if (outcome.ok()) {
                outcome = daemon_.settle(device_);
            }
        }
        const bool wireless = device_.kind == Device::Kind::wireless;
        if (outcome.ok() && !wireless && network()) {
            outcome = {kSCStatusFailed, "a network to join is named and the card is no wireless one"};
        }
        if (outcome.ok() && wireless) {
            outcome = switchRadio();
        }
        if (outcome.ok()) {
            outcome = daemon_.findActive(device_, active_);
        }
        WirelessFacts facts;
        if (outcome.ok() && wireless) {
            outcome = lookAround(facts);
        }
        if (outcome.ok() && wireless && !network() && facts.current.empty()) {
            logLine(LogLevel::notice,
                    plan_.name + ": no network is named and the card is on none, so it joins none");
            return {};
        }
        Sections sections;
        if (outcome.ok()) {
            outcome = makeProfile(plan_, wireless ? &facts : nullptr, note_, sections);
        }
        bool changed = true;
        std::string path;
        if (outcome.ok()) {
            outcome = storeProfile(sections, path, changed);
        }
        if (outcome.ok() && (changed || !active_ || active_->profile != path || !active_->complete)) {
            outcome = daemon_.activate(path, device_);
        }
        return outcome;
    }

  private:
    [[nodiscard]] std::optional<std::string> network() const {
        return plan_.wireless ? plan_.wireless->network : std::nullopt;
    }
    [[nodiscard]] std::string secret() const {
        return plan_.wireless ? plan_.wireless->key.value_or("") : "";
    }

    Outcome removeProfile() {
        std::optional<Profile> profile;
        Outcome outcome = findOurProfile(daemon_, plan_.name, profile);
        return outcome.ok() && profile ? daemon_.deleteProfile(profile->path) : outcome;
    }

    Outcome switchRadio() {
        const bool wanted = plan_.wireless && plan_.wireless->powerEnabled.value_or(false);
        if (!wanted || (daemon_.isRadioOn() && !daemon_.isRadioBlocked())) {
            return {};
        }
        if (daemon_.isRadioBlocked()) {
            return {kSCStatusFailed, "the radio is switched off by a switch on the computer"};
        }
        Outcome outcome = daemon_.setRadio(true);
        return outcome.ok() ? daemon_.settle(device_) : outcome;
    }

    Outcome lookAround(WirelessFacts& facts) {
        Outcome outcome = daemon_.look(device_, network().value_or(""), facts);
        std::optional<Profile> current;
        if (outcome.ok() && active_ && !active_->external) {
            outcome = daemon_.findProfile(active_->uuid, current);
        }
        if (outcome.ok() && current) {
            facts.current = wirelessSections(current->sections);
            outcome = daemon_.readSecrets(current->path, facts.current);
        }
        return outcome;
    }

    Outcome storeProfile(const Sections& sections, std::string& path, bool& changed) {
        std::optional<Profile> known;
        Outcome outcome = findOurProfile(daemon_, plan_.name, known);
        if (!outcome.ok() || !known) {
            return outcome.ok() ? daemon_.addProfile(sections, secret(), path) : outcome;
        }
        // Whether it says something new is seen by reading it twice: the daemon writes a profile its own way.
        path = known->path;
        Sections before = known->sections;
        outcome = daemon_.readSecrets(path, before);
        if (outcome.ok()) {
            outcome = daemon_.updateProfile(path, sections, secret());
        }
        if (outcome.ok()) {
            outcome = findOurProfile(daemon_, plan_.name, known);
        }
        if (outcome.ok() && known) {
            outcome = daemon_.readSecrets(path, known->sections);
            changed = known->sections != before;
        }
        return outcome;
    }

    Daemon& daemon_;
    const InterfacePlan& plan_;
    const ProfileNote& note_;
    Device device_;
    std::optional<Active> active_;
};

// One interface on its way back.
class Returning {
  public:
    Returning(Daemon& daemon, const std::string& interface, const Earlier& earlier)
        : daemon_(daemon), interface_(interface), note_(earlier.note), following_(earlier.following) {}

    Outcome run() {
        std::optional<Device> device;
        Outcome outcome = daemon_.findProfile(profileUUID(interface_), profile_);
        if (profile_ && !isOurs(profile_->sections)) {
            profile_.reset();
        }
        if (outcome.ok()) {
            outcome = daemon_.findDevice(interface_, device);
        }
        if (outcome.ok() && device) {
            device_ = std::move(*device);
            outcome = daemon_.findActive(device_, active_);
        }
        if (!outcome.ok() || !device) {
            return outcome.ok() ? removeProfile() : outcome;
        }
        if (active_ && active_->uuid != note_.earlier && active_->uuid != profileUUID(interface_)) {
            logLine(LogLevel::notice,
                    interface_ + ": somebody else has taken it over, and it is left to them");
            return removeProfile();
        }
        outcome = manage();
        if (!outcome.ok()) {
            return outcome;
        }
        const Outcome restored = note_.earlier.empty() ? leaveIdle() : activateEarlier();
        // Even when the earlier profile does not come up: the temporary one is not to stay in its place.
        const Outcome removed = removeProfile();
        outcome = restored.ok() ? removed : restored;
        if (outcome.ok()) {
            outcome = restoreSwitches();
        }
        return outcome.ok() ? compare() : outcome;
    }

  private:
    Outcome removeProfile() {
        Outcome outcome = profile_ ? daemon_.deleteProfile(profile_->path) : Outcome();
        profile_.reset();
        return outcome;
    }

    Outcome manage() {
        if (device_.managed) {
            return {};
        }
        Outcome outcome = daemon_.setManaged(device_, true);
        return outcome.ok() ? daemon_.settle(device_) : outcome;
    }

    Outcome leaveIdle() { return daemon_.disconnect(device_); }

    Outcome activateEarlier() {
        std::optional<Profile> earlier;
        Outcome outcome = daemon_.findProfile(note_.earlier, earlier);
        if (!outcome.ok()) {
            return outcome;
        }
        if (!earlier || device_.state < deviceDisconnected) {
            // What is active next is up to the daemon, as if this system had never been there.
            logLine(LogLevel::notice,
                    interface_ + (earlier ? ": no profile can be active on it now"
                                          : ": the profile that was active on it is deleted"));
            given_ = true;
            return {};
        }
        if (active_ && active_->uuid == note_.earlier) {
            return active_->complete ? Outcome() : daemon_.awaitActive(*active_, device_);
        }
        Outcome activated = releaseFollowing();
        if (activated.ok()) {
            activated = daemon_.activate(earlier->path, device_);
        }
        return activated.ok()
                   ? activated
                   : Outcome(activated.status(),
                             "the profile that was active before does not come up: " + activated.reason());
    }

    // The daemon gives the routes of a card a worse number than those of all cards that are active. A card
    // that is to have a worse one than this one, and was never taken over because the run was ended before,
    // makes way, and comes back when it is its turn.
    Outcome releaseFollowing() {
        Outcome outcome;
        for (const auto& [interface, uuid] : following_) {
            std::optional<Device> device;
            std::optional<Active> active;
            outcome = daemon_.findDevice(interface, device);
            if (outcome.ok() && device) {
                outcome = daemon_.findActive(*device, active);
            }
            if (outcome.ok() && active && active->uuid == uuid) {
                outcome = daemon_.disconnect(*device);
            }
            if (!outcome.ok()) {
                break;
            }
        }
        return outcome;
    }

    // After our profile is gone, or the daemon would activate it again.
    Outcome restoreSwitches() {
        Outcome outcome = findExisting(daemon_, interface_, device_);
        if (outcome.ok() && device_.autoconnect != note_.autoconnect) {
            outcome = daemon_.setAutoconnect(device_, note_.autoconnect);
        }
        if (outcome.ok() && !note_.radio && daemon_.isRadioOn()) {
            outcome = daemon_.setRadio(false);
        }
        return outcome;
    }

    Outcome compare() {
        Outcome outcome = findExisting(daemon_, interface_, device_);
        if (outcome.ok()) {
            outcome = daemon_.findActive(device_, active_);
        }
        if (!outcome.ok()) {
            return outcome;
        }
        const bool same = (given_ || (active_ ? active_->uuid : "") == note_.earlier) && device_.managed &&
                          device_.autoconnect == note_.autoconnect;
        return same ? Outcome() : Outcome(kSCStatusFailed, "it is not as it was before");
    }

    Daemon& daemon_;
    const std::string& interface_;
    const ProfileNote& note_;
    const TextMap& following_;
    Device device_;
    std::optional<Active> active_;
    std::optional<Profile> profile_;
    bool given_ = false;
};

Outcome NetworkManagerAgent::captureOne(Daemon& daemon, const Device& device, const std::string& interface,
                                        Earlier& earlier) {
    std::optional<Active> active;
    Outcome outcome = daemon.findActive(device, active);
    bool isVolatile = false;
    if (outcome.ok() && active && !active->external) {
        outcome = daemon.isVolatile(active->profile, isVolatile);
    }
    if (!outcome.ok()) {
        return outcome;
    }
    if (device.kind == Device::Kind::other) {
        earlier.refusal = "it is neither a wired nor a wireless card";
    } else if (active && active->external) {
        earlier.refusal = "another program than NetworkManager configured it";
    } else if (isVolatile) {
        earlier.refusal = "its profile would be lost with its connection";
    }
    if (!earlier.refusal.empty()) {
        earlier.leader = Leader::other;
        return {};
    }
    earlier.note = {active ? active->uuid : "", device.autoconnect, daemon.isRadioOn()};
    if (earlier.note.earlier == profileUUID(interface)) {
        // The record of how it was is lost, but not the profile.
        std::optional<Profile> profile;
        outcome = findOurProfile(daemon, interface, profile);
        earlier.note = profile ? noteOf(profile->sections) : ProfileNote();
    }
    return outcome;
}

Outcome NetworkManagerAgent::capture(std::span<const std::string> interfaces,
                                     std::vector<Captured>& captured) {
    captured.clear();
    Daemon daemon;
    Outcome outcome = daemon.connect();
    struct Ranked {
        std::uint32_t metric;
        std::string interface;
        Earlier earlier;
    };
    std::vector<Ranked> ranked;
    std::vector<std::string> unmanaged;
    for (const std::string& interface : interfaces) {
        std::optional<Device> device;
        std::uint32_t metric = 0;
        Earlier earlier;
        if (outcome.ok()) {
            outcome = daemon.findDevice(interface, device);
        }
        if (outcome.ok() && device && !device->managed) {
            unmanaged.push_back(interface);
            continue;
        }
        if (outcome.ok() && device) {
            outcome = captureOne(daemon, *device, interface, earlier);
        }
        if (outcome.ok() && device) {
            outcome = daemon.readMetric(*device, metric);
        }
        if (!outcome.ok()) {
            return outcome;
        }
        if (device) {
            ranked.push_back({metric, interface, std::move(earlier)});
        }
    }
    // NetworkManager numbers the cards' routes in the order of activation, so the card with the best number
    // comes first; before all, the ones that have none, which are to leave theirs free.
    std::stable_sort(ranked.begin(), ranked.end(),
                     [](const Ranked& a, const Ranked& b) { return a.metric < b.metric; });
    for (auto one = ranked.begin(); one != ranked.end(); ++one) {
        std::for_each(one + 1, ranked.end(), [one](const Ranked& later) {
            if (!later.earlier.note.earlier.empty()) {
                one->earlier.following[later.interface] = later.earlier.note.earlier;
            }
        });
        captured.push_back({one->interface, encode(one->earlier)});
    }
    // What NetworkManager is told to leave alone is led without it, which it does not even notice.
    std::vector<Captured> direct;
    if (outcome.ok() && !unmanaged.empty()) {
        outcome = direct_->capture(unmanaged, direct);
    }
    for (Captured& one : direct) {
        Earlier earlier;
        earlier.leader = Leader::nobody;
        earlier.direct = std::move(one.state);
        captured.push_back({std::move(one.interface), encode(earlier)});
    }
    return outcome;
}

Outcome NetworkManagerAgent::takeOver(const InterfacePlan& plan, const Captured& before) {
    Earlier earlier;
    Outcome outcome = decode(before.state.get(), earlier);
    if (outcome.ok() && earlier.leader == Leader::nobody) {
        return direct_->takeOver(plan, {before.interface, earlier.direct});
    }
    if (outcome.ok() && earlier.leader == Leader::other) {
        outcome = {kSCStatusFailed, "it is left as it is: " + earlier.refusal};
    }
    Daemon daemon;
    if (outcome.ok()) {
        outcome = daemon.connect();
    }
    std::optional<Device> device;
    if (outcome.ok()) {
        outcome = daemon.findDevice(plan.name, device);
    }
    if (!outcome.ok()) {
        return outcome;
    }
    if (!device) {
        return plan.active ? Outcome(kSCStatusFailed, "the card is gone") : Outcome();
    }
    Going going(daemon, plan, earlier.note, std::move(*device));
    return plan.active ? going.bringUp() : going.switchOff();
}

Outcome NetworkManagerAgent::giveBack(const Captured& before) {
    Earlier earlier;
    Outcome outcome = decode(before.state.get(), earlier);
    if (!outcome.ok() || earlier.leader == Leader::other) {
        return outcome;
    }
    if (earlier.leader == Leader::nobody) {
        return direct_->giveBack({before.interface, earlier.direct});
    }
    Daemon daemon;
    outcome = daemon.connect();
    return outcome.ok() ? Returning(daemon, before.interface, earlier).run() : outcome;
}

}  // namespace

std::shared_ptr<Agent> makeNetworkManagerAgent() {
    return std::make_shared<NetworkManagerAgent>();
}

Outcome isNetworkManagerRunning(bool& running) {
    Bus bus;
    running = false;
    bool found = false;
    Outcome outcome = bus.connect("org.freedesktop.NetworkManager", found);
    return outcome.ok() && found ? bus.hasOwner(running) : outcome;
}

}  // namespace platform::apply
