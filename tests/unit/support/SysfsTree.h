// A made sysfs: folders, attribute files and links as the kernel lays them out, in a temporary directory
// whose path is the host's sysfsRoot.
#pragma once

#include <filesystem>
#include <sstream>
#include <string>

#include "tests/unit/support/TemporaryDirectory.h"

namespace testing_support {

class SysfsTree {
  public:
    [[nodiscard]] std::string root() const { return directory_.path().string(); }

    // Makes what a line says; every path counts from the root.
    //
    //     device PATH SUBSYSTEM [DRIVER]     pci ADDRESS [DRIVER]       a device below devices/pci0000:00
    //     port NAME DEVICE [MAC]             of Ethernet
    //     tty NAME [DEVICE]                  one that has no device is a console or a pseudo-terminal
    //     PATH = ATTRIBUTE                   PATH -> TARGET             remove PATH
    void make(const std::string& line) {
        std::istringstream words(line);
        std::string verb;
        std::string name;
        std::string device;
        std::string last;
        words >> verb >> name >> device >> last;
        if (verb == "device") {
            makeDevice(name, device, last);
        } else if (verb == "pci") {
            makeDevice("devices/pci0000:00/" + name, "pci", device);
        } else if (verb == "port") {
            const std::string node = addNode("net", name, device);
            make(node + "/type = 1");
            make(node + "/address = " + (last.empty() ? "02:00:00:00:00:01" : last));
        } else if (verb == "tty") {
            addNode("tty", name, device);
        } else if (verb == "remove") {
            std::filesystem::remove_all(directory_.path() / name);
        } else if (name == "->") {
            link(verb, device);
        } else {
            const std::size_t sign = line.find(" =");
            directory_.write(line.substr(0, sign), line.substr(std::min(sign + 3, line.size())) + "\n");
        }
    }
    // One wired PCI card with its port.
    void addPciEthernet(const std::string& name, const std::string& address) {
        make("pci " + address + " e1000e");
        make("port " + name + " devices/pci0000:00/" + address);
    }

  private:
    void folder(const std::string& path) { std::filesystem::create_directories(directory_.path() / path); }
    // Relative, as the kernel makes them.
    void link(const std::string& from, const std::string& to) {
        const std::filesystem::path at = directory_.path() / from;
        std::filesystem::create_directories(at.parent_path());
        std::filesystem::remove(at);
        const std::filesystem::path folder = std::filesystem::canonical(at.parent_path());
        std::filesystem::create_symlink(
            (std::filesystem::canonical(directory_.path()) / to).lexically_relative(folder), at);
    }
    void makeDevice(const std::string& device, const std::string& subsystem, const std::string& driver) {
        folder(device);
        folder("bus/" + subsystem);
        link(device + "/subsystem", "bus/" + subsystem);
        if (!driver.empty()) {
            folder("bus/" + subsystem + "/drivers/" + driver);
            link(device + "/driver", "bus/" + subsystem + "/drivers/" + driver);
        }
    }
    std::string addNode(const std::string& kind, const std::string& name, const std::string& device) {
        const std::string node = (device.empty() ? "devices/virtual" : device) + "/" + kind + "/" + name;
        folder(node);
        if (!device.empty()) {
            link(node + "/device", device);
        }
        link("class/" + kind + "/" + name, node);
        return node;
    }

    TemporaryDirectory directory_;
};

}  // namespace testing_support
