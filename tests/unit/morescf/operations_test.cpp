// Every operation on locations, services and entities.
#include "morescf/MoreSCFPortScanner.h"
#include "tests/unit/morescf/Calls.h"

namespace morescf_test {
namespace {

class OperationsTest : public CallsTest {
  protected:
    ~OperationsTest() override { MoreSCFSetPortNameCallback(nullptr); }
};

// Location 1, current, lists service 5, which is off, and links 4; nobody lists 4 or 7.
constexpr const char* oneSet = R"({
    Sets = {1 = {UserDefinedName = Home; Network = {Global = {IPv4 = {ServiceOrder = (5)}};
                     Service = {5 = {__LINK__ = /NetworkServices/5}; 4 = {__LINK__ = /NetworkServices/4}}}}};
    NetworkServices = {4 = {}; 5 = {UserDefinedName = Wired; __INACTIVE__ = #1; IPv4 = {ConfigMethod = DHCP}; DNS = {}}; 7 = {}};
    CurrentSet = /Sets/1})";
constexpr const char* lostService = R"({
    Sets = {1 = {Network = {Global = {IPv4 = {ServiceOrder = (5, 4)}};
                     Service = {5 = {__LINK__ = /NetworkServices/5}; 4 = {__LINK__ = /NetworkServices/4}}}}};
    NetworkServices = {5 = {}}; CurrentSet = /Sets/1})";
constexpr const char* noOrder = R"({
    Sets = {1 = {Network = {Service = {}; Global = {IPv4 = {}}}}}; NetworkServices = {5 = {}; 7 = {}}; CurrentSet = /Sets/1})";
// Nobody can tell what location 2 lists.
constexpr const char* unknownOrder = R"({
    Sets = {1 = {Network = {Global = {IPv4 = {ServiceOrder = (5)}}; Service = {5 = {__LINK__ = /NetworkServices/5}}}}; 2 = {};
            3 = {}};
    NetworkServices = {5 = {}; 7 = {}}; CurrentSet = /Sets/1})";

TEST_F(OperationsTest, Locations) {
    transcript = std::make_unique<testing_support::Transcript>("locations");
    const Str s1("1"), s2("2"), s9("9"), name("New");
    const Value tree = read("{8 = {}}");
    on("oneSet", oneSet);
    CALL(MoreSCSetSetsDict(dictionary(tree)));
    CALL(MoreSCSetSetsDict(nullptr));
    CALL(MoreSCSetCurrentSet(s9));
    CALL(MoreSCSetCurrentSet(nullptr));
    CALL(MoreSCCopyCurrentSet(&string));
    CALL(MoreSCCopyUserVisibleNameOfSet(nullptr, &string));
    CALL(MoreSCRenameSet(nullptr, name));
    CALL(MoreSCRenameSet(s9, name));
    CALL(MoreSCRenameSet(s1, nullptr));
    CALL(MoreSCNewSet(name, &string));
    CALL(MoreSCNewSet(nullptr, &string));
    CALL(MoreSCDuplicateSet(s1, name, &string));
    CALL(MoreSCDuplicateSet(nullptr, nullptr, nullptr));
    CALL(MoreSCDeleteSet(s1));
    CALL(MoreSCDeleteSet(nullptr));
    CALL(MoreSCDeleteSet(s9));
    on("twoSets", twoSets);
    CALL(MoreSCCopySetIDs(&array, &index));
    CALL(MoreSCSetCurrentSet(s2) + MoreSCCopySetIDs(&array, &index) + MoreSCDeleteSet(s1));
    on("lostService", lostService);
    CALL(MoreSCDuplicateSet(nullptr, nullptr, &string));
    on("unknownOrder", unknownOrder);
    CALL(MoreSCDeleteSet(Str("3")));

    // One service for each port, in the ports' order.
    sysfs.addPciEthernet("eth0", "0000:03:00.0");
    sysfs.addPciWireless("wlan0", "0000:04:00.0");
    sysfs.addUsbSerial("ttyACM0", "1-2", "Modem of 1994");
    on("three ports", twoSets);
    CALL(MoreSCNewSet(name, &string));
    // A port that can be listed, but not be described: it has no type.
    MoreSCFSetPortNameCallback(
        [](io_object_t, CFMutableDictionaryRef port, CFStringRef proposed, CFStringRef* base) {
            if (CFEqual(CFDictionaryGetValue(port, CFSTR("DeviceName")), CFSTR("wlan0"))) {
                CFDictionaryRemoveValue(port, CFSTR("Type"));
            }
            *base = CFStringCreateCopy(nullptr, proposed);
            return OSStatus{0};
        });
    CALL(MoreSCNewSet(name, &string));
}

