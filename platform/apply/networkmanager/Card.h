// A card that NetworkManager leads, while it is given the settings of a plan or is restored to how it was.
#pragma once

#include <algorithm>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/apply/Agent.h"
#include "platform/apply/networkmanager/Daemon.h"
#include "platform/apply/networkmanager/Profile.h"
#include "platform/base/Outcome.h"
#include "platform/values/Fields.h"

namespace platform::apply {

// A card as it was when this system found it.
struct CardSnapshot {
    ProfileSnapshot profile;
    bool wasUp = false;  // the profile was complete, with its addresses
    // The card's own switch, which the daemon sees only where there is a device manager; nothing without one.
    std::optional<bool> radioOff = {};
    std::vector<std::string> iwdAutoconnect = {};  // the networks that iwd joins of its own accord

    template <class Self, class Fields>
    static void listFields(Self& self, Fields& fields) {
        fields("UUID", self.profile.uuid);
        fields("Autoconnect", self.profile.autoconnect);
        fields("Radio", self.profile.radio);
        fields("WasUp", self.wasUp);
        fields("RadioOff", self.radioOff);
        fields("IwdAutoconnect", self.iwdAutoconnect);
    }
};

// A card's place in the order of the routes: the daemon numbers the routes of cards of one kind in the order
// in which they get to their addresses.
struct Place {
    bool isTaken = false;
    std::shared_ptr<const Place> before;  // the next better one; null for none
};

// One card's task, taken step by step: it never waits itself.
class Card {
  public:
    Card(Daemon& daemon, Task& task, CardSnapshot earlier, Clock::time_point deadline)
        : daemon_(daemon),
          task_(task),
          interface_(task.before->interface),
          before_(std::move(earlier)),
          deadline_(deadline) {}
    Card(const Card&) = delete;
    Card& operator=(const Card&) = delete;
    virtual ~Card() = default;

    // Takes every step that can be taken now. True when the task is settled.
    bool step();
    // When to step again though no signal has come.
    [[nodiscard]] Clock::time_point wakeAt() const noexcept { return std::min(wakeAt_, deadline_); }
    [[nodiscard]] Task& task() noexcept { return task_; }

  protected:
    // Each step names the one that comes next, is taken again, or ends the steps of this turn by waitUntil()
    // or settle().
    template <class Kind>
    void next(Outcome (Kind::*stage)()) {
        next_ = static_cast<Outcome (Card::*)()>(stage);
    }
    void settle(const std::string& trouble = {});
    void waitUntil(Clock::time_point time) {
        isWaiting_ = true;
        wakeAt_ = time;
    }
    // The same, unless that time or the deadline has come; whether it waits.
    bool waitsUntil(Clock::time_point time) {
        if (Clock::now() < std::min(time, deadline_)) {
            waitUntil(time);
        }
        return isWaiting_;
    }
    [[nodiscard]] bool isWaiting() const noexcept { return isWaiting_; }
    [[nodiscard]] bool isLate() const { return Clock::now() >= deadline_; }
    // Nothing, and success, when there is no such card.
    Outcome findCard(std::optional<Device>& device);
    // These wait, and are to be asked again, or are done. That a profile can be activated on the card, or
    // that it never can without a carrier, a radio, ...:
    Outcome awaitReady(bool& isReady);
    // ... that nothing is active on it any more:
    Outcome awaitRest();
    // ... why its profile is down; 0 for no reason.
    std::uint32_t awaitReason();
    // Our profile for the card; nothing when there is none. isForeign when somebody else's has its UUID.
    Outcome findOurProfile(std::optional<Profile>& profile, bool& isForeign);
    Outcome removeProfile();

    Daemon& daemon_;
    Task& task_;
    const std::string& interface_;
    const CardSnapshot before_;
    Device device_;
    std::optional<Active> active_;
    // What was on the air, and when the card's last scan ended, when it was looked at last.
    unsigned changesOnAir_ = 0;
    std::int64_t lastScan_ = 0;
    Clock::time_point deadline_;
    Clock::time_point readyDeadline_;
    Clock::time_point reasonDeadline_;

  private:
    Outcome (Card::*next_)() = nullptr;
    Clock::time_point wakeAt_;
    bool isWaiting_ = false;
    bool isSettled_ = false;
};

[[nodiscard]] std::unique_ptr<Card> makeConfiguringCard(Daemon& daemon, Task& task,
                                                        const CardSnapshot& earlier,
                                                        Clock::time_point deadline);
[[nodiscard]] std::unique_ptr<Card> makeRestoringCard(Daemon& daemon, Task& task, const CardSnapshot& earlier,
                                                      std::shared_ptr<Place> place,
                                                      Clock::time_point deadline);

// How long a card that was just handed to the daemon may take until a profile can be activated on it: without
// a carrier it never can.
inline constexpr std::chrono::seconds readyBound{2};
// And a wireless one whose radio was just switched on.
inline constexpr std::chrono::seconds radioBound{5};
// How long a card waits for the one before it to take its place.
inline constexpr std::chrono::seconds placeBound{4};
// What a card says about its failure comes right after what its profile says.
inline constexpr std::chrono::milliseconds reasonBound{250};
// A supplicant that was looking for the network itself is on it this soon after it was heard. One that
// waited for the daemon's own look to end would look once more, which takes seconds, unless asked anew.
inline constexpr std::chrono::milliseconds joinsAtOnce{250};

}  // namespace platform::apply
