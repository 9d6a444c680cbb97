// A store in a temporary directory, in force as long as the object lives.
#pragma once

#include <gtest/gtest.h>

#include <string>
#include <string_view>

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

class StoreTest : public testing::Test {
  protected:
    static SessionRef open() {
        return SessionRef::adopt(SCPreferencesCreate(nullptr, CFSTR("tester"), nullptr));
    }
    // Puts the value at the path.
    static bool set(const SessionRef& session, std::string_view path, std::string_view value) {
        return SCPreferencesPathSetValue(session.get(), text(path).get(),
                                         as<CFDictionaryRef>(read(value).get())) != 0;
    }
    static bool commit(const SessionRef& session) { return SCPreferencesCommitChanges(session.get()) != 0; }
    static std::string shown(const SessionRef& session, std::string_view path) {
        return show(SCPreferencesPathGetValue(session.get(), text(path).get()));
    }
    // A store that holds {Sets = {1 = {Name = one}}}.
    void makeStore() const { (void)directory.write("store/preferences.plist", smallTree); }

    static constexpr std::string_view smallTree =
        "<plist version=\"1.0\">\n<dict><key>Sets</key><dict><key>1</key><dict><key>Name</key>"
        "<string>one</string></dict></dict></dict></plist>";

    testing_support::TemporaryDirectory directory;
    std::string log;  // the lines since somebody emptied it
    platform::Host host = [this] {
        platform::Host made;
        made.preferencesDirectory = directory.at("store");
        return made;
    }();
    platform::HostOverride inForce{host};
    platform::LogCapture capture{[this](platform::LogLevel /*level*/, std::string_view line) {
        log += "\n    " + std::string(line);
        const std::string root = directory.path().string();
        for (std::size_t at = 0; (at = log.find(root)) != std::string::npos;) {
            log.replace(at, root.size(), "");
        }
    }};
};

}  // namespace preferences_test
