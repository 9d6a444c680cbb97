// A store in a temporary directory, and the faces' operations with less to write.
#pragma once

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <algorithm>
#include <fstream>
#include <iterator>
#include <string>
#include <string_view>
#include <vector>

#include "platform/SystemConfiguration.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"
#include "tests/unit/support/Notation.h"
#include "tests/unit/support/TemporaryDirectory.h"

namespace preferences_test {

using platform::values::as;
using platform::values::Owned;
using testing_support::read;
using testing_support::show;

using SessionRef = Owned<SCPreferencesRef>;

inline Owned<CFStringRef> text(std::string_view bytes) {
    return platform::values::makeString(bytes);
}

inline std::string contentOf(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

inline struct stat statusOf(const std::string& path) {
    struct stat status {};
    EXPECT_EQ(lstat(path.c_str(), &status), 0) << path;
    return status;
}

// Puts {Name = name} at the path.
inline bool set(const SessionRef& session, std::string_view path, std::string_view name) {
    const auto value = Owned<CFMutableDictionaryRef>::adopt(CFDictionaryCreateMutable(
        nullptr, 0, &kCFTypeDictionaryKeyCallBacks, &kCFTypeDictionaryValueCallBacks));
    CFDictionarySetValue(value.get(), CFSTR("Name"), text(name).get());
    return SCPreferencesPathSetValue(session.get(), text(path).get(), value.get()) != 0;
}

inline std::string shown(const SessionRef& session, std::string_view path = "/") {
    return show(SCPreferencesPathGetValue(session.get(), text(path).get()));
}

// The "Name" in the dictionary at the path; "-" without one.
inline std::string nameAt(const SessionRef& session, std::string_view path) {
    CFDictionaryRef const dictionary = SCPreferencesPathGetValue(session.get(), text(path).get());
    const void* name = nullptr;
    const bool isThere =
        dictionary != nullptr && CFDictionaryGetValueIfPresent(dictionary, CFSTR("Name"), &name) != 0;
    return isThere ? show(name) : "-";
}

class StoreTest : public testing::Test {
  protected:
    [[nodiscard]] static platform::Host hostIn(const std::string& directory) {
        platform::Host host;
        host.preferencesDirectory = directory + "/store";
        host.runtimeDirectory = directory + "/run";
        return host;
    }
    static SessionRef open() {
        return SessionRef::adopt(SCPreferencesCreate(nullptr, CFSTR("tester"), nullptr));
    }
    static bool commit(const SessionRef& session) { return SCPreferencesCommitChanges(session.get()) != 0; }
    void writeStore(std::string_view content) const {
        (void)directory.write("store/preferences.plist", content);
    }
    // A store that holds {Sets = {1 = {Name = one}}}.
    void makeStore() const { writeStore(smallTree); }
    [[nodiscard]] bool logHas(std::string_view fragment) const {
        return std::ranges::any_of(
            log, [&](const std::string& line) { return line.find(fragment) != std::string::npos; });
    }

    static constexpr std::string_view smallTree =
        "<plist version=\"1.0\">\n<dict><key>Sets</key><dict><key>1</key><dict><key>Name</key>"
        "<string>one</string></dict></dict></dict></plist>";

    testing_support::TemporaryDirectory directory;
    std::string store = directory.at("store");
    std::string file = directory.at("store/preferences.plist");
    std::vector<std::string> log;
    platform::HostOverride host{hostIn(directory.path().string())};
    platform::LogCapture capture{
        [this](platform::LogLevel /*level*/, std::string_view line) { log.emplace_back(line); }};
};

}  // namespace preferences_test
