#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <netinet/in.h>
#include <sys/socket.h>

#include <chrono>
#include <cstdlib>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "platform/CoreServices.h"
#include "platform/base/FileDescriptor.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"
#include "tests/unit/support/Transcript.h"

namespace {

using namespace std::chrono_literals;

// Long enough for a busy machine where an answer is expected, short where none will come.
constexpr std::chrono::milliseconds patient = 20s;
constexpr std::chrono::milliseconds impatient = 300ms;

using Inputs = testing_support::Transcript::Inputs;

// Treats one connection on loopback as an answer says: what it does when it has said it, and the parts of it.
class Server {
  public:
    explicit Server(const Inputs& answer) : listener_(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
        sockaddr_in place{AF_INET, 0, {htonl(INADDR_LOOPBACK)}, {}};
        auto* generic = reinterpret_cast<sockaddr*>(&place);
        socklen_t length = sizeof place;
        EXPECT_EQ(bind(listener_.get(), generic, length), 0);
        EXPECT_EQ(listen(listener_.get(), 1), 0);
        EXPECT_EQ(getsockname(listener_.get(), generic, &length), 0);
        url = "http://127.0.0.1:" + std::to_string(ntohs(place.sin_port)) + "/mactestfoo.html";
        thread_ = std::thread([this, &answer] { serve(answer); });
    }
    ~Server() { finish(); }

    // What was asked, once the client is gone.
    const std::string& finish() {
        shutdown(listener_.get(), SHUT_RDWR);
        if (thread_.joinable()) {
            thread_.join();
        }
        return request_;
    }

    std::string url;

  private:
    void serve(const Inputs& answer) {
        const platform::FileDescriptor client(accept4(listener_.get(), nullptr, nullptr, SOCK_CLOEXEC));
        char byte = 0;
        while (!request_.ends_with("\r\n\r\n") && recv(client.get(), &byte, 1, 0) == 1) {
            request_ += byte;
        }
        const auto say = [&](const std::string& text) {
            return send(client.get(), text.data(), text.size(), MSG_NOSIGNAL) ==
                   static_cast<ssize_t>(text.size());
        };
        const std::string& then = answer[0];
        for (std::size_t i = 1; i < answer.size() && say(answer[i]); ++i) {
        }
        while ((then == "repeats" || then == "drips") && say(answer.back())) {
            std::this_thread::sleep_for(then == "drips" ? 60ms : 0ms);
        }
        while (then == "is silent" && recv(client.get(), &byte, 1, 0) > 0) {
        }
        if (then == "resets") {
            const linger atOnce{1, 0};
            setsockopt(client.get(), SOL_SOCKET, SO_LINGER, &atOnce, sizeof atOnce);
        }
    }

    platform::FileDescriptor listener_;
    std::string request_;
    std::thread thread_;
};

class Download : public testing::Test {
  protected:
    ~Download() override { DisposeHandle(buffer_); }

    OSStatus fetch(const std::string& url, std::chrono::milliseconds whole,
                   const Inputs& libraries = platform::Host().httpLibraries) {
        platform::Host host;
        host.downloadBound = whole;
        host.httpLibraries = libraries;
        const platform::HostOverride override(host);
        log.clear();
        const auto begin = std::chrono::steady_clock::now();
        const OSStatus err = URLSimpleDownload(url.c_str(), nullptr, buffer_, 0, nullptr, nullptr);
        EXPECT_LT(std::chrono::steady_clock::now() - begin, whole + 5s) << url;
        return err;
    }
    // Of a long one its size.
    [[nodiscard]] std::string content() const {
        const auto size = static_cast<std::size_t>(GetHandleSize(buffer_));
        return size > 99 ? std::to_string(size) + " bytes" : std::string(GetHandleData(buffer_), size);
    }

    std::vector<std::string> log;

  private:
    platform::LogCapture capture_{
        [this](platform::LogLevel, std::string_view line) { log.emplace_back(line); }};
    Handle buffer_ = NewHandle(3);
};

TEST_F(Download, EndsWithinItsBoundsWhateverTheServerDoes) {
    setenv("http_proxy", "http://127.0.0.1:9", 1);
    testing_support::Transcript transcript("downloads");
    for (const auto& [part, whole] :
         {std::pair("the server has its time", patient), std::pair("it takes too long", impatient)}) {
        transcript.replay(part, [this, time = whole](const Inputs& answer) {
            Server server(answer);
            const OSStatus status = fetch(server.url, time);
            EXPECT_EQ(log.size(), status < 0 ? 1U : 0U);
            EXPECT_EQ(server.finish(), "GET /mactestfoo.html HTTP/1.1\r\nHost: " + server.url.substr(7, 15) +
                                           "\r\nUser-Agent: location-assistant\r\nAccept: */*\r\n\r\n");
            return std::to_string(status) + (content().empty() ? "" : " " + content());
        });
    }
    transcript.replay("URLs of nobody",
                      [this](const Inputs& url) { return std::to_string(fetch(url[0], patient)); });
    transcript.replay("libraries that are none", [this](const Inputs& libraries) {
        const OSStatus status = fetch("http://127.0.0.1:9/", patient, libraries);
        return std::to_string(status) + " " + log.at(0).substr(0, log.at(0).rfind(": "));
    });
}

}  // namespace
