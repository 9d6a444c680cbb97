#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>
#include <map>
#include <string>
#include <vector>

#include "platform/CoreServices.h"
#include "platform/base/Host.h"
#include "tests/unit/support/TemporaryDirectory.h"

namespace {

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

// The flags of each item by its name, read 50 at a time.
std::map<std::u16string, UInt32> itemsIn(SInt16 domain) {
    std::map<std::u16string, UInt32> items;
    FSRef folder{};
    FSIterator iterator = nullptr;
    EXPECT_EQ(FSFindFolder(domain, kModemScriptsFolderType, false, &folder), noErr);
    EXPECT_EQ(FSOpenIterator(&folder, kFSIterateFlat, &iterator), noErr);
    std::vector<FSRef> references(50);
    std::vector<HFSUniStr255> names(50);
    OSErr err = noErr;
    while (err == noErr) {
        UInt32 count = 99;
        err = FSGetCatalogInfoBulk(iterator, 50, &count, nullptr, kFSCatInfoNone, nullptr, references.data(),
                                   nullptr, names.data());
        EXPECT_EQ(err, count == 50 ? noErr : errFSNoMoreItems);
        for (UInt32 i = 0; i < count; ++i) {
            LSItemInfoRecord info{0xFFFF};
            EXPECT_EQ(LSCopyItemInfoForRef(&references[i], kLSRequestBasicFlagsOnly, &info), noErr);
            EXPECT_TRUE(
                items
                    .emplace(std::u16string(names[i].unicode, names[i].unicode + names[i].length), info.flags)
                    .second);
        }
    }
    EXPECT_EQ(FSCloseIterator(iterator), noErr);
    return items;
}

TEST_F(Folders, FindsTheFolderOfEachDomainOnlyWhenItIsThere) {
    directory.write("local/only here", "");
    directory.write("network", "a file");
    std::filesystem::create_symlink("local", directory.at("user"));
    FSRef folder{};
    EXPECT_EQ(FSFindFolder(kNetworkDomain, kModemScriptsFolderType, false, &folder), fnfErr);
    EXPECT_EQ(FSFindFolder(kSystemDomain, kModemScriptsFolderType, false, &folder), fnfErr);
    EXPECT_EQ(itemsIn(kLocalDomain).count(u"only here"), 1U);
    EXPECT_EQ(itemsIn(kUserDomain).count(u"only here"), 1U);
}

TEST_F(Folders, TellsWhatEachItemIsAndPassesOverNamesThatCannotBeDelivered) {
    std::map<std::u16string, UInt32> expected = {
        {u"plain", kLSItemInfoIsPlainFile},
        {u".hidden", kLSItemInfoIsPlainFile | kLSItemInfoIsInvisible},
        {u"Caf\u00E9 \U0001F600", kLSItemInfoIsPlainFile},
        {u"folder", kLSItemInfoIsContainer},
        {u"to plain", kLSItemInfoIsPlainFile},
        {u"to folder", kLSItemInfoIsContainer},
        {u"dangling", 0},
        {u"round", 0},
        {u"fifo", 0},
    };
    for (const char* file :
         {"plain", ".hidden", "Caf\xC3\xA9 \xF0\x9F\x98\x80", "bad\xFF", "bell\x07",
          "longer than the 64 bytes that a name may have so that it can be shown \xF0\x9F\x98\x80",
          "folder/inner"}) {
        directory.write("system/" + std::string(file), "");
    }
    for (int i = 0; i < 110; ++i) {
        const std::string name = std::to_string(i);
        directory.write("system/" + name, "");
        expected[std::u16string(name.begin(), name.end())] = kLSItemInfoIsPlainFile;
    }
    const std::pair<const char*, const char*> links[] = {
        {"to plain", "plain"}, {"to folder", "folder"}, {"dangling", "nowhere"}, {"round", "round"}};
    for (const auto& [name, target] : links) {
        std::filesystem::create_symlink(target, directory.at("system") + "/" + name);
    }
    ASSERT_EQ(mkfifo(directory.at("system/fifo").c_str(), 0600), 0);
    EXPECT_EQ(itemsIn(kSystemDomain), expected);
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
