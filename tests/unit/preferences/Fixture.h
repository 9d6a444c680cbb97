// A store in a temporary directory, and the faces' operations with less to write.
#pragma once

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <fstream>
#include <iterator>
#include <string>
#include <string_view>
#include <vector>

#include "platform/SystemConfiguration.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"
#include "platform/values/PropertyListXML.h"
#include "platform/values/Values.h"
#include "tests/unit/support/TemporaryDirectory.h"

namespace preferences_test {

using platform::values::as;
using platform::values::makeString;
using platform::values::Owned;

using SessionRef = Owned<SCPreferencesRef>;

inline Owned<CFStringRef> text(std::string_view bytes) {
    return makeString(bytes);
}

// {"Name": name}
inline Owned<CFDictionaryRef> named(std::string_view name) {
    const auto value = text(name);
    const void* key = CFSTR("Name");
    const void* item = value.get();
    return Owned<CFDictionaryRef>::adopt(CFDictionaryCreate(
        nullptr, &key, &item, 1, &kCFTypeDictionaryKeyCallBacks, &kCFTypeDictionaryValueCallBacks));
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

inline Owned<CFPropertyListRef> parsed(std::string_view xml) {
    platform::values::ParseError error;
    auto value = platform::values::parsePropertyListXML(xml, error);
    EXPECT_TRUE(value) << error.reason;
    return value;
}

inline bool set(const SessionRef& session, std::string_view path, std::string_view name) {
    return SCPreferencesPathSetValue(session.get(), text(path).get(), named(name).get()) != 0;
}

// The "Name" in the dictionary at the path; "-" without one.
inline std::string nameAt(const SessionRef& session, std::string_view path) {
    CFDictionaryRef const dictionary = SCPreferencesPathGetValue(session.get(), text(path).get());
    const auto name =
        dictionary != nullptr ? as<CFStringRef>(CFDictionaryGetValue(dictionary, CFSTR("Name"))) : nullptr;
    return name != nullptr ? std::string(platform::values::textOf(name)) : "-";
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
    // A store that holds {"Sets": {"1": {"Name": "one"}}}.
    void makeStore() const { (void)directory.write("store/preferences.plist", smallTree); }
    [[nodiscard]] bool logHas(std::string_view fragment) const {
        for (const std::string& line : log) {
            if (line.find(fragment) != std::string::npos) {
                return true;
            }
        }
        return false;
    }

    static constexpr std::string_view smallTree =
        "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n<dict><key>Sets</key><dict>"
        "<key>1</key><dict><key>Name</key><string>one</string></dict></dict></dict></plist>";

    testing_support::TemporaryDirectory directory;
    std::string store = directory.at("store");
    std::string file = directory.at("store/preferences.plist");
    std::vector<std::string> log;
    platform::HostOverride host{hostIn(directory.path().string())};
    platform::LogCapture capture{
        [this](platform::LogLevel /*level*/, std::string_view line) { log.emplace_back(line); }};
};

}  // namespace preferences_test
