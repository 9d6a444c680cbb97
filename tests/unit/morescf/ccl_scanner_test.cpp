#include "morescf/MoreSCFCCLScanner.h"

#include "platform/CoreServices.h"
#include "tests/unit/morescf/Fixture.h"

namespace morescf_test {
namespace {

class ScannerTest : public MoreSCFTest {
  protected:
    void add(const char* domain, const std::vector<std::string>& names) const {
        for (const std::string& name : names) {
            (void)directory.write("scripts/" + std::string(domain) + "/" + name, "");
        }
    }
    // The index of the default one, and the list.
    static std::string scan() {
        Output<CFArrayRef> scripts;
        CFIndex index = 77;
        const OSStatus err = MoreSCCreateCCLArray(&scripts, &index);
        return (err != 0 ? std::to_string(err) : std::to_string(index)) + " " + scripts.shown();
    }
};

TEST_F(ScannerTest, SortsByNumberAndListsEachNameOnce) {
    add("user", {"Modem 10", "abc", ".hidden", "Zebra", "folder/inside"});
    add("network", {"ABC"});
    add("local", {"Modem 9", "abc", "Modem 10"});
    add("system", {"ABC"});
    EXPECT_EQ("0 (abc, ABC, Modem 9, Modem 10, Zebra)", scan());
    add("system", {"Apple Internal 56K Modem (v.90)", "Apple Internal 56K Modem"});
    EXPECT_EQ(
        "3 (abc, ABC, Apple Internal 56K Modem, Apple Internal 56K Modem (v.90), Modem 9, Modem 10, Zebra)",
        scan());
    // A folder that cannot be read whole fails the listing.
    for (int i = 0; i < 4097; ++i) {
        add("local", {"Modem " + std::to_string(i)});
    }
    EXPECT_EQ(std::to_string(ioErr) + " null", scan());
}

TEST_F(ScannerTest, ReadsFoldersOfManyBatches) {
    for (const int count : {50, 51, 173}) {
        for (int i = 0; i < count; ++i) {
            add("local", {"Modem " + std::to_string(i)});
        }
        Output<CFArrayRef> scripts;
        EXPECT_EQ(0, MoreSCCreateCCLArray(&scripts, nullptr));
        ASSERT_EQ(count, CFArrayGetCount(scripts));
    }
}

}  // namespace
}  // namespace morescf_test
