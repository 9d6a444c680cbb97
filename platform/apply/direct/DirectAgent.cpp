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
        task_->refusal = task_->plan != nullptr ? apply(*task_->plan) : giveBack();
        isSettled_ = !task_->refusal.ok();
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
        const std::optional<Snapshot> before = snapshot();
        if (!before) {
            return {kSCStatusFailed, "what the record says of the time before cannot be understood"};
        }
        RETURN_IF_FAILED(interface_.open());
        RETURN_IF_FAILED(interface_.giveBack(*before, join_));
        waitsForNetworkd_ = waitsForCarrier_ =
            interface_.link() && before->others.networkd && !before->state.addresses.empty();
        return {};
    }

    [[nodiscard]] std::optional<Snapshot> snapshot() const {
        Snapshot before;
        return values::fromPropertyList(task_->before->state.get(), before) ? std::optional(before)
                                                                            : std::nullopt;
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
        if (waitsForNetworkd_ && !isLate() && !isNetworkdSettled(interface_.link()->index)) {
            return false;
        }
        isSettled_ = true;
        return true;
    }

    bool advanceJoin() {
        WirelessJoin::State state{};
        std::string reason;
        task_->refusal = join_->poll(state, reason);
        if (task_->refusal.ok() && state == WirelessJoin::State::waiting && !isLate()) {
            return false;
        }
        join_.reset();
        carrierDeadline_ = std::min(deadline_, Clock::now() + carrierBound);
        if (task_->refusal.ok() && state != WirelessJoin::State::joined) {
            giveUp(reason.empty() ? "the network was not joined in time" : reason);
        } else if (task_->refusal.ok()) {
            interface_.noteJoined();
            if (waitsForLease_) {
                hurryDhcpClient(name_);
            }
        }
        isSettled_ = isSettled_ || !task_->refusal.ok();
        return true;
    }

    bool advanceCarrier() {
        task_->refusal = interface_.refresh();
        if (!task_->refusal.ok() || !interface_.link()) {
            giveUp(task_->refusal.ok() ? "the card was taken out" : "");
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
        bool isRunning = false;
        LeaseState lease;
        task_->refusal = isDhcpClientRunning(name_, isRunning);
        if (task_->refusal.ok()) {
            task_->refusal = readLease(name_, lease);
        }
        if (!task_->refusal.ok() || lease.isTaken) {
            isSettled_ = true;
        } else if (!lease.refusal.empty()) {
            giveUp(lease.refusal);
        } else if (!isRunning) {
            task_->refusal = {kSCStatusFailed, "the DHCP client ended before it had a lease"};
            isSettled_ = true;
        } else if (isLate()) {
            giveUp("no DHCP server answered; the DHCP client goes on asking");
        } else {
            return false;
        }
        return true;
    }

    // What was told first is what the rest follows from.
    void giveUp(const std::string& trouble) {
        if (task_->trouble.empty()) {
            task_->trouble = trouble;
        }
        isSettled_ = true;
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
    bool waitsForNetworkd_ = false;  // which configures the interface anew
    bool isSettled_ = false;
};

class DirectAgent final : public Agent {
  public:
    [[nodiscard]] std::string_view name() const noexcept override { return "direct"; }

    Outcome capture(std::span<const std::string> interfaces, std::vector<Captured>& captured,
                    std::vector<Trouble>& leftAlone) override {
        captured.clear();
        leftAlone.clear();
        for (const std::string& name : interfaces) {
            DirectInterface interface(name);
            RETURN_IF_FAILED(interface.open());
            if (interface.link()) {
                Snapshot snapshot;
                RETURN_IF_FAILED(interface.takeSnapshot(snapshot));
                captured.push_back({name, values::toPropertyList(snapshot)});
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
