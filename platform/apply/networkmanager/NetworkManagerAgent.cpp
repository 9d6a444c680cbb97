// The agent that leads interfaces through NetworkManager.
//
// Neither checkpoints nor volatile profiles, which look made for this: a checkpoint is lost when the daemon
// restarts and takes back what the user changed meanwhile; a volatile profile is dropped with the first
// pulled cable, and the daemon then brings the best profile instead of the one before. An ordinary profile in
// memory, and what was active before, survive all of that.
#include <algorithm>
#include <map>
#include <memory>
#include <utility>

#include "platform/apply/Agents.h"
#include "platform/apply/Radio.h"
#include "platform/apply/networkmanager/Card.h"

namespace platform::apply {
namespace {

// For cards that make way for others before the way back.
constexpr std::chrono::seconds makeWayBound{2};

class NetworkManagerAgent final : public Agent {
  public:
    [[nodiscard]] std::string_view name() const noexcept override { return "networkmanager"; }
    Outcome open(bool& running) { return daemon_.open(running); }
    Outcome takeSnapshots(std::span<const std::string> interfaces, std::vector<Snapshot>& snapshots,
                          std::vector<Trouble>& leftAlone) override;
    void start(std::span<Task> tasks, Clock::time_point deadline) override;
    bool settle(Clock::time_point until) override;

  private:
    // Why the card is left alone goes into reason; empty for one that this agent leads.
    Outcome captureCard(const Device& device, const std::string& interface, CardSnapshot& earlier,
                        std::string& reason);
    Outcome prepare(std::span<Task> tasks, std::vector<std::shared_ptr<Place>>& places);
    Outcome awaitRest(std::span<const Device> devices);