TEST_F(OperationsTest, Services) {
    transcript = std::make_unique<testing_support::Transcript>("services");
    const Str s1("1"), s4("4"), s5("5"), s9("9"), name("New");
    const Value values[] = {read("{8 = {__LINK__ = /x}}"), read("(8)")};
    on("oneSet", oneSet);
    CALL(MoreSCSetServicesDict(nullptr, dictionary(values[0]), nullptr));
    CALL(MoreSCSetServicesDict(s1, nullptr, arrayOf(values[1])));
    CALL(MoreSCSetServicesDict(Str("nowhere"), dictionary(values[0]), arrayOf(values[1])));
    CALL(MoreSCCopyServicesDict(s1, &dict, &array));
    CALL(MoreSCCopyServicesDict(s9, &dict, &array));
    CALL(MoreSCCopyServicesDictMutable(s1, &mutableDict, &mutableArray));
    CALL(MoreSCCopyUserVisibleNameOfService(s1, s5, &string));
    CALL(MoreSCCopyBSDNameOfService(s1, s5, &string));
    CALL(MoreSCIsServiceActive(s1, s5, &flag));
    CALL(MoreSCIsServiceActive(s1, s4, &flag));
    CALL(MoreSCSetServiceActive(s1, s5, true));
    CALL(MoreSCSetServiceActive(s1, s4, 2));
    CALL(MoreSCSetServiceActive(s1, s5, false));
    CALL(MoreSCRenameService(nullptr, s5, name));
    CALL(MoreSCDuplicateService(nullptr, s5, name, &string));
    CALL(MoreSCDuplicateService(nullptr, s9, nullptr, &string));
    CALL(MoreSCDuplicateService(nullptr, nullptr, nullptr, nullptr));
    CALL(MoreSCDeleteService(nullptr, s5));
    CALL(MoreSCDeleteService(nullptr, s4));
    CALL(MoreSCDeleteService(s9, s5));
    CALL(MoreSCDeleteService(nullptr, nullptr));
    on("twoSets", twoSets);
    CALL(MoreSCCopyServiceIDs(Str("2"), &array, &second));
    CALL(MoreSCCopyBSDNameOfService(Str("2"), Str("60"), &string));
    CALL(MoreSCDeleteService(s1, s5));
    CALL(MoreSCDeleteService(s1, Str("6")));
    on("noOrder", noOrder);
    CALL(MoreSCDuplicateService(nullptr, s5, nullptr, nullptr));
    CALL(MoreSCDeleteService(nullptr, s5));
    on("lostService", lostService);
    CALL(MoreSCCopyServiceIDs(s1, &array, nullptr));
    CALL(MoreSCCopyServiceIDs(s1, &array, &second));
    on("unknownOrder", unknownOrder);
    CALL(MoreSCDeleteService(nullptr, s5));
}

TEST_F(OperationsTest, NewServices) {
    transcript = std::make_unique<testing_support::Transcript>("new_services");
    const auto make = [this](const char* port) {
        const Value value = read(port);
        run(port, [&] { return MoreSCNewService(nullptr, dictionary(value), &string); });
    };
    const char* card =
        "{UserDefinedName = x; DeviceName = eth9; Hardware = Ethernet; Type = Ethernet; MACAddress = "
        "00:0a:95:9d:68:16}";
    const char* modem =
        "{UserDefinedName = Fax; DeviceName = ttyS9; Hardware = Modem; Type = PPP; SubType = PPPSerial; "
        "HardwareVariant = IrDA-IrCOMM}";
    on("oneSet", oneSet);
    CALL(MoreSCNewService(nullptr, nullptr, &string));
    make("{a = b}");
    make("{UserDefinedName = typeless; DeviceName = eth0; Hardware = Ethernet}");
    make(
        "{UserDefinedName = AirPort; DeviceName = wlan0; Hardware = AirPort; Type = Ethernet; SubType = "
        "unused; MACAddress = "
        "00:0A:95:9D:68:16}");
    make(modem);
    for (const char* script : {"Apple Internal 56K Modem (v.90)", "AAA"}) {
        (void)directory.write("scripts/local/" + std::string(script), "");
    }
    make(modem);
    for (const std::optional<std::int32_t> version :
         {std::optional<std::int32_t>(), std::optional(0x1012), std::optional(0x1013), std::optional(0x101F),
          std::optional(0x1020)}) {
        platform::Host old = host;
        old.systemVersion = version;
        const platform::HostOverride scope(old);
        transcript->add("\n=== version " + std::to_string(version.value_or(0)));
        make(card);
    }
}

