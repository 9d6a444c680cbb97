// The agent that configures interfaces itself: through the kernel, with a DHCP client of its own and, where
// one runs, the card's wireless supplicant.
#include <algorithm>
#include <memory>
#include <optional>
#include <thread>
#include <utility>

#include "platform/apply/Agents.h"
#include "platform/apply/direct/DhcpClient.h"
#include "platform/apply/direct/DirectInterface.h"
#include "platform/apply/direct/Lease.h"

namespace platform::apply {
namespace {

// An interface without a carrier by then gets no more of our time: the cable or the radio may come later, and
// the settings stand.
constexpr std::chrono::milliseconds carrierBound{2000};
constexpr std::chrono::milliseconds lookAgain{20};

// One task from its start to the point where nothing more can be expected.
class Progress {
  public:
    Progress(Task& task, Clock::time_point deadline)
        : task_(&task), name_(task.before->interface), interface_(name_), deadline_(deadline) {}

    void start() {
        if (task_->plan != nullptr) {
            check(apply(*task_->plan));
        } else {
            check(giveBack());
        }
        carrierDeadline_ = std::min(deadline_, Clock::now() + carrierBound);
    }

    // True when it is settled.
    bool step() {
        while (!isSettled_ && advance()) {
        }
        return isSettled_;
    }

  private:
    Outcome apply(const InterfacePlan& plan) {
        RETURN_IF_FAILED(interface_.open());
        if (!interface_.link()) {
            task_->trouble = isOff(plan) ? "" : "there is no such interface";
            return {};
        }
        waitsForCarrier_ = !isOff(plan);
        waitsForLease_ = !isOff(plan) && plan.method == IPv4Method::dhcp;
        return interface_.apply(plan, snapshot(), join_, task_->trouble);
    }

    Outcome giveBack() {
        before_ = snapshot();
        if (!before_) {
            return {kSCStatusFailed, "what the record says of the time before cannot be understood"};
        }
        RETURN_IF_FAILED(interface_.open());
        // Asked before there is a network to answer, a DHCP client would ask again many seconds later.
        waitsForCarrier_ = waitsForOthers_ = interface_.link() && before_->hasLedAddress();
        std::string obstacle;
        RETURN_IF_FAILED(interface_.giveBack(*before_, join_, obstacle));
        if (!obstacle.empty()) {
            leaveUnfinished(obstacle);
        }
        return {};
    }

    [[nodiscard]] std::optional<LinkSnapshot> snapshot() const {
        LinkSnapshot before;
        return values::fromPropertyList(task_->before->state.get(), before) ? std::optional(before)
                                                                            : std::nullopt;
    }

    // Keeps the machine's first refusal, after which nothing is waited for. What fails for a card that is
    // gone is no refusal.
    bool check(const Outcome& outcome) {
        if (outcome.ok()) {
            return true;
        }
        if (interface_.refresh().ok() && !interface_.link()) {
            leaveUnfinished("the card was taken out");
        } else {
            task_->refusal = task_->refusal.ok() ? outcome : task_->refusal;
            stopWaiting();
        }
        return false;
    }

    // For the next run, which finds the switch turned or the card back, or gone for good.
    void leaveUnfinished(const std::string& trouble) {
        giveUp(trouble);
        task_->isUnfinished = task_->plan == nullptr;
    }

    void stopWaiting() {
        join_.reset();
        waitsForCarrier_ = waitsForLease_ = waitsForOthers_ = false;
    }

    // Takes one step; false when there is something to wait for.
    bool advance() {
        if (join_) {
            return advanceJoin();
        }
        if (waitsForCarrier_) {
            return advanceCarrier();
        }
        if (waitsForLease_) {
            return advanceLease();
        }
        if (before_ && !isResumed_) {
            isResumed_ = true;
            resumedAt_ = Clock::now();
            check(interface_.letOthersIn(*before_, task_->refusal.ok() && !task_->isUnfinished));
        } else if (waitsForOthers_ && !isLate()) {
            return advanceOthers();
        } else {
            isSettled_ = true;
        }
        return true;
    }

    bool advanceJoin() {
        WirelessJoin::State state{};
        std::string reason;
        if (!check(join_->poll(state, reason))) {
            return true;
        }
        if (state == WirelessJoin::State::waiting && !isLate()) {
            return false;
        }
        join_.reset();
        carrierDeadline_ = std::min(deadline_, Clock::now() + carrierBound);
        if (state != WirelessJoin::State::joined) {
            giveUp(reason.empty() ? "the network was not joined in time" : reason);
            return true;
        }
        interface_.noteJoined();
        if (waitsForLease_) {
            hurryDhcpClient(name_);
        }
        return true;
    }