    Daemon daemon_;
    bool isJustConnected_ = false;
    std::vector<std::unique_ptr<Card>> cards_;
};

Outcome NetworkManagerAgent::captureCard(const Device& device, const std::string& interface,
                                         CardSnapshot& earlier, std::string& reason) {
    std::optional<Active> active;
    RETURN_IF_FAILED(daemon_.findActive(device, active));
    bool isVolatile = false;
    if (active && !active->external) {
        RETURN_IF_FAILED(daemon_.isVolatile(active->profile, isVolatile));
    }
    reason = device.kind == Device::Kind::other
                 ? "it is left as it is: it is neither a wired nor a wireless card"
             : active && active->external
                 ? "it is left as it is: another program than NetworkManager configured it"
             : isVolatile ? "it is left as it is: its profile would be lost with its connection"
                          : "";
    earlier = {{active ? active->uuid : "", device.autoconnect, daemon_.isRadioOn()},
               active && active->complete,
               {}};
    if (const std::optional<Radio> radio = readRadio(interface)) {
        earlier.radioOff = radio->isOff;
    }
    if (earlier.profile.uuid == profileUUID(interface)) {
        // The record of how it was is lost, but not the profile.
        std::optional<Profile> profile;
        RETURN_IF_FAILED(daemon_.findProfile(profileUUID(interface), profile));
        const bool isKnown = profile && isOurs(profile->sections);
        earlier = {isKnown ? snapshotIn(profile->sections) : ProfileSnapshot(), true, {}};
    }
    return device.kind == Device::Kind::wireless ? daemon_.iwd().readAutoconnect(earlier.iwdAutoconnect)
                                                 : Outcome();
}

Outcome NetworkManagerAgent::takeSnapshots(std::span<const std::string> interfaces,
                                           std::vector<Snapshot>& snapshots,
                                           std::vector<Trouble>& leftAlone) {
    snapshots.clear();
    leftAlone.clear();
    RETURN_IF_FAILED(daemon_.connect());
    isJustConnected_ = true;
    struct Ranked {
        std::uint32_t metric;
        Snapshot snapshot;
    };
    std::vector<Ranked> ranked;
    for (const std::string& interface : interfaces) {
        std::optional<Device> device;
        RETURN_IF_FAILED(daemon_.findDevice(interface, device));
        // What NetworkManager is told to leave alone is led without it, which it does not even notice.
        if (!device || !device->managed) {
            continue;
        }
        CardSnapshot earlier;
        std::string reason;
        RETURN_IF_FAILED(captureCard(*device, interface, earlier, reason));
        if (!reason.empty()) {
            leftAlone.push_back({interface, std::move(reason)});
            continue;
        }
        std::uint32_t metric = 0;
        RETURN_IF_FAILED(daemon_.readMetric(*device, metric));
        ranked.push_back({metric, {interface, values::toPropertyList(earlier)}});
    }
    // NetworkManager numbers the cards' routes in the order of activation, so the card with the best number
    // comes first; before all, the ones that have none, which are to leave theirs free.
    std::ranges::stable_sort(ranked, {}, &Ranked::metric);
    for (Ranked& one : ranked) {
        snapshots.push_back(std::move(one.snapshot));
    }
    return {};
}

void NetworkManagerAgent::start(std::span<Task> tasks, Clock::time_point deadline) {
    cards_.clear();
    std::vector<std::shared_ptr<Place>> places;
    const Outcome prepared = prepare(tasks, places);
    for (std::size_t i = 0; i < tasks.size(); ++i) {
        Task& task = tasks[i];
        CardSnapshot earlier;
        if (!prepared.ok()) {
            task.refusal = prepared;
        } else if (!values::fromPropertyList(task.before->state.get(), earlier)) {
            task.refusal = {kSCStatusFailed, "what the record says of the time before cannot be understood"};
        } else {
            cards_.push_back(task.plan != nullptr
                                 ? makeConfiguringCard(daemon_, task, earlier, deadline)
                                 : makeRestoringCard(daemon_, task, earlier, places[i], deadline));
        }
    }
    std::erase_if(cards_, [](const auto& card) { return card->step(); });
}

// The daemon gives the routes of a card a worse number than those of all cards that are active. A card of
// this way back that is to have a worse one than one before it, and is on its earlier profile already because
// the run that would have taken it over was ended before, makes way, and comes back when it is its turn.
Outcome NetworkManagerAgent::prepare(std::span<Task> tasks, std::vector<std::shared_ptr<Place>>& places) {
    // A look of a moment ago counts.
    if (!std::exchange(isJustConnected_, false)) {
        RETURN_IF_FAILED(daemon_.connect());
    }
    RETURN_IF_FAILED(daemon_.listen());
    std::map<Device::Kind, std::shared_ptr<Place>> last;
    std::vector<Device> makingWay;
    bool isAnyAway = false;
    for (const Task& task : tasks) {
        std::optional<Device> device;
        if (task.plan == nullptr) {
            RETURN_IF_FAILED(daemon_.findDevice(task.before->interface, device));
        }
        std::shared_ptr<Place>& before = last[device ? device->kind : Device::Kind::other];
        places.push_back(std::make_shared<Place>(Place{false, before}));
        before = places.back();
        CardSnapshot earlier;
        if (!device || !values::fromPropertyList(task.before->state.get(), earlier) ||
            earlier.profile.uuid.empty()) {
            continue;
        }
        std::optional<Active> active;
        RETURN_IF_FAILED(daemon_.findActive(*device, active));
        const bool isBack = active && active->uuid == earlier.profile.uuid;
        if (isBack && isAnyAway) {
            RETURN_IF_FAILED(daemon_.disconnect(*device));
            makingWay.push_back(*device);
        }
        isAnyAway = isAnyAway || !isBack;
    }
    return awaitRest(makingWay);
}

Outcome NetworkManagerAgent::awaitRest(std::span<const Device> devices) {
    const Clock::time_point deadline = Clock::now() + makeWayBound;
    for (const Device& device : devices) {
        std::uint32_t state = 0;
        RETURN_IF_FAILED(daemon_.deviceState(device.path, state));
        while (state > deviceDisconnected && Clock::now() < deadline) {
            RETURN_IF_FAILED(daemon_.handleSignals(deadline));
            RETURN_IF_FAILED(daemon_.deviceState(device.path, state));
        }
    }
    return {};
}

bool NetworkManagerAgent::settle(Clock::time_point until) {
    for (;;) {
        std::erase_if(cards_, [](const auto& card) { return card->step(); });
        if (cards_.empty() || Clock::now() >= until) {
            return cards_.empty();
        }
        Clock::time_point wake = until;
        for (const auto& card : cards_) {
            wake = std::min(wake, card->wakeAt());
        }
        if (const Outcome heard = daemon_.handleSignals(wake); !heard.ok()) {
            for (const auto& card : cards_) {
                card->task().refusal = heard;
            }
            cards_.clear();
        }
    }
}

}  // namespace

Outcome findNetworkManagerAgent(std::shared_ptr<Agent>& agent) {
    const auto made = std::make_shared<NetworkManagerAgent>();
    bool running = false;
    RETURN_IF_FAILED(made->open(running));
    agent = running ? made : nullptr;
    return {};
}

std::shared_ptr<Agent> makeNetworkManagerAgent() {
    return std::make_shared<NetworkManagerAgent>();
}

}  // namespace platform::apply
