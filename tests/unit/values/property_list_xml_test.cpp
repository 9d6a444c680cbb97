#include <gtest/gtest.h>

#include <cmath>

#include "tests/unit/values/Values.h"

using namespace values_test;
using namespace std::string_literals;

namespace {

const std::string document =
    "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
    "<!DOCTYPE plist PUBLIC \"-//Apple//DTD PLIST 1.0//EN\" "
    "\"http://www.apple.com/DTDs/PropertyList-1.0.dtd\">\n"
    "<plist version=\"1.0\">\n"
    "<dict>\n"
    "\t<key>a &amp; b</key>\n"
    "\t<array>\n"
    "\t\t<string>&lt;x&gt;\"'&#13;\n\t\xC3\xA4\xF0\x9F\x98\x80</string>\n"
    "\t\t<integer>-9223372036854775808</integer>\n"
    "\t\t<real>0.1</real>\n"
    "\t\t<true/>\n"
    "\t\t<false/>\n"
    "\t\t<date>2004-02-29T12:30:00Z</date>\n"
    "\t\t<data>\n"
    "\t\tAAECAwQFAAECAwQFAAECAwQFAAECAwQFAAECAwQFAAECAwQFAAECAwQFAAECAwQFAAEC\n"
    "\t\tAw==\n"
    "\t\t</data>\n"
    "\t\t<dict/>\n"
    "\t\t<array/>\n"
    "\t\t<string></string>\n"
    "\t</array>\n"
    "\t<key></key>\n"
    "\t<integer>0</integer>\n"
    "</dict>\n"
    "</plist>\n";

Owned<CFPropertyListRef> parse(std::string_view text) {
    ParseError error;
    return parsePropertyListXML(text, error);
}

TEST(PropertyListXML, WritesWhatItRead) {
    const auto value = parse(document);
    ASSERT_TRUE(value);
    EXPECT_EQ(writePropertyListXML(value.get()), document);
    const auto copy = Owned<CFPropertyListRef>::adopt(
        CFPropertyListCreateDeepCopy(nullptr, value.get(), kCFPropertyListMutableContainersAndLeaves));
    EXPECT_EQ(writePropertyListXML(copy.get()), document);
}

TEST(PropertyListXML, ReadsWhatOthersWrite) {
    const std::pair<const char*, const char*> rows[] = {
        {"<string>a<!-- c -->b<![CDATA[<&>]]>&#x41;\r\n</string>", "ab<&>A "},
        {"<string>a\r\nb &amp;&lt;&gt;&quot;&apos;</string>", "a b &<>\"'"},
        {"<data>3q2+\n\t7w==</data>", "<deadbeef>"},
        {"<data/>", "<>"},
        {"<integer> +12 </integer>", "12"},
        {"<real>-1.5e3</real>", "-1500"},
        {"<real>+inf</real>", "inf"},
        {"<real>nan</real>", "nan"},
        {"<date>\n0000-01-01T00:00:00Z </date>", "0000-01-01T00:00:00Z"},
        {"<date>9999-12-31T23:59:59Z</date>", "9999-12-31T23:59:59Z"},
        {"<array><true></true><dict></dict></array>", "(true, {})"},
    };
    for (const auto& [inner, expected] : rows) {
        EXPECT_EQ(descriptionOf(parsed(inner).get()), expected) << inner;
    }
    EXPECT_TRUE(parse("\xEF\xBB\xBF<?xml version='1.0' encoding='utf-8'?><plist><true/></plist>"));
}

TEST(PropertyListXML, RefusesEveryTruncation) {
    for (std::size_t size = 0; size < document.size() - 1; ++size) {
        ParseError error;
        ASSERT_FALSE(parsePropertyListXML(std::string_view(document).substr(0, size), error)) << size;
        ASSERT_FALSE(error.reason.empty());
    }
    EXPECT_TRUE(parse(document.substr(0, document.size() - 1)));
}

TEST(PropertyListXML, RefusesWhatIsNoPropertyList) {
    // clang-format off
    for (const char* inner : {
        "", "text", "<string>a</string><string>b</string>", "<key>a</key>",
        "<dict><string>a</string></dict>", "<dict><key>a</key><key>b</key></dict>", "<dict><key>a</key></dict>",
        "<dict><key>a</key><true/><key>a</key><true/></dict>", "<array><key>a</key></array>",
        "<string><true/></string>", "<true>x</true>", "<set/>", "<dict id=\"1\"/>", "<integer/>",
        "<integer>9223372036854775808</integer>", "<integer>+-1</integer>", "<integer>0x10</integer>",
        "<real>1e999</real>", "<date>2004-02-30T00:00:00Z</date>", "<date>2004-02-28T24:00:00Z</date>",
        "<date>2004-02-28T00:00:00</date>", "<data>AAA=AAAA</data>", "<data>AA*=</data>", "<data>AAAAAA</data>",
        "<string>&#1;</string>", "<string>\x80</string>", "<string>\xED\xA0\x80</string>",
        "<string>\xEF\xBF\xBF</string>"}) {
        // clang-format on
        EXPECT_FALSE(parsed(inner)) << inner;
    }
    const std::string plist = "<plist version=\"1.0\"><true/></plist>";
    for (const std::string& text :
         {""s, "not XML"s, "\0\0"s, "<?xml version=\"1.0\"?>"s, "<html/>"s, "<dict/>"s, "bplist00"s,
          plist + plist, plist + "text"s, "<plist version=\"2.0\"><true/></plist>"s,
          "<plist kind=\"x\"><true/></plist>"s, "<?xml version=\"1.0\" encoding=\"ISO-8859-1\"?>"s + plist,
          "<!DOCTYPE plist [<!ENTITY a \"aaaaaaaa\"><!ENTITY b \"&a;&a;&a;\">]>"
          "<plist version=\"1.0\"><string>&b;</string></plist>"s,
          "<!DOCTYPE plist [<!ENTITY a SYSTEM \"file:///etc/passwd\">]>"
          "<plist version=\"1.0\"><string>&a;</string></plist>"s,
          "<!DOCTYPE html><plist version=\"1.0\"><true/></plist>"s}) {
        EXPECT_FALSE(parse(text)) << text;
    }
}

TEST(PropertyListXML, BoundsTheDepth) {
    const auto nested = [](std::size_t levels, const std::string& open, const std::string& close) {
        std::string text = "<plist version=\"1.0\">";
        for (std::size_t i = 0; i < levels; ++i) {
            text += open;
        }
        for (std::size_t i = 0; i < levels; ++i) {
            text += close;
        }
        return text + "</plist>";
    };
    const auto deepest = parse(nested(deepestPropertyList, "<array>", "</array>"));
    ASSERT_TRUE(deepest);
    EXPECT_TRUE(frozen(deepest.get()));
    const auto text = writePropertyListXML(deepest.get());
    ASSERT_TRUE(text.has_value());
    EXPECT_TRUE(CFEqual(parse(*text).get(), deepest.get()));
    for (const std::size_t levels : {deepestPropertyList + 1UL, 1'000'000UL}) {
        EXPECT_FALSE(parse(nested(levels, "<array>", "</array>")));
        EXPECT_FALSE(parse(nested(levels, "<dict><key>k</key>", "</dict>")));
        EXPECT_FALSE(parse(nested(levels, "<x>", "</x>")));
    }
    EXPECT_FALSE(writePropertyListXML(nestedArrays(deepestPropertyList + 1).get()));
}

TEST(PropertyListXML, TellsThePlaceOfAnError) {
    ParseError error;
    EXPECT_FALSE(
        parsePropertyListXML("<plist><dict>\n<key>\xC3\xA4</key><integer>x</integer></dict></plist>", error));
    EXPECT_EQ(error.line, 2U);
    EXPECT_EQ(error.column, 24U);
    EXPECT_EQ(error.reason, "not an integer, or one that does not fit 64 bits");
    EXPECT_FALSE(parsePropertyListXML("<plist version=\"1.0\">\n<true/>\n", error));
    EXPECT_EQ(error.line, 3U);
    EXPECT_EQ(error.reason, "no element found");
}

TEST(PropertyListXML, FindsASecondKeyAmongMany) {
    std::string entries;
    for (int i = 0; i < 5000; ++i) {
        entries += "<key>" + std::to_string(i) + "</key><true/>";
    }
    EXPECT_TRUE(parsed("<dict>" + entries + "</dict>"));
    EXPECT_FALSE(parsed("<dict>" + entries + "<key>4321</key><true/></dict>"));
}

TEST(PropertyListXML, ReadsBackEveryReal) {
    for (const double real : {0.1, -0.0, 1e300, 5e-324, 1.0 / 3, HUGE_VAL, -HUGE_VAL, std::nan(""), 1.0}) {
        const auto number = makeReal(real);
        const auto back = parse(*writePropertyListXML(number.get()));
        ASSERT_TRUE(back && CFNumberIsFloatType(as<CFNumberRef>(back.get()))) << real;
        EXPECT_TRUE(CFEqual(back.get(), number.get()) &&
                    descriptionOf(back.get()) == descriptionOf(number.get()));
    }
}

TEST(PropertyListXML, RefusesToWriteWhatItCannotReadBack) {
    for (const std::string& text : {"\0"s, "\x01"s, "\x1F"s, "\x0B"s, "\xEF\xBF\xBE"s, "\xEF\xBF\xBF"s}) {
        const auto dictionary = mutableDictionary();
        CFDictionarySetValue(dictionary.get(), CFSTR("k"), str(text).get());
        EXPECT_FALSE(writePropertyListXML(dictionary.get()));
        CFDictionaryRemoveValue(dictionary.get(), CFSTR("k"));
        CFDictionarySetValue(dictionary.get(), str(text).get(), kCFBooleanTrue);
        EXPECT_FALSE(writePropertyListXML(dictionary.get()));
    }
    for (const std::string& text : {"\t\n\r"s, "\x7F"s, "\xC2\x80"s, "\xEF\xBF\xBD"s, "]]>"s, "  a  "s}) {
        const auto written = writePropertyListXML(str(text).get());
        ASSERT_TRUE(written.has_value());
        EXPECT_EQ(textOf(as<CFStringRef>(parse(*written).get())), text);
    }
    EXPECT_FALSE(writePropertyListXML(makeDate(253'402'300'800).get()));
    EXPECT_FALSE(writePropertyListXML(makeDate(-62'167'219'201).get()));
}

}  // namespace
