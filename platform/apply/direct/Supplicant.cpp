#include "platform/apply/direct/Supplicant.h"

#include <algorithm>
#include <chrono>
#include <utility>

#include "platform/apply/WirelessChoice.h"
#include "platform/apply/direct/SupplicantSocket.h"
#include "platform/base/Hexadecimal.h"

namespace platform::apply {
namespace {

using std::chrono::steady_clock;

// Between two scans for a network that was not heard: the supplicant itself takes its time.
constexpr std::chrono::seconds scanAgain{2};
// Between two looks at the state when no notice tells of a change.
constexpr std::chrono::milliseconds lookAgain{250};

// The settings of the network to add, each as the words that follow its number.
std::vector<std::string> settingsFor(const WirelessSettings& settings, const JoinChoice& choice) {
    std::vector<std::string> words{"ssid " + hexOf(*settings.network), "scan_ssid 1"};
    if (choice.isAdHoc) {
        words.emplace_back("mode 1");
        words.push_back("frequency " + std::to_string(choice.frequency));
    }
    const std::string key = settings.key.value_or("");
    const std::string quoted = "\"" + key + "\"";
    switch (choice.security) {
        case Security::wep:
            words.emplace_back("key_mgmt NONE");
            words.push_back("wep_key0 " + (isInDigits(key) ? key : quoted));
            words.emplace_back("wep_tx_keyidx 0");
            break;
        case Security::wpa:
            words.emplace_back("key_mgmt WPA-PSK");
            // Ten digits are a WEP key, and characters here.
            words.push_back("psk " + (key.size() == 64 ? key : quoted));
            if (choice.isAdHoc) {
                // All that a network without an access point can agree on.
                words.insert(words.end(), {"proto RSN", "pairwise CCMP", "group CCMP"});
            }
            break;
        case Security::sae:
            words.emplace_back("key_mgmt SAE");
            words.emplace_back("ieee80211w 2");
            words.push_back("sae_password " + quoted);
            break;
        case Security::open:
        case Security::enterprise:
            words.emplace_back("key_mgmt NONE");
            break;
    }
    return words;
}

class SupplicantJoin final : public WirelessJoin {
  public:
    SupplicantJoin(SupplicantSocket socket, WirelessSettings settings)
        : socket_(std::move(socket)), settings_(std::move(settings)) {}

    Outcome start(bool mayStay) {
        std::vector<ConfiguredNetwork> networks;
        RETURN_IF_FAILED(socket_.listNetworks(networks));
        RETURN_IF_FAILED(socket_.order("ATTACH", "tell what happens"));
        for (const ConfiguredNetwork& network : networks) {
            if (network.isOurs) {
                earlier_.push_back(network.number);
            }
        }
        if (mayStay && earlier_.size() == 1) {
            number_ = earlier_[0];
            RETURN_IF_FAILED(look());
            if (state_ == State::joined) {
                return {};
            }
        }
        return decide();
    }

    Outcome poll(State& state, std::string& reason) override {
        if (state_ == State::waiting) {
            RETURN_IF_FAILED(hear());
        }
        if (state_ == State::waiting && steady_clock::now() >= nextLook_) {
            nextLook_ = steady_clock::now() + lookAgain;
            RETURN_IF_FAILED(look());
        }
        if (state_ == State::waiting && !choice_.isHeard && steady_clock::now() >= nextScan_) {
            nextScan_ = steady_clock::now() + scanAgain;
            // By its name, as the network says. One that is under way goes on.
            std::string answer;
            RETURN_IF_FAILED(socket_.ask("SCAN", "look around", answer));
        }
        state = state_;
        reason = reason_;
        return {};
    }

  private:
    // Looks whether the card is on the network.
    Outcome look() {
        SupplicantValues status;
        RETURN_IF_FAILED(socket_.readStatus(status));
        if (status["wpa_state"] != "COMPLETED" || status["id"] != std::to_string(number_)) {
            return {};
        }
        const std::string& bssid = status["bssid"];
        if (choice_.isAdHoc && std::ranges::count(cells_, bssid) == 0) {
            // The cell was gone, and the card has formed one of its own: it leaves it at once.
            gone_.insert(gone_.end(), cells_.begin(), cells_.end());
            cells_.clear();
            choice_ = chooseNetwork({}, settings_.key).choice.value_or(JoinChoice());
            return configure();
        }
        state_ = State::joined;
        return {};
    }

