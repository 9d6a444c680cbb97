#include "morescf/MoreSCFPortScanner.h"

#include <gtest/gtest.h>

#include <map>
#include <string>
#include <vector>

#include "morecfq/MoreCFQ.h"
#include "platform/IOKit.h"
#include "tests/unit/support/Notation.h"

namespace {

using testing_support::read;
using testing_support::show;
using testing_support::Value;

// A registry in which each port is a chain of entries: itself, its parent, its parent's parent. An entry is a
// dictionary of properties.
struct Port {
    std::vector<const char*> chain;
    const char* type = "IOEthernetInterface";
};

constexpr io_object_t kMaster = 1;

struct Registry {
    struct Entry {
        std::string type;
        Value properties;
        io_object_t parent = 0;
    };
    std::vector<Port> ports;
    std::map<io_object_t, Entry> entries;
    std::map<io_object_t, std::vector<io_object_t>> iterators;
    std::multimap<io_object_t, int> handles;  // what was handed out and not given back
    io_object_t last = kMaster;

    io_object_t handOut(io_object_t object) {
        handles.emplace(object, 0);
        return object;
    }
    CFTypeRef copyProperty(io_object_t entry, CFStringRef key) {
        CFTypeRef all = entries.at(entry).properties.get();
        return CFQRetain(CFDictionaryGetValue(static_cast<CFDictionaryRef>(all), key));
    }
};

Registry gRegistry;

}  // namespace

kern_return_t IOMasterPort(mach_port_t, mach_port_t* master) noexcept {
    *master = gRegistry.handOut(kMaster);
    return KERN_SUCCESS;
}

CFMutableDictionaryRef IOServiceMatching(const char* className) noexcept {
    const Value matching = read("{IOProviderClass = " + std::string(className) + "}");
    return CFDictionaryCreateMutableCopy(nullptr, 0, static_cast<CFDictionaryRef>(matching.get()));
}

kern_return_t IOServiceGetMatchingServices(mach_port_t, CFDictionaryRef matching,
                                           io_iterator_t* iterator) noexcept {
    std::vector<io_object_t> found;
    const std::string type = show(CFDictionaryGetValue(matching, CFSTR("IOProviderClass")));
    CFTypeRef stream = CFDictionaryGetValue(matching, CFSTR("IOSerialBSDClientType"));
    for (const Port& port : gRegistry.ports) {
        const io_object_t first = gRegistry.last + 1;
        for (const char* properties : port.chain) {
            ++gRegistry.last;
            gRegistry.entries[gRegistry.last] = {port.type, read(properties), gRegistry.last + 1};
        }
        gRegistry.entries[gRegistry.last].parent = 0;
        Value ofPort = Value::adopt(gRegistry.copyProperty(first, CFSTR("IOSerialBSDClientType")));
        if (type == port.type && (stream == nullptr || show(ofPort.get()).starts_with(show(stream)))) {
            found.push_back(gRegistry.handOut(first));
        }
    }
    CFRelease(matching);
    *iterator = gRegistry.handOut(++gRegistry.last);
    gRegistry.iterators[*iterator] = {found.rbegin(), found.rend()};
    return KERN_SUCCESS;
}

io_object_t IOIteratorNext(io_iterator_t iterator) noexcept {
    auto& rest = gRegistry.iterators.at(iterator);
    const io_object_t next = rest.empty() ? 0 : rest.back();
    if (next != 0) {
        rest.pop_back();
    }
    return next;
}

CFTypeRef IORegistryEntryCreateCFProperty(io_registry_entry_t entry, CFStringRef key, CFAllocatorRef,
                                          IOOptionBits) noexcept {
    return gRegistry.copyProperty(entry, key);
}

kern_return_t IORegistryEntryCreateCFProperties(io_registry_entry_t entry, CFMutableDictionaryRef* properties,
                                                CFAllocatorRef, IOOptionBits) noexcept {
    CFTypeRef all = gRegistry.entries.at(entry).properties.get();
    *properties = CFDictionaryCreateMutableCopy(nullptr, 0, static_cast<CFDictionaryRef>(all));
    return KERN_SUCCESS;
}

