#include <gtest/gtest.h>

#include <cstdint>
#include <filesystem>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/IOKit.h"
#include "platform/base/Host.h"
#include "platform/values/Values.h"
#include "tests/unit/support/SysfsTree.h"

namespace {

using platform::values::Owned;
using testing_support::SysfsTree;
using Lines = std::vector<std::string>;

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

std::string asText(CFTypeRef value) {
    const auto data = platform::values::as<CFDataRef>(value);
    if (data == nullptr) {
        return platform::values::descriptionOf(value);
    }
    std::string text;
    for (CFIndex i = 0; i < CFDataGetLength(data); ++i) {
        const char c = static_cast<char>(CFDataGetBytePtr(data)[i]);
        constexpr std::string_view digits = "0123456789abcdef";
        const auto byte = static_cast<unsigned char>(c);
        text += c == '\0'                    ? std::string("\\0")
                : byte > 0x20 && byte < 0x7F ? std::string(1, c)
                                             : std::string{'\\', digits[byte >> 4U], digits[byte & 15U]};
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

Lines linesOf(io_iterator_t iterator) {
    Lines lines;
    while (const io_object_t entry = IOIteratorNext(iterator)) {
        lines.push_back(describe(entry));
        EXPECT_EQ(IOObjectRelease(entry), KERN_SUCCESS);
    }
    EXPECT_EQ(IOObjectRelease(iterator), KERN_SUCCESS);
    return lines;
}

TEST_F(Registry, TellsEthernetCardsByBusDriverAndSlot) {
    sysfs.addPciEthernet("eth10", "0000:05:00.0", "00:0a:95:9d:68:16");
    sysfs.addPciEthernet("eth2", "0000:03:00.0", "00:0a:95:9d:68:17", "r8169");
    sysfs.addSlot("7", "0000:03:00");
    sysfs.addPciWireless("wlan0", "0000:04:00.0", "00:0a:95:9d:68:18");
    sysfs.attribute("class/net/wlan0/address", "de:ad:be:ef:00:01");
    sysfs.attribute("devices/pci0000:00/0000:04:00.0/label", "Onboard WLAN");
    sysfs.addVirtioEthernet("ens3", "0000:00:03.0");
    sysfs.addUsbEthernet("enx1", "1-2");
    sysfs.addPlatformEthernet("end0");
    const Lines expected = {
        "BSD Name=end0 < IOMACAddress=\\02\\0\\0\\0\\0\\06 IOClass=fec IOProviderClass=IOPlatformDevice < "
        "name=platform:end0.ethernet\\0",
        "BSD Name=ens3 < IOMACAddress=\\02\\0\\0\\0\\0\\04 IOClass=virtio_net IOProviderClass=IOPCIDevice < "
        "name=pci:0000:00:03.0\\0 AAPL,slot-name=SLOT-0000:00:03.0\\0",
        "BSD Name=enx1 < IOMACAddress=\\02\\0\\0\\0\\0\\05 IOClass=ax88179_178a IOProviderClass=IOUSBDevice "
        "< "
        "name=usb:1-2:1.0\\0",
        "BSD Name=eth2 < IOMACAddress=\\0\\0a\\95\\9dh\\17 IOClass=r8169 IOProviderClass=IOPCIDevice < "
        "name=pci:0000:03:00.0\\0 AAPL,slot-name=SLOT-7\\0",
        "BSD Name=eth10 < IOMACAddress=\\0\\0a\\95\\9dh\\16 IOClass=e1000e IOProviderClass=IOPCIDevice < "
        "name=pci:0000:05:00.0\\0 AAPL,slot-name=SLOT-0000:05:00.0\\0",
        "BSD Name=wlan0 < IOMACAddress=\\0\\0a\\95\\9dh\\18 IOClass=AirPortiwlwifi "
        "IOProviderClass=IOPCIDevice < name=pci:0000:04:00.0\\0 AAPL,slot-name=SLOT-Onboard\\20WLAN\\0",
    };
    EXPECT_EQ(linesOf(findEthernet()), expected);
}

TEST_F(Registry, PassesOverWhatIsNoEthernetHardware) {
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
    EXPECT_EQ(linesOf(findEthernet()), Lines{});
}

TEST_F(Registry, LeavesOutAddressesThatAreNone) {
    const char* bad[] = {"",
                         "00:00:00:00:00:00",
                         "00:0a:95:9d:68",
                         "00-0a-95-9d-68-16",
                         "00:0a:95:9d:68:1g",
                         "+1:0a:95:9d:68:16"};
    for (const char* mac : bad) {
        SCOPED_TRACE(mac);
        sysfs.addPciEthernet("eth0", "0000:03:00.0", mac);
        const Lines lines = linesOf(findEthernet());
        ASSERT_EQ(lines.size(), 1U);
        EXPECT_EQ(lines[0].find("IOMACAddress"), std::string::npos) << lines[0];
    }
    sysfs.attribute("class/net/eth0/address", "02:00:00:00:00:09");
    sysfs.attribute("class/net/eth0/bonding_slave/perm_hwaddr", "02:00:00:00:00:0B");
    EXPECT_NE(linesOf(findEthernet()).at(0).find("IOMACAddress=\\02\\0\\0\\0\\0\\0b"), std::string::npos);
}

TEST_F(Registry, NumbersThePortsOfOneCard) {
    sysfs.addPciEthernet("single", "0000:02:00.1");
    sysfs.addPciEthernet("fn0", "0000:03:00.0");
    sysfs.addPciEthernet("fn2", "0000:03:00.2");
    sysfs.addPciPort("port1", "0000:04:00.0", 1);
    sysfs.addPciPort("port0", "0000:04:00.0", 0);
    sysfs.addPciPort("mixA", "0000:05:00.0", 0);
    sysfs.addPciPort("mixB", "0000:05:00.0", 1);
    sysfs.addPciPort("mixC", "0000:05:00.1", 0);
    Lines indices;
    for (const std::string& line : linesOf(findEthernet())) {
        constexpr std::string_view key = "IOChildIndex=";
        const std::string name = line.substr(9, line.find(' ', 9) - 9);
        const std::size_t at = line.find(key);
        indices.push_back(name + " " + (at == std::string::npos ? "-" : line.substr(at + key.size())));
    }
    EXPECT_EQ(indices,
              (Lines{"fn0 0", "fn2 2", "mixA 0", "mixB 1", "mixC 2", "port0 0", "port1 1", "single -"}));
}

TEST_F(Registry, TakesALabelOnlyWhenItReadsTheSameEverywhere) {
    sysfs.addPciEthernet("eth0", "0000:03:00.0");
    const std::string device = "devices/pci0000:00/0000:03:00.0";
    const auto slot = [this] {
        const std::string line = linesOf(findEthernet()).at(0);
        return line.substr(line.find("SLOT-"));
    };
    sysfs.attribute(device + "/acpi_index", "2");
    EXPECT_EQ(slot(), "SLOT-onboard\\202\\0");
    for (const char* label : {"Port \xC3\xA9", "Port \x1b[1m"}) {
        sysfs.attribute(device + "/label", label);
        EXPECT_EQ(slot(), "SLOT-onboard\\202\\0");
    }
    sysfs.addSlot("3-1", "0000:03:00");
    EXPECT_EQ(slot(), "SLOT-3-1\\0");
}

TEST_F(Registry, TellsSerialPortsByTheirKind) {
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
    EXPECT_EQ(
        linesOf(findSerial(CFSTR("IOModemSerialStream"))),
        (Lines{
            "IOTTYDevice=rfcomm0 IOTTYBaseName=Bluetooth-Modem IOSerialBSDClientType=IOModemSerialStream < ",
            "IOTTYDevice=ttyACM0 IOTTYBaseName=usbmodem IOSerialBSDClientType=IOModemSerialStream < "
            "Product Name=56K Modem",
            "IOTTYDevice=ttyACM2 IOTTYBaseName=usbmodem IOSerialBSDClientType=IOModemSerialStream < "}));
    EXPECT_EQ(
        linesOf(findSerial(CFSTR("IORS232SerialStream"))),
        (Lines{
            "IOTTYDevice=ttyS0 IOTTYBaseName=ttyS0 IOSerialBSDClientType=IORS232SerialStream < ",
            "IOTTYDevice=ttyUSB0 IOTTYBaseName=ttyUSB0 IOSerialBSDClientType=IORS232SerialStream < Product "
            "Name=USB-Serial Controller"}));
    EXPECT_EQ(linesOf(find(IOServiceMatching("IOSerialBSDClient"))).size(), 5U);
}

TEST_F(Registry, ShowsOfAProductsTextWhatPrints) {
    const std::string fill(62, 'x');
    const struct {
        std::string text;
        std::string shown;
    } rows[] = {
        {"\t Caf\xC3\xA9 \xE6\x95\xB0 \r\n", "Caf\xC3\xA9 \xE6\x95\xB0"},
        {"\x1b]0;root\x07 \x01\x7F", "?]0;root? ??"},
        {"csi \xC2\x9B", "csi ?"},
        {"override \xE2\x80\xAE isolate \xE2\x81\xA7 mark \xE2\x80\x8F", "override ? isolate ? mark ?"},
        {"line\nbreak \xE2\x80\xA8 \xE2\x80\xA9", "line?break ? ?"},
        {"private \xEE\x80\x80 none \xEF\xBF\xBF tag \xF3\xA0\x81\x81", "private ? none ? tag ?"},
        {"bad \xFF \xC3( \xC0\x80 \xED\xA0\x80", "bad ? ?( ?? ???"},
        {fill + "\xC3\xA9tail", fill + "\xC3\xA9"},
        {fill + "x\xC3\xA9tail", fill + "x"},
        {fill + " \xF0\x9F\x96\xA8", fill},
        {std::string(4000, '\x01') + "x", ""},
        {" \x01 \xFF ", ""},
    };
    for (const auto& [text, shown] : rows) {
        sysfs.addUsbSerial("ttyACM0", "1-3", text);
        const std::string line = linesOf(findSerial(CFSTR("IOModemSerialStream"))).at(0);
        EXPECT_EQ(line.substr(line.find("< ") + 2), shown.empty() ? "" : "Product Name=" + shown);
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
    EXPECT_EQ(linesOf(findEthernet()).size(), 1U);
    addPorts("real", 0, 1);
    io_iterator_t iterator = 77;
    EXPECT_EQ(IOServiceGetMatchingServices(master, IOServiceMatching("IOEthernetInterface"), &iterator),
              kIOReturnError);
    EXPECT_EQ(iterator, 77U);
}

TEST_F(Registry, KeepsItsSnapshotWhenTheDeviceIsPulledOut) {
    sysfs.addPciEthernet("eth0", "0000:03:00.0");
    sysfs.addPciEthernet("eth1", "0000:04:00.0");
    const io_iterator_t iterator = findEthernet();
    sysfs.remove("devices");
    sysfs.remove("class");
    EXPECT_EQ(linesOf(iterator).size(), 2U);
    EXPECT_EQ(linesOf(findEthernet()), Lines{});
}

TEST_F(Registry, RefusesHandlesThatAreNone) {
    sysfs.addPciEthernet("eth0", "0000:03:00.0");
    const io_iterator_t iterator = findEthernet();
    const io_object_t entry = IOIteratorNext(iterator);
    IOObjectRelease(entry);

    for (const io_object_t bad : {IO_OBJECT_NULL, entry, iterator, ~io_object_t{0}}) {
        SCOPED_TRACE(bad);
        CFMutableDictionaryRef properties = nullptr;
        io_registry_entry_t parent = 77;
        EXPECT_EQ(IORegistryEntryCreateCFProperties(bad, &properties, nullptr, 0), kIOReturnBadArgument);
        EXPECT_EQ(IORegistryEntryGetParentEntry(bad, kIOServicePlane, &parent), kIOReturnBadArgument);
        EXPECT_EQ(parent, IO_OBJECT_NULL);
    }
    EXPECT_EQ(IOIteratorNext(entry), IO_OBJECT_NULL);
    EXPECT_EQ(IOObjectRelease(iterator), KERN_SUCCESS);
    EXPECT_EQ(IOObjectRelease(iterator), kIOReturnBadArgument);
}

}  // namespace
