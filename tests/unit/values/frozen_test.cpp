#include <gtest/gtest.h>

#include <vector>

#include "tests/unit/values/Values.h"

using namespace values_test;

namespace {

constexpr const char* treeText =
    "<dict>"
    "<key>Sets</key><dict><key>0</key><dict><key>Name</key><string>a</string></dict>"
    "<key>1</key><dict><key>Name</key><string>b</string></dict></dict>"
    "<key>CurrentSet</key><string>/Sets/0</string>"
    "</dict>";

CFDictionaryRef childOf(CFDictionaryRef parent, CFStringRef key) {
    return as<CFDictionaryRef>(CFDictionaryGetValue(parent, key));
}

TEST(Frozen, IsARetainOfWhatNobodyCanChange) {
    const auto tree = parsed(treeText);
    EXPECT_EQ(frozen(tree.get()).get(), tree.get());
    const auto built = nestedArrays(deepestPropertyList);
    EXPECT_EQ(frozen(built.get()).get(), built.get());
    EXPECT_FALSE(frozen(nestedArrays(deepestPropertyList + 1).get()));
    EXPECT_TRUE(frozen(nestedArrays(12).get(), deepestPropertyList - 12));
    EXPECT_FALSE(frozen(nestedArrays(12).get(), deepestPropertyList - 11));
}

TEST(Frozen, FindsTheMutablePartHoweverDeepAndSharesTheRest) {
    const auto tree = parsedAs<CFDictionaryRef>(treeText);
    const auto name = Owned<CFMutableStringRef>::adopt(CFStringCreateMutableCopy(nullptr, 0, CFSTR("c")));
    CFTypeRef item = name.get();
    const auto holder = Owned<CFArrayRef>::adopt(CFArrayCreate(nullptr, &item, 1, &kCFTypeArrayCallBacks));
    const auto root =
        Owned<CFMutableDictionaryRef>::adopt(CFDictionaryCreateMutableCopy(nullptr, 0, tree.get()));
    CFDictionarySetValue(root.get(), CFSTR("New"), holder.get());

    const auto copy = frozen(root.get());
    const auto* const dictionary = as<CFDictionaryRef>(copy.get());
    ASSERT_NE(dictionary, nullptr);
    EXPECT_TRUE(CFEqual(copy.get(), root.get()));
    EXPECT_EQ(childOf(dictionary, CFSTR("Sets")), childOf(tree.get(), CFSTR("Sets")));
    CFStringReplace(name.get(), CFRangeMake(0, 1), CFSTR("changed"));
    CFDictionaryRemoveValue(root.get(), CFSTR("Sets"));
    EXPECT_EQ(descriptionOf(copy.get()),
              "{Sets = {0 = {Name = a}; 1 = {Name = b}}; CurrentSet = /Sets/0; New = (c)}");
    EXPECT_EQ(frozen(copy.get()).get(), copy.get());
}

TEST(Frozen, RefusesWhatIsNoPropertyList) {
    const auto dictionary = mutableDictionary();
    CFDictionarySetValue(dictionary.get(), makeNumber(1).get(), CFSTR("key is no string"));
    EXPECT_FALSE(frozen(dictionary.get()));
    const auto array = mutableArray();
    const auto url =
        Owned<CFURLRef>::adopt(CFURLCreateWithString(nullptr, CFSTR("http://192.0.0.192/"), nullptr));
    CFArrayAppendValue(array.get(), url.get());
    EXPECT_FALSE(frozen(array.get()));
}

TEST(Frozen, DeepMutableCopyIsApartThroughout) {
    const auto tree = parsedAs<CFDictionaryRef>(treeText);
    const auto copy = Owned<CFDictionaryRef>::adopt(static_cast<CFDictionaryRef>(
        CFPropertyListCreateDeepCopy(nullptr, tree.get(), kCFPropertyListMutableContainersAndLeaves)));
    auto* const sets = const_cast<CFMutableDictionaryRef>(childOf(copy.get(), CFSTR("Sets")));
    auto* const set = const_cast<CFMutableDictionaryRef>(childOf(sets, CFSTR("0")));
    auto* const name =
        const_cast<CFMutableStringRef>(as<CFStringRef>(CFDictionaryGetValue(set, CFSTR("Name"))));
    CFStringReplace(name, CFRangeMake(0, 1), CFSTR("changed"));
    CFDictionaryRemoveValue(sets, CFSTR("1"));
    EXPECT_EQ(descriptionOf(copy.get()), "{Sets = {0 = {Name = changed}}; CurrentSet = /Sets/0}");
    EXPECT_TRUE(CFEqual(tree.get(), parsed(treeText).get()));
}

void setName(Owned<CFDictionaryRef>& root, std::string_view set, std::string_view name) {
    setAtPath(root, std::vector{str("Sets"), str(set), str("Name")}, str(name).get());
}

TEST(Editing, WritesInPlaceWhatNobodyElseHolds) {
    auto root = parsedAs<CFDictionaryRef>(treeText);
    const CFDictionaryRef handle = root.get();
    const CFDictionaryRef sets = childOf(handle, CFSTR("Sets"));
    const CFDictionaryRef set = childOf(sets, CFSTR("1"));
    setName(root, "1", "new");
    EXPECT_EQ(root.get(), handle);
    EXPECT_EQ(childOf(sets, CFSTR("1")), set);
    removeAtPath(root, std::vector{str("Sets"), str("0")});
    setAtPath(root, std::vector{str("a"), str("b"), str("c")}, kCFBooleanTrue);
    EXPECT_EQ(descriptionOf(root.get()),
              "{Sets = {1 = {Name = new}}; CurrentSet = /Sets/0; a = {b = {c = true}}}");
}

}  // namespace
