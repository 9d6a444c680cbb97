// Wireless networks that the kernel joins by itself, without a supplicant: open and WEP ones.
//
// Nothing here waits: a request is answered at once, and what comes of it is a notice. No network is ever
// formed, and the regulatory domain is left alone.
#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "platform/Outcome.h"
#include "platform/apply/direct/Kernel.h"
#include "platform/apply/direct/WirelessMessages.h"
#include "platform/netlink/Generic.h"
#include "platform/netlink/Socket.h"

namespace platform::apply {

// What a card is on by the kernel's own doing.
struct WirelessState {
    std::uint32_t type = 0;    // NL80211_IFTYPE_
    std::string network;       // the bytes of its SSID; empty for none
    bool isProtected = false;  // by a key, which the kernel does not give back
    bool operator==(const WirelessState&) const = default;
};

// Of these heard networks the one to join: of that name, heard no longer ago than `age`, open without a key,
// WEP with one that fits; the strongest. Nothing, and why, when there is none; isHopeless when one of that
// name is there and only another key or a supplicant could help. The reason holds no key.
struct NetworkChoice {
    std::optional<HeardNetwork> network;
    bool isHopeless = false;
    std::string reason;
};
[[nodiscard]] NetworkChoice chooseNetwork(const std::vector<HeardNetwork>& heard, const std::string& name,
                                          const std::optional<std::string>& key,
                                          std::chrono::milliseconds age);

// One card. Start one thing, then call goOn, at once and then whenever the descriptor is readable or a tenth
// of a second has passed, until it says done or refused, or until the caller's deadline. Ending it in
// between leaves the card as it is.
class KernelWireless {
  public:
    enum class Progress { looking, joining, done, refused };

    // Success with isWireless false when it is no wireless card, or there is none of that name: nothing else
    // may be called then.
    Outcome open(const std::string& interface, bool& isWireless);
    Outcome read(WirelessState& state);

    // Leaves the network that the card is on, unless it mayStay and has that name, and looks for the one
    // named until it is heard, however often that takes. The link is to be up; its addresses and routes may
    // be made before, but its routes have to be made again when it has joined: changing between access points
    // and ad-hoc cells takes the link down for a moment.
    Outcome startJoining(const std::string& network, const std::optional<std::string>& key, bool mayStay);
    // Leaves, makes the card of the type that it was, and looks for the network that it was on, if any. One
    // with a key is not joined again, since only whoever had the key can do that.
    Outcome startRestoring(const WirelessState& before);

    Outcome goOn(Progress& progress);
    // Why it is not on the network, for the log; what goOn ended with, or what it is still trying.
    [[nodiscard]] const std::string& reason() const noexcept { return reason_; }
    [[nodiscard]] int descriptor() const noexcept { return notices_.descriptor(); }

  private:
    using Clock = std::chrono::steady_clock;
    // idle: a scan is to be started.
    enum class Phase { idle, scanning, joining, done, refused };

    [[nodiscard]] WirelessRequests requests() const { return {*family_, link_->index}; }
    Outcome listen();
    Outcome readHeard(std::vector<HeardNetwork>& heard);
    Outcome readCurrent(std::optional<HeardNetwork>& current);
    Outcome setType(std::uint32_t type);
    Outcome leave();
    Outcome look(const std::string& network, const std::optional<std::string>& key);
    void takeNotices(bool& isScanOver, std::optional<std::uint16_t>& joinStatus);
    Outcome scan();
    Outcome choose(NetworkChoice& choice);
    Outcome endScanEarly();
    Outcome join();
    Outcome checkJoined(std::optional<std::uint16_t> joinStatus);
    // A refusal of the kernel's is what this card cannot do, and no failure of the machine's.
    Outcome refuse(Outcome refused);

    Kernel kernel_;
    std::string interface_;
    std::optional<Link> link_;
    netlink::Socket socket_;
    netlink::Socket notices_;
    std::optional<netlink::GenericFamily> family_;

    Phase phase_ = Phase::done;
    std::string network_;
    std::optional<std::string> key_;
    std::optional<HeardNetwork> chosen_;
    Clock::time_point since_;      // of the scan, or of the joining
    Clock::time_point notBefore_;  // of the next scan
    bool isScanEnding_ = false;
    std::string reason_;
};

}  // namespace platform::apply
