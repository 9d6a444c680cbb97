#include <random>

#include "platform/preferences/Tree.h"
#include "tests/unit/preferences/Fixture.h"
#include "tests/unit/support/Notation.h"

namespace preferences_test {
namespace {

constexpr std::string_view sample =
    "{CurrentSet = /Sets/1; Sets = {1 = {Name = one}; 2 = no dictionary}; Link = {__LINK__ = /Sets/1}; "
    "BadLink = "
    "{__LINK__ = #1}}";

class TreeTest : public StoreTest {
  protected:
    TreeTest() {
        (void)directory.write("store/preferences.plist",
                              *platform::values::writePropertyListXML(testing_support::read(sample).get()));
        session = open();
    }

    [[nodiscard]] std::string wholeTree() const {
        return platform::values::descriptionOf(SCPreferencesPathGetValue(session.get(), CFSTR("/")));
    }

    SessionRef session;
};

TEST_F(TreeTest, PathsThatLeadNowhereSayWhyAndChangeNothing) {
    const struct {
        std::string_view path;
        int get, set, remove;
    } rows[] = {
        {"/Sets/1", 0, 0, 0},
        {"/Sets/9", 1004, 0, 1004},
        {"/New/a/b", 1004, 0, 1004},
        {"/Sets/2", 1001, 0, 0},          // there, but no dictionary
        {"/Sets/2/x", 1001, 1001, 1001},  // the same on the way
        {"/Link/Name", 1004, 0, 1004},    // links are not followed
        {"/", 0, 0, 1002},
        {"", 1002, 1002, 1002},
        {"Sets/1", 1002, 1002, 1002},
        {"/Sets//1", 1002, 1002, 1002},
        {"/Sets/1/", 1002, 1002, 1002},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.path);
        const auto path = text(row.path);
        session = open();
        const std::string before = wholeTree();
        EXPECT_EQ(SCPreferencesPathGetValue(session.get(), path.get()) != nullptr, row.get == 0);
        EXPECT_EQ(SCError(), row.get);
        EXPECT_EQ(SCPreferencesPathSetValue(session.get(), path.get(), named("new").get()), row.set == 0);
        EXPECT_EQ(SCError(), row.set);
        EXPECT_EQ(row.set == 0 ? nameAt(session, row.path) : "new", "new");
        EXPECT_EQ(wholeTree() == before, row.set != 0);
        session = open();
        EXPECT_EQ(SCPreferencesPathRemoveValue(session.get(), path.get()), row.remove == 0);
        EXPECT_EQ(SCError(), row.remove);
        EXPECT_EQ(wholeTree() == before, row.remove != 0);
    }
}

TEST_F(TreeTest, LinksNameTheirTarget) {
    const struct {
        CFStringRef path;
        int status;
    } rows[] = {{CFSTR("/Link"), 0},      {CFSTR("/BadLink"), 1001}, {CFSTR("/Sets/1"), 1004},
                {CFSTR("/Sets/2"), 1001}, {CFSTR("/None"), 1004},    {CFSTR("Link"), 1002}};
    for (const auto& row : rows) {
        SCOPED_TRACE(platform::values::textOf(row.path));
        CFStringRef const target = SCPreferencesPathGetLink(session.get(), row.path);
        EXPECT_EQ(SCError(), row.status);
        ASSERT_EQ(target != nullptr, row.status == 0);
        EXPECT_TRUE(target == nullptr || CFEqual(target, CFSTR("/Sets/1")) != 0);
    }
}

TEST_F(TreeTest, TopLevelValuesMayBeOfAnyPropertyListType) {
    EXPECT_TRUE(CFEqual(SCPreferencesGetValue(session.get(), CFSTR("CurrentSet")), CFSTR("/Sets/1")));
    EXPECT_TRUE(SCPreferencesSetValue(session.get(), CFSTR("a/b"), kCFBooleanTrue));
    EXPECT_EQ(SCPreferencesGetValue(session.get(), CFSTR("a/b")), kCFBooleanTrue);
    EXPECT_EQ(SCPreferencesGetValue(session.get(), CFSTR("none")), nullptr);
    EXPECT_EQ(SCError(), 1004);
    const auto noList = Owned<CFURLRef>::adopt(CFURLCreateWithString(nullptr, CFSTR("http://a/"), nullptr));
    EXPECT_FALSE(SCPreferencesSetValue(session.get(), CFSTR("url"), noList.get()));
    EXPECT_EQ(SCError(), 1002);
}

// What can be stored can be committed, and read again.
TEST_F(TreeTest, NoDeeperThanAFileMayBe) {
    const auto nested = [](int levels) {
        auto value = testing_support::read("{}");
        for (int i = 1; i < levels; ++i) {
            const void* key = CFSTR("a");
            const void* item = value.get();
            value = testing_support::Value::adopt(CFDictionaryCreate(
                nullptr, &key, &item, 1, &kCFTypeDictionaryKeyCallBacks, &kCFTypeDictionaryValueCallBacks));
        }
        return static_cast<CFDictionaryRef>(value.take());
    };
    for (const int levels : {510, 511, 512}) {
        const auto value = Owned<CFDictionaryRef>::adopt(nested(levels));
        const bool fits = levels + 2 <= 512;
        const bool fitsAtTop = levels + 1 <= 512;
        EXPECT_EQ(SCPreferencesPathSetValue(session.get(), CFSTR("/New/deep"), value.get()) != 0, fits);
        EXPECT_EQ(SCError(), fits ? 0 : 1002);
        EXPECT_EQ(SCPreferencesSetValue(session.get(), CFSTR("deep"), value.get()) != 0, fitsAtTop);
        EXPECT_EQ(SCError(), fitsAtTop ? 0 : 1002);
    }
    EXPECT_TRUE(commit(session));
    (void)directory.write("store/preferences.plist", contentOf(file));
    EXPECT_TRUE(open());
}

TEST_F(TreeTest, StoresValuesAsTheyAreNow) {
    const auto inner = Owned<CFMutableDictionaryRef>::adopt(CFDictionaryCreateMutable(
        nullptr, 0, &kCFTypeDictionaryKeyCallBacks, &kCFTypeDictionaryValueCallBacks));
    const auto outer = Owned<CFMutableDictionaryRef>::adopt(CFDictionaryCreateMutable(
        nullptr, 0, &kCFTypeDictionaryKeyCallBacks, &kCFTypeDictionaryValueCallBacks));
    CFDictionarySetValue(outer.get(), CFSTR("inner"), inner.get());
    ASSERT_TRUE(SCPreferencesPathSetValue(session.get(), CFSTR("/Sets/3"), outer.get()));
    CFDictionarySetValue(inner.get(), CFSTR("Name"), CFSTR("later"));
    CFDictionarySetValue(outer.get(), CFSTR("Name"), CFSTR("later"));
    EXPECT_EQ(nameAt(session, "/Sets/3"), "-");
    EXPECT_EQ(nameAt(session, "/Sets/3/inner"), "-");
}

// Random edits; whatever was handed out and retained on the way stays as it was, in this session's tree and
// in those of others who share it.
TEST_F(TreeTest, WhatACallerHoldsNeverChanges) {
    std::mt19937 random(1);
    const auto pick = [&random](unsigned count) { return static_cast<unsigned>(random() % count); };
    const auto somePath = [&pick] {
        std::string path;
        for (unsigned depth = 1 + pick(4); depth > 0; --depth) {
            path += "/" + std::string(1, static_cast<char>('a' + pick(3)));
        }
        return path;
    };
    std::vector<std::pair<Owned<CFDictionaryRef>, std::string>> held;
    SessionRef other;
    std::string otherTree;
    ASSERT_TRUE(set(session, "/a/a/a", "start") && commit(session));
    for (int round = 0; round < 3000; ++round) {
        const std::string path = somePath();
        switch (pick(6)) {
            case 0:
                SCPreferencesPathRemoveValue(session.get(), text(path).get());
                break;
            case 1: {
                const auto value = Owned<CFDictionaryRef>::retained(
                    SCPreferencesPathGetValue(session.get(), text(path).get()));
                if (value && held.size() < 200) {
                    held.emplace_back(value, platform::values::descriptionOf(value.get()));
                }
                break;
            }
            default:
                set(session, path, std::to_string(round));
        }
        if (round == 1500) {
            ASSERT_TRUE(commit(session));
            other = open();
            otherTree = wholeTree();
        }
    }
    EXPECT_GT(held.size(), 50U);
    for (const auto& [value, description] : held) {
        EXPECT_EQ(platform::values::descriptionOf(value.get()), description);
    }
    EXPECT_EQ(platform::values::descriptionOf(SCPreferencesPathGetValue(other.get(), CFSTR("/"))), otherTree);
}

}  // namespace
}  // namespace preferences_test
