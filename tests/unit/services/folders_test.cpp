#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <map>
#include <set>
#include <string>
#include <vector>

#include "platform/CoreServices.h"
#include "platform/Host.h"
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

std::string asText(const HFSUniStr255& name) {
    std::string text;
    for (UInt16 i = 0; i < name.length; ++i) {
        const UniChar unit = name.unicode[i];
        text += unit < 0x80 ? std::string(1, static_cast<char>(unit)) : "<" + std::to_string(unit) + ">";
    }
    return text;
}

struct Item {
    FSRef reference;
    UInt32 flags;
};

// Reads in batches of `batch`; the sizes of the batches are noted.
std::map<std::string, Item> itemsIn(const FSRef& folder, UInt32 batch, std::vector<UInt32>* sizes = nullptr) {
    std::map<std::string, Item> items;
    FSIterator iterator = nullptr;
    EXPECT_EQ(FSOpenIterator(&folder, kFSIterateFlat, &iterator), noErr);
    std::vector<FSRef> references(batch);
    std::vector<HFSUniStr255> names(batch);
    OSErr err = noErr;
    while (err == noErr) {
        UInt32 count = 99;
        err = FSGetCatalogInfoBulk(iterator, batch, &count, nullptr, kFSCatInfoNone, nullptr,
                                   references.data(), nullptr, names.data());
        for (UInt32 i = 0; i < count; ++i) {
            LSItemInfoRecord info{0xFFFF};
            EXPECT_EQ(LSCopyItemInfoForRef(&references[i], kLSRequestBasicFlagsOnly, &info), noErr);
            EXPECT_TRUE(items.emplace(asText(names[i]), Item{references[i], info.flags}).second);
        }
        if (sizes != nullptr) {
            sizes->push_back(count);
        }
    }
    EXPECT_EQ(err, errFSNoMoreItems);
    EXPECT_EQ(FSCloseIterator(iterator), noErr);
    EXPECT_EQ(FSCloseIterator(iterator), paramErr);
    return items;
}

TEST_F(Folders, FindsTheFolderOfEachDomainOnlyWhenItIsThere) {
    FSRef folder{};
    std::filesystem::create_directories(directory.at("elsewhere"));
    std::filesystem::create_symlink("elsewhere", directory.at("user"));
    directory.write("network", "a file");
    directory.write("local/only here", "");
    EXPECT_EQ(FSFindFolder(kUserDomain, kModemScriptsFolderType, false, &folder), noErr);
    EXPECT_EQ(itemsIn(folder, 5).size(), 0U);
    EXPECT_EQ(FSFindFolder(kNetworkDomain, kModemScriptsFolderType, false, &folder), fnfErr);
    EXPECT_EQ(FSFindFolder(kSystemDomain, kModemScriptsFolderType, false, &folder), fnfErr);
    EXPECT_EQ(FSFindFolder(0, kModemScriptsFolderType, false, &folder), paramErr);
    EXPECT_EQ(FSFindFolder(kLocalDomain, 0x646F6373, false, &folder), paramErr);
    EXPECT_EQ(FSFindFolder(kLocalDomain, kModemScriptsFolderType, true, &folder), paramErr);
    EXPECT_EQ(FSFindFolder(kLocalDomain, kModemScriptsFolderType, false, &folder), noErr);
    EXPECT_EQ(itemsIn(folder, 5).count("only here"), 1U);
    EXPECT_FALSE(std::filesystem::exists(directory.at("system")));
}