    bool advanceCarrier() {
        if (!check(interface_.refresh())) {
            return true;
        }
        if (!interface_.link()) {
            giveUp("the card was taken out");
        } else if (interface_.link()->running) {
            waitsForCarrier_ = false;
        } else if (Clock::now() >= carrierDeadline_) {
            giveUp("it has no carrier: the cable is out, or the card is on no network");
        } else {
            return false;
        }
        return true;
    }

    bool advanceLease() {
        std::optional<DhcpClient> client;
        LeaseState lease;
        if (!check(readDhcpClient(name_, client)) || !check(readLease(name_, lease))) {
            return true;
        }
        if (lease.isTaken) {
            waitsForLease_ = false;
        } else if (!lease.refusal.empty()) {
            giveUp(lease.refusal);
        } else if (!client || !isAlive(client->process)) {
            check({kSCStatusFailed, "the DHCP client ended before it had a lease"});
        } else if (isLate()) {
            giveUp("no DHCP server answered; the DHCP client goes on asking");
        } else {
            return false;
        }
        return true;
    }

    // systemd-networkd configures the interface anew. A client whose lease has ended meanwhile takes the
    // address away first, and then brings one.
    bool advanceOthers() {
        bool has = false;
        if (!check(interface_.hasAddress(has))) {
            return true;
        }
        wasWithout_ = wasWithout_ || !has;
        const bool isRenewed =
            wasWithout_ || !before_->hasLeaseEnded() || Clock::now() - resumedAt_ > carrierBound;
        waitsForOthers_ =
            before_->others.networkd ? !isNetworkdSettled(interface_.link()->index) : !has || !isRenewed;
        return !waitsForOthers_;
    }

    // What was told first is what the rest follows from.
    void giveUp(const std::string& trouble) {
        if (task_->trouble.empty()) {
            task_->trouble = trouble;
        }
        stopWaiting();
    }
    [[nodiscard]] bool isLate() const { return Clock::now() >= deadline_; }

    Task* task_;
    std::string name_;
    DirectInterface interface_;
    Clock::time_point deadline_;
    Clock::time_point carrierDeadline_;
    std::unique_ptr<WirelessJoin> join_;
    bool waitsForCarrier_ = false;
    bool waitsForLease_ = false;
    // Giving back: how it was, and the others who led it.
    std::optional<LinkSnapshot> before_;
    bool isResumed_ = false;
    Clock::time_point resumedAt_;
    bool waitsForOthers_ = false;
    bool wasWithout_ = false;
    bool isSettled_ = false;
};

class DirectAgent final : public Agent {
  public:
    [[nodiscard]] std::string_view name() const noexcept override { return "direct"; }

    Outcome takeSnapshots(std::span<const std::string> interfaces, std::vector<Snapshot>& snapshots,
                          std::vector<Trouble>& leftAlone) override {
        snapshots.clear();
        leftAlone.clear();
        for (const std::string& name : interfaces) {
            DirectInterface interface(name);
            RETURN_IF_FAILED(interface.open());
            if (interface.link()) {
                LinkSnapshot snapshot;
                RETURN_IF_FAILED(interface.takeSnapshot(snapshot));
                snapshots.push_back({name, values::toPropertyList(snapshot)});
            }
        }
        return {};
    }

    void start(std::span<Task> tasks, Clock::time_point deadline) override {
        progress_.clear();
        for (const Task& task : tasks) {
            if (task.plan == nullptr) {
                askDhcpClientToEnd(task.before->interface);  // all of them, before any is waited for
            }
        }
        for (Task& task : tasks) {
            progress_.push_back(std::make_unique<Progress>(task, deadline));
            progress_.back()->start();
        }
    }

    bool settle(Clock::time_point until) override {
        for (;;) {
            std::erase_if(progress_, [](const auto& one) { return one->step(); });
            if (progress_.empty() || Clock::now() >= until) {
                return progress_.empty();
            }
            std::this_thread::sleep_for(lookAgain);
        }
    }

  private:
    std::vector<std::unique_ptr<Progress>> progress_;
};

}  // namespace

std::shared_ptr<Agent> makeDirectAgent() {
    return std::make_shared<DirectAgent>();
}

}  // namespace platform::apply
