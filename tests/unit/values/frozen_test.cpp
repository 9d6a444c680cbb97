#include <gtest/gtest.h>

#include <vector>

#include "platform/values/Fields.h"
#include "tests/unit/support/Transcript.h"
#include "tests/unit/values/Values.h"

using namespace values_test;

namespace {

constexpr const char* tree = "{Sets = {0 = {Name = a}; 1 = {Name = b}}; CurrentSet = /Sets/0}";

CFDictionaryRef childOf(CFDictionaryRef parent, CFStringRef key) {
    return as<CFDictionaryRef>(CFDictionaryGetValue(parent, key));
}

TEST(Frozen, IsARetainOfWhatNobodyCanChangeAndBoundsTheDepth) {
    const auto deepest = nestedArrays(deepestPropertyList);
    EXPECT_EQ(frozen(deepest.get()).get(), deepest.get());
    EXPECT_FALSE(frozen(nestedArrays(deepestPropertyList + 1).get()));
    EXPECT_TRUE(frozen(nestedArrays(12).get(), deepestPropertyList - 12));
    EXPECT_FALSE(frozen(nestedArrays(12).get(), deepestPropertyList - 11));
}

TEST(Frozen, FindsTheMutablePartHoweverDeepAndSharesTheRest) {
    const auto first = frozen(read(tree).get());
    const auto name = Owned<CFMutableStringRef>::adopt(CFStringCreateMutableCopy(nullptr, 0, CFSTR("c")));
    CFTypeRef item = name.get();
    const auto holder = Owned<CFArrayRef>::adopt(CFArrayCreate(nullptr, &item, 1, &kCFTypeArrayCallBacks));
    const auto root = Owned<CFMutableDictionaryRef>::adopt(
        CFDictionaryCreateMutableCopy(nullptr, 0, as<CFDictionaryRef>(first.get())));
    const auto same = frozen(root.get());
    CFDictionarySetValue(root.get(), CFSTR("New"), holder.get());
    EXPECT_EQ(show(same.get()), tree);
    const auto copy = frozen(root.get());
    CFStringReplace(name.get(), CFRangeMake(0, 1), CFSTR("changed"));
    CFDictionaryRemoveValue(root.get(), CFSTR("Sets"));
    EXPECT_EQ(show(copy.get()), std::string(tree).replace(std::string(tree).size() - 1, 1, "; New = (c)}"));
    EXPECT_EQ(childOf(as<CFDictionaryRef>(copy.get()), CFSTR("Sets")),
              childOf(as<CFDictionaryRef>(first.get()), CFSTR("Sets")));
    EXPECT_EQ(frozen(copy.get()).get(), copy.get());
}

TEST(Frozen, RefusesWhatIsNoPropertyList) {
    const auto dictionary = mutableDictionary();
    CFDictionarySetValue(dictionary.get(), makeNumber(1).get(), CFSTR("key is no string"));
    EXPECT_FALSE(frozen(dictionary.get()));
    EXPECT_FALSE(writePropertyListXML(dictionary.get()));
    const auto array = arrayOf("()");
    CFArrayAppendValue(
        array.get(),
        Owned<CFURLRef>::adopt(CFURLCreateWithString(nullptr, CFSTR("http://a/"), nullptr)).get());
    EXPECT_FALSE(frozen(array.get()));
    EXPECT_FALSE(writePropertyListXML(array.get()));
}

TEST(Frozen, DeepMutableCopyIsApartThroughout) {
    const auto original = frozen(read(tree).get());
    const auto copy = Owned<CFDictionaryRef>::adopt(static_cast<CFDictionaryRef>(
        CFPropertyListCreateDeepCopy(nullptr, original.get(), kCFPropertyListMutableContainersAndLeaves)));
    auto* const sets = const_cast<CFMutableDictionaryRef>(childOf(copy.get(), CFSTR("Sets")));
    const void* const name = CFDictionaryGetValue(childOf(sets, CFSTR("0")), CFSTR("Name"));
    CFStringReplace(const_cast<CFMutableStringRef>(as<CFStringRef>(name)), CFRangeMake(0, 1),
                    CFSTR("changed"));
    CFDictionaryRemoveValue(sets, CFSTR("1"));
    EXPECT_EQ(show(copy.get()), "{Sets = {0 = {Name = changed}}; CurrentSet = /Sets/0}");
    const auto kept = Owned<CFTypeRef>::adopt(
        CFPropertyListCreateDeepCopy(nullptr, original.get(), kCFPropertyListImmutable));
    EXPECT_EQ(kept.get(), original.get()) << "what cannot change needs no second one";
    EXPECT_EQ(show(original.get()), tree);
}

TEST(Editing, WritesInPlaceWhatNobodyElseHolds) {
    auto root = Owned<CFDictionaryRef>::adopt(as<CFDictionaryRef>(frozen(read(tree).get()).take()));
    const CFDictionaryRef handle = root.get();
    const CFDictionaryRef sets = childOf(handle, CFSTR("Sets"));
    const CFDictionaryRef set = childOf(sets, CFSTR("1"));
    const auto rename = [&](std::string_view name) {
        setAtPath(root, std::vector{str("Sets"), str("1"), str("Name")}, str(name).get());
    };
    rename("new");
    EXPECT_EQ(root.get(), handle);
    EXPECT_EQ(childOf(sets, CFSTR("1")), set);
    const auto held = Owned<CFDictionaryRef>::retained(set);
    rename("newer");
    EXPECT_EQ(show(held.get()), "{Name = new}");
    const auto whole = Owned<CFDictionaryRef>::retained(root.get());
    removeAtPath(root, std::vector{str("Sets"), str("0")});
    setAtPath(root, std::vector{str("a"), str("b"), str("c")}, kCFBooleanTrue);
    EXPECT_EQ(show(root.get()), "{Sets = {1 = {Name = newer}}; CurrentSet = /Sets/0; a = {b = {c = #true}}}");
    EXPECT_EQ(frozen(root.get()).get(), root.get()) << "nobody else can change it";
}

struct Kept {
    enum class Kind { one, two, last = two };
    bool flag = true;
    Kind kind = Kind::two;
    std::uint8_t small = 255;
    std::string text = "\xFF";
    std::array<std::uint8_t, 2> address{1, 2};
    std::vector<std::string> list{"a", "b"};
    std::optional<std::string> absent;
    template <class Self, class Fields>
    static void listFields(Self& self, Fields& fields) {
        fields("Flag", self.flag);
        fields("Kind", self.kind);
        fields("Small", self.small);
        fields("Text", self.text);
        fields("Address", self.address);
        fields("List", self.list);
        fields("Absent", self.absent);
    }
};

TEST(Fields, ReadBackWhatTheyWroteAndNothingElse) {
    EXPECT_EQ(show(toPropertyList(Kept()).get()),
              "{Flag = #true; Kind = #1; Small = #255; Text = <ff>; Address = <0102>; List = (a, b)}");
    testing_support::Transcript transcript("fields");
    transcript.replay("trees", [](const testing_support::Transcript::Inputs& inputs) {
        Kept kept{false, Kept::Kind::one, 0, "as it was", {}, {}, "there"};
        const bool isRead = fromPropertyList(mutableDictionary(inputs[0]).get(), kept);
        return (isRead ? "" : "refused, still ") + show(toPropertyList(kept).get());
    });
}

}  // namespace
