#include <gtest/gtest.h>

#include <cstdlib>
#include <fstream>
#include <set>
#include <string>
#include <vector>

#include "platform/CoreServices.h"
#include "platform/base/Host.h"
#include "platform/values/Values.h"
#include "tests/unit/support/PrivateNetwork.h"
#include "tests/unit/support/TemporaryDirectory.h"
#include "tests/unit/support/Transcript.h"

namespace {

using platform::values::descriptionOf;
using platform::values::Owned;
using testing_support::TemporaryDirectory;

class Folders : public testing::Test {
  protected:
    TemporaryDirectory directory;

  private:
    const platform::HostOverride host_{[this] {
        platform::Host made;
        made.userModemScripts = directory.at("user");
        made.networkModemScripts = directory.at("network");
        made.localModemScripts = directory.at("local");
        made.systemModemScripts = directory.at("system");
        return made;
    }()};
};

// The items of a folder, read 50 at a time, in the order of their names: "name=flags".
std::string itemsIn(SInt16 domain) {
    FSRef folder{};
    FSIterator iterator = nullptr;
    if (const OSErr err = FSFindFolder(domain, kModemScriptsFolderType, false, &folder); err != noErr) {
        return std::to_string(err);
    }
    if (const OSErr err = FSOpenIterator(&folder, kFSIterateFlat, &iterator); err != noErr) {
        return "not to be read: " + std::to_string(err);
    }
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
            const OSStatus looked = LSCopyItemInfoForRef(&references[i], kLSRequestBasicFlagsOnly, &info);
            const auto name = Owned<CFStringRef>::adopt(
                CFStringCreateWithCharacters(nullptr, names[i].unicode, names[i].length));
            items.insert(descriptionOf(name.get()) + "=" +
                         std::to_string(looked == noErr ? static_cast<OSStatus>(info.flags) : looked));
        }
    }
    EXPECT_EQ(FSCloseIterator(iterator), noErr);
    std::string told;
    for (const std::string& item : items) {
        told += (told.empty() ? "" : ", ") + item;
    }
    return told;
}

// What each operation here says when its argument of that number is wrong.
std::string statusesWith(const std::vector<std::string>& inputs) {
    const std::size_t wrong = std::stoul(inputs[0]);
    FSRef folder{}, item{}, found{};
    const FSRef unknown{};
    FSIterator iterator = nullptr, other = nullptr;
    UInt32 count = 9;
    SInt32 version = 9;
    LSItemInfoRecord info{9};
    EXPECT_EQ(FSFindFolder(kLocalDomain, kModemScriptsFolderType, false, &folder), noErr);
    EXPECT_EQ(FSOpenIterator(&folder, kFSIterateFlat, &iterator), noErr);
    FSIterator none = iterator;
    Handle const buffer = NewHandle(2);
    void* odd[8] = {};
    odd[wrong] = &info;
    const OSStatus statuses[] = {
        FSGetCatalogInfoBulk(wrong == 1 ? nullptr : iterator, wrong != 2, wrong == 3 ? nullptr : &count,
                             static_cast<Boolean*>(odd[4]), wrong == 5, odd[6], &item, odd[7], nullptr),
        FSFindFolder(wrong == 1 ? 0 : kLocalDomain, wrong == 2 ? 1 : kModemScriptsFolderType, wrong == 3,
                     wrong == 4 ? nullptr : &found),
        FSOpenIterator(wrong == 1 ? &unknown : &folder, wrong == 2, wrong == 3 ? nullptr : &other),
        FSOpenIterator(wrong == 4 ? nullptr : &folder, 1, &none),
        LSCopyItemInfoForRef(wrong == 1 ? &unknown : &item, wrong == 2 ? 0 : 4, wrong == 3 ? nullptr : &info),
        LSCopyItemInfoForRef(wrong == 4 ? nullptr : &unknown, 4, &info),
        URLSimpleDownload(wrong == 1 ? nullptr : "http://127.0.0.1:1/", odd[2], wrong == 3 ? nullptr : buffer,
                          wrong == 4, odd[5], odd[6]),
        Gestalt(wrong == 1 ? 1 : gestaltSystemVersion, wrong == 2 ? nullptr : &version),
        FSCloseIterator(iterator),
        FSCloseIterator(iterator),
        FSCloseIterator(other)};
    EXPECT_EQ(count, wrong == 0 ? 1U : wrong == 3 ? 9U : 0U);
    EXPECT_EQ(version, wrong == 1 || wrong == 2 ? 9 : 0x1040);
    EXPECT_EQ(GetHandleSize(buffer), wrong % 7 == 0 ? 0 : 2);
    EXPECT_TRUE(NewHandle(-1) == nullptr && none == nullptr);
    DisposeHandle(buffer);
    std::string told;
    for (const OSStatus status : statuses) {
        told += std::to_string(status) + " ";
    }
    return told;
}

// Each line is a command line, in the folder that holds those of the domains; "nobody" looks when it says so.
TEST_F(Folders, TellWhatTheirItemsAre) {
    testing_support::Transcript transcript("folders");
    transcript.replay(
        "what the user, the network, the machine and the system have",
        [this](const std::vector<std::string>& inputs) {
            EXPECT_EQ(std::system(("cd " + directory.path().string() + " && " + inputs[0]).c_str()), 0);
            if (inputs.size() > 1 && getuid() == 0) {
                EXPECT_EQ(seteuid(65534), 0);
            }
            std::string told;
            for (const SInt16 domain : {kUserDomain, kNetworkDomain, kLocalDomain, kSystemDomain}) {
                told += "\n\t" + itemsIn(domain);
            }
            EXPECT_EQ(seteuid(getuid()), 0);
            return told;
        });
    transcript.replay("arguments, the wrong one by its number", statusesWith);
}

TEST_F(Folders, AreInTheHomeOfTheUserWhoIsKnown) {
    if (!testing_support::PrivateNetwork::isAvailable()) {
        LA_SKIP("needs user and mount namespaces");
    }
    directory.write("home/.local/share/modem-scripts/mine", "");
    testing_support::PrivateNetwork::run([this] {
        const platform::HostOverride production{platform::Host()};
        EXPECT_EQ(itemsIn(kUserDomain), "-43");
        std::ofstream("/etc/passwd") << "root:x:0:0::" << directory.at("home") << ":/bin/sh\n";
        EXPECT_EQ(itemsIn(kUserDomain), "mine=1");
        std::ofstream("/etc/passwd") << "";
        EXPECT_EQ(itemsIn(kUserDomain), "-43");
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
        directory.write("local/one more", "");
    }
}

}  // namespace