    // What the supplicant tells of its own accord.
    Outcome hear() {
        std::vector<std::string> notices;
        RETURN_IF_FAILED(socket_.takeNotices(notices));
        for (const std::string& notice : notices) {
            const auto has = [&notice](const char* text) { return notice.find(text) != std::string::npos; };
            if (has("reason=WRONG_KEY") || has("pre-shared key may be incorrect")) {
                state_ = State::givenUp;
                reason_ = "the network refused the key";
                return {};
            }
            if (has("CTRL-EVENT-ASSOC-REJECT") || has("CTRL-EVENT-AUTH-REJECT")) {
                reason_ = "the network refused the card";
            } else if (has("CTRL-EVENT-CONNECTED")) {
                nextLook_ = steady_clock::now();
            } else if (has("CTRL-EVENT-SCAN-RESULTS")) {
                RETURN_IF_FAILED(decide());
            }
        }
        return {};
    }

    // Chooses among what is on the air, and has the supplicant join it, unless it is at it.
    Outcome decide() {
        std::vector<HeardNetwork> heard;
        RETURN_IF_FAILED(socket_.readHeard(*settings_.network, heard));
        std::erase_if(heard, [this](const HeardNetwork& network) {
            return std::ranges::count(gone_, network.bssid) != 0;
        });
        const JoinDecision decision = chooseNetwork(heard, settings_.key);
        if (!decision.choice) {
            state_ = State::givenUp;
            reason_ = decision.reason;
            return removeEarlier();
        }
        if (!decision.reason.empty() || !decision.choice->isHeard) {
            reason_ = decision.reason.empty() ? "the network was not found" : decision.reason;
        } else if (reason_ == "the network was not found") {
            reason_.clear();
        }
        for (const HeardNetwork& network : heard) {
            if (network.isAdHoc && std::ranges::count(cells_, network.bssid) == 0) {
                cells_.push_back(network.bssid);
            }
        }
        // What is not heard in this scan may be heard in the next: the supplicant keeps what it was told.
        if (isConfigured_ && (!decision.choice->isHeard || decision.choice->isSameJoin(choice_))) {
            return {};
        }
        choice_ = *decision.choice;
        return configure();
    }

    Outcome configure() {
        RETURN_IF_FAILED(socket_.addNetwork(settingsFor(settings_, choice_), number_));
        RETURN_IF_FAILED(socket_.order("SELECT_NETWORK " + std::to_string(number_), "choose a network"));
        isConfigured_ = true;
        // Not before: the card may be on an earlier one of ours.
        RETURN_IF_FAILED(removeEarlier());
        earlier_ = {number_};
        return {};
    }

    Outcome removeEarlier() {
        for (const int number : std::exchange(earlier_, {})) {
            RETURN_IF_FAILED(socket_.removeNetwork(number));
        }
        return {};
    }

    SupplicantSocket socket_;
    WirelessSettings settings_;
    int number_ = -1;
    std::vector<int> earlier_;  // of ours, to be removed behind the next one
    JoinChoice choice_;
    bool isConfigured_ = false;
    std::vector<std::string> cells_;  // every ad-hoc cell of the name that was heard
    std::vector<std::string> gone_;   // and those that were not there when they were joined
    State state_ = State::waiting;
    std::string reason_;
    steady_clock::time_point nextLook_;
    steady_clock::time_point nextScan_ = steady_clock::now() + scanAgain;
};

// The card goes back to one of its own networks by itself, unless a scan hears none.
class SupplicantReturn final : public WirelessJoin {
  public:
    explicit SupplicantReturn(SupplicantSocket socket) : socket_(std::move(socket)) {}

    Outcome start() { return socket_.order("ATTACH", "tell what happens"); }

