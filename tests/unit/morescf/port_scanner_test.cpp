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

// The properties of an entry, of its parent, and so on: "{...} < {...}".
using Chain = std::string;

std::vector<Chain> gCards;
std::vector<Chain> gSerialPorts;

}  // namespace

// The scans of this program's registry.
namespace platform::hardware {

static EntryRef entryOf(const Chain& chain, std::string_view className) {
    const std::size_t end = chain.find(" < ");
    const Value content = read(chain.substr(0, end));
    return std::make_shared<const Entry>(Entry{
        className, values::Owned<CFDictionaryRef>::retained(static_cast<CFDictionaryRef>(content.get())),
        end == Chain::npos ? EntryRef() : entryOf(chain.substr(end + 3), "")});
}
static std::optional<std::vector<EntryRef>> entriesOf(const std::vector<Chain>& chains,
                                                      std::string_view className) {
    std::vector<EntryRef> entries;
    for (const Chain& chain : chains) {
        entries.push_back(entryOf(chain, className));
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
std::string scan() {
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

// The hook's status and the name that it gives, behind a blank: "none", or "=" for the one that the rules
// propose.
std::string gHook;

OSStatus giveName(io_object_t port, CFMutableDictionaryRef dict, CFStringRef proposed, CFStringRef* base) {
    EXPECT_TRUE(IOObjectConformsTo(port, "IOEthernetInterface"));
    CFDictionarySetValue(dict, CFSTR("AAPL,slot-name"), CFSTR("%3$@%2$@"));
    const std::string name = gHook.substr(gHook.find(' ') + 1);
    if (name == "=") {
        *base = CFStringCreateCopy(nullptr, proposed);
    } else if (name != "none") {
        *base = platform::values::makeString(name).take();
    }
    return std::stoi(gHook);
}

TEST(PortScanner, DescribesNamesAndSorts) {
    testing_support::Transcript transcript("ports");
    transcript.playItself([](const std::string& step) -> std::string {
        const std::size_t end = step.find(' ');
        const std::string what = step.substr(0, end), with = step.substr(std::min(end, step.size() - 1) + 1);
        if (what == "scan") {
            const std::string ports = scan();
            gCards.clear();
            gSerialPorts.clear();
            MoreSCFSetPortNameCallback(nullptr);
            return "    " + ports;
        }
        if (what == "hook") {
            gHook = with;
            MoreSCFSetPortNameCallback(giveName);
        } else {
            (what == "card" ? gCards : gSerialPorts).push_back(with);
        }
        return "";
    });
}

}  // namespace
