#include <gtest/gtest.h>

#include <cstdlib>
#include <set>
#include <string>
#include <vector>

#include "platform/CoreServices.h"
#include "platform/base/Host.h"
#include "platform/values/Values.h"
#include "tests/unit/support/TemporaryDirectory.h"
#include "tests/unit/support/Transcript.h"

namespace {

using platform::values::descriptionOf;
using platform::values::Owned;
using testing_support::TemporaryDirectory;

class Folders : public testing::Test {
  protected:
    Folders() : host_(hostIn(directory)) {}

    TemporaryDirectory directory;

  private:
    static platform::Host hostIn(const TemporaryDirectory& directory) {
        platform::Host host;
        host.userModemScripts = directory.at("user");
        host.networkModemScripts = directory.at("network");
        host.localModemScripts = directory.at("local");
        host.systemModemScripts = directory.at("system");
        return host;
    }
    platform::HostOverride host_;
};

// The items of a folder, read 50 at a time, in the order of their names: "name=flags".
std::string itemsIn(SInt16 domain) {
    FSRef folder{};
    FSIterator iterator = nullptr;
    if (const OSErr err = FSFindFolder(domain, kModemScriptsFolderType, false, &folder); err != noErr) {
        return std::to_string(err);
    }
    EXPECT_EQ(FSOpenIterator(&folder, kFSIterateFlat, &iterator), noErr);
    std::set<std::string> items;
    std::vector<FSRef> references(50);
    std::vector<HFSUniStr255> names(50);
    for (OSErr err = noErr; err == noErr;) {
        UInt32 count = 99;
        err = FSGetCatalogInfoBulk(iterator, 50, &count, nullptr, kFSCatInfoNone, nullptr, references.data(),
                                   nullptr, names.data());
        EXPECT_EQ(err, count == 50 ? noErr : errFSNoMoreItems);
        for (UInt32 i = 0; i < count; ++i) {
            LSItemInfoRecord info{0xFFFF};
            EXPECT_EQ(LSCopyItemInfoForRef(&references[i], kLSRequestBasicFlagsOnly, &info), noErr);
            const auto name = Owned<CFStringRef>::adopt(
                CFStringCreateWithCharacters(nullptr, names[i].unicode, names[i].length));
            items.insert(descriptionOf(name.get()) + "=" + std::to_string(info.flags));
        }
    }
    EXPECT_EQ(FSCloseIterator(iterator), noErr);
    std::string told;
    for (const std::string& item : items) {
        told += (told.empty() ? "" : ", ") + item;
    }
    return told;
}

// Each line is a command line, in the folder that holds those of the domains.
TEST_F(Folders, TellWhatTheirItemsAre) {
    testing_support::Transcript transcript("folders");
    transcript.replay(
        "what the user, the network, the machine and the system have",
        [this](const std::vector<std::string>& inputs) {
            EXPECT_EQ(std::system(("cd " + directory.path().string() + " && " + inputs[0]).c_str()), 0);
            std::string told;
            for (const SInt16 domain : {kUserDomain, kNetworkDomain, kLocalDomain, kSystemDomain}) {
                told += "\n\t" + itemsIn(domain);
            }
            return told;
        });
}

TEST_F(Folders, GiveNoPartOfAList) {
    for (int i = 0; i < 4096; ++i) {
        directory.write("local/" + std::to_string(i), "");
    }
    for (const OSErr expected : {errFSNoMoreItems, ioErr}) {
        FSRef folder{};
        FSIterator iterator = nullptr;
        UInt32 count = 0;
        ASSERT_EQ(FSFindFolder(kLocalDomain, kModemScriptsFolderType, false, &folder), noErr);
        ASSERT_EQ(FSOpenIterator(&folder, kFSIterateFlat, &iterator), noErr);
        EXPECT_EQ(FSGetCatalogInfoBulk(iterator, 5000, &count, nullptr, kFSCatInfoNone, nullptr, nullptr,
                                       nullptr, nullptr),
                  expected);
        EXPECT_EQ(count, 4096U);
        EXPECT_EQ(FSCloseIterator(iterator), noErr);
        EXPECT_EQ(FSCloseIterator(iterator), paramErr);
        directory.write("local/one more", "");
    }
}

}  // namespace