    Outcome poll(State& state, std::string& reason) override {
        std::vector<std::string> notices;
        RETURN_IF_FAILED(socket_.takeNotices(notices));
        const bool isAnyThere = std::ranges::none_of(notices, [](const std::string& notice) {
            return notice.find("CTRL-EVENT-NETWORK-NOT-FOUND") != std::string::npos;
        });
        state = isAnyThere ? State::waiting : State::givenUp;
        reason = "the wireless network of before is not there now, and is joined when it comes";
        if (!isAnyThere || steady_clock::now() < nextLook_) {
            return {};
        }
        nextLook_ = steady_clock::now() + lookAgain;
        SupplicantValues status;
        RETURN_IF_FAILED(socket_.readStatus(status));
        if (status["wpa_state"] == "COMPLETED") {
            state = State::joined;
        }
        return {};
    }

  private:
    SupplicantSocket socket_;
    steady_clock::time_point nextLook_;
};

}  // namespace

Outcome readKnownNetworks(const std::string& interface, std::optional<KnownNetworks>& networks) {
    networks.reset();
    SupplicantSocket supplicant;
    bool isThere = false;
    RETURN_IF_FAILED(supplicant.open(interface, isThere));
    if (!isThere) {
        return {};
    }
    std::vector<ConfiguredNetwork> list;
    SupplicantValues status;
    RETURN_IF_FAILED(supplicant.listNetworks(list));
    RETURN_IF_FAILED(supplicant.readStatus(status));
    KnownNetworks& known = networks.emplace();
    known.isOnOne = status["wpa_state"] == "COMPLETED";
    for (const ConfiguredNetwork& network : list) {
        known.all.push_back(network.number);
        if (!network.isDisabled) {
            known.enabled.push_back(network.number);
        }
    }
    return {};
}

Outcome joinBySupplicant(const std::string& interface, const WirelessSettings& settings, bool mayStay,
                         std::unique_ptr<WirelessJoin>& join) {
    join.reset();
    SupplicantSocket supplicant;
    bool isThere = false;
    RETURN_IF_FAILED(supplicant.open(interface, isThere));
    if (!isThere) {
        return {};
    }
    auto started = std::make_unique<SupplicantJoin>(std::move(supplicant), settings);
    RETURN_IF_FAILED(started->start(mayStay));
    join = std::move(started);
    return {};
}

Outcome leaveBySupplicant(const std::string& interface, const std::optional<KnownNetworks>& before,
                          std::unique_ptr<WirelessJoin>& join) {
    join.reset();
    SupplicantSocket supplicant;
    bool isThere = false;
    RETURN_IF_FAILED(supplicant.open(interface, isThere));
    if (!isThere) {
        return {};
    }
    std::vector<ConfiguredNetwork> networks;
    RETURN_IF_FAILED(supplicant.listNetworks(networks));
    for (ConfiguredNetwork& network : networks) {
        // A run that ended between adding one and marking it.
        network.isOurs = network.isOurs || (before && network.isNameless && network.isDisabled &&
                                            std::ranges::count(before->all, network.number) == 0);
    }
    // With another network chosen since, that one is on, and what is on or off is somebody else's choice.
    const bool isOursChosen = std::ranges::all_of(
        networks, [](const ConfiguredNetwork& network) { return network.isOurs || network.isDisabled; });
    for (const ConfiguredNetwork& network : networks) {
        if (before && isOursChosen && network.isDisabled &&
            std::ranges::count(before->enabled, network.number) != 0) {
            RETURN_IF_FAILED(
                supplicant.order("ENABLE_NETWORK " + std::to_string(network.number), "switch on a network"));
        }
    }
    // Last: a run that is ended before finds them again.
    for (const ConfiguredNetwork& network : networks) {
        if (network.isOurs) {
            RETURN_IF_FAILED(supplicant.removeNetwork(network.number));
        }
    }
    if (before && before->isOnOne) {
        auto started = std::make_unique<SupplicantReturn>(std::move(supplicant));
        RETURN_IF_FAILED(started->start());
        join = std::move(started);
    }
    return {};
}

}  // namespace platform::apply
