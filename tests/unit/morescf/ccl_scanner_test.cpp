#include "morescf/MoreSCFCCLScanner.h"

#include "tests/unit/morescf/Fixture.h"

namespace morescf_test {
namespace {

class ScannerTest : public MoreSCFTest {
  protected:
    void script(const char* domain, const std::string& name) const {
        (void)directory.write("scripts/" + std::string(domain) + "/" + name, "");
    }
    static std::string scan(CFIndex& index) {
        Output<CFArrayRef> scripts;
        index = 77;
        const OSStatus err = MoreSCCreateCCLArray(&scripts, &index);
        return err == 0 ? scripts.shown() : std::to_string(err) + " " + scripts.shown();
    }
    CFIndex index = 0;
};

TEST_F(ScannerTest, SortsByNumberAndListsEachNameOnce) {
    for (const char* name : {"Modem 10", "abc", ".hidden", "Zebra"}) {
        script("user", name);
    }
    script("user", "folder/inside");
    script("network", "ABC");
    for (const char* name : {"Modem 9", "abc", "Modem 10"}) {
        script("local", name);
    }
    script("system", "ABC");
    EXPECT_EQ("(abc, ABC, Modem 9, Modem 10, Zebra)", scan(index));
    EXPECT_EQ(0, index);
    script("system", "Apple Internal 56K Modem (v.90)");
    script("system", "Apple Internal 56K Modem");
    EXPECT_EQ(
        "(abc, ABC, Apple Internal 56K Modem, Apple Internal 56K Modem (v.90), Modem 9, Modem 10, Zebra)",
        scan(index));
    EXPECT_EQ(3, index);
}

TEST_F(ScannerTest, ReadsFoldersOfManyBatches) {
    for (const int count : {50, 51, 173}) {
        for (int i = 0; i < count; ++i) {
            script("local", "Modem " + std::to_string(i));
        }
        Output<CFArrayRef> scripts;
        EXPECT_EQ(0, MoreSCCreateCCLArray(&scripts, &index));
        ASSERT_EQ(count, CFArrayGetCount(scripts));
        EXPECT_EQ("Modem " + std::to_string(count - 1), show(CFArrayGetValueAtIndex(scripts, count - 1)));
    }
}

}  // namespace
}  // namespace morescf_test
