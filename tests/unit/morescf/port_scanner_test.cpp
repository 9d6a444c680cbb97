#include "morescf/MoreSCFPortScanner.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "morecfq/MoreCFQ.h"
#include "platform/IOKit.h"
#include "platform/hardware/Entry.h"
#include "tests/unit/support/Notation.h"
#include "tests/unit/support/Transcript.h"

namespace {

using testing_support::read;
using testing_support::show;
using testing_support::Value;

// The properties of an entry, of its parent, and so on.
using Chain = std::vector<std::string>;

std::vector<Chain> gCards;
std::vector<Chain> gSerialPorts;

}  // namespace

// The scans of this program's registry.
namespace platform::hardware {

static std::optional<std::vector<EntryRef>> entriesOf(const std::vector<Chain>& chains,
                                                      std::string_view className) {
    std::vector<EntryRef> entries;
    for (const Chain& chain : chains) {
        EntryRef entry;
        for (std::size_t level = chain.size(); level-- > 0;) {
            const Value content = read(chain[level]);
            std::vector<Property> properties;
            for (const auto& [key, value] : values::entriesOf(static_cast<CFDictionaryRef>(content.get()))) {
                properties.push_back({static_cast<CFStringRef>(key), Value::retained(value)});
            }
            entry = std::make_shared<const Entry>(level == 0 ? className : "", properties, entry);
        }
        entries.push_back(entry);
    }
    return entries;
}

std::optional<std::vector<EntryRef>> scanEthernet(const std::string&) {
    return entriesOf(gCards, ethernetClass);
}
std::optional<std::vector<EntryRef>> scanSerial(const std::string&) {
    return entriesOf(gSerialPorts, serialClass);
}

}  // namespace platform::hardware

