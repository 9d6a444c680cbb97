#include <cstdlib>
#include <filesystem>

#include "tests/unit/preferences/Fixture.h"
#include "tests/unit/support/Transcript.h"

namespace preferences_test {
namespace {

using StoreFileTest = StoreTest;

// The statuses of opening the store and of a commit, and what the log says; nothing in the store changes.
TEST_F(StoreFileTest, WhatIsNoStoreOrWhatOthersCanChangeIsRefused) {
    testing_support::Transcript transcript("stores");
    transcript.replay("what somebody does to a good store", [this](const std::vector<std::string>& inputs) {
        std::filesystem::remove_all(directory.path());
        makeStore();
        EXPECT_EQ(chmod(store.c_str(), 0700), 0);
        EXPECT_EQ(std::system(("cd " + directory.path().string() + " && " + inputs[0]).c_str()), 0);
        log.clear();
        const struct stat before = statusOf(file);
        const SessionRef session = open();
        std::string told = "open " + std::to_string(SCError());
        if (session) {
            EXPECT_FALSE(set(session, "/Sets/1", "new") && commit(session));
            told += ", commit " + std::to_string(SCError());
        }
        const struct stat after = statusOf(file);
        EXPECT_TRUE(session
                        ? contentOf(file) == smallTree
                        : before.st_ino == after.st_ino && before.st_ctim.tv_nsec == after.st_ctim.tv_nsec);
        for (std::string line : log) {
            for (std::size_t at = 0; (at = line.find(directory.path().string())) != std::string::npos;) {
                line.replace(at, directory.path().string().size(), "");
            }
            told += "; " + line;
        }
        return told;
    });
}

TEST_F(StoreFileTest, TheFirstRunTreeIsCommittedAsItIs) {
    SessionRef session = open();
    ASSERT_TRUE(session);
    EXPECT_FALSE(std::filesystem::exists(store));
    ASSERT_TRUE(commit(session));
    const std::string written = contentOf(file);
    writeStore(written);
    EXPECT_EQ(shown(open()),
              "{CurrentSet = /Sets/0; NetworkServices = {0 = {UserDefinedName = Managed by the system; "
              "Interface = {DeviceName = *; Hardware = System; Type = System}}}; Sets = {0 = "
              "{UserDefinedName = Automatic; Network = {Global = {IPv4 = {PPPOverridePrimary = #0; "
              "ServiceOrder = (0)}; NetInfo = {}}; Service = {0 = {__LINK__ = /NetworkServices/0}}}}}}");
}

TEST_F(StoreFileTest, WhatItWritesIsPrivate) {
    const mode_t before = umask(0);
    for (const mode_t wide : {0600U, 0666U, 0640U}) {
        SessionRef session = open();
        ASSERT_TRUE(set(session, "/Sets/1", std::to_string(wide)) && commit(session));
        EXPECT_EQ(statusOf(store).st_mode & 07777U, 0700U);
        EXPECT_EQ(statusOf(file).st_mode & 07777U, 0600U);
        EXPECT_EQ(statusOf(directory.at("store/preferences.lock")).st_mode & 07777U, 0600U);
        ASSERT_EQ(chmod(file.c_str(), wide), 0);
        (void)open();
        EXPECT_EQ(statusOf(file).st_mode & 07777U, 0600U) << "what an editor or a copy made of it";
        ASSERT_EQ(chmod(file.c_str(), wide), 0);
    }
    umask(before);
}

}  // namespace
}  // namespace preferences_test
