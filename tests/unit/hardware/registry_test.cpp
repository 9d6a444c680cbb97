#include <gtest/gtest.h>

#include <cstdint>
#include <cstdio>
#include <filesystem>
#include <string>

#include "platform/IOKit.h"
#include "platform/base/Host.h"
#include "platform/values/Values.h"
#include "tests/unit/support/SysfsTree.h"
#include "tests/unit/support/Transcript.h"

namespace {

using platform::values::Owned;
using testing_support::SysfsTree;

class Registry : public testing::Test {
  protected:
    Registry() : host_(hostOn(sysfs)) { EXPECT_EQ(IOMasterPort(MACH_PORT_NULL, &master), KERN_SUCCESS); }
    ~Registry() override { EXPECT_EQ(IOObjectRelease(master), KERN_SUCCESS); }

    io_iterator_t find(CFDictionaryRef matching) {
        io_iterator_t iterator = IO_OBJECT_NULL;
        EXPECT_EQ(IOServiceGetMatchingServices(master, matching, &iterator), KERN_SUCCESS);
        return iterator;
    }
    io_iterator_t findEthernet() { return find(IOServiceMatching("IOEthernetInterface")); }
    io_iterator_t findSerial(CFStringRef type) {
        CFMutableDictionaryRef matching = IOServiceMatching("IOSerialBSDClient");
        CFDictionarySetValue(matching, CFSTR("IOSerialBSDClientType"), type);
        return find(matching);
    }

    SysfsTree sysfs;
    mach_port_t master = MACH_PORT_NULL;

