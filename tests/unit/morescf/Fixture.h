// The library on a computer of the test's own: a store in a temporary directory, a made sysfs, script
// folders, and an agent that records what is applied.
#pragma once

#include <gtest/gtest.h>

#include <cstdint>
#include <fstream>
#include <iterator>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCF.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"
#include "platform/values/PropertyListXML.h"
#include "tests/unit/support/Notation.h"
#include "tests/unit/support/RecordingAgent.h"
#include "tests/unit/support/SysfsTree.h"
#include "tests/unit/support/TemporaryDirectory.h"

namespace morescf_test {

using testing_support::read;
using testing_support::show;
using testing_support::Value;

// A string that lives as long as the test.
class Str {
  public:
    explicit Str(std::string_view text) : value_(platform::values::makeString(text)) {}
    operator CFStringRef() const { return value_.get(); }

  private:
    platform::values::Owned<CFStringRef> value_;
};

// Receives an output, shows it and gives it back. One that was never written reads "untouched".
template <class Ref>
class Output {
  public:
    Output() = default;
    ~Output() { reset(); }
    Output(const Output&) = delete;
    Output& operator=(const Output&) = delete;

    Ref* operator&() {
        reset();
        return &value_;
    }
    operator Ref() const { return value_; }
    [[nodiscard]] std::string shown() const { return value_ == untouched() ? "untouched" : show(value_); }
    void reset() {
        if (value_ != untouched()) {
            CFQRelease(value_);
        }
        value_ = untouched();
    }

  private:
    static Ref untouched() { return reinterpret_cast<Ref>(static_cast<std::uintptr_t>(16)); }
    Ref value_ = untouched();
};

inline CFArrayRef arrayOf(const Value& value) {
    return static_cast<CFArrayRef>(value.get());
}

class MoreSCFTest : public testing::Test {
  protected:
    MoreSCFTest() : host(makeHost()), override(host) {
        for (const char* interface : {"eth0", "eth1", "eth2", "eth9", "en0", "wlan0"}) {
            agent->machine[interface] = "idle";
        }
    }
    ~MoreSCFTest() override { EXPECT_EQ(nullptr, MoreSCGetSCPreferencesRef()) << "a session is open"; }

    platform::Host makeHost() {
        platform::Host made;
        made.preferencesDirectory = directory.at("store");
        made.runtimeDirectory = directory.at("run");
        made.sysfsRoot = sysfs.root();
        made.userModemScripts = directory.at("scripts/user");
        made.networkModemScripts = directory.at("scripts/network");
        made.localModemScripts = directory.at("scripts/local");
        made.systemModemScripts = directory.at("scripts/system");
        made.agents = {agent};
        return made;
    }

    // The file's content; "none" when it is no property list.
    void setTree(std::string_view notation) const {
        const Value tree = read(notation);
        (void)directory.write("store/preferences.plist",
                              platform::values::writePropertyListXML(tree.get()).value_or("none"));
    }
    [[nodiscard]] std::string tree() const {
        std::ifstream file(directory.at("store/preferences.plist"), std::ios::binary);
        const std::string content{std::istreambuf_iterator<char>(file), {}};
        platform::values::ParseError error;
        return show(platform::values::parsePropertyListXML(content, error).get());
    }
    // Location 1, current, with services 5 (on eth0) and 6; location 2, with service 6 under the ID 60.
    static constexpr const char* twoSets = R"({
        Sets = {1 = {UserDefinedName = Home; Network = {Global = {IPv4 = {PPPOverridePrimary = #0; ServiceOrder = (6, 5)};
                         NetInfo = {}}; Service = {5 = {__LINK__ = /NetworkServices/5}; 6 = {__LINK__ = /NetworkServices/6}}}};
                2 = {UserDefinedName = Away; Network = {Global = {IPv4 = {ServiceOrder = (60)}};
                         Service = {60 = {__LINK__ = /NetworkServices/6}}}}};
        NetworkServices = {5 = {UserDefinedName = Wired; Interface = {DeviceName = eth0; Type = Ethernet}; IPv4 = {ConfigMethod = DHCP}};
                           6 = {UserDefinedName = Dial; Interface = {DeviceName = ttyS0; Type = PPP}; IPv4 = {ConfigMethod = PPP}}};
        CurrentSet = /Sets/1})";

    testing_support::TemporaryDirectory directory;
    testing_support::SysfsTree sysfs;
    std::shared_ptr<testing_support::RecordingAgent> agent =
        std::make_shared<testing_support::RecordingAgent>();
    std::string log;  // the lines, each with its line break
    platform::LogCapture capture{
        [this](platform::LogLevel /*level*/, std::string_view line) { log += std::string(line) + "\n"; }};
    platform::Host host;
    platform::HostOverride override;
};

}  // namespace morescf_test
