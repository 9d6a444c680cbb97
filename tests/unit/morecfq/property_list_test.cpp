#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "morecfq/MoreCFQ.h"
#include "tests/unit/support/Notation.h"
#include "tests/unit/support/Transcript.h"

namespace {

using testing_support::read;
using testing_support::show;
using testing_support::Value;

CFArrayRef array(const Value& value) {
    return static_cast<CFArrayRef>(value.get());
}
// A mutable dictionary that nobody else holds.
auto changeable(const char* text) {
    const Value made = read(text);
    return platform::values::Owned<CFMutableDictionaryRef>::adopt(
        CFDictionaryCreateMutableCopy(nullptr, 0, static_cast<CFDictionaryRef>(made.get())));
}

TEST(Creation, ArraysOfADictionaryCorrespondAndMakeItAgain) {
    for (const char* text : {"{}", "{b = x; a = #2; c = (1, 2)}"}) {
        const auto from = changeable(text);
        CFArrayRef keys = nullptr;
        CFArrayRef values = nullptr;
        CFDictionaryRef again = nullptr;
        EXPECT_EQ(0, CFQArrayCreateWithDictionaryKeys(from.get(), &keys));
        EXPECT_EQ(0, CFQArrayCreateWithDictionaryValues(from.get(), &values));
        EXPECT_EQ(-50,
                  CFQDictionaryCreateWithArrayOfKeysAndValues(keys, array(read("(1, 2, 3, 4)")), &again));
        EXPECT_EQ(nullptr, again);
        EXPECT_EQ(0, CFQDictionaryCreateWithArrayOfKeysAndValues(keys, values, &again));
        EXPECT_EQ(text, show(again));
        CFQRelease(again);
        CFQRelease(keys);
        CFQRelease(values);
    }
    const auto dict = changeable("{n = old}");
    EXPECT_EQ(0, CFQDictionarySetNumber(dict.get(), CFSTR("n"), -2147483647 - 1));
    EXPECT_EQ("{n = #-2147483648}", show(dict.get()));
    EXPECT_EQ(1, CFGetRetainCount(CFDictionaryGetValue(dict.get(), CFSTR("n"))));
}

// A tree and a path: what getting, setting and removing come to, by the vector and by the array.
std::string pathOutcome(const std::vector<std::string>& inputs) {
    const Value keys = read(inputs[1]);
    CFArrayRef path = array(keys);
    const CFIndex count = CFArrayGetCount(path);
    const CFTypeRef* vector = platform::values::itemsOf(path).data();
    std::string told[2];
    for (const bool byArray : {false, true}) {
        const auto original = changeable(inputs[0].c_str());
        CFTypeRef found = CFSTR("untouched");
        const OSStatus get = byArray ? CFQDictionaryGetValueAtPathArray(original.get(), path, &found)
                                     : CFQDictionaryGetValueAtPath(original.get(), vector, count, &found);
        told[byArray] = "get " + std::to_string(get) + " " + show(found);
        const auto tree = changeable(inputs[0].c_str());
        const OSStatus set = byArray ? CFQDictionarySetValueAtPathArray(tree.get(), path, CFSTR("new"))
                                     : CFQDictionarySetValueAtPath(tree.get(), vector, count, CFSTR("new"));
        told[byArray] += ", set " + std::to_string(set) + " " + show(tree.get());
        const auto rest = changeable(inputs[0].c_str());
        const OSStatus remove = byArray ? CFQDictionaryRemoveValueAtPathArray(rest.get(), path)
                                        : CFQDictionaryRemoveValueAtPath(rest.get(), vector, count);
        told[byArray] += ", remove " + std::to_string(remove) + " " + show(rest.get());
    }
    EXPECT_EQ(told[0], told[1]);
    return told[0];
}

// What the deep walk sees, and with its keys the shallow one.
std::string walkOutcome(const std::vector<std::string>& inputs) {
    const Value value = read(inputs[0]);
    std::string seen = CFQPropertyListIsLeaf(value.get()) != 0 ? "leaf: " : "";
    const auto deep = [](CFTypeRef node, void* context) {
        *static_cast<std::string*>(context) += show(node) + " ";
    };
    const auto shallow = [](CFTypeRef key, CFTypeRef node, void* context) {
        *static_cast<std::string*>(context) += " " + show(key) + ":" + show(node);
    };
    CFQPropertyListDeepApplyFunction(value.get(), deep, &seen);
    seen += "|";
    CFQPropertyListShallowApplyFunction(value.get(), shallow, &seen);
    return seen;
}

TEST(PropertyLists, HavePathsAndWalks) {
    testing_support::Transcript transcript("property_lists");
    transcript.replay("paths", pathOutcome);
    transcript.replay("walks", walkOutcome);
}

TEST(Paths, EveryLevelIsReplacedEvenBeforeAFailure) {
    const auto dict = changeable("{a = {b = {}; s = x}}");
    const void* const before = CFDictionaryGetValue(dict.get(), CFSTR("a"));
    const void* intoNothing[] = {CFSTR("a"), CFSTR("b"), CFSTR("none")};
    EXPECT_EQ(kCFQPathKeyMissingErr, CFQDictionaryRemoveValueAtPath(dict.get(), intoNothing, 3));
    // It is mutable now, and is replaced all the same.
    const Value held = Value::retained(CFDictionaryGetValue(dict.get(), CFSTR("a")));
    EXPECT_NE(before, held.get());
    const void* inner[] = {CFSTR("a"), CFSTR("s")};
    EXPECT_EQ(0, CFQDictionarySetValueAtPath(dict.get(), inner, 2, CFSTR("y")));
    EXPECT_EQ("{b = {}; s = x}", show(held.get()));
    EXPECT_EQ("{a = {b = {}; s = y}}", show(dict.get()));
    EXPECT_EQ(1, CFGetRetainCount(CFDictionaryGetValue(dict.get(), CFSTR("a"))));
    // Nobody but the tree holds the value, which the walk takes out of it.
    EXPECT_EQ(
        0, CFQDictionarySetValueAtPath(dict.get(), inner, 2, CFDictionaryGetValue(dict.get(), CFSTR("a"))));
    EXPECT_EQ("{a = {b = {}; s = {b = {}; s = y}}}", show(dict.get()));
}

TEST(Paths, NullOnTheWayIsNoDictionary) {
    CFTypeRef found = CFSTR("untouched");
    EXPECT_EQ(-50, CFQDictionaryGetValueAtPathArray(changeable("{}").get(), array(read("()")), &found));
    auto* dict = CFDictionaryCreateMutable(nullptr, 0, &kCFTypeDictionaryKeyCallBacks, nullptr);
    CFDictionarySetValue(dict, CFSTR("a"), nullptr);
    const void* path[] = {CFSTR("a"), CFSTR("b")};
    EXPECT_EQ(kCFQPathNotDictionaryErr, CFQDictionaryGetValueAtPath(dict, path, 2, &found));
    EXPECT_EQ(0, CFQDictionaryGetValueAtPath(dict, path, 1, &found));
    EXPECT_EQ(nullptr, found);
    CFRelease(dict);
}

struct Emptied {
    CFMutableDictionaryRef dict;
    CFMutableArrayRef array;
    std::string seen;
};

void emptyContainers(CFTypeRef, CFTypeRef node, void* context) {
    auto* emptied = static_cast<Emptied*>(context);
    if (CFQPropertyListIsLeaf(node)) {
        CFDictionaryRemoveValue(emptied->dict, CFSTR("a"));
        CFDictionaryRemoveValue(emptied->dict, CFSTR("b"));
        while (CFArrayGetCount(emptied->array) > 0) {
            CFArrayRemoveValueAtIndex(emptied->array, 0);
        }
        emptied->seen += show(node) + " ";
    }
}

TEST(Walks, HoldOnToWhatTheFunctionTakesOut) {
    const auto deep = [](CFTypeRef node, void* context) { emptyContainers(nullptr, node, context); };
    for (const int walk : {0, 1, 2, 3}) {
        const auto dict = changeable("{a = x; b = y}");
        Emptied emptied = {dict.get(), CFArrayCreateMutableCopy(nullptr, 0, array(read("(x, y)"))), ""};
        CFTypeRef walked = walk < 2 ? static_cast<CFTypeRef>(emptied.dict) : emptied.array;
        walk % 2 == 0 ? CFQPropertyListDeepApplyFunction(walked, deep, &emptied)
                      : CFQPropertyListShallowApplyFunction(walked, emptyContainers, &emptied);
        EXPECT_EQ("x ", emptied.seen);
        CFRelease(emptied.array);
    }
}

}  // namespace
