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
    Registry() { EXPECT_EQ(IOMasterPort(MACH_PORT_NULL, &master), KERN_SUCCESS); }
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
    const platform::HostOverride host_{[this] {
        platform::Host made;
        made.sysfsRoot = sysfs.root();
        return made;
    }()};
};

// Data as an input of a transcript notes it.
std::string asText(CFTypeRef value) {
    const auto data = platform::values::as<CFDataRef>(value);
    return data == nullptr ? platform::values::descriptionOf(value)
                           : testing_support::escaped({reinterpret_cast<const char*>(CFDataGetBytePtr(data)),
                                                       static_cast<std::size_t>(CFDataGetLength(data))});
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

// A line for each entry, behind a tab; "none" without one.
std::string linesOf(io_iterator_t iterator) {
    std::string lines;
    while (const io_object_t entry = IOIteratorNext(iterator)) {
        lines += "\n\t" + describe(entry);
        EXPECT_EQ(IOObjectRelease(entry), KERN_SUCCESS);
    }
    EXPECT_EQ(IOObjectRelease(iterator), KERN_SUCCESS);
    return lines.empty() ? "none" : lines;
}

TEST_F(Registry, ListsTheHardwareOfASysfs) {
    testing_support::Transcript transcript("registry");
    transcript.replay("network cards and serial ports", [this](const std::vector<std::string>& inputs) {
        const std::string& line = inputs[0];
        if (line == "ethernet") {
            return linesOf(findEthernet());
        }
        if (line == "modem" || line == "serial") {
            return linesOf(
                findSerial(line == "modem" ? CFSTR("IOModemSerialStream") : CFSTR("IORS232SerialStream")));
        }
        if (line == "all") {
            return linesOf(find(IOServiceMatching("IOSerialBSDClient")));
        }
        sysfs.make(line);
        return std::string();
    });
}

TEST_F(Registry, GivesNoPartOfAList) {
    // Links to one device each, as quick as thousands of them have to be.
    const auto addPorts = [this](const std::string& kind, int first, int last) {
        for (int i = first; i < last; ++i) {
            std::filesystem::create_symlink("../../devices/" + kind,
                                            sysfs.root() + "/class/net/" + kind + std::to_string(i));
        }
    };
    sysfs.make("class/net/bonding_masters =");
    sysfs.make("devices/virtual/type = 1");
    sysfs.make("devices/real/device/type = 1");
    addPorts("virtual", 0, 9);
    addPorts("real", 1, 4096);
    sysfs.addPciEthernet("zzz", "0000:03:00.0");
    EXPECT_TRUE(linesOf(findEthernet()).starts_with("\n\tBSD Name=zzz "));
    addPorts("real", 0, 1);
    io_iterator_t iterator = 77;
    EXPECT_EQ(IOServiceGetMatchingServices(master, IOServiceMatching("IOEthernetInterface"), &iterator),
              kIOReturnError);
    EXPECT_EQ(iterator, 77U);
}

TEST_F(Registry, KeepsItsSnapshotWhenTheDeviceIsPulledOut) {
    sysfs.addPciEthernet("eth0", "0000:03:00.0");
    const io_iterator_t iterator = findEthernet();
    sysfs.make("remove devices");
    sysfs.make("remove class");
    EXPECT_TRUE(linesOf(iterator).starts_with("\n\tBSD Name=eth0 < IOMACAddress="));
    EXPECT_EQ(linesOf(findEthernet()), "none");
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
