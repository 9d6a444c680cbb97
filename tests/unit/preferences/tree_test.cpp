#include <random>

#include "platform/values/PropertyListXML.h"
#include "tests/unit/preferences/Fixture.h"
#include "tests/unit/support/Transcript.h"

namespace preferences_test {
namespace {

class TreeTest : public StoreTest {
  protected:
    TreeTest() {
        writeStore(*platform::values::writePropertyListXML(
            read("{CurrentSet = /Sets/1; Sets = {1 = {Name = one}; 2 = text}; Link = {__LINK__ = /Sets/1}; "
                 "BadLink = {__LINK__ = #1}}")
                .get()));
        session = open();
    }

    SessionRef session;
};

TEST_F(TreeTest, PathsThatLeadNowhereSayWhyAndChangeNothing) {
    testing_support::Transcript transcript("paths");
    transcript.replay("what a path leads to", [this](const std::vector<std::string>& inputs) {
        const auto path = text(inputs[0]);
        session = open();
        const std::string before = shown(session);
        std::string told = "get " + show(SCPreferencesPathGetValue(session.get(), path.get()));
        told += " " + std::to_string(SCError());
        told += ", link " + show(SCPreferencesPathGetLink(session.get(), path.get()));
        told += " " + std::to_string(SCError());
        for (const char* change : {", set ", ", remove "}) {
            session = open();
            const bool done = change == std::string(", set ")
                                  ? set(session, inputs[0], "new")
                                  : SCPreferencesPathRemoveValue(session.get(), path.get()) != 0;
            EXPECT_EQ(done, SCError() == 0);
            told += change + std::to_string(SCError());
            told += shown(session) != before ? " " + shown(session) : "";
        }
        return told;
    });
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
    std::string deep = "{}";
    for (int levels = 1; levels <= 512; ++levels) {
        const auto value = read(deep);
        deep = "{a = " + deep + "}";
        if (levels < 510) {
            continue;
        }
        const auto* const dictionary = as<CFDictionaryRef>(value.get());
        EXPECT_EQ(SCPreferencesPathSetValue(session.get(), CFSTR("/New/deep"), dictionary), levels < 511);
        EXPECT_EQ(SCError(), levels < 511 ? 0 : 1002);
        EXPECT_EQ(SCPreferencesSetValue(session.get(), CFSTR("deep"), dictionary), levels < 512);
    }
    EXPECT_TRUE(commit(session));
    writeStore(contentOf(file));
    EXPECT_TRUE(open());
}

TEST_F(TreeTest, StoresValuesAsTheyAreNow) {
    const auto value = read("{inner = {}}");
    const auto* const outer = as<CFDictionaryRef>(value.get());
    const void* inner = CFDictionaryGetValue(outer, CFSTR("inner"));
    ASSERT_TRUE(SCPreferencesPathSetValue(session.get(), CFSTR("/Sets/3"), outer));
    for (const void* changed : {inner, value.get()}) {
        CFDictionarySetValue(const_cast<CFMutableDictionaryRef>(as<CFDictionaryRef>(changed)), CFSTR("Name"),
                             CFSTR("later"));
    }
    EXPECT_EQ(shown(session, "/Sets/3"), "{inner = {}}");
}

// Random edits; whatever was handed out and retained on the way stays as it was, in this session's tree and
// in those of others who share it.
TEST_F(TreeTest, WhatACallerHoldsNeverChanges) {
    std::mt19937 random(1);
    const auto pick = [&random](unsigned count) { return static_cast<unsigned>(random() % count); };
    std::vector<std::pair<Owned<CFDictionaryRef>, std::string>> held;
    SessionRef other;
    std::string otherTree;
    ASSERT_TRUE(set(session, "/a/a/a", "start") && commit(session));
    for (int round = 0; round < 3000; ++round) {
        std::string path;
        for (unsigned depth = 1 + pick(4); depth > 0; --depth) {
            path += "/" + std::string(1, static_cast<char>('a' + pick(3)));
        }
        const unsigned action = pick(6);
        if (action == 0) {
            SCPreferencesPathRemoveValue(session.get(), text(path).get());
        } else if (action > 1) {
            set(session, path, std::to_string(round));
        } else if (CFDictionaryRef const value = SCPreferencesPathGetValue(session.get(), text(path).get())) {
            held.emplace_back(Owned<CFDictionaryRef>::retained(value), show(value));
        }
        if (round == 1500) {
            ASSERT_TRUE(commit(session));
            other = open();
            otherTree = shown(session);
        }
    }
    EXPECT_GT(held.size(), 50U);
    for (const auto& [value, description] : held) {
        EXPECT_EQ(show(value.get()), description);
    }
    EXPECT_EQ(shown(other), otherTree);
}

}  // namespace
}  // namespace preferences_test
