#include <gtest/gtest.h>

#include <fstream>
#include <iterator>

#include "tests/unit/values/Values.h"

using namespace values_test;

namespace {

Owned<CFPropertyListRef> parse(std::string_view text) {
    ParseError error;
    return parsePropertyListXML(text, error);
}

TEST(PropertyListXML, WritesWhatItReadAndRefusesEveryPartOfIt) {
    std::ifstream file(LA_GOLDEN "/document.plist", std::ios::binary);
    const std::string document(std::istreambuf_iterator<char>(file), {});
    const auto value = parse(document);
    ASSERT_TRUE(value);
    EXPECT_EQ(writePropertyListXML(value.get()), document);
    const auto copy = Owned<CFPropertyListRef>::adopt(
        CFPropertyListCreateDeepCopy(nullptr, value.get(), kCFPropertyListMutableContainersAndLeaves));
    EXPECT_EQ(writePropertyListXML(copy.get()), document);
    for (std::size_t size = 0; size < document.size() - 1; ++size) {
        ASSERT_FALSE(parse(std::string_view(document).substr(0, size))) << size;
    }
}

TEST(PropertyListXML, BoundsTheDepth) {
    const auto nested = [](std::size_t levels, const std::string& open, const std::string& close) {
        std::string text;
        for (std::size_t i = 0; i < levels; ++i) {
            text.insert(0, open).append(close);
        }
        return parsed(text);
    };
    const auto deepest = nested(deepestPropertyList, "<array>", "</array>");
    ASSERT_TRUE(deepest);
    EXPECT_TRUE(CFEqual(parse(writePropertyListXML(deepest.get()).value_or("")).get(), deepest.get()));
    for (const std::size_t levels : {deepestPropertyList + 1UL, 20'000UL}) {
        EXPECT_FALSE(nested(levels, "<array>", "</array>"));
        EXPECT_FALSE(nested(levels, "<dict><key>k</key>", "</dict>"));
        EXPECT_FALSE(nested(levels, "<x>", "</x>"));
    }
}

TEST(PropertyListXML, WritesNothingThatItCannotReadBack) {
    EXPECT_FALSE(writePropertyListXML(nestedArrays(deepestPropertyList + 1).get()));
    EXPECT_FALSE(writePropertyListXML(makeDate(253'402'300'800).get()));
    EXPECT_FALSE(writePropertyListXML(makeDate(-62'167'219'201).get()));
}

}  // namespace