kern_return_t IORegistryEntryGetParentEntry(io_registry_entry_t entry, const char*,
                                            io_registry_entry_t* parent) noexcept {
    const io_object_t found = gRegistry.entries.at(entry).parent;
    *parent = found != 0 ? gRegistry.handOut(found) : 0;
    return found != 0 ? KERN_SUCCESS : kIOReturnNoDevice;
}

Boolean IOObjectConformsTo(io_object_t object, const char* className) noexcept {
    return gRegistry.entries.at(object).type == className;
}

kern_return_t IOObjectRelease(io_object_t object) noexcept {
    const auto held = gRegistry.handles.find(object);
    EXPECT_NE(gRegistry.handles.end(), held) << "given back twice";
    if (held != gRegistry.handles.end()) {
        gRegistry.handles.erase(held);
    }
    for (const io_object_t rest : gRegistry.iterators[object]) {
        gRegistry.handles.erase(gRegistry.handles.find(rest));
    }
    gRegistry.iterators.erase(object);
    return KERN_SUCCESS;
}

namespace {

// The ports as text, or the status. Every handle has to be given back, whatever happens.
std::string scan(std::vector<Port> ports) {
    gRegistry = Registry();
    gRegistry.ports = std::move(ports);
    CFArrayRef array = nullptr;
    const OSStatus err = MoreSCCreatePortArray(&array);
    std::string text = err == 0 ? show(array) : std::to_string(err);
    EXPECT_EQ(err != 0, array == nullptr);
    EXPECT_TRUE(gRegistry.handles.empty());
    CFQRelease(array);
    return text;
}

constexpr const char* kSerial = "IOSerialBSDClient";
constexpr const char* kCard = "{BSD Name = en1}";
constexpr const char* kPCI = "{IOProviderClass = IOPCIDevice; IOClass = Card}";

TEST(PortScanner, DescribesAndNamesEthernet) {
    const auto ethernet = [](const char* added, const char* name, int order,
                             const char* hardware = "Ethernet") {
        return "({SortOrder = #" + std::to_string(order) + "; DeviceName = en1; Hardware = " + hardware +
               "; Type = Ethernet" + added + "; UserDefinedName = " + name + "})";
    };
    const char* pci = "{name = <70636900>; AAPL,slot-name = <534c4f542d3300>}";
    EXPECT_EQ("()", scan({}));
    EXPECT_EQ(ethernet("; MACAddress = 00:0a:95:9d:68:16; AAPL,slot-name = 3", "PCI Ethernet Slot 3", 6),
              scan({{{kCard, "{IOMACAddress = <000a959d6816>; IOProviderClass = IOPCIDevice}", pci}}}));
    EXPECT_EQ(ethernet("; AAPL,slot-name = 3; IOChildIndex = 2", "PCI Ethernet Slot 3, Port 2", 6),
              scan({{{kCard, kPCI, "{name = <7063>; AAPL,slot-name = <534c4f542d33>; IOChildIndex = #1}"}}}));
    // Seven bytes are no address, zero bytes no name; a slot without one is unknown.
    EXPECT_EQ(ethernet("; AAPL,slot-name = unknown", "PCI Ethernet Slot unknown", 6),
              scan({{{kCard, "{IOMACAddress = <000a959d681677>; IOProviderClass = IOPCIDevice}",
                      "{name = <0000>}"}}}));
    EXPECT_EQ(ethernet("; AAPL,slot-name = ", "PCI Ethernet Slot ", 6),
              scan({{{kCard, kPCI, "{name = <00>; AAPL,slot-name = <0000>}"}}}));
    EXPECT_EQ(ethernet("", "Wireless Network Adaptor", 8),
              scan({{{kCard, kPCI, "{name = <726164696f0000>}"}}}));
    EXPECT_EQ(ethernet("; BSD Name = en1", "Ethernet Adaptor (en1)", 9),
              scan({{{kCard, "{IOProviderClass = IOUSBDevice}", "{name = <726164696f31>}"}}}));
    EXPECT_EQ(ethernet("", "AirPort", 7, "AirPort"), scan({{{kCard, "{IOClass = AirPortDriver}", "{}"}}}));
    EXPECT_EQ(
        "({SortOrder = #5; DeviceName = en0; Hardware = Ethernet; Type = Ethernet; UserDefinedName = "
        "Built-in "
        "Ethernet})",
        scan({{{"{BSD Name = en0}", "{IOClass = AirPortDriver}", "{}"}}}));
}

TEST(PortScanner, DescribesAndNamesSerialPorts) {
    struct Row {
        const char* entry;
        const char* parent;
        const char* order;
        const char* added;
        const char* name;
    };
    const Row rows[] = {
        {"{IOTTYBaseName = modem; IOSerialBSDClientType = IOModemSerialStream", "{}", "0", "",
         "Internal Modem"},
        {"{IOTTYBaseName = modem; IOSerialBSDClientType = IORS232SerialStream", "{}", "4", "", "Modem Port"},
        {"{IOTTYBaseName = Modem; IOSerialBSDClientType = IOModemSerialStream", "{}", "2",
         "; IOTTYBaseName = modem", "modem-port"},
        {"{IOTTYBaseName = printer; IOSerialBSDClientType = IOModemSerialStream", "{}", "2", "",
         "Printer Port"},
        {"{IOTTYBaseName = usbmodem; IOSerialBSDClientType = IORS232SerialStream", "{}", "1", "",
         "USB Modem"},
        {"{IOTTYBaseName = modem-printer; IOSerialBSDClientType = IORS232SerialStream", "{}", "4", "",
         "Modem/Printer Port"},
        {"{IOTTYBaseName = usbmodem; IOSerialBSDClientType = IOModemSerialStream",
         "{Product Name = Fax 100%4$@}", "1", "", "Fax 100unknown"},
        {"{IOTTYBaseName = IrDA-IrCOMM; IOSerialBSDClientType = IORS232SerialStream", "{}", "3",
         "; HardwareVariant = IrDA-IrCOMM", "IrDA Modem Port"},
        {"{IOTTYBaseName = IrDA-IrCOMMch-b; IOSerialBSDClientType = IOModemSerialStream", "{}", "2",
         "; HardwareVariant = IrDA-IrCOMM; IOTTYBaseName = irda-ircommch-b", "irda-ircommch-b-port"},
    };
    for (const Row& row : rows) {
        const std::string entry = std::string(row.entry) + "; IOTTYDevice = tty1}";
        EXPECT_EQ("({SortOrder = #" + std::string(row.order) +
                      "; DeviceName = tty1; Hardware = Modem; Type = PPP; SubType = PPPSerial" + row.added +
                      "; UserDefinedName = " + row.name + "})",
                  scan({{{entry.c_str(), row.parent}, kSerial}}));
    }
    EXPECT_EQ("()", scan({{{"{IOTTYBaseName = irda; IOSerialBSDClientType = IOModemSerialStream}"}, kSerial},
                          {{"{IOSerialBSDClientType = IORS232SerialStream}"}, kSerial}}));
}

TEST(PortScanner, OnePortThatCannotBeDescribedFailsAll) {
    const std::string noDevice = std::to_string(kIOReturnNoDevice);
    const Port good = {{"{BSD Name = en0}", "{}", "{}"}};
    EXPECT_EQ("-1", scan({good, {{"{}", "{}", "{}"}}})) << "no name";
    EXPECT_EQ("-1", scan({good, {{kCard, kPCI, "{}"}}})) << "a bus without a name";
    EXPECT_EQ("-1",
              scan({good, {{"{IOTTYBaseName = b; IOSerialBSDClientType = IORS232SerialStream}"}, kSerial}}))
        << "no device";
    EXPECT_EQ(noDevice, scan({good, {{kCard}}})) << "no controller";
    EXPECT_EQ(noDevice, scan({good, {{kCard, "{}"}}})) << "no bus";
}

TEST(PortScanner, SortsByClassThenByName) {
    const auto card = [](const char* entry) {
        return Port{{entry, "{IOProviderClass = IOUSBDevice}", "{name = <75>}"}};
    };
    CFArrayRef ports = nullptr;
    gRegistry = Registry();
    gRegistry.ports = {
        card("{BSD Name = en3}"),
        card("{BSD Name = en10}"),
        card("{BSD Name = EN3}"),
        card("{BSD Name = en0}"),
        {{"{IOTTYBaseName = b; IOTTYDevice = t1; IOSerialBSDClientType = IORS232SerialStream}"}, kSerial},
        {{"{IOTTYBaseName = B; IOTTYDevice = t2; IOSerialBSDClientType = IORS232SerialStream}"}, kSerial},
        {{"{IOTTYBaseName = zzz; IOTTYDevice = t3; IOSerialBSDClientType = IOModemSerialStream}"}, kSerial},
        {{"{IOTTYBaseName = modem; IOTTYDevice = t4; IOSerialBSDClientType = IOModemSerialStream}"},
         kSerial}};
    EXPECT_EQ(0, MoreSCCreatePortArray(&ports));
    std::string devices;
    for (CFIndex i = 0; i < CFArrayGetCount(ports); ++i) {
        devices += show(CFDictionaryGetValue(static_cast<CFDictionaryRef>(CFArrayGetValueAtIndex(ports, i)),
                                             CFSTR("DeviceName"))) +
                   " ";
    }
    // "b-port" twice: as the registry gave them. Digits stand for themselves.
    EXPECT_EQ("t4 t3 t1 t2 en0 en10 en3 EN3 ", devices);
    CFQRelease(ports);
}

class HookTest : public testing::Test {
  protected:
    ~HookTest() override { MoreSCFSetPortNameCallback(nullptr); }
    static std::string nameOf(Port port) {
        const std::string ports = scan({std::move(port)});
        const std::size_t at = ports.find("UserDefinedName = ");
        return at == std::string::npos ? ports : ports.substr(at + 18, ports.size() - at - 20);
    }
};

TEST_F(HookTest, ItsNameAndItsStatusReplaceThoseOfTheRules) {
    const Port unnamed = {{kCard, "{}", "{}"}};
    MoreSCFSetPortNameCallback(
        [](io_object_t port, CFMutableDictionaryRef dict, CFStringRef proposed, CFStringRef* base) {
            EXPECT_EQ(nullptr, proposed);
            EXPECT_TRUE(IOObjectConformsTo(port, "IOEthernetInterface"));
            CFDictionarySetValue(dict, CFSTR("AAPL,slot-name"), CFSTR("%3$@%2$@"));
            *base = CFStringCreateCopy(nullptr, CFSTR("%1$@ %2$@ %2$@ %4$@"));
            return OSStatus{0};
        });
    // Later keywords are found in what replaced earlier ones, and each one only once.
    EXPECT_EQ("unknown unknown%2$@ %2$@ unknown", nameOf(unnamed));
    MoreSCFSetPortNameCallback(
        [](io_object_t, CFMutableDictionaryRef, CFStringRef proposed, CFStringRef* base) {
            EXPECT_EQ("AirPort", show(proposed));
            *base = CFStringCreateCopy(nullptr, proposed);
            return OSStatus{-77};
        });
    EXPECT_EQ("-77", nameOf({{kCard, "{IOClass = AirPort}", "{}"}}));
    MoreSCFSetPortNameCallback(
        [](io_object_t, CFMutableDictionaryRef, CFStringRef, CFStringRef*) { return OSStatus{0}; });
    EXPECT_EQ("-1", nameOf(unnamed));
}

}  // namespace
