#include <gtest/gtest.h>

#include <algorithm>
#include <random>
#include <vector>

#include "tests/unit/values/Values.h"

using namespace values_test;

namespace {

constexpr auto text = descriptionOf;

TEST(Dictionary, KeepsOrderReferencesAndAnyKey) {
    const auto dictionary = mutableDictionary();
    const auto key = Owned<CFMutableStringRef>::adopt(CFStringCreateMutableCopy(nullptr, 0, CFSTR("b")));
    const auto value = makeNumber(1);
    CFDictionarySetValue(dictionary.get(), key.get(), value.get());
    CFStringReplace(key.get(), CFRangeMake(0, 1), CFSTR("other"));
    EXPECT_EQ(CFGetRetainCount(value.get()), 2);
    CFDictionarySetValue(dictionary.get(), CFSTR("a"), CFSTR("first"));
    CFDictionaryAddValue(dictionary.get(), CFSTR("a"), CFSTR("not taken"));
    CFDictionarySetValue(dictionary.get(), CFSTR("b"), CFSTR("replaced in place"));
    EXPECT_EQ(CFGetRetainCount(value.get()), 1);
    CFDictionarySetValue(dictionary.get(), value.get(), CFSTR("number"));
    EXPECT_EQ(text(CFDictionaryGetValue(dictionary.get(), makeReal(1).get())), "number");
    EXPECT_EQ(text(dictionary.get()), "{b = replaced in place; a = first; 1 = number}");
    CFDictionarySetValue(dictionary.get(), CFSTR("held"), value.get());
    {
        const auto copy =
            Owned<CFDictionaryRef>::adopt(CFDictionaryCreateMutableCopy(nullptr, 0, dictionary.get()));
        EXPECT_EQ(CFGetRetainCount(value.get()), 5) << "as a key and as a value of each";
    }
    CFDictionaryRemoveValue(dictionary.get(), CFSTR("held"));
    CFDictionaryRemoveValue(dictionary.get(), value.get());
    EXPECT_EQ(CFGetRetainCount(value.get()), 1);
    CFDictionaryRemoveValue(dictionary.get(), CFSTR("b"));
    CFDictionaryRemoveValue(dictionary.get(), CFSTR("absent"));
    CFDictionarySetValue(dictionary.get(), CFSTR("b"), CFSTR("last"));
    EXPECT_EQ(text(dictionary.get()), "{a = first; b = last}");
}

TEST(Dictionary, HoldsValuesThatItDoesNotLookAt) {
    int target = 0;
    const auto dictionary = Owned<CFMutableDictionaryRef>::adopt(
        CFDictionaryCreateMutable(nullptr, 0, &kCFTypeDictionaryKeyCallBacks, nullptr));
    CFDictionarySetValue(dictionary.get(), CFSTR("pointer"), &target);
    CFDictionarySetValue(dictionary.get(), CFSTR("null"), nullptr);
    const void* value = &value;
    EXPECT_TRUE(CFDictionaryGetValueIfPresent(dictionary.get(), CFSTR("null"), &value));
    EXPECT_EQ(value, nullptr);
    EXPECT_EQ(CFDictionaryGetValue(dictionary.get(), CFSTR("pointer")), &target);
    EXPECT_FALSE(writePropertyListXML(dictionary.get()).has_value());
    EXPECT_FALSE(frozen(dictionary.get()));
    EXPECT_EQ(text(dictionary.get()), "{pointer = ?; null = ?}");
    const auto other =
        Owned<CFMutableDictionaryRef>::adopt(CFDictionaryCreateMutableCopy(nullptr, 0, dictionary.get()));
    EXPECT_TRUE(CFEqual(other.get(), dictionary.get()));
    CFDictionarySetValue(other.get(), CFSTR("null"), &target);
    EXPECT_FALSE(CFEqual(other.get(), dictionary.get()));
}

// Against a model, through growth, index, holes and copies that must not see each other's changes.
TEST(Dictionary, BehavesAsAModelThroughRandomChanges) {
    std::mt19937 generator(4);
    const auto random = [&] { return static_cast<unsigned>(generator()); };
    for (const unsigned keyCount : {5U, 20U, 400U}) {
        auto dictionary = mutableDictionary();
        std::vector<unsigned> model;
        std::vector<std::pair<Owned<CFMutableDictionaryRef>, std::vector<unsigned>>> copies;
        for (int step = 0; step < 6000; ++step) {
            const unsigned key = random() % keyCount;
            const auto number = makeNumber(key);
            const auto place = std::ranges::find(model, key);
            if (random() % 100 < (step / 1000 % 2 == 0 ? 70U : 30U)) {
                CFDictionarySetValue(dictionary.get(), number.get(), number.get());
                if (place == model.end()) {
                    model.push_back(key);
                }
            } else {
                CFDictionaryRemoveValue(dictionary.get(), number.get());
                if (place != model.end()) {
                    model.erase(place);
                }
            }
            ASSERT_EQ(CFDictionaryGetCount(dictionary.get()), static_cast<CFIndex>(model.size()));
            const unsigned asked = random() % keyCount;
            ASSERT_EQ(CFDictionaryContainsKey(dictionary.get(), makeNumber(asked).get()) != 0,
                      std::ranges::find(model, asked) != model.end());
            if (step % 500 == 0) {
                copies.emplace_back(dictionary, model);
                dictionary = Owned<CFMutableDictionaryRef>::adopt(
                    CFDictionaryCreateMutableCopy(nullptr, 0, dictionary.get()));
            }
        }
        copies.emplace_back(dictionary, model);
        for (const auto& [copy, expected] : copies) {
            std::vector<unsigned> found;
            for (const Entry& entry : entriesOf(copy.get())) {
                found.push_back(static_cast<unsigned>(std::stoul(text(entry.key))));
            }
            EXPECT_EQ(found, expected);
        }
    }
}

TEST(Array, ChangesCopiesApartAndFindsByContent) {
    const auto array = arrayOf("(a, b, c, b)");
    const auto copy = Owned<CFMutableArrayRef>::adopt(CFArrayCreateMutableCopy(nullptr, 0, array.get()));
    const void* const removed = CFArrayGetValueAtIndex(array.get(), 1);
    CFArrayRemoveValueAtIndex(copy.get(), 1);
    EXPECT_EQ(CFGetRetainCount(removed), 1);
    CFArrayRemoveValueAtIndex(copy.get(), 3);
    CFArrayAppendValue(copy.get(), CFSTR("d"));
    EXPECT_EQ(text(array.get()), "(a, b, c, b)");
    EXPECT_EQ(text(copy.get()), "(a, c, b, d)");
    EXPECT_EQ(CFArrayGetFirstIndexOfValue(array.get(), CFRangeMake(2, 2), CFSTR("b")), 3);
    EXPECT_EQ(CFArrayGetFirstIndexOfValue(array.get(), CFRangeMake(2, 1), CFSTR("b")), kCFNotFound);
}

CFComparisonResult compareLengths(const void* lhs, const void* rhs, void* calls) {
    ++*static_cast<int*>(calls);
    const CFIndex left = CFStringGetLength(static_cast<CFStringRef>(lhs));
    const CFIndex right = CFStringGetLength(static_cast<CFStringRef>(rhs));
    return left < right ? kCFCompareLessThan : left > right ? kCFCompareGreaterThan : kCFCompareEqualTo;
}

TEST(Array, SortsStablyAndSearchesInARange) {
    const auto array = arrayOf("(zzzz, ccc, bb, aaa, dd, a, zz)");
    int calls = 0;
    CFArraySortValues(array.get(), CFRangeMake(1, 5), compareLengths, &calls);
    EXPECT_EQ(text(array.get()), "(zzzz, a, bb, dd, ccc, aaa, zz)");
    const auto search = [&](const char* wanted) {
        return CFArrayBSearchValues(array.get(), CFRangeMake(1, 5), str(wanted).get(), compareLengths,
                                    &calls);
    };
    EXPECT_EQ(search("xxx"), 4);
    EXPECT_EQ(search("xxxx"), 6);
    // A short range is sorted stably by whatever sorts it.
    const auto many = arrayOf("()");
    for (int i = 0; i < 90; ++i) {
        CFArrayAppendValue(many.get(), str(std::to_string(10 + i * 7 % 90)).get());
    }
    const std::string before = text(many.get());
    CFArraySortValues(many.get(), CFRangeMake(0, 90), compareLengths, &calls);
    EXPECT_EQ(text(many.get()), before);
}

TEST(Values, SurviveBeingNestedVeryDeep) {
    const auto deep = nestedArrays(100'000);
    const auto twin = nestedArrays(100'000);
    EXPECT_TRUE(CFEqual(deep.get(), twin.get()));
    EXPECT_FALSE(CFEqual(deep.get(), nestedArrays(99'999).get()));
    EXPECT_FALSE(frozen(deep.get()));
    EXPECT_EQ(CFPropertyListCreateDeepCopy(nullptr, deep.get(), kCFPropertyListMutableContainersAndLeaves),
              nullptr);
    EXPECT_FALSE(writePropertyListXML(deep.get()).has_value());
    EXPECT_NE(text(nestedArrays(deepestPropertyList).get()).find("innermost"), std::string::npos);
    EXPECT_EQ(text(nestedArrays(deepestPropertyList + 1).get()).find("innermost"), std::string::npos);
}

}  // namespace
