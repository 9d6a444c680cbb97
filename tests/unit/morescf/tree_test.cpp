#include "morescf/MoreSCFTree.h"

#include "tests/unit/morescf/Fixture.h"

namespace morescf_test {
namespace {

class TreeTest : public MoreSCFTest {
  protected:
    // Runs in a session on that tree, and drops what it changed.
    template <class Work>
    void within(std::string_view notation, Work work) {
        setTree(notation);
        OSStatus err = MoreSCOpen(false, false);
        ASSERT_EQ(0, err);
        work();
        MoreSCClose(&err, false);
    }
};

TEST_F(TreeTest, NewKeysCountUpFromTheLargestDecimalOne) {
    const struct {
        const char* tree;
        const char* id;  // "null": no key
    } rows[] = {
        {"{Sets = {0 = {}; 3 = {}; 12 = {}}}", "13"},
        {"{Sets = {0 = {}; -5 = {}; 007 = {}}}", "8"},
        {"{Sets = {000000000000042 = {}}}", "43"},            // 15 characters
        {"{Sets = {0000000000000042 = {}}}", "-2147483647"},  // 16
        {"{Sets = {5 = {}; 99999999999 = {}; 2147483648 = {}; 2147483646 = {}}}", "2147483647"},
        {"{Sets = {4294967295 = {}}}", "-2147483647"},
        {"{Sets = {2147483647 = {}}}", "null"},
        {"{Sets = {7x = {}; +9 = {}; 8 9 = {}; 7B3A-11 = {}}}", "-2147483647"},
        {"{Sets = {5٣ = {}; ٣ = {}}}", "-2147483647"},  // digits, but not ASCII
        {"{Other = {}}", "-2147483647"},
        {"{Sets = {__LINK__ = /Other; 3 = {}}}", "null"},
        {"{Sets = text}", "null"},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.tree);
        within(row.tree, [&] {
            CFStringRef id = nullptr;
            CFStringRef path = nullptr;
            const bool isMade = std::string(row.id) != "null";
            EXPECT_EQ(isMade ? 0 : kSCStatusFailed, MakeNewSeAndCopyIDAndPath(CFSTR("Sets"), &id, &path));
            EXPECT_EQ(row.id, show(id));
            EXPECT_EQ(isMade ? "/Sets/" + std::string(row.id) : "null", show(path));
            EXPECT_EQ(isMade ? "{}" : "null", at("/Sets/" + std::string(row.id)));
            CFQRelease(id);
            CFQRelease(path);
        });
    }
}

TEST_F(TreeTest, PathsFollowTheCurrentSetAndLinks) {
    Output<CFStringRef> path;
    const Str two("2");
    const auto expect = [&path](const char* expected, OSStatus err) {
        EXPECT_EQ(expected, err == 0 ? path.shown() : std::to_string(err) + " " + path.shown());
    };
    within(
        "{CurrentSet = /odd/path; Sets = {2 = {Network = {Service = {60 = {__LINK__ = /NetworkServices/6}; 7 "
        "= {}; 8 = {__LINK__ = "
        "#8}}}}}}",
        [&] {
            expect("/odd/path", CopySetPath(nullptr, &path));
            expect("/odd/path/Network/Global", CopyResolvedServicePath(nullptr, nullptr, &path));
            expect("/Sets/2/Network/Global/IPv4", CopyEntityPath(two, nullptr, CFSTR("IPv4"), &path));
            expect("/NetworkServices/6/DNS", CopyEntityPath(two, Str("60"), CFSTR("DNS"), &path));
            expect("1004 untouched", CopyResolvedServicePath(two, Str("6"), &path));
            expect("1004 untouched", CopyResolvedServicePath(two, Str("7"), &path));
            expect("1001 untouched", CopyResolvedServicePath(two, Str("8"), &path));
            expect("6", CopySeIDFromSePath(CFSTR("/NetworkServices/6/DNS"), &path));
            expect("", CopySeIDFromSePath(CFSTR("/Sets/"), &path));
            expect("-4960 untouched", CopySeIDFromSePath(CFSTR("/Sets"), &path));
        });
    auto* links = CFDictionaryCreateMutableCopy(nullptr, 0, dictionary(read("{5 = {__LINK__ = /odd}}")));
    EXPECT_EQ(0, AddServiceLinkToDict(CFSTR("5"), links));
    EXPECT_EQ(0, SetDictionaryActive(links, false, nullptr));
    EXPECT_EQ("{5 = {__LINK__ = /odd}; __INACTIVE__ = #1}", show(links)) << "a link that is there stays";
    CFRelease(links);
}

}  // namespace
}  // namespace morescf_test
