// One wireless card and what the kernel is asked about it (nl80211). Nothing here waits: a request is
// answered at once, and what comes of it is a notice.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "platform/apply/direct/Kernel.h"
#include "platform/apply/direct/WirelessMessages.h"
#include "platform/base/Outcome.h"
#include "platform/netlink/Generic.h"
#include "platform/netlink/Socket.h"

namespace platform::apply {

// What a card is on by the kernel's own doing.
struct WirelessState {
    std::uint32_t type = 0;    // NL80211_IFTYPE_
    std::string network;       // the bytes of its SSID; empty for none
    bool isProtected = false;  // by a key, which the kernel does not give back
    bool operator==(const WirelessState&) const = default;

    template <class Self, class Fields>
    static void listFields(Self& self, Fields& fields) {
        fields("Type", self.type);
        fields("Network", self.network);
        fields("Protected", self.isProtected);
    }
};

class WirelessCard {
  public:
    // Success with isWireless false when it is no wireless card, or is gone: nothing else may be called then.
    Outcome open(const std::string& interface, bool& isWireless);

    Outcome read(WirelessState& state);
    // Every network that the kernel remembers, however long ago it was heard; and the one that the card is
    // on.
    Outcome readEntries(std::vector<ScanEntry>& entries);
    Outcome readCurrent(std::optional<ScanEntry>& current);
    // Whether its link has a carrier that the kernel has taken note of.
    Outcome readRunning(bool& isRunning);

    // Goes down for a moment to do so, and has its addresses and routes again afterwards.
    Outcome setType(std::uint32_t type);
    // Calls out for one network by its name, which one that hides it answers too. A scan that is under way
    // goes on, and a link that is down for a moment has none: error() tells.
    Outcome scan(const std::string& network);
    // A card that can't end its scan sends its notice later.
    void endScan();
    Outcome join(const ScanEntry& network, const std::optional<std::string>& key);
    Outcome leave();
    // The errno that the kernel answered the last request with; see Socket.
    [[nodiscard]] int error() const noexcept { return socket_.error(); }

    // From then on the notices of the card's scans and joinings are kept.
    Outcome listen();
    // isScanOver also when some notices were lost. joinStatus: see WirelessNotice.
    void takeNotices(bool& isScanOver, std::optional<std::uint16_t>& joinStatus);

  private:
    [[nodiscard]] netlink::Message requestFor(std::uint8_t command, std::uint16_t flags = NLM_F_ACK) const {
        return makeRequest(*family_, index_, command, flags);
    }

    Kernel kernel_;
    int index_ = 0;
    netlink::Socket socket_;
    netlink::Socket notices_;
    std::optional<netlink::GenericFamily> family_;
};

}  // namespace platform::apply
