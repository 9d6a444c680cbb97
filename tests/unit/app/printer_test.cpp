#include <gtest/gtest.h>

#include <cstdio>
#include <memory>
#include <string>
#include <vector>

#include "app/ArvAssistant.h"
#include "app/Printer.h"
#include "app/Trace.h"
#include "platform/base/Host.h"
#include "platform/live/NetworkState.h"
#include "platform/services/Download.h"
#include "platform/services/Opener.h"

namespace {

using namespace platform;

// Plays a list of answers, the last one for ever.
struct Answers : live::NetworkState, services::Downloader, services::Opener {
    std::vector<bool> reachable = {false};
    std::vector<OSStatus> downloads = {404};
    std::size_t queries = 0;
    std::size_t probes = 0;
    std::vector<std::string> opened;

    Outcome primaryRoute(std::optional<live::PrimaryRoute>&) override { return {}; }
    Outcome reach(const live::Destination&, live::Reach& route) override {
        route.isReachable = reachable[std::min(queries++, reachable.size() - 1)];
        return {};
    }
    Outcome subscribe(std::unique_ptr<live::Notices>&) override { return {kSCStatusFailed, "not here"}; }
    OSStatus fetch(std::string_view url, std::string&) override {
        EXPECT_EQ(url, "http://192.0.0.192/mactestfoo.html");
        return downloads[std::min(probes++, downloads.size() - 1)];
    }
    OSStatus open(const std::string& url) override {
        opened.push_back(url);
        return fnfErr;
    }
};

class Printer : public testing::Test {
  protected:
    Printer() {
        Host host;
        host.networkState = answers_;
        host.downloader = answers_;
        host.opener = answers_;
        override_ = std::make_unique<HostOverride>(host);
    }

    std::string traceOf(int (*check)(int), int tries, int* result) {
        testing::internal::CaptureStdout();
        *result = check(tries);
        return testing::internal::GetCapturedStdout();
    }

    std::shared_ptr<Answers> answers_ = std::make_shared<Answers>();
    std::unique_ptr<HostOverride> override_;
};

TEST_F(Printer, IsAskedForByNameAndThenByAddressUntilThereIsARoute) {
    answers_->reachable = {false, false, false, true};
    int reachable = -1;
    EXPECT_EQ(traceOf(IsWirelessPrinterReachableViaSCF, 5, &reachable),
              "IsWirelessPrinterReachableViaSCF() try 0\n"
              "from SCNetworkCheckReachabilityByName(), flags = 0\n"
              "from SCNetworkCheckReachabilityByAddress(), flags = 0\n"
              "IsWirelessPrinterReachableViaSCF() try 1\n"
              "from SCNetworkCheckReachabilityByName(), flags = 0\n"
              "from SCNetworkCheckReachabilityByAddress(), flags = 2\n"
              "IsWirelessPrinterReachableViaSCF(): reachable=1\n");
    EXPECT_EQ(reachable, 1);
}

TEST_F(Printer, IsFoundByTheAnswerThatItHasNoSuchPage) {
    answers_->downloads = {-1, 404};
    int reachable = -1;
    EXPECT_EQ(traceOf(IsWirelessPrinterReachableViaHTTP, 3, &reachable),
              "Looking for the device at 192.0.0.192\n"
              "IsWirelessPrinterReachableViaHTTP() try 0\n"
              "*** Device NOT found (result = -1) ****\n"
              "IsWirelessPrinterReachableViaHTTP() try 1\n"
              "Device found (result = 404)\n");
    EXPECT_EQ(reachable, 1);

    answers_->downloads = {0};
    EXPECT_EQ(traceOf(IsWirelessPrinterReachableViaHTTP, 1, &reachable),
              "Looking for the device at 192.0.0.192\n"
              "IsWirelessPrinterReachableViaHTTP() try 0\n"
              "*** Device NOT found (result = 0) ****\n"
              "*** Bailing out (tries = 1) ****\n");
    EXPECT_EQ(reachable, 0);
}

TEST_F(Printer, PromptWaitsForYes) {
    const struct {
        const char* typed;
        const char* shown;
    } rows[] = {
        {"y\n", "Done yet? <y/n>"},
        {"n\ny\n", "Done yet? <y/n>Done yet? <y/n>"},
        {"\r\n\ny\n", "Done yet? <y/n>Done yet? <y/n>Done yet? <y/n>Done yet? <y/n>"},
        {"x\ny\n", "Done yet? <y/n>bad character entered: x\nDone yet? <y/n>"},
        // The character behind an answer is eaten whatever it is.
        {"nyy\n", "Done yet? <y/n>Done yet? <y/n>"},
        {"Y\ny\n", "Done yet? <y/n>bad character entered: Y\nDone yet? <y/n>"},
    };
    std::FILE* const terminal = stdin;
    for (const auto& row : rows) {
        std::string typed = row.typed;
        stdin = fmemopen(typed.data(), typed.size(), "r");
        testing::internal::CaptureStdout();
        EXPECT_EQ(WaitForUserToBeDone(), 0);
        EXPECT_EQ(testing::internal::GetCapturedStdout(), row.shown);
        std::fclose(stdin);
    }
    stdin = terminal;
}

TEST_F(Printer, PageThatCannotBeOpenedIsPassedOver) {
    OpenConfigurationPage();
    EXPECT_EQ(answers_->opened, std::vector<std::string>{"http://192.0.0.192/dot11_config_start.htm"});

    const char first = gQF_config_URL1[0];
    gQF_config_URL1[0] = ' ';
    OpenConfigurationPage();
    gQF_config_URL1[0] = first;
    EXPECT_EQ(answers_->opened.size(), 1U);
}

}  // namespace
