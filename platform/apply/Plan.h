// What the current location asks of each interface, as a pure function of the preferences tree.
#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "platform/CoreFoundation.h"
#include "platform/values/Fields.h"

namespace platform::apply {

// In network byte order, as in_addr holds it.
using IPv4Address = std::uint32_t;

// Random bytes that one record's digests are made with.
using Salt = std::array<std::uint8_t, 16>;

enum class IPv4Method { none, manual, dhcp, last = dhcp };

struct ManualAddress {
    IPv4Address address = 0;
    unsigned prefixLength = 32;
    bool operator==(const ManualAddress&) const = default;
    template <class Self, class Fields>
    static void listFields(Self& self, Fields& fields) {
        fields("Address", self.address);
        fields("PrefixLength", self.prefixLength);
    }
};

struct WirelessSettings {
    // "PowerEnabled": nothing when the location does not say.
    std::optional<bool> powerEnabled;
    // The network to join, as the bytes of its SSID (IEEE 802.11: 1 to 32); nothing keeps the one the card is
    // on.
    std::optional<std::string> network;
    // The key as UTF-8 text. Never logged.
    std::optional<std::string> key;
    bool operator==(const WirelessSettings&) const = default;
    template <class Self, class Fields>
    static void listFields(Self& self, Fields& fields) {
        fields("Power", self.powerEnabled);
        fields("Network", self.network);
        fields("Key", self.key);
    }
};

struct InterfacePlan {
    std::string name;     // the kernel's name
    bool active = false;  // false: switched off, and nothing below counts
    IPv4Method method = IPv4Method::none;
    std::vector<ManualAddress> addresses;  // manual only
    IPv4Address router = 0;                // manual only; 0 for none. The default route.
    std::string dhcpClientID;              // DHCP only; empty for none
    std::vector<IPv4Address> nameServers;
    std::vector<std::string> searchDomains;
    std::optional<WirelessSettings> wireless;  // when the service has an AirPort entity
    // The interface's place among the active ones, in service order: the default route of 0 is preferred to
    // that of 1, and all of them to the ones of interfaces that are left to the system. 0 for an interface
    // that is off.
    unsigned rank = 0;
    bool operator==(const InterfacePlan&) const = default;
    template <class Self, class Fields>
    static void listFields(Self& self, Fields& fields) {
        fields("Name", self.name);
        fields("Active", self.active);
        fields("Method", self.method);
        fields("Addresses", self.addresses);
        fields("Router", self.router);
        fields("ClientID", self.dhcpClientID);
        fields("NameServers", self.nameServers);
        fields("SearchDomains", self.searchDomains);
        fields("Wireless", self.wireless);
        fields("Rank", self.rank);
    }
};

// Whether the interface is to be off: its service is, or its radio is not to be on.
[[nodiscard]] inline bool isOff(const InterfacePlan& plan) noexcept {
    return !plan.active || (plan.wireless && plan.wireless->powerEnabled == false);
}

// In service order: the first active interface is the preferred one. An interface stands here once; of
// several services for it the first active one counts. Interfaces that are not named are left to the system.
using Plan = std::vector<InterfacePlan>;

// Something in the current location that cannot be made so, for the log: whose, and why.
struct Trouble {
    std::string interface;  // empty when it is about the whole location
    std::string reason;
    bool operator==(const Trouble&) const = default;
};

// The plan for the current location of a preferences tree (its root dictionary). Empty, with one trouble,
// when "CurrentSet" names no location. An interface whose settings cannot be used (an address that is no
// dotted quad, a mask with holes, a name that no interface or network can have) is left to the system, with a
// trouble for it, so that one bad service does not keep the others from being made so.
//
// A "Manual" entity without addresses, as a new location has it, asks for an interface that is on and has
// none. An address without a mask gets the one of its class. A serial service ("Type" "PPP") and a service
// that is not in the order ask for nothing. A service for the device "*" stands for every interface that no
// other service names, and leaves them to the system.
[[nodiscard]] Plan makePlan(CFDictionaryRef root, std::vector<Trouble>& troubles);

// The plan as the record keeps it: the key is replaced by a short digest of it under the salt, enough to see
// that it changed, too little to tell it from the thousands of others with the same one. Equal plans give
// equal ones under one salt.
[[nodiscard]] InterfacePlan withoutKey(InterfacePlan plan, const Salt& salt);

}  // namespace platform::apply
