// Every operation on locations, services and entities: what it returns, and the tree after it.
#include "morescf/MoreSCFHelpers.h"
#include "tests/unit/morescf/Fixture.h"

namespace morescf_test {
namespace {

using OperationsTest = MoreSCFTest;

// Location 1, current, lists service 5, which is off, and links 4; nobody lists 4 or 7.
constexpr const char* oneSet =
    "{Sets = {1 = {UserDefinedName = Home; Network = {Service = {5 = {__LINK__ = /NetworkServices/5}; 4 = "
    "{__LINK__ = /NetworkServices/4}}; Global = {IPv4 = {ServiceOrder = (5)}}}}}; NetworkServices = {4 = {}; "
    "5 = {UserDefinedName = Wired; __INACTIVE__ = #1; IPv4 = {ConfigMethod = DHCP}; DNS = {}}; 7 = {}}; "
    "CurrentSet = /Sets/1}";
constexpr const char* smallTree = "{Sets = {1 = {}}; CurrentSet = /Sets/1}";
constexpr const char* noOrder =
    "{Sets = {1 = {Network = {Service = {}; Global = {IPv4 = {}}}}}; NetworkServices = {5 = {}; 7 = {}}; "
    "CurrentSet = /Sets/1}";
// Service 5 is off and so is its AppleTalk; 6 has it on, 7 has none.
constexpr const char* appleTalk =
    "{Sets = {1 = {Network = {Service = {5 = {__LINK__ = /NetworkServices/5}; 6 = {__LINK__ = "
    "/NetworkServices/6}; 7 "
    "= {__LINK__ = /NetworkServices/7}}; Global = {IPv4 = {ServiceOrder = (5, 6, 7)}}}}}; NetworkServices = "
    "{5 = "
    "{__INACTIVE__ = #1; AppleTalk = {__INACTIVE__ = #1}}; 6 = {AppleTalk = {}}; 7 = {}}; CurrentSet = "
    "/Sets/1}";
constexpr const char* lostService =
    "{Sets = {1 = {Network = {Service = {5 = {__LINK__ = /NetworkServices/5}; 4 = {__LINK__ = "
    "/NetworkServices/4}"
    "}; Global = {IPv4 = {ServiceOrder = (5, 4)}}}}}; NetworkServices = {5 = {}}; CurrentSet = /Sets/1}";

// Nobody can tell what location 2 lists.
constexpr const char* unknownOrder =
    "{Sets = {1 = {Network = {Service = {5 = {__LINK__ = /NetworkServices/5}}; Global = {IPv4 = "
    "{ServiceOrder = "
    "(5)}}}}; 2 = {}; 3 = {}}; NetworkServices = {5 = {}; 7 = {}}; CurrentSet = /Sets/1}";

// The text with "old -> new" edits made, one after the other, between which stands " | ".
std::string edited(std::string text, std::string_view edits) {
    while (!edits.empty()) {
        const std::size_t end = std::min(edits.find(" | "), edits.size());
        const std::string_view edit = edits.substr(0, end);
        const std::size_t arrow = edit.find(" -> ");
        const std::size_t at = text.find(edit.substr(0, arrow));
        EXPECT_NE(std::string::npos, at) << edit;
        text.replace(at, arrow, edit.substr(arrow + 4));
        edits.remove_prefix(std::min(end + 3, edits.size()));
    }
    return text;
}

// clang-format off
#define SWEPT "4 = {}; 5 -> 5 | ; 7 = {}}; C -> }; C"
#define CHANGES(call) #call, [&]() -> OSStatus { return call; }

TEST_F(OperationsTest, ChangeTheTreeAndMarkTheSession) {
    const Str s5("5"), s1("1");
    const Value values[] = {read("{8 = {__LINK__ = /x}}"), read("{a = b}"), read("(8)"), read("()"),
                            read("(IPv6, DNS, DNS, UserDefinedName)"), read("({}, {a = b}, {}, {})"),
                            read("{UserDefinedName = typeless; DeviceName = eth0; Hardware = Ethernet}")};
    CFDictionaryRef links = dictionary(values[0]), ab = dictionary(values[1]), port = dictionary(values[6]);
    CFArrayRef order = array(values[2]), none = array(values[3]), names = array(values[4]), four = array(values[5]);
    enum Mark { marked, unmarked };
    const struct { const char* tree; const char* call; std::function<OSStatus()> run; OSStatus err; Mark mark; const char* edits; } rows[] = {
        {smallTree, CHANGES(MoreSCSetSetsDict(links)), 0, marked, "1 = {} -> 8 = {__LINK__ = /x}"},
        {smallTree, CHANGES(MoreSCSetSetsDict(nullptr)), -50, unmarked, ""},
        {smallTree, CHANGES(MoreSCSetCurrentSet(Str("9"))), 0, marked, "/Sets/1 -> /Sets/9"},
        {oneSet, CHANGES(MoreSCSetCurrentSet(nullptr)), -50, unmarked, ""},
        {oneSet, CHANGES(MoreSCRenameSet(nullptr, CFSTR("New"))), 0, marked, "Home -> New"},
        {oneSet, CHANGES(MoreSCRenameSet(Str("9"), CFSTR("New"))), 1004, unmarked, ""},
        {oneSet, CHANGES(MoreSCNewSet(CFSTR("New"), nullptr)), 0, marked,
         "}; NetworkS -> ; 2 = {Network = {Service = {}; Global = {IPv4 = {PPPOverridePrimary = #0; ServiceOrder = ()}; "
         "NetInfo = {}}}; UserDefinedName = New}}; NetworkS"},
        {oneSet, CHANGES(MoreSCDuplicateSet(s1, CFSTR("New"), nullptr)), 0, marked,
         "}; NetworkS -> ; 2 = {UserDefinedName = New; Network = {Service = {8 = {__LINK__ = /NetworkServices/8}}; Global = "
         "{IPv4 = {ServiceOrder = (8)}}}}}; NetworkS | 7 = {} -> 7 = {}; 8 = {UserDefinedName = Wired; __INACTIVE__ = #1; "
         "IPv4 = {ConfigMethod = DHCP}; DNS = {}}"},
        // What it had made is gone again, through a deletion that marks.
        {lostService, CHANGES(MoreSCDuplicateSet(nullptr, nullptr, nullptr)), 1004, marked, ""},
        {oneSet, CHANGES(MoreSCDeleteSet(s1)), -50, unmarked, SWEPT},
        {oneSet, CHANGES(MoreSCDeleteSet(nullptr)), -50, unmarked, ""},
        {oneSet, CHANGES(MoreSCDeleteSet(Str("9"))), 1004, unmarked, SWEPT},
        {twoSets, CHANGES(MoreSCSetCurrentSet(Str("2")) + MoreSCDeleteSet(s1)), 0, marked,
         "1 = {UserDefinedName = Home; Network = {Service = {5 = {__LINK__ = /NetworkServices/5}; 6 = {__LINK__ = "
         "/NetworkServices/6}}; Global = {IPv4 = {PPPOverridePrimary = #0; ServiceOrder = (6, 5)}; NetInfo = {}}}}; 2 -> 2 | "
         "5 = {UserDefinedName = Wired; Interface = {DeviceName = eth0; Type = Ethernet}; IPv4 = {ConfigMethod = DHCP}}; 6 "
         "-> 6 | t = /Sets/1 -> t = /Sets/2"},
        {oneSet, CHANGES(MoreSCSetServicesDict(nullptr, links, nullptr)), 0, marked,
         "{5 = {__LINK__ = /NetworkServices/5}; 4 = {__LINK__ = /NetworkServices/4}} -> {8 = {__LINK__ = /x}}"},
        {oneSet, CHANGES(MoreSCSetServicesDict(s1, nullptr, order)), 0, marked, "(5) -> (8)"},
        {oneSet, CHANGES(MoreSCSetServiceActive(s1, s5, true)), 0, marked, " __INACTIVE__ = #1; -> "},
        {oneSet, CHANGES(MoreSCSetServiceActive(s1, s5, false)), 0, unmarked, ""},
        {oneSet, CHANGES(MoreSCDuplicateService(nullptr, s5, CFSTR("New"), nullptr)), 0, marked,
         "(5) -> (5, 8) | /NetworkServices/4} -> /NetworkServices/4}; 8 = {__LINK__ = /NetworkServices/8} | 7 = {} -> 7 = "
         "{}; 8 = {UserDefinedName = New; __INACTIVE__ = #1; IPv4 = {ConfigMethod = DHCP}; DNS = {}}"},
        {oneSet, CHANGES(MoreSCDuplicateService(nullptr, Str("7"), nullptr, nullptr)), 0, marked,
         "(5) -> (5, 8) | /NetworkServices/4} -> /NetworkServices/4}; 8 = {__LINK__ = /NetworkServices/8} | 7 = {} -> 7 = "
         "{}; 8 = {}"},
        {oneSet, CHANGES(MoreSCDuplicateService(nullptr, Str("9"), nullptr, nullptr)), 1004, unmarked, SWEPT},
        {oneSet, CHANGES(MoreSCDuplicateService(nullptr, nullptr, nullptr, nullptr)), -50, unmarked, ""},
        {noOrder, CHANGES(MoreSCDuplicateService(nullptr, s5, nullptr, nullptr)), -4960, unmarked, "7 = {} -> 7 = {}; 8 = {}"},
        {oneSet, CHANGES(MoreSCNewService(nullptr, ab, nullptr)), -50, marked, SWEPT},
        {oneSet, CHANGES(MoreSCNewService(nullptr, port, nullptr)), -50, marked, SWEPT},
        {oneSet, CHANGES(MoreSCDeleteService(nullptr, s5)), 0, marked,
         "5 = {UserDefinedName = Wired; __INACTIVE__ = #1; IPv4 = {ConfigMethod = DHCP}; DNS = {}} ->  | "
         "4 = {}; ; 7 = {} ->  | 5 = {__LINK__ = /NetworkServices/5}; 4 -> 4 | (5) -> ()"},
        {twoSets, CHANGES(MoreSCDeleteService(s1, Str("6"))), 0, marked,
         "; 6 = {__LINK__ = /NetworkServices/6} ->  | (6, 5) -> (5)"},
        {oneSet, CHANGES(MoreSCDeleteService(nullptr, Str("4"))), 0, marked,
         SWEPT " | ; 4 = {__LINK__ = /NetworkServices/4} -> "},
        {oneSet, CHANGES(MoreSCDeleteService(nullptr, nullptr)), -50, unmarked, ""},
        {noOrder, CHANGES(MoreSCDeleteService(nullptr, s5)), -4960, unmarked, ""},
        // The removal of services fails behind the rest.
        {unknownOrder, CHANGES(MoreSCDeleteService(nullptr, s5)), 1004, marked, "5 = {__LINK__ = /NetworkServices/5} ->  | (5) -> ()"},
        {unknownOrder, CHANGES(MoreSCDeleteSet(Str("3"))), 1004, unmarked, "; 3 = {} -> "},
        {oneSet, CHANGES(MoreSCRenameService(nullptr, s5, CFSTR("New"))), 0, marked, "Wired -> New"},
        {oneSet, CHANGES(MoreSCSetEntitiesDict(s1, nullptr, ab)), 0, marked, "{IPv4 = {ServiceOrder = (5)}} -> {a = b}"},
        {oneSet, CHANGES(MoreSCSetEntity(s1, s5, CFSTR("New"), ab)), 0, marked, "DNS = {} -> DNS = {}; New = {a = b}"},
        {oneSet, CHANGES(MoreSCSetEntity(s1, s5, CFSTR("IPv4"), ab)), 0, marked, "{ConfigMethod = DHCP} -> {a = b}"},
        {oneSet, CHANGES(MoreSCSetEntity(s1, s5, nullptr, ab)), -50, unmarked, ""},
        // The first of two entities of one protocol counts, and none against a property.
        {oneSet, CHANGES(MoreSCSetEntities(s1, s5, names, four)), 0, marked,
         "IPv4 = {ConfigMethod = DHCP}; DNS = {} -> IPv6 = {}; DNS = {a = b}"},
        {oneSet, CHANGES(MoreSCSetEntities(s1, s5, none, none)), 0, marked, "; IPv4 = {ConfigMethod = DHCP}; DNS = {} -> "},
        {oneSet, CHANGES(MoreSCSetEntities(s1, s5, none, four)), -50, unmarked, ""},
        {oneSet, CHANGES(MoreSCNewEntity(s1, s5, CFSTR("New"), ab)), 0, marked, "DNS = {} -> DNS = {}; New = {a = b}"},
        {oneSet, CHANGES(MoreSCNewEntity(s1, s5, CFSTR("DNS"), ab)), -50, unmarked, ""},
        {oneSet, CHANGES(MoreSCDeleteEntity(s1, s5, CFSTR("IPv4"))), 0, marked, "IPv4 = {ConfigMethod = DHCP}; DNS -> DNS"},
        {oneSet, CHANGES(MoreSCDeleteEntity(s1, s5, CFSTR("New"))), 0, marked, ""},
        {oneSet, CHANGES(MoreSCDeleteEntity(s1, s5, nullptr)), -50, unmarked, ""},
        {oneSet, CHANGES(MoreSCSetEntityActive(s1, s5, CFSTR("DNS"), false)), 0, marked, "DNS = {} -> DNS = {__INACTIVE__ = #1}"},
        {oneSet, CHANGES(MoreSCSetEntityActive(s1, s5, CFSTR("DNS"), true)), 0, unmarked, ""},
        {oneSet, CHANGES(MoreSCSetEntityActive(s1, s5, CFSTR("New"), true)), 1004, unmarked, ""},
        {appleTalk, CHANGES(MoreSCSetAppleTalkActive(nullptr, true)), 0, marked, "{__INACTIVE__ = #1} -> {}"},
        {appleTalk, CHANGES(MoreSCSetAppleTalkActive(s1, false)), 0, marked, "AppleTalk = {}} -> AppleTalk = {__INACTIVE__ = #1}}"},
        {oneSet, CHANGES(MoreSCSetAppleTalkActive(nullptr, true)), 0, unmarked, ""},
    };
    // clang-format on
    for (const auto& row : rows) {
        SCOPED_TRACE(row.call);
        setTree(row.tree);
        OSStatus err = MoreSCOpen(false, false);
        EXPECT_EQ(row.err, row.run());
        EXPECT_EQ(edited(row.tree, row.edits), at("/"));
        // On disk only what a marked session commits.
        SCPreferencesSetValue(MoreSCGetSCPreferencesRef(), CFSTR("Added"), kCFBooleanTrue);
        MoreSCClose(&err, false);
        EXPECT_EQ(row.mark == marked, tree().ends_with("; Added = #true}"));
    }
}

// The status, unless it is 0, and the outputs.
template <class Ref1, class Ref2 = CFArrayRef, class Operation>
std::string got(Operation operation) {
    Output<Ref1> first;
    Output<Ref2> second;
    const OSStatus err = operation(&first, &second);
    return (err != 0 ? std::to_string(err) + " " : "") + first.shown() + " " + second.shown();
}

// clang-format off
#define READ(call) #call, [&]([[maybe_unused]] auto* out, [[maybe_unused]] auto* two) -> OSStatus { return call; }

TEST_F(OperationsTest, Read) {
    const Str s5("5"), s1("1"), s9("9"), s4("4"), s2("2"), s60("60");
    Boolean flag = 0;
    CFIndex index = 77;
    const auto expect = [](const std::string& expected, const char* call, const std::string& result) {
        EXPECT_EQ(expected, result) << call;
    };
    const auto string = [&](const char* expected, const char* call, auto run) { expect(expected, call, got<CFStringRef>(run)); };
    const auto dict = [&](const char* expected, const char* call, auto run) { expect(expected, call, got<CFDictionaryRef>(run)); };
    const auto mutableDict = [&](const char* expected, const char* call, auto run) {
        expect(expected, call, got<CFMutableDictionaryRef, CFMutableArrayRef>(run));
    };
    const auto arrays = [&](const char* expected, const char* call, auto run) { expect(expected, call, got<CFArrayRef>(run)); };
    const auto active = [&](int expected, OSStatus err) { EXPECT_EQ(expected, err != 0 ? err : flag); };
    setTree(oneSet);
    string("Home untouched", READ(MoreSCCopyUserVisibleNameOfSet(nullptr, out)));
    string("1004 untouched untouched", READ(MoreSCCopyUserVisibleNameOfSet(s9, out)));
    string("1 untouched", READ(MoreSCCopyCurrentSet(out)));
    string("Wired untouched", READ(MoreSCCopyUserVisibleNameOfService(s1, s5, out)));
    string("1004 untouched untouched", READ(MoreSCCopyBSDNameOfService(s1, s5, out)));
    dict("{5 = {__LINK__ = /NetworkServices/5}; 4 = {__LINK__ = /NetworkServices/4}} (5)", READ(MoreSCCopyServicesDict(s1, out, two)));
    dict("1004 null null", READ(MoreSCCopyServicesDict(s9, out, two)));
    mutableDict("{5 = {__LINK__ = /NetworkServices/5}; 4 = {__LINK__ = /NetworkServices/4}} (5)", READ(MoreSCCopyServicesDictMutable(s1, out, two)));
    mutableDict("1004 untouched untouched", READ(MoreSCCopyServicesDictMutable(s9, out, two)));
    dict("{IPv4 = {ServiceOrder = (5)}} untouched", READ(MoreSCCopyEntitiesDict(s1, nullptr, out)));
    dict("1004 null untouched", READ(MoreSCCopyEntitiesDict(s1, s9, out)));
    mutableDict("{} untouched", READ(MoreSCCopyEntitiesDictMutable(s1, s4, out)));
    mutableDict("1004 untouched untouched", READ(MoreSCCopyEntitiesDictMutable(s1, s9, out)));
    dict("{ConfigMethod = DHCP} untouched", READ(MoreSCCopyEntity(s1, s5, CFSTR("IPv4"), out)));
    dict("1004 null untouched", READ(MoreSCCopyEntity(s1, s5, CFSTR("New"), out)));
    mutableDict("{ServiceOrder = (5)} untouched", READ(MoreSCCopyEntityMutable(s1, nullptr, CFSTR("IPv4"), out)));
    mutableDict("1004 untouched untouched", READ(MoreSCCopyEntityMutable(s1, s5, CFSTR("New"), out)));
    arrays("(IPv4, DNS) ({ConfigMethod = DHCP}, {})", READ(MoreSCCopyEntities(s1, s5, out, two)));
    arrays("(IPv4, DNS) untouched", READ(MoreSCCopyEntities(s1, s5, out, nullptr)));
    arrays("-50 untouched untouched", READ(MoreSCCopyEntities(s1, s5, nullptr, two)));
    arrays("1004 untouched untouched", READ(MoreSCCopyEntities(s1, s9, out, two)));
    active(0, MoreSCIsServiceActive(s1, s5, &flag));
    active(1, MoreSCIsServiceActive(s1, s4, &flag));
    active(1004, MoreSCIsServiceActive(s1, s9, &flag));
    active(1, MoreSCIsEntityActive(s1, s5, CFSTR("DNS"), &flag));
    active(1004, MoreSCIsEntityActive(s1, s5, CFSTR("New"), &flag));
    setTree(twoSets);
    arrays("(1, 2) untouched", READ(MoreSCCopySetIDs(out, &index)));
    EXPECT_EQ(0, index);
    arrays("1004 untouched untouched", READ(MoreSCCopyServiceIDs(s9, out, two)));
    arrays("(60) (6)", READ(MoreSCCopyServiceIDs(s2, out, two)));
    string("ttyS0 untouched", READ(MoreSCCopyBSDNameOfService(s2, s60, out)));
    setTree("{Sets = {1 = {}}; CurrentSet = /Sets/9}");
    dict("{1 = {}} untouched", READ(MoreSCCopySetsDict(out)));
    arrays("(1) untouched", READ(MoreSCCopySetIDs(out, &(index = 77))));
    EXPECT_EQ(77, index);
    string("-4960 untouched untouched", READ(MoreSCCopyUserVisibleNameOfSet(s1, out)));
    setTree("{Sets = {1 = {}}}");
    arrays("1004 null untouched", READ(MoreSCCopySetIDs(out, &index)));
}
// clang-format on

}  // namespace
}  // namespace morescf_test
