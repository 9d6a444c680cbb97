#include "tests/unit/morescf/Fixture.h"

namespace morescf_test {
namespace {

class EntitiesTest : public MoreSCFTest {
  protected:
    EntitiesTest() { setTree(tree_); }

    [[nodiscard]] std::string service() const {
        Output<CFDictionaryRef> dict;
        return MoreSCCopyEntitiesDict(nullptr, five, &dict) == 0 ? dict.shown() : "failed";
    }

    static constexpr const char* tree_ =
        "{CurrentSet = /Sets/1; Sets = {1 = {UserDefinedName = Home; Network = {Service = {5 = {__LINK__ = "
        "/NetworkServices/5}; 6 = {__LINK__ = /NetworkServices/6}}; Global = {IPv4 = {ServiceOrder = "
        "(5)}}}}}; "
        "NetworkServices = {5 = {UserDefinedName = Wired; DNS = {}; __INACTIVE__ = #1; IPv4 = {ConfigMethod "
        "= "
        "DHCP}; PPP = {__INACTIVE__ = #1}; Odd = (list)}}}";
    const Str five{"5"};
};

TEST_F(EntitiesTest, ListsTheDictionariesAlone) {
    Output<CFArrayRef> protocols;
    Output<CFArrayRef> values;
    EXPECT_EQ(0, MoreSCCopyEntities(nullptr, five, &protocols, &values));
    EXPECT_EQ("(DNS, IPv4, PPP)", protocols.shown());
    EXPECT_EQ("({}, {ConfigMethod = DHCP}, {__INACTIVE__ = #1})", values.shown());
    EXPECT_EQ(0, MoreSCCopyEntities(nullptr, nullptr, &protocols, nullptr));
    EXPECT_EQ("(IPv4)", protocols.shown());
    EXPECT_EQ(0, MoreSCCopyEntities(nullptr, five, nullptr, nullptr));
    EXPECT_EQ(-50, MoreSCCopyEntities(nullptr, five, nullptr, &values));
    EXPECT_EQ(kSCStatusNoKey, MoreSCCopyEntities(nullptr, Str("6"), &protocols, &values))
        << "a link to nowhere";
    EXPECT_EQ("untouched untouched", protocols.shown() + " " + values.shown());
}

TEST_F(EntitiesTest, ReplacingKeepsTheServicesOwnProperties) {
    const Value protocols = read("(Modem, UserDefinedName)");
    const Value values = read("({Speaker = #1}, {x = y})");
    EXPECT_EQ(-50, MoreSCSetEntities(nullptr, five, array(protocols), array(read("({})"))));
    EXPECT_EQ(-50, MoreSCSetEntities(nullptr, five, nullptr, array(values)));
    EXPECT_EQ(0, MoreSCSetEntities(nullptr, five, array(protocols), array(values)));
    EXPECT_EQ("{UserDefinedName = Wired; __INACTIVE__ = #1; Odd = (list); Modem = {Speaker = #1}}",
              service());
    EXPECT_EQ(0, MoreSCSetEntities(nullptr, five, array(read("()")), array(read("()"))));
    EXPECT_EQ("{UserDefinedName = Wired; __INACTIVE__ = #1; Odd = (list)}", service());
}

TEST_F(EntitiesTest, AddReadWriteAndRemoveOne) {
    const Value entity = read("{a = b}");
    EXPECT_EQ(-50, MoreSCNewEntity(nullptr, five, CFSTR("DNS"), dictionary(entity))) << "it is there";
    EXPECT_EQ(-50, MoreSCNewEntity(nullptr, five, CFSTR("Odd"), dictionary(entity))) << "as a property";
    EXPECT_EQ(-50, MoreSCNewEntity(nullptr, five, nullptr, dictionary(entity)));
    EXPECT_EQ(-50, MoreSCSetEntity(nullptr, five, CFSTR("DNS"), nullptr));
    EXPECT_EQ(-50, MoreSCSetEntity(nullptr, five, nullptr, dictionary(entity)));
    EXPECT_EQ(-50, MoreSCSetEntitiesDict(nullptr, five, nullptr));
    EXPECT_EQ(show(read(tree_).get()), tree()) << "nothing changed so far";

    EXPECT_EQ(0, MoreSCNewEntity(nullptr, five, CFSTR("Modem"), dictionary(entity)));
    EXPECT_EQ(0, MoreSCSetEntity(nullptr, five, CFSTR("AirPort"), dictionary(entity)));
    EXPECT_EQ(0, MoreSCSetEntity(nullptr, five, CFSTR("DNS"), dictionary(entity)));
    EXPECT_EQ(0, MoreSCDeleteEntity(nullptr, five, CFSTR("PPP")));
    EXPECT_EQ(0, MoreSCDeleteEntity(nullptr, five, CFSTR("PPP"))) << "gone already";
    EXPECT_EQ(
        "{UserDefinedName = Wired; DNS = {a = b}; __INACTIVE__ = #1; IPv4 = {ConfigMethod = DHCP}; Odd = "
        "(list); Modem = {a = b}; AirPort = {a = b}}",
        service());

    Output<CFDictionaryRef> read;
    Output<CFMutableDictionaryRef> own;
    EXPECT_EQ(0, MoreSCCopyEntity(nullptr, nullptr, CFSTR("IPv4"), &read));
    EXPECT_EQ("{ServiceOrder = (5)}", read.shown());
    EXPECT_EQ(0, MoreSCCopyEntityMutable(nullptr, five, CFSTR("IPv4"), &own));
    CFDictionarySetValue(own, CFSTR("Router"), CFSTR("192.0.0.192"));
    EXPECT_EQ(0, MoreSCCopyEntity(nullptr, five, CFSTR("IPv4"), &read));
    EXPECT_EQ("{ConfigMethod = DHCP}", read.shown()) << "the store does not see it";
    EXPECT_EQ(kSCStatusNoKey, MoreSCCopyEntity(nullptr, five, CFSTR("PPP"), &read));
    EXPECT_EQ(kSCStatusFailed, MoreSCCopyEntityMutable(nullptr, five, CFSTR("Odd"), &own));
    EXPECT_EQ("null null", read.shown() + " " + own.shown());
}

TEST_F(EntitiesTest, SwitchingWritesOnlyAChange) {
    const struct {
        const char* protocol;
        Boolean active;
        OSStatus err;
        bool commits;
    } rows[] = {
        {"IPv4", true, 0, false}, {"IPv4", false, 0, true},      {"IPv4", false, 0, false},
        {"PPP", true, 0, true},   {"Modem", false, 1004, false},
    };
    for (const auto& row : rows) {
        const std::string before = fileIdentity();
        EXPECT_EQ(row.err, MoreSCSetEntityActive(nullptr, five, Str(row.protocol), row.active));
        EXPECT_EQ(row.commits, before != fileIdentity()) << row.protocol;
        Boolean active = 9;
        EXPECT_EQ(row.err, MoreSCIsEntityActive(nullptr, five, Str(row.protocol), &active));
        EXPECT_EQ(row.err == 0 ? row.active : 9, active);
    }
}

}  // namespace
}  // namespace morescf_test
