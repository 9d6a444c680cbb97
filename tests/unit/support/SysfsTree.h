// A made sysfs: folders, attribute files and links as the kernel lays them out, in a temporary directory
// whose path is the host's sysfsRoot.
#pragma once

#include <filesystem>
#include <string>

#include "tests/unit/support/TemporaryDirectory.h"

namespace testing_support {

class SysfsTree {
  public:
    [[nodiscard]] std::string root() const { return directory_.path().string(); }

    // A wired PCI card with one port. `address` is the PCI address, as in "0000:03:00.0".
    void addPciEthernet(const std::string& name, const std::string& address,
                        const std::string& mac = "02:00:00:00:00:01", const std::string& driver = "e1000e") {
        addPort(name, pciDevice(address, driver), mac);
    }
    // One more port of a PCI function that is there or not yet.
    void addPciPort(const std::string& name, const std::string& address, int devPort) {
        addPort(name, pciDevice(address, "mlx4_core"), "02:00:00:00:00:02");
        attribute("class/net/" + name + "/dev_port", std::to_string(devPort));
    }
    void addPciWireless(const std::string& name, const std::string& address,
                        const std::string& mac = "02:00:00:00:00:03", const std::string& driver = "iwlwifi") {
        addPort(name, pciDevice(address, driver), mac);
        makeWireless(name, mac);
    }
    // A virtual machine's card: the virtio device stands between the port and the PCI device.
    void addVirtioEthernet(const std::string& name, const std::string& address) {
        addPort(name, describe(pciDevice(address, "virtio-pci") + "/virtio0", "virtio", "virtio_net"),
                "02:00:00:00:00:04");
    }
    // `port` is the place on the USB bus, as in "1-2".
    void addUsbEthernet(const std::string& name, const std::string& port,
                        const std::string& mac = "02:00:00:00:00:05") {
        addPort(name, usbInterface(port, "ax88179_178a", "USB LAN"), mac);
    }
    // A port soldered to the board.
    void addPlatformEthernet(const std::string& name) {
        addPort(name, describe("devices/platform/" + name + ".ethernet", "platform", "fec"),
                "02:00:00:00:00:06");
    }
    // An interface without hardware: a bridge, a tunnel, the loopback.
    void addVirtual(const std::string& name, int type = 1) {
        const std::string node = "devices/virtual/net/" + name;
        attribute(node + "/type", std::to_string(type));
        attribute(node + "/address", "02:00:00:00:00:07");
        link("class/net/" + name, node);
    }
    // The firmware's name for the slot that holds a PCI address without its function, as in "0000:03:00".
    void addSlot(const std::string& label, const std::string& address) {
        attribute("bus/pci/slots/" + label + "/address", address);
    }

    // A port of the PC's own; without a UART the kernel shows type 0.
    void addSerial(const std::string& name, bool hasUart = true) {
        addTty(name, describe("devices/platform/serial8250", "platform", "serial8250"));
        attribute("class/tty/" + name + "/type", hasUart ? "4" : "0");
    }
    // ttyUSB* or ttyACM*; the product stays unnamed when it is empty.
    void addUsbSerial(const std::string& name, const std::string& port, const std::string& product) {
        addTty(name, usbInterface(port, "cdc_acm", product));
    }
    // A Bluetooth serial port, connected or only bound.
    void addBluetoothSerial(const std::string& name, bool connected = true) {
        const std::string device = describe("devices/virtual/bluetooth/hci0/hci0:42", "bluetooth", "");
        addTty(name, connected ? device : "");
    }
    // A console or a pseudo-terminal.
    void addVirtualTty(const std::string& name) { addTty(name, ""); }

    // Sets an attribute of anything that is there.
    void attribute(const std::string& path, const std::string& value) {
        directory_.write(path, value + "\n");
    }
    // Relative links, as the kernel makes them; both paths count from the root.
    void link(const std::string& from, const std::string& to) {
        const std::filesystem::path at = directory_.path() / from;
        std::filesystem::create_directories(at.parent_path());
        std::filesystem::remove(at);
        const std::filesystem::path folder = std::filesystem::canonical(at.parent_path());
        std::filesystem::create_symlink(
            (std::filesystem::canonical(directory_.path()) / to).lexically_relative(folder), at);
    }
    void remove(const std::string& path) { std::filesystem::remove_all(directory_.path() / path); }
    // A folder that holds nothing.
    void folder(const std::string& path) { std::filesystem::create_directories(directory_.path() / path); }
    // What the kernel shows for a card whose driver is a wireless one.
    void makeWireless(const std::string& name, const std::string& permanentMac) {
        attribute("class/net/" + name + "/uevent", "DEVTYPE=wlan\nINTERFACE=" + name);
        folder("class/net/" + name + "/wireless");
        const std::string phy = "devices/virtual/ieee80211/phy-" + name;
        attribute(phy + "/macaddress", permanentMac);
        link("class/net/" + name + "/phy80211", phy);
    }

  private:
    std::string describe(const std::string& device, const std::string& subsystem, const std::string& driver) {
        folder(device);
        folder("bus/" + subsystem);
        link(device + "/subsystem", "bus/" + subsystem);
        if (!driver.empty()) {
            folder("bus/" + subsystem + "/drivers/" + driver);
            link(device + "/driver", "bus/" + subsystem + "/drivers/" + driver);
        }
        return device;
    }
    std::string pciDevice(const std::string& address, const std::string& driver) {
        return describe("devices/pci0000:00/" + address, "pci", driver);
    }
    std::string usbInterface(const std::string& port, const std::string& driver, const std::string& product) {
        const std::string hub = describe(pciDevice("0000:00:14.0", "xhci_hcd") + "/usb1", "usb", "usb");
        attribute(hub + "/idVendor", "1d6b");
        attribute(hub + "/product", "Host Controller");
        const std::string device = describe(hub + "/" + port, "usb", "usb");
        attribute(device + "/idVendor", "0525");
        if (!product.empty()) {
            attribute(device + "/product", product);
        }
        return describe(device + "/" + port + ":1.0", "usb", driver);
    }
    void addPort(const std::string& name, const std::string& device, const std::string& mac) {
        const std::string node = device + "/net/" + name;
        attribute(node + "/type", "1");
        attribute(node + "/address", mac);
        attribute(node + "/dev_port", "0");
        link(node + "/device", device);
        link("class/net/" + name, node);
    }
    void addTty(const std::string& name, const std::string& device) {
        const std::string node = (device.empty() ? "devices/virtual" : device) + "/tty/" + name;
        folder(node);
        if (!device.empty()) {
            link(node + "/device", device);
        }
        link("class/tty/" + name, node);
    }

    TemporaryDirectory directory_;
};

}  // namespace testing_support