namespace {

io_object_t nextHandle() {
    mach_port_t master = MACH_PORT_NULL;
    EXPECT_EQ(KERN_SUCCESS, IOMasterPort(MACH_PORT_NULL, &master));
    EXPECT_EQ(KERN_SUCCESS, IOObjectRelease(master));
    return master + 1;
}

// The ports as text, or the status. Every handle has to be given back, whatever happens.
std::string scan(std::vector<Chain> cards, std::vector<Chain> serialPorts = {}) {
    gCards = std::move(cards);
    gSerialPorts = std::move(serialPorts);
    CFArrayRef array = nullptr;
    const io_object_t first = nextHandle();
    const OSStatus err = MoreSCCreatePortArray(&array);
    for (io_object_t handle = first, end = nextHandle(); handle < end; ++handle) {
        EXPECT_EQ(kIOReturnBadArgument, IOObjectRelease(handle)) << "kept";
    }
    const std::string text = err == 0 ? show(array) : std::to_string(err);
    EXPECT_EQ(err != 0, array == nullptr);
    CFQRelease(array);
    return text;
}

std::string serial(const std::string& baseName, bool isModem, const std::string& device = "tty1") {
    return "{IOTTYBaseName = " + baseName + "; IOTTYDevice = " + device +
           "; IOSerialBSDClientType = " + (isModem ? "IOModemSerialStream}" : "IORS232SerialStream}");
}

constexpr const char* card = "{BSD Name = en1}";
constexpr const char* pci = "{IOProviderClass = IOPCIDevice; IOClass = Card}";

TEST(PortScanner, DescribesNamesAndSorts) {
    testing_support::Transcript transcript("ports");
    const auto record = [&transcript](const std::string& text) { transcript.add(text); };
    record(scan({}));
    record("\n=== cards: controller < bus");
    for (const auto& [controller, bus] : {
             std::pair("{IOMACAddress = <000a959d6816>; IOProviderClass = IOPCIDevice}",
                       "{name = <70636900>; AAPL,slot-name = <534c4f542d3300>}"),
             {"{IOMACAddress = <000a959d681677>; IOProviderClass = IOPCIDevice}", "{name = <0000>}"},
             {pci, "{name = <7063>; AAPL,slot-name = <534c4f542d33>; IOChildIndex = #1}"},
             {pci, "{name = <00>; AAPL,slot-name = <0000>}"},
             {pci, "{name = <00>; AAPL,slot-name = <8e31>}"},  // Mac OS Roman
             {pci, "{name = <726164696f0000>}"},
             {"{IOProviderClass = IOUSBDevice}", "{name = <726164696f31>}"},
             {"{IOClass = AirPortDriver}", "{}"},
         }) {
        record(std::string(controller) + " < " + bus + "\n    " + scan({{card, controller, bus}}));
    }
    record(scan({{"{BSD Name = en0}", "{IOClass = AirPortDriver}", "{}"}}));
    record("\n=== serial ports < device");
    for (const char* name : {"modem", "Modem", "printer", "usbmodem", "modem-printer", "IrDA-IrCOMM",
                             "IrDA-IrCOMMch-b", "irda"}) {
        for (const bool isModem : {true, false}) {
            record(serial(name, isModem) + "\n    " + scan({}, {{serial(name, isModem), "{}"}}));
        }
    }
    record(scan({}, {{serial("usbmodem", true), "{Product Name = Fax 100%4$@}"}}));
    record(scan({}, {{"{IOSerialBSDClientType = IORS232SerialStream}"}}));
    record("\n=== a port that cannot be described fails all");
    const Chain good = {"{BSD Name = en0}", "{}", "{}"};
    record("no name: " + scan({{"{}", "{}", "{}"}, good}));
    record("no name of the bus: " + scan({good, {card, pci, "{}"}}));
    record("no device: " +
           scan({good}, {{"{IOTTYBaseName = b; IOSerialBSDClientType = IORS232SerialStream}"}}));
    record("no controller: " + std::to_string(scan({good, {card}}) == std::to_string(kIOReturnNoDevice)));
    record("no bus: " + std::to_string(scan({good, {card, "{}"}}) == std::to_string(kIOReturnNoDevice)));
    // By their class, then by their names, in which digits stand for themselves; "b-port" as the registry has
    // it.
    record("\n=== sorted");
    std::vector<Chain> cards;
    for (const char* name : {"en3", "en10", "EN3", "en0"}) {
        cards.push_back(
            {"{BSD Name = " + std::string(name) + "}", "{IOProviderClass = IOUSBDevice}", "{name = <75>}"});
    }
    record(scan(cards, {{serial("b", false, "t1")},
                        {serial("B", false, "t2")},
                        {serial("zzz", true, "t3")},
                        {serial("modem", true, "t4")}}));
}

TEST(PortScanner, AHooksNameAndStatusReplaceThoseOfTheRules) {
    const auto nameWith = [](MoreSCFPortNameCallback hook, const Chain& port) {
        MoreSCFSetPortNameCallback(hook);
        const std::string ports = scan({port});
        MoreSCFSetPortNameCallback(nullptr);
        return ports.starts_with("(") ? ports.substr(ports.find("UserDefinedName")) : ports;
    };
    const Chain unnamed = {card, "{}", "{}"};
    // Later keywords are found in what replaced earlier ones, and each one only once.
    EXPECT_EQ("UserDefinedName = unknown unknown%2$@ %2$@ unknown})",
              nameWith(
                  [](io_object_t port, CFMutableDictionaryRef dict, CFStringRef proposed, CFStringRef* base) {
                      EXPECT_EQ(nullptr, proposed);
                      EXPECT_TRUE(IOObjectConformsTo(port, "IOEthernetInterface"));
                      CFDictionarySetValue(dict, CFSTR("AAPL,slot-name"), CFSTR("%3$@%2$@"));
                      *base = CFStringCreateCopy(nullptr, CFSTR("%1$@ %2$@ %2$@ %4$@"));
                      return OSStatus{0};
                  },
                  unnamed));
    EXPECT_EQ("-77", nameWith(
                         [](io_object_t, CFMutableDictionaryRef, CFStringRef proposed, CFStringRef* base) {
                             *base = CFStringCreateCopy(nullptr, proposed);
                             return OSStatus{-77};
                         },
                         {card, "{IOClass = AirPort}", "{}"}));
    EXPECT_EQ("-1", nameWith([](io_object_t, CFMutableDictionaryRef, CFStringRef,
                                CFStringRef*) { return OSStatus{0}; },
                             unnamed));
}

}  // namespace
