// Every operation on locations, services and entities: what it returns, and the tree after it.
#include <utility>

#include "tests/unit/morescf/Fixture.h"

namespace morescf_test {
namespace {

using OperationsTest = MoreSCFTest;
using Edits = std::vector<std::pair<const char*, const char*>>;

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

const Edits unchanged;
// What every removal of services does to oneSet.
constexpr std::pair<const char*, const char*> swept = {"4 = {}; ", ""};
constexpr std::pair<const char*, const char*> sweptToo = {"; 7 = {}}; C", "}; C"};

std::string edited(std::string text, const Edits& edits) {
    for (const auto& [from, to] : edits) {
        const std::size_t at = text.find(from);
        EXPECT_NE(std::string::npos, at) << from;
        text.replace(at, std::string(from).size(), to);
    }
    return text;
}

TEST_F(OperationsTest, ChangeTheTreeAndMarkTheSession) {
    const Str five("5");
    const Str one("1");
    const Value link = read("{8 = {__LINK__ = /x}}");
    const Value order = read("(8)");
    const Value entity = read("{a = b}");
    const Value twice = read("(IPv6, DNS, DNS, UserDefinedName)");
    const Value four = read("({}, {a = b}, {}, {})");
    const Value none = read("()");
    enum Mark { marked, unmarked };
    const struct {
        const char* what;
        const char* tree;
        std::function<OSStatus()> operation;
        OSStatus err;
        Mark mark;
        Edits edits;
    } rows[] = {
        {"SetSetsDict",
         smallTree,
         [&] { return MoreSCSetSetsDict(dictionary(link)); },
         0,
         marked,
         {{"1 = {}", "8 = {__LINK__ = /x}"}}},
        {"SetSetsDict, null", smallTree, [&] { return MoreSCSetSetsDict(nullptr); }, -50, unmarked,
         unchanged},
        {"SetCurrentSet, to nothing",
         smallTree,
         [&] { return MoreSCSetCurrentSet(Str("9")); },
         0,
         marked,
         {{"/Sets/1", "/Sets/9"}}},
        {"SetCurrentSet, null", oneSet, [&] { return MoreSCSetCurrentSet(nullptr); }, -50, unmarked,
         unchanged},
        {"RenameSet",
         oneSet,
         [&] { return MoreSCRenameSet(nullptr, CFSTR("New")); },
         0,
         marked,
         {{"Home", "New"}}},
        {"RenameSet, none",
         oneSet,
         [&] { return MoreSCRenameSet(Str("9"), CFSTR("New")); },
         1004,
         unmarked,
         {}},
        {"NewSet, no ports",
         oneSet,
         [&] { return MoreSCNewSet(CFSTR("New"), nullptr); },
         0,
         marked,
         {{"}; NetworkS",
           "; 2 = {Network = {Service = {}; Global = {IPv4 = {PPPOverridePrimary = #0; ServiceOrder = ()}; "
           "NetInfo = {}}}; UserDefinedName = New}}; NetworkS"}}},
        {"DuplicateSet",
         oneSet,
         [&] { return MoreSCDuplicateSet(one, CFSTR("New"), nullptr); },
         0,
         marked,
         {{"}; NetworkS",
           "; 2 = {UserDefinedName = New; Network = {Service = {8 = {__LINK__ = /NetworkServices/8}}; Global "
           "= "
           "{IPv4 = {ServiceOrder = (8)}}}}}; NetworkS"},
          {"7 = {}",
           "7 = {}; 8 = {UserDefinedName = Wired; __INACTIVE__ = #1; IPv4 = {ConfigMethod = DHCP}; DNS = "
           "{}}"}}},
        {"DuplicateSet, a service gone",
         "{Sets = {1 = {Network = {Service = {5 = {__LINK__ = /NetworkServices/5}; 4 = {__LINK__ = "
         "/NetworkServices/4}}; Global = {IPv4 = {ServiceOrder = (5, 4)}}}}}; NetworkServices = {5 = {}}; "
         "CurrentSet = /Sets/1}",
         [&] { return MoreSCDuplicateSet(nullptr, nullptr, nullptr); }, 1004, marked, unchanged},
        {"DeleteSet, current",
         oneSet,
         [&] { return MoreSCDeleteSet(one); },
         -50,
         unmarked,
         {swept, sweptToo}},
        {"DeleteSet, null", oneSet, [&] { return MoreSCDeleteSet(nullptr); }, -50, unmarked, unchanged},
        {"DeleteSet, none",
         oneSet,
         [&] { return MoreSCDeleteSet(Str("9")); },
         1004,
         unmarked,
         {swept, sweptToo}},
        {"DeleteSet, another",
         twoSets,
         [&] { return MoreSCSetCurrentSet(Str("2")) + MoreSCDeleteSet(one); },
         0,
         marked,
         {{"1 = {UserDefinedName = Home; Network = {Service = {5 = {__LINK__ = /NetworkServices/5}; 6 = "
           "{__LINK__ "
           "= /NetworkServices/6}}; Global = {IPv4 = {PPPOverridePrimary = #0; ServiceOrder = (6, 5)}; "
           "NetInfo = "
           "{}}}}; ",
           ""},
          {"5 = {UserDefinedName = Wired; Interface = {DeviceName = eth0; Type = Ethernet}; IPv4 = "
           "{ConfigMethod = "
           "DHCP}}; ",
           ""},
          {"t = /Sets/1", "t = /Sets/2"}}},
        {"SetServicesDict, links",
         oneSet,
         [&] { return MoreSCSetServicesDict(nullptr, dictionary(link), nullptr); },
         0,
         marked,
         {{"{5 = {__LINK__ = /NetworkServices/5}; 4 = {__LINK__ = /NetworkServices/4}}",
           "{8 = {__LINK__ = /x}}"}}},
        {"SetServicesDict, order",
         oneSet,
         [&] { return MoreSCSetServicesDict(one, nullptr, array(order)); },
         0,
         marked,
         {{"(5)", "(8)"}}},
        {"SetServiceActive",
         oneSet,
         [&] { return MoreSCSetServiceActive(one, five, true); },
         0,
         marked,
         {{" __INACTIVE__ = #1;", ""}}},
        {"SetServiceActive, the same", oneSet, [&] { return MoreSCSetServiceActive(one, five, false); }, 0,
         unmarked, unchanged},
        {"DuplicateService",
         oneSet,
         [&] { return MoreSCDuplicateService(nullptr, five, CFSTR("New"), nullptr); },
         0,
         marked,
         {{"(5)", "(5, 8)"},
          {"/NetworkServices/4}", "/NetworkServices/4}; 8 = {__LINK__ = /NetworkServices/8}"},
          {"7 = {}",
           "7 = {}; 8 = {UserDefinedName = New; __INACTIVE__ = #1; IPv4 = {ConfigMethod = DHCP}; DNS = "
           "{}}"}}},
        {"DuplicateService, unnamed, unlisted",
         oneSet,
         [&] { return MoreSCDuplicateService(nullptr, Str("7"), nullptr, nullptr); },
         0,
         marked,
         {{"(5)", "(5, 8)"},
          {"/NetworkServices/4}", "/NetworkServices/4}; 8 = {__LINK__ = /NetworkServices/8}"},
          {"7 = {}", "7 = {}; 8 = {}"}}},
        {"DuplicateService, none",
         oneSet,
         [&] { return MoreSCDuplicateService(nullptr, Str("9"), nullptr, nullptr); },
         1004,
         unmarked,
         {swept, sweptToo}},
        {"DuplicateService, null", oneSet,
         [&] { return MoreSCDuplicateService(nullptr, nullptr, nullptr, nullptr); }, -50, unmarked,
         unchanged},
        {"DuplicateService, no order to put it in",
         noOrder,
         [&] { return MoreSCDuplicateService(nullptr, five, nullptr, nullptr); },
         -4960,
         unmarked,
         {{"7 = {}", "7 = {}; 8 = {}"}}},
        {"DeleteService",
         oneSet,
         [&] { return MoreSCDeleteService(nullptr, five); },
         0,
         marked,
         {swept,
          sweptToo,
          {"5 = {UserDefinedName = Wired; __INACTIVE__ = #1; IPv4 = {ConfigMethod = DHCP}; DNS = {}}", ""},
          {"5 = {__LINK__ = /NetworkServices/5}; ", ""},
          {"(5)", "()"}}},
        {"DeleteService, that another location lists",
         twoSets,
         [&] { return MoreSCDeleteService(one, Str("6")); },
         0,
         marked,
         {{"; 6 = {__LINK__ = /NetworkServices/6}", ""}, {"(6, 5)", "(5)"}}},
        {"DeleteService, only linked",
         oneSet,
         [&] { return MoreSCDeleteService(nullptr, Str("4")); },
         0,
         marked,
         {swept, sweptToo, {"; 4 = {__LINK__ = /NetworkServices/4}", ""}}},
        {"DeleteService, null",
         oneSet,
         [&] { return MoreSCDeleteService(nullptr, nullptr); },
         -50,
         unmarked,
         {}},
        {"DeleteService, no order",
         noOrder,
         [&] { return MoreSCDeleteService(nullptr, five); },
         -4960,
         unmarked,
         {}},
        {"RenameService",
         oneSet,
         [&] { return MoreSCRenameService(nullptr, five, CFSTR("New")); },
         0,
         marked,
         {{"Wired", "New"}}},
        {"SetEntitiesDict",
         oneSet,
         [&] { return MoreSCSetEntitiesDict(one, nullptr, dictionary(entity)); },
         0,
         marked,
         {{"{IPv4 = {ServiceOrder = (5)}}", "{a = b}"}}},
        {"SetEntity, new",
         oneSet,
         [&] { return MoreSCSetEntity(one, five, CFSTR("New"), dictionary(entity)); },
         0,
         marked,
         {{"DNS = {}", "DNS = {}; New = {a = b}"}}},
        {"SetEntity, there",
         oneSet,
         [&] { return MoreSCSetEntity(one, five, CFSTR("IPv4"), dictionary(entity)); },
         0,
         marked,
         {{"{ConfigMethod = DHCP}", "{a = b}"}}},
        {"SetEntity, no protocol", oneSet,
         [&] { return MoreSCSetEntity(one, five, nullptr, dictionary(entity)); }, -50, unmarked, unchanged},
        {"SetEntities, the first of two, and none against a property",
         oneSet,
         [&] { return MoreSCSetEntities(one, five, array(twice), array(four)); },
         0,
         marked,
         {{"IPv4 = {ConfigMethod = DHCP}; DNS = {}", "IPv6 = {}; DNS = {a = b}"}}},
        {"SetEntities, none",
         oneSet,
         [&] { return MoreSCSetEntities(one, five, array(none), array(none)); },
         0,
         marked,
         {{"; IPv4 = {ConfigMethod = DHCP}; DNS = {}", ""}}},
        {"SetEntities, of different length", oneSet,
         [&] { return MoreSCSetEntities(one, five, array(none), array(four)); }, -50, unmarked, unchanged},
        {"NewEntity",
         oneSet,
         [&] { return MoreSCNewEntity(one, five, CFSTR("New"), dictionary(entity)); },
         0,
         marked,
         {{"DNS = {}", "DNS = {}; New = {a = b}"}}},
        {"NewEntity, there", oneSet,
         [&] { return MoreSCNewEntity(one, five, CFSTR("DNS"), dictionary(entity)); }, -50, unmarked,
         unchanged},
        {"DeleteEntity",
         oneSet,
         [&] { return MoreSCDeleteEntity(one, five, CFSTR("IPv4")); },
         0,
         marked,
         {{"IPv4 = {ConfigMethod = DHCP}; ", ""}}},
        {"DeleteEntity, none",
         oneSet,
         [&] { return MoreSCDeleteEntity(one, five, CFSTR("New")); },
         0,
         marked,
         {}},
        {"DeleteEntity, null",
         oneSet,
         [&] { return MoreSCDeleteEntity(one, five, nullptr); },
         -50,
         unmarked,
         {}},
        {"SetEntityActive",
         oneSet,
         [&] { return MoreSCSetEntityActive(one, five, CFSTR("DNS"), false); },
         0,
         marked,
         {{"DNS = {}", "DNS = {__INACTIVE__ = #1}"}}},
        {"SetEntityActive, the same", oneSet,
         [&] { return MoreSCSetEntityActive(one, five, CFSTR("DNS"), true); }, 0, unmarked, unchanged},
        {"SetEntityActive, none", oneSet,
         [&] { return MoreSCSetEntityActive(one, five, CFSTR("New"), true); }, 1004, unmarked, unchanged},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.what);
        setTree(row.tree);
        OSStatus err = MoreSCOpen(false, false);
        EXPECT_EQ(row.err, row.operation());
        EXPECT_EQ(edited(row.tree, row.edits), at("/"));
        // On disk only what a marked session commits.
        SCPreferencesSetValue(MoreSCGetSCPreferencesRef(), CFSTR("Added"), kCFBooleanTrue);
        MoreSCClose(&err, false);
        EXPECT_EQ(row.mark == marked, tree().ends_with("; Added = #true}"));
    }
}

template <class Ref, class Operation>
std::string got(Operation operation) {
    Output<Ref> output;
    const OSStatus err = operation(&output);
    return (err != 0 ? std::to_string(err) + " " : "") + output.shown();
}
template <class Ref1, class Ref2, class Operation>
std::string gotTwo(Operation operation) {
    Output<Ref1> first;
    Output<Ref2> second;
    const OSStatus err = operation(&first, &second);
    return (err != 0 ? std::to_string(err) + " " : "") + first.shown() + " " + second.shown();
}
template <class Value, class Operation>
std::string gotPlain(Operation operation) {
    Value value = 77;
    const OSStatus err = operation(&value);
    return (err != 0 ? std::to_string(err) + " " : "") + std::to_string(value);
}

TEST_F(OperationsTest, Read) {
    const Str five("5");
    const Str one("1");
    const Str nine("9");
    const auto rowsOf = [&](const char* tree, const std::vector<std::pair<std::string, const char*>>& rows) {
        for (const auto& [shown, expected] : rows) {
            EXPECT_EQ(expected, shown) << tree;
        }
    };
    using Dict = CFDictionaryRef;
    using MutableDict = CFMutableDictionaryRef;
    using Array = CFArrayRef;
    using String = CFStringRef;
    setTree(oneSet);
    rowsOf(
        oneSet,
        {
            {got<String>([&](auto* o) { return MoreSCCopyUserVisibleNameOfSet(nullptr, o); }), "Home"},
            {got<String>([&](auto* o) { return MoreSCCopyUserVisibleNameOfSet(nine, o); }), "1004 untouched"},
            {got<String>([&](auto* o) { return MoreSCCopyCurrentSet(o); }), "1"},
            {gotTwo<Dict, Array>([&](auto* d, auto* o) { return MoreSCCopyServicesDict(one, d, o); }),
             "{5 = {__LINK__ = /NetworkServices/5}; 4 = {__LINK__ = /NetworkServices/4}} (5)"},
            {gotTwo<Dict, Array>([&](auto* d, auto* o) { return MoreSCCopyServicesDict(nine, d, o); }),
             "1004 null null"},
            {gotTwo<MutableDict, CFMutableArrayRef>(
                 [&](auto* d, auto* o) { return MoreSCCopyServicesDictMutable(one, d, o); }),
             "{5 = {__LINK__ = /NetworkServices/5}; 4 = {__LINK__ = /NetworkServices/4}} (5)"},
            {gotTwo<MutableDict, CFMutableArrayRef>(
                 [&](auto* d, auto* o) { return MoreSCCopyServicesDictMutable(nine, d, o); }),
             "1004 untouched untouched"},
            {got<String>([&](auto* o) { return MoreSCCopyUserVisibleNameOfService(one, five, o); }), "Wired"},
            {got<String>([&](auto* o) { return MoreSCCopyBSDNameOfService(one, five, o); }),
             "1004 untouched"},
            {gotPlain<Boolean>([&](auto* o) { return MoreSCIsServiceActive(one, five, o); }), "0"},
            {gotPlain<Boolean>([&](auto* o) { return MoreSCIsServiceActive(one, Str("4"), o); }), "1"},
            {gotPlain<Boolean>([&](auto* o) { return MoreSCIsServiceActive(one, nine, o); }), "1004 77"},
            {gotPlain<Boolean>([&](auto* o) { return MoreSCIsEntityActive(one, five, CFSTR("DNS"), o); }),
             "1"},
            {got<Dict>([&](auto* o) { return MoreSCCopyEntitiesDict(one, nullptr, o); }),
             "{IPv4 = {ServiceOrder = (5)}}"},
            {got<Dict>([&](auto* o) { return MoreSCCopyEntitiesDict(one, nine, o); }), "1004 null"},
            {got<MutableDict>([&](auto* o) { return MoreSCCopyEntitiesDictMutable(one, Str("4"), o); }),
             "{}"},
            {got<MutableDict>([&](auto* o) { return MoreSCCopyEntitiesDictMutable(one, nine, o); }),
             "1004 untouched"},
            {got<Dict>([&](auto* o) { return MoreSCCopyEntity(one, five, CFSTR("IPv4"), o); }),
             "{ConfigMethod = DHCP}"},
            {got<Dict>([&](auto* o) { return MoreSCCopyEntity(one, five, CFSTR("New"), o); }), "1004 null"},
            {got<MutableDict>(
                 [&](auto* o) { return MoreSCCopyEntityMutable(one, nullptr, CFSTR("IPv4"), o); }),
             "{ServiceOrder = (5)}"},
            {got<MutableDict>([&](auto* o) { return MoreSCCopyEntityMutable(one, five, CFSTR("New"), o); }),
             "1004 untouched"},
            {gotTwo<Array, Array>([&](auto* p, auto* e) { return MoreSCCopyEntities(one, five, p, e); }),
             "(IPv4, DNS) ({ConfigMethod = DHCP}, {})"},
            {got<Array>([&](auto* p) { return MoreSCCopyEntities(one, five, p, nullptr); }), "(IPv4, DNS)"},
            {got<Array>([&](auto* e) { return MoreSCCopyEntities(one, five, nullptr, e); }), "-50 untouched"},
            {gotTwo<Array, Array>([&](auto* p, auto* e) { return MoreSCCopyEntities(one, nine, p, e); }),
             "1004 untouched untouched"},
        });
    setTree(twoSets);
    rowsOf(twoSets,
           {
               {got<Array>([&](auto* o) { return MoreSCCopySetIDs(o, nullptr); }), "(1, 2)"},
               {gotPlain<CFIndex>([&](auto* o) { return MoreSCCopySetIDs(nullptr, o); }), "0"},
               {gotTwo<Array, Array>([&](auto* l, auto* r) { return MoreSCCopyServiceIDs(Str("2"), l, r); }),
                "(60) (6)"},
               {got<String>([&](auto* o) { return MoreSCCopyBSDNameOfService(Str("2"), Str("60"), o); }),
                "ttyS0"},
           });
    setTree("{Sets = {1 = {}}; CurrentSet = /Sets/9}");
    rowsOf(
        "a current location that is none",
        {
            {got<Dict>([&](auto* o) { return MoreSCCopySetsDict(o); }), "{1 = {}}"},
            {gotPlain<CFIndex>([&](auto* o) { return MoreSCCopySetIDs(nullptr, o); }), "77"},
            {got<String>([&](auto* o) { return MoreSCCopyUserVisibleNameOfSet(one, o); }), "-4960 untouched"},
        });
    setTree("{Sets = {1 = {}}}");
    rowsOf("no current location", {
                                      {gotTwo<Array, Array>([&](auto* o, auto* /*unused*/) {
                                           CFIndex index = 0;
                                           return MoreSCCopySetIDs(o, &index);
                                       }),
                                       "1004 null untouched"},
                                  });
}

}  // namespace
}  // namespace morescf_test