TEST_F(OperationsTest, Entities) {
    transcript = std::make_unique<testing_support::Transcript>("entities");
    const Str s1("1"), s4("4"), s5("5"), s9("9"), none("New"), ipv4("IPv4"), dns("DNS");
    const Value values[] = {read("{a = b}"), read("()"), read("(IPv6, DNS, DNS, UserDefinedName)"),
                            read("({}, {a = b}, {}, {})")};
    CFDictionaryRef ab = dictionary(values[0]);
    CFArrayRef empty = arrayOf(values[1]), names = arrayOf(values[2]), four = arrayOf(values[3]);
    on("oneSet", oneSet);
    CALL(MoreSCCopyEntitiesDict(s1, nullptr, &dict));
    CALL(MoreSCCopyEntitiesDict(s1, s9, &dict));
    CALL(MoreSCCopyEntitiesDictMutable(s1, s4, &mutableDict));
    CALL(MoreSCCopyEntitiesDictMutable(s1, s9, &mutableDict));
    CALL(MoreSCSetEntitiesDict(s1, nullptr, ab));
    CALL(MoreSCCopyEntity(s1, s5, ipv4, &dict));
    CALL(MoreSCCopyEntity(s1, s5, none, &dict));
    CALL(MoreSCCopyEntityMutable(s1, nullptr, ipv4, &mutableDict));
    CALL(MoreSCSetEntity(s1, s5, ipv4, ab));
    CALL(MoreSCSetEntity(s1, s5, nullptr, ab));
    CALL(MoreSCCopyEntities(s1, s5, &array, &second));
    CALL(MoreSCCopyEntities(s1, s5, &array, nullptr));
    CALL(MoreSCCopyEntities(s1, s5, nullptr, &second));
    CALL(MoreSCCopyEntities(s1, s9, &array, &second));
    CALL(MoreSCSetEntities(s1, s5, names, four));
    CALL(MoreSCSetEntities(s1, s5, empty, empty));
    CALL(MoreSCSetEntities(s1, s5, empty, four));
    CALL(MoreSCNewEntity(s1, s5, none, ab));
    CALL(MoreSCNewEntity(s1, s5, dns, ab));
    CALL(MoreSCNewEntity(s1, s5, none, nullptr));
    CALL(MoreSCDeleteEntity(s1, s5, ipv4));
    CALL(MoreSCDeleteEntity(s1, s5, nullptr));
    CALL(MoreSCIsEntityActive(s1, s5, dns, &flag));
    CALL(MoreSCSetEntityActive(s1, s5, dns, false));
    CALL(MoreSCSetEntityActive(s1, s5, dns, true));
}

// What somebody else may have written.
TEST_F(OperationsTest, WrongTypes) {
    transcript = std::make_unique<testing_support::Transcript>("wrong_types");
    const Str s1("1");
    for (const char* tree :
         {"{Sets = {1 = {}}}", "{Sets = {1 = {}}; CurrentSet = /Sets/9}",
          "{Sets = text; CurrentSet = /Sets/1}", "{Sets = {1 = text}; CurrentSet = /Sets/1}",
          "{Sets = {1 = {Network = {Global = {IPv4 = {ServiceOrder = (#5)}}}}; 2 = {}}; CurrentSet = "
          "/Sets/1}",
          "{Sets = {1 = {Network = {Global = {IPv4 = {ServiceOrder = (5)}}; Service = {5 = {__LINK__ = "
          "abc}}}}; 2 = {}}; CurrentSet "
          "= /Sets/1}",
          "{Sets = {1 = {Network = {Global = {IPv4 = {ServiceOrder = ()}}}}; 2 = {}}; NetworkServices = (); "
          "CurrentSet = /Sets/1}",
          "{Sets = {1 = {UserDefinedName = x; Network = {Global = {IPv4 = {ServiceOrder = ()}}}}; 2 = {}}; "
          "NetworkServices = {}; "
          "CurrentSet = #1}"}) {
        on(tree, tree);
        CALL(MoreSCCopySetsDict(&dict));
        CALL(MoreSCCopySetIDs(&array, &index));
        CALL(MoreSCCopyUserVisibleNameOfSet(s1, &string));
        CALL(MoreSCCopyServiceIDs(s1, &array, &second));
        CALL(MoreSCCopyServiceIDs(s1, &array, nullptr));
        CALL(MoreSCDeleteSet(Str("2")));
    }
}

}  // namespace
}  // namespace morescf_test