TEST_F(Folders, TellsWhatEachItemIs) {
    directory.write("local/plain", "");
    directory.write("local/.hidden", "");
    directory.write("local/folder/inner", "");
    const auto link = [this](const char* target, const char* name) {
        std::filesystem::create_symlink(target, directory.at(std::string("local/") + name));
    };
    link("plain", "to plain");
    link("folder", "to folder");
    link("nowhere", "dangling");
    link("round", "round");
    link("plain/below", "below a file");
    ASSERT_EQ(mkfifo(directory.at("local/fifo").c_str(), 0600), 0);
    FSRef folder{};
    ASSERT_EQ(FSFindFolder(kLocalDomain, kModemScriptsFolderType, false, &folder), noErr);
    std::map<std::string, UInt32> flags;
    const auto items = itemsIn(folder, 3);
    for (const auto& [name, item] : items) {
        flags[name] = item.flags;
    }
    const std::map<std::string, UInt32> expected = {
        {"plain", kLSItemInfoIsPlainFile},
        {".hidden", kLSItemInfoIsPlainFile | kLSItemInfoIsInvisible},
        {"folder", kLSItemInfoIsContainer},
        {"to plain", kLSItemInfoIsPlainFile},
        {"to folder", kLSItemInfoIsContainer},
        {"dangling", 0},
        {"round", 0},
        {"below a file", 0},
        {"fifo", 0},
    };
    EXPECT_EQ(flags, expected);

    std::filesystem::remove(directory.at("local/plain"));
    LSItemInfoRecord info{0xFFFF};
    EXPECT_EQ(LSCopyItemInfoForRef(&items.at("plain").reference, kLSRequestBasicFlagsOnly, &info), noErr);
    EXPECT_EQ(info.flags, 0U);
}

TEST_F(Folders, DeliversNamesInBatchesAndPassesOverThoseThatCannotBe) {
    std::set<std::string> expected;
    for (int i = 0; i < 117; ++i) {
        expected.insert("Modem " + std::to_string(i));
    }
    expected.insert("Caf<233> <55357><56832>");
    expected.insert(std::string(255, 'n'));
    for (const std::string& name : expected) {
        if (name[0] != 'C') {
            directory.write("system/" + name, "");
        }
    }
    directory.write("system/Caf\xC3\xA9 \xF0\x9F\x98\x80", "");
    directory.write("system/bad\xFF", "");
    FSRef folder{};
    ASSERT_EQ(FSFindFolder(kSystemDomain, kModemScriptsFolderType, false, &folder), noErr);
    std::vector<UInt32> sizes;
    std::set<std::string> names;
    for (const auto& [name, item] : itemsIn(folder, 50, &sizes)) {
        names.insert(name);
    }
    EXPECT_EQ(names, expected);
    EXPECT_EQ(sizes, (std::vector<UInt32>{50, 50, 19}));
    sizes.clear();
    itemsIn(folder, 119, &sizes);
    EXPECT_EQ(sizes, (std::vector<UInt32>{119, 0}));
}

TEST_F(Folders, RefusesReferencesAndIteratorsThatAreNone) {
    FSRef none{};
    FSIterator iterator = nullptr;
    LSItemInfoRecord info{};
    UInt32 count = 7;
    EXPECT_EQ(FSOpenIterator(&none, kFSIterateFlat, &iterator), paramErr);
    EXPECT_EQ(iterator, nullptr);
    EXPECT_EQ(LSCopyItemInfoForRef(&none, kLSRequestBasicFlagsOnly, &info), paramErr);
    EXPECT_EQ(
        FSGetCatalogInfoBulk(nullptr, 5, &count, nullptr, kFSCatInfoNone, nullptr, nullptr, nullptr, nullptr),
        paramErr);
    EXPECT_EQ(count, 0U);

    directory.write("user/item", "");
    FSRef folder{};
    ASSERT_EQ(FSFindFolder(kUserDomain, kModemScriptsFolderType, false, &folder), noErr);
    std::filesystem::remove_all(directory.at("user"));
    EXPECT_EQ(FSOpenIterator(&folder, kFSIterateFlat, &iterator), fnfErr);
}

TEST(Gestalt, AnswersWithTheVersionOfTheHost) {
    SInt32 version = 7;
    EXPECT_EQ(Gestalt(gestaltSystemVersion, &version), noErr);
    EXPECT_EQ(version, 0x1040);
    platform::Host host;
    host.systemVersion.reset();
    const platform::HostOverride override(host);
    version = 7;
    EXPECT_EQ(Gestalt(gestaltSystemVersion, &version), gestaltUndefSelectorErr);
    EXPECT_EQ(Gestalt(0x71756572, &version), gestaltUndefSelectorErr);
    EXPECT_EQ(version, 7);
}

}  // namespace
