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
        const char* id;  // null: no key
        OSStatus err;
    } rows[] = {
        {"{Sets = {0 = {}; 3 = {}; 12 = {}}}", "13", 0},
        {"{Sets = {0 = {}; -5 = {}}}", "1", 0},
        {"{Sets = {007 = {}}}", "8", 0},
        {"{Sets = {000000000000042 = {}}}", "43", 0},            // 15 characters
        {"{Sets = {0000000000000042 = {}}}", "-2147483647", 0},  // 16
        {"{Sets = {5 = {}; 99999999999 = {}}}", "6", 0},         // more than 32 bits
        {"{Sets = {5 = {}; 2147483648 = {}; 2147483646 = {}}}", "2147483647", 0},
        {"{Sets = {2147483647 = {}}}", nullptr, kSCStatusFailed},
        {"{Sets = {7x = {}; +9 = {}; 8 9 = {}; 7B3A-11 = {}}}", "-2147483647", 0},
        {"{Sets = {5٣ = {}; ٣ = {}}}", "-2147483647", 0},  // digits, but not ASCII
        {"{Other = {}}", "-2147483647", 0},
        {"{Sets = {__LINK__ = /Other; 3 = {}}}", nullptr, kSCStatusFailed},
        {"{Sets = text}", nullptr, kSCStatusFailed},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.tree);
        within(row.tree, [&] {
            CFStringRef id = nullptr;
            CFStringRef path = nullptr;
            EXPECT_EQ(row.err, MakeNewSeAndCopyIDAndPath(CFSTR("Sets"), &id, &path));
            EXPECT_EQ(row.id != nullptr ? row.id : "null", show(id));
            if (row.id != nullptr) {
                EXPECT_EQ("/Sets/" + std::string(row.id), show(path));
                EXPECT_EQ("{}", at("/Sets/" + std::string(row.id)));
            } else {
                EXPECT_EQ(nullptr, path);
            }
            CFQRelease(id);
            CFQRelease(path);
        });
    }
}

TEST_F(TreeTest, PathsFollowTheCurrentSetAndLinks) {
    const auto pathOf = [](OSStatus err, Output<CFStringRef>& path) {
        return err == 0 ? path.shown() : std::to_string(err);
    };
    within(
        "{CurrentSet = /odd/path; Sets = {2 = {Network = {Service = {60 = {__LINK__ = /NetworkServices/6}; 7 "
        "= {}; 8 = {__LINK__ = #8}}}}}}",
        [&] {
            Output<CFStringRef> path;
            const Str two("2");
            EXPECT_EQ("/odd/path", pathOf(CopySetPath(nullptr, &path), path));
            EXPECT_EQ("/odd/path/Network/Global",
                      pathOf(CopyResolvedServicePath(nullptr, nullptr, &path), path));
            EXPECT_EQ("/Sets/2/Network/Global/IPv4",
                      pathOf(CopyEntityPath(two, nullptr, CFSTR("IPv4"), &path), path));
            EXPECT_EQ("/NetworkServices/6/DNS",
                      pathOf(CopyEntityPath(two, Str("60"), CFSTR("DNS"), &path), path));
            EXPECT_EQ("1004", pathOf(CopyResolvedServicePath(two, Str("6"), &path), path)) << "no link";
            EXPECT_EQ("1004", pathOf(CopyResolvedServicePath(two, Str("7"), &path), path)) << "names nothing";
            EXPECT_EQ("1001", pathOf(CopyResolvedServicePath(two, Str("8"), &path), path)) << "a number";
            EXPECT_EQ("untouched", path.shown());
            EXPECT_EQ("6", pathOf(CopySeIDFromSePath(CFSTR("/NetworkServices/6/DNS"), &path), path));
            EXPECT_EQ("", pathOf(CopySeIDFromSePath(CFSTR("/Sets/"), &path), path));
            EXPECT_EQ("-4960", pathOf(CopySeIDFromSePath(CFSTR("/Sets"), &path), path));
        });
}

TEST_F(TreeTest, LinksStayAndMarkersChangeOnce) {
    auto* links = CFDictionaryCreateMutableCopy(nullptr, 0, dictionary(read("{5 = {__LINK__ = /odd}}")));
    EXPECT_EQ(0, AddServiceLinkToDict(CFSTR("5"), links));
    EXPECT_EQ(0, AddServiceLinkToDict(CFSTR("6"), links));
    EXPECT_EQ("{5 = {__LINK__ = /odd}; 6 = {__LINK__ = /NetworkServices/6}}", show(links));
    Boolean changed = false;
    EXPECT_EQ(0, SetDictionaryActive(links, true, &changed));
    EXPECT_FALSE(changed);
    EXPECT_EQ(0, SetDictionaryActive(links, false, &changed));
    EXPECT_TRUE(changed);
    EXPECT_EQ(0, SetDictionaryActive(links, 2, nullptr)) << "any flag but 0 is true";
    EXPECT_TRUE(IsDictionaryActive(links));
    CFRelease(links);
}

}  // namespace
}  // namespace morescf_test