  private:
    static platform::Host hostOn(const SysfsTree& tree) {
        platform::Host host;
        host.sysfsRoot = tree.root();
        return host;
    }
    platform::HostOverride host_;
};

// Data as text, with what does not print as "\\7f".
std::string asText(CFTypeRef value) {
    const auto data = platform::values::as<CFDataRef>(value);
    std::string text = data == nullptr ? platform::values::descriptionOf(value) : "";
    for (CFIndex i = 0; data != nullptr && i < CFDataGetLength(data); ++i) {
        const UInt8 byte = CFDataGetBytePtr(data)[i];
        char shown[4] = {static_cast<char>(byte)};
        if (byte <= ' ' || byte >= 0x7F) {
            std::snprintf(shown, sizeof shown, "\\%02x", byte);
        }
        text += shown;
    }
    return text;
}

// "key=value key=value" of an entry, then of its parent, and so on.
std::string describe(io_registry_entry_t entry) {
    std::string text;
    CFMutableDictionaryRef properties = nullptr;
    EXPECT_EQ(IORegistryEntryCreateCFProperties(entry, &properties, kCFAllocatorDefault, 0), KERN_SUCCESS);
    const auto owned = Owned<CFMutableDictionaryRef>::adopt(properties);
    for (const auto& [key, value] : platform::values::entriesOf(properties)) {
        text += (text.empty() ? "" : " ") + asText(key) + "=" + asText(value);
    }
    io_registry_entry_t parent = IO_OBJECT_NULL;
    if (IORegistryEntryGetParentEntry(entry, kIOServicePlane, &parent) == KERN_SUCCESS) {
        text += " < " + describe(parent);
        IOObjectRelease(parent);
    }
    return text;
}

// A line for each entry.
std::string linesOf(io_iterator_t iterator) {
    std::string lines;
    while (const io_object_t entry = IOIteratorNext(iterator)) {
        lines += describe(entry) + "\n";
        EXPECT_EQ(IOObjectRelease(entry), KERN_SUCCESS);
    }
    EXPECT_EQ(IOObjectRelease(iterator), KERN_SUCCESS);
    return lines;
}

TEST_F(Registry, Ethernet) {
    testing_support::Transcript transcript("ethernet");
    // Records what is there, and takes it away.
    const auto record = [&](const std::string& what) {
        transcript.add("=== " + what + "\n" + linesOf(findEthernet()));
        for (const char* folder : {"bus", "class", "devices"}) {
            sysfs.remove(folder);
        }
    };
    sysfs.addPciEthernet("eth10", "0000:05:00.0", "00:0a:95:9d:68:16");
    sysfs.addPciEthernet("eth2", "0000:03:00.0", "00:0a:95:9d:68:17", "r8169");
    sysfs.addPciEthernet("eth11", "0000:09:00.0", "00:0a:95:9d:68:19", "");
    sysfs.addSlot("7", "0000:03:00");
    sysfs.addPciWireless("wlan0", "0000:04:00.0", "00:0a:95:9d:68:18");
    sysfs.attribute("class/net/wlan0/address", "de:ad:be:ef:00:01");
    sysfs.attribute("devices/pci0000:00/0000:04:00.0/label", "Onboard WLAN");
    sysfs.addVirtioEthernet("ens3", "0000:00:03.0");
    sysfs.addUsbEthernet("enx1", "1-2");
    sysfs.addPlatformEthernet("end0");
    record("cards by bus, driver and slot");

    sysfs.addVirtual("br0");
    sysfs.addVirtual("lo", 772);
    sysfs.attribute("class/net/bonding_masters", "bond0");
    sysfs.addPciEthernet("ib0", "0000:06:00.0");
    sysfs.attribute("class/net/ib0/type", "32");
    sysfs.addPciEthernet("eth\xFF", "0000:07:00.0");
    sysfs.addPciEthernet("eth\x1b[1m", "0000:07:00.1");
    sysfs.addPciEthernet("eth0", "0000:08:00.0");
    sysfs.remove("devices/pci0000:00/0000:08:00.0");
    sysfs.link("class/net/loop", "class/net/loop");
    record("nothing that is Ethernet hardware");

    for (const char* mac : {"", "00:00:00:00:00:00", "00:0a:95:9d:68", "00-0a-95-9d-68-16",
                            "00:0a:95:9d:68:1g", "+1:0a:95:9d:68:16"}) {
        sysfs.addPciEthernet("eth0", "0000:03:00.0", mac);
        record("the address \"" + std::string(mac) + "\"");
    }
    sysfs.addPciEthernet("eth0", "0000:03:00.0");
    sysfs.attribute("class/net/eth0/address", "02:00:00:00:00:09");
    sysfs.attribute("class/net/eth0/bonding_slave/perm_hwaddr", "02:00:00:00:00:0B");
    record("a member of a bond");

    sysfs.addPciEthernet("single", "0000:02:00.1");
    sysfs.addPciEthernet("fn0", "0000:03:00.0");
    sysfs.addPciEthernet("fn2", "0000:03:00.2");
    sysfs.addPciPort("port1", "0000:04:00.0", 1);
    sysfs.addPciPort("port0", "0000:04:00.0", 0);
    sysfs.addPciPort("mixA", "0000:05:00.0", 1);
    sysfs.addPciPort("mixB", "0000:05:00.0", 2);
    sysfs.addPciPort("mixC", "0000:05:00.1", 3);
    record("cards of several ports");

    // A label counts only when it reads the same in every encoding, and behind that of a slot.
    for (const char* label : {"Port 1", "Port \xC3\xA9", "Port \x1b[1m", "3-1"}) {
        const std::string device = "devices/pci0000:00/0000:03:00.0";
        sysfs.addPciEthernet("eth0", "0000:03:00.0");
        sysfs.attribute(device + "/acpi_index", "2");
        sysfs.attribute(device + "/label", label);
        if (std::string(label) == "3-1") {
            sysfs.addSlot("4-1", "0000:03:00");
        }
        record("a label");
    }
}

TEST_F(Registry, SerialPorts) {
    testing_support::Transcript transcript("serial_ports");
    sysfs.addSerial("ttyS0");
    sysfs.addSerial("ttyS1", false);
    sysfs.addSerial("ttyS2");
    sysfs.addVirtualTty("tty0");
    sysfs.attribute("class/tty/console/active", "tty0 ttyS2");
    sysfs.addUsbSerial("ttyUSB0", "1-1", "USB-Serial Controller");
    sysfs.addUsbSerial("ttyACM0", "1-3", "  56K Modem ");
    sysfs.addUsbSerial("ttyACM2", "1-5", "");
    sysfs.addBluetoothSerial("rfcomm0");
    sysfs.addBluetoothSerial("rfcomm1", false);
    for (CFStringRef type : {CFSTR("IOModemSerialStream"), CFSTR("IORS232SerialStream")}) {
        transcript.add(linesOf(findSerial(type)));
    }
    transcript.add("=== all\n" + linesOf(find(IOServiceMatching("IOSerialBSDClient"))));
    // What prints of a product's text.
    sysfs.remove("class");
    const std::string fill(62, 'x');
    for (const std::string& text :
         {std::string("\t Caf\xC3\xA9 \xE6\x95\xB0 \r\n"), std::string("\x1b]0;root\x07 \x01\x7F"),
          std::string("csi \xC2\x9B"),
          std::string("override \xE2\x80\xAE isolate \xE2\x81\xA7 mark \xE2\x80\x8F"),
          std::string("line\nbreak \xE2\x80\xA8 \xE2\x80\xA9"),
          std::string("private \xEE\x80\x80 none \xEF\xBF\xBF tag \xF3\xA0\x81\x81"),
          std::string("bad \xFF \xC3( \xC0\x80 \xED\xA0\x80"), fill + "\xC3\xA9tail", fill + "x\xC3\xA9tail",
          fill + " \xF0\x9F\x96\xA8", std::string(4000, '\x01') + "x", std::string(" \x01 \xFF ")}) {
        sysfs.addUsbSerial("ttyACM0", "1-3", text);
        transcript.add(linesOf(findSerial(CFSTR("IOModemSerialStream"))));
    }
}

TEST_F(Registry, GivesNoPartOfAList) {
    // Links to one device each, as quick as thousands of them have to be.
    const auto addPorts = [this](const std::string& kind, int first, int last) {
        sysfs.folder("class/net");
        for (int i = first; i < last; ++i) {
            std::filesystem::create_symlink("../../devices/" + kind,
                                            sysfs.root() + "/class/net/" + kind + std::to_string(i));
        }
    };
    sysfs.folder("devices/virtual");
    sysfs.folder("devices/real/device");
    addPorts("virtual", 0, 9);
    addPorts("real", 1, 4096);
    sysfs.addPciEthernet("zzz", "0000:03:00.0");
    EXPECT_TRUE(linesOf(findEthernet()).starts_with("BSD Name=zzz "));
    addPorts("real", 0, 1);
    io_iterator_t iterator = 77;
    EXPECT_EQ(IOServiceGetMatchingServices(master, IOServiceMatching("IOEthernetInterface"), &iterator),
              kIOReturnError);
    EXPECT_EQ(iterator, 77U);
}

TEST_F(Registry, KeepsItsSnapshotWhenTheDeviceIsPulledOut) {
    sysfs.addPciEthernet("eth0", "0000:03:00.0");
    const io_iterator_t iterator = findEthernet();
    sysfs.remove("devices");
    sysfs.remove("class");
    EXPECT_TRUE(linesOf(iterator).starts_with("BSD Name=eth0 < IOMACAddress="));
    EXPECT_EQ(linesOf(findEthernet()), "");
}

TEST_F(Registry, RefusesHandlesThatAreNone) {
    sysfs.addPciEthernet("eth0", "0000:03:00.0");
    sysfs.addPciEthernet("eth1", "0000:04:00.0");
    const io_iterator_t iterator = findEthernet();
    const io_object_t gone = IOIteratorNext(iterator);
    EXPECT_EQ(IOObjectRelease(gone), KERN_SUCCESS);
    const io_object_t entry = IOIteratorNext(iterator);
    for (const io_object_t bad : {IO_OBJECT_NULL, gone, iterator, ~io_object_t{0}}) {
        SCOPED_TRACE(bad);
        EXPECT_NE(bad, entry) << "a handle is not given out again";
        auto* properties = IOServiceMatching("none");
        const auto owned = Owned<CFMutableDictionaryRef>::adopt(properties);
        io_object_t output = 77;
        EXPECT_EQ(IORegistryEntryCreateCFProperties(bad, &properties, nullptr, 0), kIOReturnBadArgument);
        EXPECT_EQ(properties, nullptr);
        EXPECT_EQ(IORegistryEntryGetParentEntry(bad, kIOServicePlane, &output), kIOReturnBadArgument);
        EXPECT_EQ(output, IO_OBJECT_NULL);
        EXPECT_EQ(IOServiceGetMatchingServices(bad, IOServiceMatching("IOEthernetInterface"), &output),
                  kIOReturnBadArgument);
    }
    io_object_t parent = IO_OBJECT_NULL;
    EXPECT_EQ(IORegistryEntryGetParentEntry(entry, "IOUSB", &parent), kIOReturnBadArgument);
    EXPECT_EQ(IORegistryEntryGetParentEntry(entry, kIOServicePlane, &parent), KERN_SUCCESS);
    EXPECT_TRUE(IOObjectConformsTo(entry, "IOEthernetInterface"));
    EXPECT_FALSE(IOObjectConformsTo(parent, ""));
    EXPECT_EQ(IOIteratorNext(entry), IO_OBJECT_NULL);
    for (const io_object_t held : {parent, entry, iterator}) {
        EXPECT_EQ(IOObjectRelease(held), KERN_SUCCESS);
        EXPECT_EQ(IOObjectRelease(held), kIOReturnBadArgument);
    }
}

}  // namespace
