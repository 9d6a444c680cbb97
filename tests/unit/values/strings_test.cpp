#include <gtest/gtest.h>

#include <vector>

#include "tests/unit/values/Values.h"

using namespace values_test;
using namespace std::string_literals;

namespace {

// One character each of one, two, three and four bytes; the last is two units.
const std::string mixed = "a\xC3\xA4\xE2\x82\xAC\xF0\x9F\x98\x80z";

Owned<CFStringRef> decoded(const std::string& bytes, CFStringEncoding encoding) {
    return Owned<CFStringRef>::adopt(
        CFStringCreateWithBytes(nullptr, reinterpret_cast<const UInt8*>(bytes.data()),
                                static_cast<CFIndex>(bytes.size()), encoding, 0));
}

TEST(String, TakesOnlyTextOfItsEncoding) {
    EXPECT_EQ(textOf(decoded("nul\0inside"s, kCFStringEncodingUTF8).get()), "nul\0inside"s);
    EXPECT_EQ(textOf(decoded(mixed, kCFStringEncodingUTF8).get()), mixed);
    EXPECT_TRUE(decoded("\xEF\xBF\xBF\xF4\x8F\xBF\xBF", kCFStringEncodingUTF8));
    for (const char* bad :
         {"\x80", "a\xC3", "\xC0\xAF", "\xC3\x28", "\xE2\x82", "\xE0\x9F\xBF", "\xED\xA0\x80",
          "\xF0\x8F\xBF\xBF", "\xF4\x90\x80\x80", "\xF5\x80\x80\x80", "\xF0\x9F\x98\x28"}) {
        EXPECT_FALSE(decoded(bad, kCFStringEncodingUTF8)) << bad;
    }
    EXPECT_FALSE(decoded(mixed, kCFStringEncodingASCII));
    EXPECT_EQ(textOf(decoded("SLOT-\x8A\xA5\xF0\xDB", kCFStringEncodingMacRoman).get()),
              "SLOT-\xC3\xA4\xE2\x80\xA2\xEF\xA3\xBF\xE2\x82\xAC");
}

TEST(String, FitsOrDoesNotFitABuffer) {
    char buffer[16] = {};
    EXPECT_TRUE(CFStringGetCString(CFSTR("12345"), buffer, 6, kCFStringEncodingASCII));
    EXPECT_FALSE(CFStringGetCString(CFSTR("12345"), buffer, 5, kCFStringEncodingASCII));
    EXPECT_FALSE(CFStringGetCString(str("\xC3\xA4").get(), buffer, 16, kCFStringEncodingASCII));
    EXPECT_FALSE(CFStringGetCString(str("\xC3\xA4").get(), buffer, 2, kCFStringEncodingUTF8));
    EXPECT_EQ(CFStringGetCStringPtr(str(mixed).get(), kCFStringEncodingASCII), nullptr);
}

TEST(String, CountsInUnits) {
    const auto string = str(mixed);
    ASSERT_EQ(CFStringGetLength(string.get()), 6);
    std::vector<UniChar> units(6);
    CFStringGetCharacters(string.get(), CFRangeMake(0, 6), units.data());
    EXPECT_EQ(units, (std::vector<UniChar>{'a', 0xE4, 0x20AC, 0xD83D, 0xDE00, 'z'}));
    const auto back = Owned<CFStringRef>::adopt(CFStringCreateWithCharacters(nullptr, units.data(), 6));
    EXPECT_TRUE(CFEqual(back.get(), string.get()));
    for (const auto& unpaired :
         {std::vector<UniChar>{0xD83D, 'a'}, {'a', 0xD83D}, {0xDE00, 0xD83D}, {0xDE00, 0xDE00}}) {
        EXPECT_EQ(CFStringCreateWithCharacters(nullptr, unpaired.data(), 2), nullptr);
    }
    const auto part = [&](CFIndex location, CFIndex length) {
        return descriptionOf(
            Owned<CFStringRef>::adopt(
                CFStringCreateWithSubstring(nullptr, string.get(), CFRangeMake(location, length)))
                .get());
    };
    EXPECT_EQ(part(1, 2), "\xC3\xA4\xE2\x82\xAC");
    EXPECT_EQ(part(0, 4), "(null)");
    EXPECT_EQ(part(5, 2), "(null)");
    const CFRange found = CFStringFind(string.get(), CFSTR("z"), 0);
    EXPECT_EQ(found.location, 5);
}

TEST(String, IsReplacedInPartAndSeparated) {
    const auto string =
        Owned<CFMutableStringRef>::adopt(CFStringCreateMutableCopy(nullptr, 0, str(mixed).get()));
    const auto before = Owned<CFStringRef>::adopt(CFStringCreateCopy(nullptr, string.get()));
    CFStringReplace(string.get(), CFRangeMake(3, 2), CFSTR("<->"));
    CFStringReplace(string.get(), CFRangeMake(1, 1), string.get());
    EXPECT_EQ(textOf(string.get()), "aa\xC3\xA4\xE2\x82\xAC<->z\xE2\x82\xAC<->z");
    EXPECT_EQ(textOf(before.get()), mixed);
    const auto pieces = [](std::string_view text, std::string_view separator) {
        const auto array = Owned<CFArrayRef>::adopt(
            CFStringCreateArrayBySeparatingStrings(nullptr, str(text).get(), str(separator).get()));
        return descriptionOf(array.get());
    };
    EXPECT_EQ(pieces("/Sets/0/", "/"), "(, Sets, 0, )");
    EXPECT_EQ(pieces("", "/"), "()");
    EXPECT_TRUE(CFStringHasPrefix(CFSTR("AirPort_x"), CFSTR("AirPort")));
    EXPECT_FALSE(CFStringHasPrefix(CFSTR("Air"), CFSTR("AirPort")));
}

TEST(String, ComparesAsTheFlagsSay) {
    constexpr CFStringCompareFlags scripts =
        kCFCompareCaseInsensitive | kCFCompareLocalized | kCFCompareNumerically;
    struct Row {
        const char* lhs;
        const char* rhs;
        CFStringCompareFlags flags;
        CFComparisonResult expected;
    };
    const Row rows[] = {
        {"Zebra", "apple", 0, kCFCompareLessThan},
        {"Zebra", "apple", kCFCompareLocalized, kCFCompareGreaterThan},
        {"\xEF\xBF\xBD", "\xF0\x9F\x98\x80", 0, kCFCompareLessThan},
        {"\xC3\x84pfel", "Birne", kCFCompareLocalized, kCFCompareLessThan},
        {"a", "A", kCFCompareLocalized, kCFCompareLessThan},
        {"\xC3\x84", "\xC3\xA4", scripts, kCFCompareEqualTo},
        {"a", "\xC3\xA4", scripts, kCFCompareLessThan},
        {"Modem 9", "modem 10", scripts, kCFCompareLessThan},
        {"Modem 010", "Modem 10", scripts, kCFCompareEqualTo},
        {"v10", "v2", kCFCompareLocalized, kCFCompareLessThan},
        {"v10", "v2", kCFCompareLocalized | kCFCompareNumerically, kCFCompareGreaterThan},
        {"", "a", scripts, kCFCompareLessThan},
    };
    for (const Row& row : rows) {
        SCOPED_TRACE(row.lhs + " against "s + row.rhs);
        EXPECT_EQ(CFStringCompare(str(row.lhs).get(), str(row.rhs).get(), row.flags), row.expected);
        EXPECT_EQ(CFStringCompare(str(row.rhs).get(), str(row.lhs).get(), row.flags), -row.expected);
    }
}

TEST(String, LowersItsCase) {
    for (const auto& [from, to] : {std::pair("Bluetooth-Modem", "bluetooth-modem"),
                                   std::pair("\xC3\x84\xC4\xB0I", "\xC3\xA4i\xCC\x87i"), std::pair("", "")}) {
        const auto string =
            Owned<CFMutableStringRef>::adopt(CFStringCreateMutableCopy(nullptr, 0, str(from).get()));
        CFStringLowercase(string.get(), nullptr);
        EXPECT_EQ(textOf(string.get()), to);
    }
}

TEST(String, IsFormatted) {
    const auto own = [](CFStringRef string) {
        return descriptionOf(Owned<CFStringRef>::adopt(string).get());
    };
    EXPECT_EQ(own(CFStringCreateWithFormat(
                  nullptr, nullptr, CFSTR("%@|%@|%d %5.3i|%-4u|%ld|%lu|%.2s|%c|%#x|%05d|100%%"),
                  CFSTR("\xC3\xA4"), nullptr, -1, 7, 8U, -(1L << 40), 1UL << 40, "cut", 'c', 255U, -42)),
              "\xC3\xA4|(null)|-1   007|8   |-1099511627776|1099511627776|cu|c|0xff|-0042|100%");
    EXPECT_EQ(own(CFStringCreateWithFormat(nullptr, nullptr, CFSTR("%.1s"), "\xC3\xA4")), "(null)");
    for (const CFStringRef format : {CFSTR("%n"), CFSTR("%*d"), CFSTR("%ls"), CFSTR("50%")}) {
        EXPECT_EQ(own(CFStringCreateWithFormat(nullptr, nullptr, format, 1, 2)), "(null)");
    }
}

}  // namespace
