#include <gtest/gtest.h>

#include <cstdio>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "app/ArvAssistant.h"
#include "app/Printer.h"
#include "app/Trace.h"
#include "platform/base/Host.h"
#include "platform/live/NetworkState.h"
#include "platform/services/Download.h"
#include "platform/services/Opener.h"
#include "tests/unit/support/Transcript.h"

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

    std::shared_ptr<Answers> answers_ = std::make_shared<Answers>();
    std::unique_ptr<HostOverride> override_;
};

TEST_F(Printer, IsReachableByARouteAndFoundByItsAnswer) {
    testing_support::Transcript transcript("printer");
    const auto record = [&transcript](const char* what, int (*check)(int), int tries) {
        testing::internal::CaptureStdout();
        const int answer = check(tries);
        transcript.add(std::string("=== ") + what + ": " + std::to_string(answer) + "\n" +
                       testing::internal::GetCapturedStdout());
    };
    record("no route", IsWirelessPrinterReachableViaSCF, 1);
    answers_->reachable = {false, false, false, true};
    answers_->queries = 0;
    record("a route at the fourth question", IsWirelessPrinterReachableViaSCF, 5);
    answers_->reachable = {true};
    record("a route at once", IsWirelessPrinterReachableViaSCF, 5);
    answers_->downloads = {-1, 404};
    record("there is no such page, at the second try", IsWirelessPrinterReachableViaHTTP, 3);
    answers_->downloads = {0};
    record("there is such a page", IsWirelessPrinterReachableViaHTTP, 1);
}

TEST_F(Printer, PromptWaitsForYes) {
    const std::string ask = "Done yet? <y/n>", bad = "bad character entered: ";
    const std::pair<const char*, std::string> rows[] = {
        {"n\ny\n", ask + ask},
        {"\r\n\ny\n", ask + ask + ask + ask},
        {"x\ny\n", ask + bad + "x\n" + ask},
        {"nyy\n", ask + ask},  // the character behind an answer is eaten whatever it is
        {"Y\ny\n", ask + bad + "Y\n" + ask},
    };
    std::FILE* const terminal = stdin;
    for (const auto& [text, shown] : rows) {
        std::string typed = text;
        stdin = fmemopen(typed.data(), typed.size(), "r");
        testing::internal::CaptureStdout();
        EXPECT_EQ(WaitForUserToBeDone(), 0);
        EXPECT_EQ(testing::internal::GetCapturedStdout(), shown);
        std::fclose(stdin);
    }
    stdin = terminal;
}

TEST_F(Printer, APageThatCannotBeOpenedIsNoFailure) {
    OpenConfigurationPage();
    EXPECT_EQ(answers_->opened, std::vector<std::string>{"http://192.0.0.192/dot11_config_start.htm"});

    const char first = gQF_config_URL1[0];
    gQF_config_URL1[0] = ' ';
    OpenConfigurationPage();
    gQF_config_URL1[0] = first;
    EXPECT_EQ(answers_->opened.size(), 1U);
}

}  // namespace
