#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "morecfq/MoreCFQ.h"
#include "tests/unit/support/Notation.h"

namespace {

using testing_support::read;
using testing_support::show;
using testing_support::Value;

CFDictionaryRef dictionary(const Value& value) {
    return static_cast<CFDictionaryRef>(value.get());
}
CFArrayRef array(const Value& value) {
    return static_cast<CFArrayRef>(value.get());
}

TEST(Creation, ArraysOfADictionaryCorrespondAndMakeItAgain) {
    for (const char* text : {"{}", "{b = x; a = #2; c = (1, 2)}"}) {
        const Value from = read(text);
        CFArrayRef keys = nullptr;
        CFArrayRef values = nullptr;
        CFDictionaryRef again = nullptr;
        EXPECT_EQ(0, CFQArrayCreateWithDictionaryKeys(dictionary(from), &keys));
        EXPECT_EQ(0, CFQArrayCreateWithDictionaryValues(dictionary(from), &values));
        EXPECT_EQ(0, CFQDictionaryCreateWithArrayOfKeysAndValues(keys, values, &again));
        EXPECT_EQ(text, show(again));
        EXPECT_EQ(CFDictionaryGetCount(dictionary(from)), CFArrayGetCount(keys));
        CFQRelease(again);
        again = nullptr;
        EXPECT_EQ(-50,
                  CFQDictionaryCreateWithArrayOfKeysAndValues(keys, array(read("(1, 2, 3, 4)")), &again));
        EXPECT_EQ(nullptr, again);
        CFQRelease(keys);
        CFQRelease(values);
    }
}

TEST(Creation, NumbersReplaceAndBelongToTheDictionaryAlone) {
    const Value made = read("{n = old}");
    auto* dict = CFDictionaryCreateMutableCopy(nullptr, 0, dictionary(made));
    EXPECT_EQ(0, CFQDictionarySetNumber(dict, CFSTR("n"), -2147483647 - 1));
    EXPECT_EQ("{n = #-2147483648}", show(dict));
    EXPECT_EQ(1, CFGetRetainCount(CFDictionaryGetValue(dict, CFSTR("n"))));
    EXPECT_EQ("{n = old}", show(made.get()));
    CFRelease(dict);
}

struct PathCase {
    const char* tree;
    const char* path;
    OSStatus get;
    OSStatus set;
    OSStatus remove;
    const char* afterSet;
};

class PathTest : public testing::TestWithParam<PathCase> {};

// Every case by the vector and by the array, on dictionaries that somebody else holds as well.
TEST_P(PathTest, GetSetRemove) {
    const PathCase& row = GetParam();
    const Value path = read(row.path);
    const CFIndex count = CFArrayGetCount(array(path));
    std::vector<CFTypeRef> vector(static_cast<std::size_t>(count));
    CFArrayGetValues(array(path), CFRangeMake(0, count), vector.data());
    for (const bool byArray : {false, true}) {
        const Value original = read(row.tree);
        const auto copy = [&] { return CFDictionaryCreateMutableCopy(nullptr, 0, dictionary(original)); };
        CFTypeRef found = CFSTR("untouched");

        EXPECT_EQ(row.get,
                  byArray ? CFQDictionaryGetValueAtPathArray(dictionary(original), array(path), &found)
                          : CFQDictionaryGetValueAtPath(dictionary(original), vector.data(), count, &found));
        EXPECT_EQ(row.get == 0, !CFEqual(found, CFSTR("untouched")));

        auto* dict = copy();
        EXPECT_EQ(row.set, byArray ? CFQDictionarySetValueAtPathArray(dict, array(path), CFSTR("new"))
                                   : CFQDictionarySetValueAtPath(dict, vector.data(), count, CFSTR("new")));
        EXPECT_EQ(row.afterSet, show(dict));
        CFRelease(dict);

        dict = copy();
        EXPECT_EQ(row.remove, byArray ? CFQDictionaryRemoveValueAtPathArray(dict, array(path))
                                      : CFQDictionaryRemoveValueAtPath(dict, vector.data(), count));
        if (row.remove == 0) {
            EXPECT_EQ(kCFQPathKeyMissingErr, CFQDictionaryGetValueAtPathArray(dict, array(path), &found));
        } else {
            EXPECT_EQ(row.tree, show(dict));
        }
        CFRelease(dict);
        EXPECT_EQ(row.tree, show(original.get()));
    }
}

INSTANTIATE_TEST_SUITE_P(
    Paths, PathTest,
    testing::Values(PathCase{"{a = x}", "(a)", 0, 0, 0, "{a = new}"},
                    PathCase{"{a = {b = x}}", "(a)", 0, 0, 0, "{a = new}"},
                    PathCase{"{}", "(a)", 5400, 0, 5400, "{a = new}"},
                    PathCase{"{}", "(a, b)", 5400, 5400, 5400, "{}"},
                    PathCase{"{a = x}", "(a, b)", 5401, 5401, 5401, "{a = x}"},
                    PathCase{"{a = (b)}", "(a, b)", 5401, 5401, 5401, "{a = (b)}"},
                    PathCase{"{a = {}}", "(a, b)", 5400, 0, 5400, "{a = {b = new}}"},
                    PathCase{"{a = {b = x; c = y}}", "(a, b)", 0, 0, 0, "{a = {b = new; c = y}}"},
                    PathCase{"{a = {b = {d = x}}}", "(a, b, c)", 5400, 0, 5400,
                             "{a = {b = {d = x; c = new}}}"},
                    PathCase{"{a = {b = x}}", "(a, b, c)", 5401, 5401, 5401, "{a = {b = x}}"}));

TEST(Paths, EveryLevelIsReplacedEvenBeforeAFailure) {
    const Value tree = read("{a = {b = {}; s = x}}");
    auto* dict = CFDictionaryCreateMutableCopy(nullptr, 0, dictionary(tree));
    const void* const before = CFDictionaryGetValue(dict, CFSTR("a"));
    const void* intoNothing[] = {CFSTR("a"), CFSTR("b"), CFSTR("none")};
    EXPECT_EQ(kCFQPathKeyMissingErr, CFQDictionaryRemoveValueAtPath(dict, intoNothing, 3));
    const void* const after = CFDictionaryGetValue(dict, CFSTR("a"));
    EXPECT_NE(before, after);
    // It is mutable now, and is replaced all the same.
    const Value held = Value::retained(after);
    const void* inner[] = {CFSTR("a"), CFSTR("s")};
    EXPECT_EQ(0, CFQDictionarySetValueAtPath(dict, inner, 2, CFSTR("y")));
    EXPECT_NE(after, CFDictionaryGetValue(dict, CFSTR("a")));
    EXPECT_EQ("{b = {}; s = x}", show(held.get()));
    EXPECT_EQ(1, CFGetRetainCount(CFDictionaryGetValue(dict, CFSTR("a"))));
    CFRelease(dict);
}

TEST(Paths, ADictionaryCanBePutIntoItsOwnCopy) {
    auto* dict = CFDictionaryCreateMutable(nullptr, 0, &kCFTypeDictionaryKeyCallBacks,
                                           &kCFTypeDictionaryValueCallBacks);
    CFDictionarySetValue(dict, CFSTR("a"), read("{b = x}").get());
    const void* path[] = {CFSTR("a"), CFSTR("b")};
    // Nobody but the tree holds the value, which the walk takes out of it.
    EXPECT_EQ(0, CFQDictionarySetValueAtPath(dict, path, 2, CFDictionaryGetValue(dict, CFSTR("a"))));
    EXPECT_EQ("{a = {b = {b = x}}}", show(dict));
    CFRelease(dict);
}

TEST(Paths, NullOnTheWayIsNoDictionary) {
    CFTypeRef none = nullptr;
    EXPECT_EQ(-50, CFQDictionaryGetValueAtPathArray(dictionary(read("{}")), array(read("()")), &none));
    auto* dict = CFDictionaryCreateMutable(nullptr, 0, &kCFTypeDictionaryKeyCallBacks, nullptr);
    CFDictionarySetValue(dict, CFSTR("a"), nullptr);
    const void* path[] = {CFSTR("a"), CFSTR("b")};
    CFTypeRef found = CFSTR("untouched");
    EXPECT_EQ(kCFQPathNotDictionaryErr, CFQDictionaryGetValueAtPath(dict, path, 2, &found));
    EXPECT_EQ(0, CFQDictionaryGetValueAtPath(dict, path, 1, &found));
    EXPECT_EQ(nullptr, found);
    CFRelease(dict);
}

TEST(Walks, DeepGoesInOrderAndShallowOneLevel) {
    const auto deep = [](CFTypeRef node, void* context) {
        *static_cast<std::string*>(context) += show(node) + " ";
    };
    const auto shallow = [](CFTypeRef key, CFTypeRef node, void* context) {
        *static_cast<std::string*>(context) += show(key) + ":" + show(node) + " ";
    };
    const struct {
        const char* value;
        const char* deep;
        const char* shallow;
        bool isLeaf;
    } rows[] = {
        {"{k = (s, {n = #1})}", "{k = (s, {n = #1})} (s, {n = #1}) s {n = #1} #1 ", "k:(s, {n = #1}) ",
         false},
        {"(x, (y), #true)", "(x, (y), #true) x (y) y #true ", "#0:x #1:(y) #2:#true ", false},
        {"{b = x; a = y}", "{b = x; a = y} x y ", "b:x a:y ", false},
        {"{}", "{} ", "", false},
        {"()", "() ", "", false},
        {"text", "text ", "", true},
        {"#7", "#7 ", "", true},
    };
    for (const auto& row : rows) {
        const Value value = read(row.value);
        std::string seen;
        CFQPropertyListDeepApplyFunction(value.get(), deep, &seen);
        EXPECT_EQ(row.deep, seen);
        seen.clear();
        CFQPropertyListShallowApplyFunction(value.get(), shallow, &seen);
        EXPECT_EQ(row.shallow, seen);
        EXPECT_EQ(row.isLeaf, CFQPropertyListIsLeaf(value.get()) != 0) << row.value;
    }
}

struct Emptied {
    CFMutableDictionaryRef dict;
    CFMutableArrayRef array;
    std::string seen;
};

void emptyContainers(CFTypeRef node, void* context) {
    auto* emptied = static_cast<Emptied*>(context);
    if (!CFQPropertyListIsLeaf(node)) {
        return;
    }
    CFDictionaryRemoveValue(emptied->dict, CFSTR("a"));
    CFDictionaryRemoveValue(emptied->dict, CFSTR("b"));
    while (CFArrayGetCount(emptied->array) > 0) {
        CFArrayRemoveValueAtIndex(emptied->array, 0);
    }
    emptied->seen += show(node) + " ";
}

TEST(Walks, HoldOnToWhatTheFunctionTakesOut) {
    for (const int walk : {0, 1, 2, 3}) {
        Emptied emptied = {CFDictionaryCreateMutableCopy(nullptr, 0, dictionary(read("{a = x; b = y}"))),
                           CFArrayCreateMutableCopy(nullptr, 0, array(read("(x, y)"))), ""};
        CFTypeRef walked = walk < 2 ? static_cast<CFTypeRef>(emptied.dict) : emptied.array;
        if (walk % 2 == 0) {
            CFQPropertyListDeepApplyFunction(walked, emptyContainers, &emptied);
        } else {
            CFQPropertyListShallowApplyFunction(
                walked, [](CFTypeRef, CFTypeRef node, void* context) { emptyContainers(node, context); },
                &emptied);
        }
        EXPECT_EQ("x ", emptied.seen);
        CFRelease(emptied.dict);
        CFRelease(emptied.array);
    }
}

}  // namespace
