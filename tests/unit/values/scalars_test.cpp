#include <gtest/gtest.h>

#include <cmath>
#include <limits>

#include "tests/unit/values/Values.h"

using namespace values_test;

namespace {

TEST(Number, TellsALossyReading) {
    struct Row {
        Owned<CFNumberRef> number;
        bool fits32;
        SInt32 as32;
        bool fits64;
        std::int64_t as64;
    };
    const std::int64_t most = std::numeric_limits<std::int64_t>::max();
    const SInt32 most32 = std::numeric_limits<SInt32>::max();
    const Row rows[] = {
        {makeNumber(2'147'483'648), false, most32, true, 2'147'483'648},
        {makeNumber(-2'147'483'649), false, -most32 - 1, true, -2'147'483'649},
        {makeReal(-3), true, -3, true, -3},
        {makeReal(2.75), false, 2, false, 2},
        {makeReal(9223372036854775808.0), false, most32, false, most},
        {makeReal(-9223372036854775808.0), false, -most32 - 1, true, -most - 1},
        {makeReal(std::nan("")), false, 0, false, 0},
    };
    for (const Row& row : rows) {
        SCOPED_TRACE(descriptionOf(row.number.get()));
        SInt32 as32 = 99;
        std::int64_t as64 = 99;
        EXPECT_EQ(CFNumberGetValue(row.number.get(), kCFNumberLongType, &as32) != 0, row.fits32);
        EXPECT_EQ(as32, row.as32);
        EXPECT_EQ(CFNumberGetValue(row.number.get(), kCFNumberSInt64Type, &as64) != 0, row.fits64);
        EXPECT_EQ(as64, row.as64);
    }
}

TEST(Number, EqualsByValue) {
    EXPECT_TRUE(CFEqual(makeNumber(1).get(), makeReal(1).get()));
    EXPECT_TRUE(CFEqual(makeReal(0.0).get(), makeReal(-0.0).get()));
    EXPECT_TRUE(CFEqual(makeReal(std::nan("")).get(), makeReal(std::nan("")).get()));
    EXPECT_FALSE(CFEqual(makeNumber((1LL << 53) + 1).get(), makeReal(9007199254740992.0).get()));
    EXPECT_FALSE(CFEqual(makeNumber(1).get(), kCFBooleanTrue));
}

TEST(URL, HasASchemeAndNothingToEscape) {
    for (const char* good : {"http://192.0.0.192/dot11_config_start.htm", "http://[::1]:80/a%20b?c=d&e#f",
                             "mailto:a@b", "a+b.c-1:", "http://a?b", "x:/a%20/b#"}) {
        const auto url = Owned<CFURLRef>::adopt(CFURLCreateWithString(nullptr, str(good).get(), nullptr));
        ASSERT_TRUE(url) << good;
        EXPECT_EQ(textOf(CFURLGetString(url.get())), good);
    }
    for (const char* bad : {"", "192.0.0.192/x", "1a:b", ":x", "http://a b/", "http://a/%2", "http://a/%",
                            "a:%4", "http://a/%zz", "http://a/\"", "http://a/[x]", "http://a/#b#c",
                            "http://\xC3\xA4/", "http://a/\n", "x:a[b]"}) {
        EXPECT_EQ(CFURLCreateWithString(nullptr, str(bad).get(), nullptr), nullptr) << bad;
    }
    EXPECT_EQ(CFURLCreateWithString(nullptr, str(std::string_view("http://a/\0b", 11)).get(), nullptr),
              nullptr);
}

}  // namespace
