#include <netinet/ether.h>

#include <algorithm>
#include <array>
#include <charconv>
#include <cstdint>
#include <map>
#include <optional>
#include <set>
#include <span>
#include <tuple>
#include <utility>

#include "platform/base/DeviceText.h"
#include "platform/hardware/Entry.h"
#include "platform/hardware/Sysfs.h"
#include "platform/values/Fields.h"

namespace platform::hardware {
namespace {

using MacAddress = std::array<std::uint8_t, 6>;

enum class Bus { pci, usb, other };

struct Port {
    std::string name;
    std::string node;    // its folder below class/net
    std::string device;  // resolved
    Bus bus = Bus::other;
    std::string busDevice;  // the nearest device that sits on a bus, resolved
    std::string card;       // the PCI address without its function; empty on another bus
    int function = 0;
    int devPort = 0;
    std::optional<int> index;  // among the ports of one card
};

const char* providerClassOf(Bus bus) {
    switch (bus) {
        case Bus::pci:
            return "IOPCIDevice";
        case Bus::usb:
            return "IOUSBDevice";
        case Bus::other:
            return "IOPlatformDevice";
    }
    return "";
}

std::optional<int> numberFrom(std::string_view text) {
    int number = 0;
    const char* end = text.data() + text.size();
    const auto [rest, error] = std::from_chars(text.data(), end, number);
    if (error != std::errc() || rest != end || number < 0) {
        return std::nullopt;
    }
    return number;
}

std::optional<MacAddress> macAddressFrom(const std::string& text) {
    constexpr std::size_t size = 17;
    ether_addr address{};
    if (text.size() != size || ether_aton_r(text.c_str(), &address) == nullptr) {
        return std::nullopt;
    }
    const MacAddress bytes = std::to_array(address.ether_addr_octet);
    // Zeros are what a driver shows that has no address to give.
    return bytes == MacAddress{} ? std::nullopt : std::optional(bytes);
}

// The address that the card was made with, before the one that it happens to use: a wireless card may use a
// random one, and a member of a bond has that of the bond.
std::optional<MacAddress> macAddressOf(const Port& port) {
    for (const char* attribute : {"/phy80211/macaddress", "/bonding_slave/perm_hwaddr", "/address"}) {
        const auto text = readAttribute(port.node + attribute);
        const auto bytes = text ? macAddressFrom(*text) : std::nullopt;
        if (bytes) {
            return bytes;
        }
    }
    return std::nullopt;
}

void findBus(Port& port, const std::string& root) {
    port.busDevice = port.device;
    for (const std::string& device : upwards(port.device, root)) {
        const auto subsystem = linkedName(device + "/subsystem");
        // A virtio device is a function of the card below it, not a place that a card sits in.
        if (!subsystem || *subsystem == "virtio") {
            continue;
        }
        port.busDevice = device;
        port.bus = *subsystem == "pci" ? Bus::pci : *subsystem == "usb" ? Bus::usb : Bus::other;
        break;
    }
    const std::string_view address = lastComponent(port.busDevice);
    const std::size_t dot = address.rfind('.');
    if (port.bus == Bus::pci && dot != std::string_view::npos) {
        port.card = address.substr(0, dot);
        port.function = numberFrom(address.substr(dot + 1)).value_or(0);
    }
}

std::optional<Port> portNamed(const std::string& name, const std::string& root) {
    Port port;
    port.name = name;
    port.node = root + "/class/net/" + name;
    constexpr std::string_view ethernetType = "1";
    if (readAttribute(port.node + "/type") != ethernetType) {
        return std::nullopt;
    }
    auto device = resolved(port.node + "/device");
    if (!device) {
        return std::nullopt;
    }
    port.device = std::move(*device);
    port.devPort = numberFrom(readAttribute(port.node + "/dev_port").value_or("")).value_or(0);
    findBus(port, root);
    return port;
}

// Tells the ports of one card apart by the PCI function, or by the driver's number of the port within its
// only function; by their order where neither does.
void numberPortsOfCard(std::vector<Port*>& ports) {
    std::set<int> functions;
    std::set<int> devPorts;
    for (const Port* port : ports) {
        functions.insert(port->function);
        devPorts.insert(port->devPort);
    }
    const bool byFunction = functions.size() == ports.size();
    const bool byDevPort = functions.size() == 1 && devPorts.size() == ports.size();
    std::stable_sort(ports.begin(), ports.end(), [](const Port* lhs, const Port* rhs) {
        return std::tie(lhs->function, lhs->devPort) < std::tie(rhs->function, rhs->devPort);
    });
    int position = 0;
    for (Port* port : ports) {
        port->index = byFunction ? port->function : byDevPort ? port->devPort : position;
        ++position;
    }
}

// A card with a single port has none to tell it from.
void numberPorts(std::vector<Port>& ports) {
    std::map<std::string, std::vector<Port*>> cards;
    for (Port& port : ports) {
        if (!port.card.empty()) {
            cards[port.card].push_back(&port);
        }
    }
    for (auto& [card, portsOfCard] : cards) {
        if (portsOfCard.size() > 1) {
            numberPortsOfCard(portsOfCard);
        }
    }
}

// Firmware text goes into a name that the user sees, and is decoded as Mac OS Roman: ASCII reads the same in
// every encoding.
bool isLabel(std::string_view text) {
    return isDeviceText(text) &&
           std::all_of(text.begin(), text.end(), [](char c) { return static_cast<unsigned char>(c) < 0x80; });
}

// The address that each slot is at, by the firmware's label for it.
std::map<std::string, std::string> labelsOfSlots(const std::string& root) {
    std::map<std::string, std::string> labels;
    const std::string slots = root + "/bus/pci/slots";
    for (const std::string& label : namesIn(slots, isLabel).value_or(std::vector<std::string>())) {
        if (const auto address = readAttribute(slots + "/" + label + "/address")) {
            labels.emplace(*address, label);
        }
    }
    return labels;
}

std::string slotLabelOf(const Port& port, const std::map<std::string, std::string>& slots) {
    if (const auto slot = slots.find(port.card); slot != slots.end()) {
        return slot->second;
    }
    // A device on the main board sits in no slot, and has a label of its own.
    if (const auto label = readAttribute(port.busDevice + "/label"); label && isLabel(*label)) {
        return *label;
    }
    if (const auto number = readAttribute(port.busDevice + "/acpi_index"); number && isLabel(*number)) {
        return "onboard " + *number;
    }
    return std::string(lastComponent(port.busDevice));
}

// The text and a NUL behind it, as firmware gives its names.
std::vector<std::byte> firmwareText(const std::string& text) {
    const auto bytes = std::as_bytes(std::span(text.c_str(), text.size() + 1));
    return {bytes.begin(), bytes.end()};
}

EntryRef busEntry(const Port& port, const std::map<std::string, std::string>& slots) {
    values::FieldWriter properties;
    // With the bus in front the name is never by accident one that a name rule looks for.
    properties("name", firmwareText(linkedName(port.busDevice + "/subsystem").value_or("device") + ":" +
                                    std::string(lastComponent(port.busDevice))));
    if (port.bus == Bus::pci) {
        properties("AAPL,slot-name", firmwareText("SLOT-" + slotLabelOf(port, slots)));
    }
    properties("IOChildIndex", port.index);
    return std::make_shared<const Entry>(Entry{"", properties.take(), nullptr});
}

EntryRef controllerEntry(const Port& port, EntryRef bus) {
    const bool isWireless = exists(port.node + "/phy80211") || exists(port.node + "/wireless");
    const std::string driverClass =
        (isWireless ? "AirPort" : "") + linkedName(port.device + "/driver").value_or("");
    values::FieldWriter properties;
    properties("IOMACAddress", macAddressOf(port));
    if (!driverClass.empty()) {
        properties("IOClass", driverClass);
    }
    properties("IOProviderClass", std::string(providerClassOf(port.bus)));
    return std::make_shared<const Entry>(Entry{"", properties.take(), std::move(bus)});
}

}  // namespace

std::optional<std::vector<EntryRef>> scanEthernet(const std::string& sysfsRoot) {
    const std::string root = resolved(sysfsRoot).value_or(sysfsRoot);
    const auto names = namesInClass(root + "/class/net");
    if (!names) {
        return std::nullopt;
    }
    std::vector<Port> ports;
    for (const std::string& name : *names) {
        if (auto port = portNamed(name, root)) {
            ports.push_back(std::move(*port));
        }
    }
    numberPorts(ports);
    const auto slots = labelsOfSlots(root);
    std::vector<EntryRef> entries;
    for (const Port& port : ports) {
        values::FieldWriter properties;
        properties("BSD Name", port.name);
        entries.push_back(std::make_shared<const Entry>(
            Entry{ethernetClass, properties.take(), controllerEntry(port, busEntry(port, slots))}));
    }
    return entries;
}

}  // namespace platform::hardware
