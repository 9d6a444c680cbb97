// What goes in and what comes out, a line each in the golden file.
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <iterator>

#include "tests/unit/support/Transcript.h"
#include "tests/unit/values/Values.h"

// Reads a document in both ways, writes it, and ends the program when something of that contradicts the rest.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size);

using namespace values_test;
using testing_support::escaped;
using Inputs = testing_support::Transcript::Inputs;

namespace {

// The first input as a string to change.
Owned<CFMutableStringRef> changeable(const Inputs& inputs) {
    return Owned<CFMutableStringRef>::adopt(CFStringCreateMutableCopy(nullptr, 0, str(inputs[0]).get()));
}

// What a document holds, or why it holds nothing.
std::string readingOf(const std::string& document) {
    ParseError error;
    LLVMFuzzerTestOneInput(reinterpret_cast<const std::uint8_t*>(document.data()), document.size());
    const auto value = parsePropertyListXML(document, error);
    if (!value) {
        return std::to_string(error.line) + ":" + std::to_string(error.column) + " " + error.reason;
    }
    return escaped(descriptionOf(value.get()));
}

// In each encoding: the text, and the smallest buffer for it. Then what every string can do.
std::string decodingOf(const Inputs& inputs) {
    std::string told;
    for (const auto& [name, encoding] :
         {std::pair("UTF-8", kCFStringEncodingUTF8), std::pair(", ASCII", kCFStringEncodingASCII),
          std::pair(", Mac", kCFStringEncodingMacRoman)}) {
        const auto string = Owned<CFStringRef>::adopt(
            CFStringCreateWithBytes(nullptr, reinterpret_cast<const UInt8*>(inputs[0].data()),
                                    static_cast<CFIndex>(inputs[0].size()), encoding, 0));
        told += std::string(name) + (string ? " \"" + escaped(textOf(string.get())) + "\"" : " none");
        char buffer[64];
        CFIndex size = 0;
        while (string && size < 64 && !CFStringGetCString(string.get(), buffer, size, encoding)) {
            ++size;
        }
        told += string && size < 64 ? " in " + std::to_string(size) : "";
    }
    const auto string = str(inputs[0]);
    if (string) {
        std::vector<UniChar> units(static_cast<std::size_t>(CFStringGetLength(string.get())));
        const auto count = static_cast<CFIndex>(units.size());
        CFStringGetCharacters(string.get(), CFRangeMake(0, count), units.data());
        const auto back =
            Owned<CFStringRef>::adopt(CFStringCreateWithCharacters(nullptr, units.data(), count));
        EXPECT_TRUE(CFEqual(back.get(), string.get()));
        const auto written = writePropertyListXML(string.get());
        const auto dictionary = mutableDictionary();
        CFDictionarySetValue(dictionary.get(), string.get(), kCFBooleanTrue);
        EXPECT_EQ(writePropertyListXML(dictionary.get()).has_value(), written.has_value());
        ParseError error;
        EXPECT_TRUE(!written || CFEqual(parsePropertyListXML(*written, error).get(), string.get()));
        told += ", " + std::to_string(count) + " units" + (written ? "" : ", not for XML");
    }
    return told;
}

std::string numberIn(const Inputs& inputs) {
    const auto value = parsed(inputs[0]);
    SInt32 as32 = 99;
    std::int64_t as64 = 99;
    const bool fits32 = CFNumberGetValue(as<CFNumberRef>(value.get()), kCFNumberLongType, &as32) != 0;
    const bool fits64 = CFNumberGetValue(as<CFNumberRef>(value.get()), kCFNumberSInt64Type, &as64) != 0;
    return std::to_string(as32) + (fits32 ? ", " : " lossy, ") + std::to_string(as64) +
           (fits64 ? "" : " lossy");
}

// Equal values are the same key.
std::string equalityOf(const Inputs& inputs) {
    const auto lhs = parsed(inputs[0]);
    const auto rhs = parsed(inputs[1]);
    const bool isEqual = CFEqual(lhs.get(), rhs.get()) != 0;
    const auto dictionary = mutableDictionary();
    CFDictionarySetValue(dictionary.get(), lhs.get(), kCFBooleanTrue);
    EXPECT_EQ(CFDictionaryContainsKey(dictionary.get(), rhs.get()) != 0, isEqual) << inputs[0];
    EXPECT_EQ(CFEqual(rhs.get(), lhs.get()) != 0, isEqual) << inputs[0];
    return isEqual ? "equal" : "different";
}

std::string comparisonOf(const Inputs& inputs) {
    std::string told;
    for (const auto& [name, flags] :
         {std::pair("bytes ", CFStringCompareFlags{0}), std::pair(", localized ", kCFCompareLocalized),
          std::pair(", numeric ", kCFCompareLocalized | kCFCompareNumerically),
          std::pair(", any case ",
                    kCFCompareLocalized | kCFCompareNumerically | kCFCompareCaseInsensitive)}) {
        const CFComparisonResult order = CFStringCompare(str(inputs[0]).get(), str(inputs[1]).get(), flags);
        EXPECT_EQ(CFStringCompare(str(inputs[1]).get(), str(inputs[0]).get(), flags), -order) << inputs[0];
        told += name + std::string(1, "<=>"[order + 1]);
    }
    return told + (CFStringHasPrefix(str(inputs[0]).get(), str(inputs[1]).get()) != 0 ? ", prefix" : "");
}

// The piece at a place; the text with it replaced; where the replacement is found in that.
std::string editOf(const Inputs& inputs) {
    const CFRange range = CFRangeMake(std::stol(inputs[1]), std::stol(inputs[2]));
    const auto string = changeable(inputs);
    const auto piece = Owned<CFStringRef>::adopt(CFStringCreateWithSubstring(nullptr, string.get(), range));
    CFStringReplace(string.get(), range, str(inputs[3]).get());
    return descriptionOf(piece.get()) + ", " + descriptionOf(string.get()) + ", " +
           std::to_string(CFStringFind(string.get(), str(inputs[3]).get(), 0).location);
}

TEST(Values, DoWhatTheirTablesSay) {
    testing_support::Transcript transcript("values");
    transcript.replay("documents", [](const Inputs& inputs) { return readingOf(inputs[0]); });
    transcript.replay("what a property list holds", [](const Inputs& inputs) {
        return readingOf("<plist version=\"1.0\">" + inputs[0] + "</plist>");
    });
    transcript.replay("bytes", decodingOf);
    transcript.replay("numbers in 32 and 64 bits", numberIn);
    transcript.replay("equality", equalityOf);
    transcript.replay("comparison", comparisonOf);
    transcript.replay("edits", editOf);
    transcript.replay("separation", [](const Inputs& inputs) {
        return descriptionOf(
            Owned<CFArrayRef>::adopt(
                CFStringCreateArrayBySeparatingStrings(nullptr, str(inputs[0]).get(), str(inputs[1]).get()))
                .get());
    });
    transcript.replay("lower case", [](const Inputs& inputs) {
        const auto string = changeable(inputs);
        CFStringLowercase(string.get(), nullptr);
        return descriptionOf(string.get());
    });
    transcript.replay("URLs", [](const Inputs& inputs) {
        const auto url =
            Owned<CFURLRef>::adopt(CFURLCreateWithString(nullptr, str(inputs[0]).get(), nullptr));
        return escaped(descriptionOf(url.get()));
    });
}

TEST(Values, AreReadFromTheSeedsOfTheFuzzer) {
    int count = 0;
    for (const auto& seed : std::filesystem::directory_iterator(LA_SEEDS)) {
        std::ifstream file(seed.path(), std::ios::binary);
        readingOf({std::istreambuf_iterator<char>(file), {}});
        ++count;
    }
    EXPECT_GT(count, 10);
}

TEST(Values, AreFormatted) {
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

TEST(Values, TakeNoHalvesOfCharacters) {
    for (const auto& unpaired :
         {std::vector<UniChar>{0xD83D, 'a'}, {'a', 0xD83D}, {0xDE00, 0xD83D}, {0xDE00, 0xDE00}}) {
        EXPECT_EQ(CFStringCreateWithCharacters(nullptr, unpaired.data(), 2), nullptr);
    }
}

}  // namespace
