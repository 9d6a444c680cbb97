#include <gtest/gtest.h>

#include <chrono>
#include <cstdlib>
#include <string>
#include <vector>

#include "platform/Host.h"
#include "platform/Log.h"
#include "platform/services/Download.h"
#include "tests/unit/services/LoopbackServer.h"

namespace {

using platform::services::DownloadBounds;
using testing_support::LoopbackServer;
using namespace std::chrono_literals;

// Long enough for a busy machine where an answer is expected, short where none will come.
constexpr std::chrono::milliseconds patient = 20s;
constexpr std::chrono::milliseconds impatient = 300ms;

class Download : public testing::Test {
  protected:
    ~Download() override { DisposeHandle(buffer_); }

    OSStatus fetch(const std::string& url, std::chrono::milliseconds whole = patient) {
        DownloadBounds bounds;
        bounds.whole = whole;
        bounds.connecting = whole / 2;
        platform::Host host;
        host.downloader = platform::services::makeHttpDownloader(bounds);
        const platform::HostOverride override(host);
        const auto begin = std::chrono::steady_clock::now();
        const OSStatus err = URLSimpleDownload(url.c_str(), nullptr, buffer_, 0, nullptr, nullptr);
        EXPECT_LT(std::chrono::steady_clock::now() - begin, whole + 5s) << url;
        return err;
    }
    [[nodiscard]] std::string content() const {
        return {GetHandleData(buffer_), static_cast<std::size_t>(GetHandleSize(buffer_))};
    }

    std::vector<std::string> log;

  private:
    platform::LogCapture capture_{
        [this](platform::LogLevel, std::string_view line) { log.emplace_back(line); }};
    Handle buffer_ = NewHandle(3);
};

enum class Then { close, reset, silence, repeatLast };

struct Answer {
    const char* what;
    std::vector<std::string> parts;
    Then then;
    OSStatus status;
    std::string body;
};

std::string megabytes(std::size_t count) {
    return std::string(count * 1024 * 1024, 'x');
}

const Answer answers[] = {
    {"whole", {"HTTP/1.1 200 OK\r\nContent-Length: 5\r\n\r\nhello"}, Then::silence, 0, "hello"},
    {"without content", {"HTTP/1.1 204 No Content\r\n\r\n"}, Then::silence, 0, ""},
    {"until the end, HTTP/1.0", {"HTTP/1.0 200 OK\r\n\r\nhel", "lo"}, Then::close, 0, "hello"},
    {"in chunks",
     {"HTTP/1.1 200 OK\r\nTransfer-Encoding: chunked\r\n\r\n3\r\nhel\r\n", "2\r\nlo\r\n0\r\n\r\n"},
     Then::silence,
     0,
     "hello"},
    {"interim answers first",
     {"HTTP/1.1 100 Continue\r\n\r\n", "HTTP/1.1 103 Early Hints\r\nLink: x\r\n\r\nHTTP/1.1 404 No\r\n\r\n"},
     Then::silence,
     404,
     ""},
    {"interim answers only",
     {"HTTP/1.1 100 Continue\r\n\r\n"},
     Then::repeatLast,
     kURLAnswerTooLargeError,
     ""},
    {"404 with a body", {"HTTP/1.1 404 Not Found\r\nContent-Length: 4\r\n\r\ngone"}, Then::close, 404, ""},
    {"404 without", {"HTTP/1.1 404 Not Found\r\nContent-Length: 0\r\n\r\n"}, Then::close, 404, ""},
    {"404 without a reason", {"HTTP/1.0 404 \r\n\r\n"}, Then::close, 404, ""},
    {"404 without the blank either", {"HTTP/1.0 404\r\nServer: x\r\n", "\r\n"}, Then::silence, 404, ""},
    {"nothing behind the status", {"HTTP/1.0 200\r\n\r\nhello"}, Then::close, 0, "hello"},
    {"a status that is none", {"HTTP/1.0 4x4\r\n\r\n"}, Then::silence, kURLMalformedAnswerError, ""},
    {"404 cut short", {"HTTP/1.1 404 Not Found\r\nContent-Length: 4\r\n\r\n"}, Then::reset, 404, ""},
    {"404 that never ends", {"HTTP/1.1 404 Not Found\r\n\r\n", "more "}, Then::repeatLast, 404, ""},
    {"404 of 10 MB", {"HTTP/1.1 404 Not Found\r\nContent-Length: 10485760\r\n\r\n"}, Then::silence, 404, ""},
    {"redirect", {"HTTP/1.1 302 Found\r\nLocation: /nothing\r\n\r\n"}, Then::close, 302, ""},
    {"server's failure", {"HTTP/1.1 500 Oh\r\n\r\n"}, Then::close, 500, ""},
    {"silence", {}, Then::silence, kURLTimedOutError, ""},
    {"silence in the header", {"HTTP/1.1 404 Not Fo"}, Then::silence, kURLTimedOutError, ""},
    {"silence in the body",
     {"HTTP/1.1 200 OK\r\nContent-Length: 9\r\n\r\nhello"},
     Then::silence,
     kURLTimedOutError,
     ""},
    {"farewell at once", {}, Then::close, kURLConnectionLostError, ""},
    {"reset in the header", {"HTTP/1.1 404 Not Fo"}, Then::reset, kURLConnectionLostError, ""},
    {"farewell in the header", {"HTTP/1.1 404 Not Found\r\n"}, Then::close, kURLConnectionLostError, ""},
    {"farewell in the body",
     {"HTTP/1.1 200 OK\r\nContent-Length: 9\r\n\r\nhello"},
     Then::close,
     kURLConnectionLostError,
     ""},
    {"endless header", {"HTTP/1.1 200 OK\r\n", "X: y\r\n"}, Then::repeatLast, kURLAnswerTooLargeError, ""},
    {"endless header line",
     {"HTTP/1.1 200 OK\r\nX: ", "yyyyyyy"},
     Then::repeatLast,
     kURLAnswerTooLargeError,
     ""},
    {"endless body",
     {"HTTP/1.1 200 OK\r\n\r\n", megabytes(1)},
     Then::repeatLast,
     kURLAnswerTooLargeError,
     ""},
    {"endless chunks",
     {"HTTP/1.1 200 OK\r\nTransfer-Encoding: chunked\r\n\r\n", "400\r\n" + std::string(0x400, 'x') + "\r\n"},
     Then::repeatLast,
     kURLAnswerTooLargeError,
     ""},
    {"endless chunk extension",
     {"HTTP/1.1 200 OK\r\nTransfer-Encoding: chunked\r\n\r\n5;a=", "bbbbbbbb"},
     Then::repeatLast,
     kURLAnswerTooLargeError,
     ""},
    {"10 MB",
     {"HTTP/1.1 200 OK\r\nContent-Length: 10485760\r\n\r\n", megabytes(10)},
     Then::close,
     kURLAnswerTooLargeError,
     ""},
    {"not HTTP", {"SSH-2.0-OpenSSH_9.2\r\n\r\n"}, Then::silence, kURLMalformedAnswerError, ""},
    {"zero bytes", {std::string(64, '\0')}, Then::silence, kURLMalformedAnswerError, ""},
    {"two lengths",
     {"HTTP/1.1 200 OK\r\nContent-Length: 1\r\nContent-Length: 2\r\n\r\nab"},
     Then::silence,
     kURLMalformedAnswerError,
     ""},
};

TEST_F(Download, EndsWithinItsBoundsWhateverTheServerDoes) {
    for (const Answer& answer : answers) {
        SCOPED_TRACE(answer.what);
        std::string request;
        LoopbackServer server([&](int connection, const std::string& received) {
            request = received;
            bool isThere = true;
            for (const std::string& part : answer.parts) {
                isThere = isThere && LoopbackServer::say(connection, part);
            }
            while (answer.then == Then::repeatLast && LoopbackServer::say(connection, answer.parts.back())) {
            }
            if (answer.then == Then::silence) {
                LoopbackServer::waitForEnd(connection);
            }
            if (answer.then == Then::reset) {
                LoopbackServer::resetConnection(connection);
            }
        });
        log.clear();
        EXPECT_EQ(
            fetch(server.url("/mactestfoo.html"), answer.status == kURLTimedOutError ? impatient : patient),
            answer.status);
        EXPECT_EQ(content(), answer.body);
        EXPECT_EQ(log.size(), answer.status < 0 ? 1U : 0U);
        EXPECT_TRUE(request.starts_with("GET /mactestfoo.html HTTP/1.1\r\nHost: 127.0.0.1:")) << request;
    }
}

TEST_F(Download, SlowDripsDoNotMoveTheDeadline) {
    const std::pair<const char*, const char*> drips[] = {{"HTTP/1.1 200 OK\r\n\r\n", "x"},
                                                         {"", "HTTP/1.1 100 Continue\r\n\r\n"}};
    for (const auto& row : drips) {
        LoopbackServer server([&](int connection, const std::string&) {
            LoopbackServer::say(connection, row.first);
            while (LoopbackServer::say(connection, row.second)) {
                std::this_thread::sleep_for(60ms);
            }
        });
        EXPECT_EQ(fetch(server.url("/"), impatient), kURLTimedOutError);
        EXPECT_EQ(content(), "");
    }
}

TEST_F(Download, TalksIPv6AndDropsTheFragment) {
    std::string request;
    LoopbackServer server(
        [&](int connection, const std::string& received) {
            request = received;
            LoopbackServer::say(connection, "HTTP/1.1 200 OK\r\nContent-Length: 2\r\n\r\nv6");
        },
        "::1");
    EXPECT_EQ(fetch("HTTP://[::1]:" + std::to_string(server.port()) + "?a=b#c"), 0);
    EXPECT_EQ(content(), "v6");
    EXPECT_TRUE(request.starts_with("GET /?a=b HTTP/1.1\r\n")) << request;
}

TEST_F(Download, AsksNoProxy) {
    int proxied = 0;
    LoopbackServer proxy([&](int, const std::string&) { ++proxied; });
    setenv("http_proxy", proxy.url("").c_str(), 1);
    setenv("ALL_PROXY", proxy.url("").c_str(), 1);
    LoopbackServer server([](int connection, const std::string&) {
        LoopbackServer::say(connection, "HTTP/1.1 404 Not Found\r\n\r\n");
    });
    EXPECT_EQ(fetch(server.url("/")), 404);
    unsetenv("http_proxy");
    unsetenv("ALL_PROXY");
    EXPECT_EQ(proxied, 0);
}

TEST_F(Download, TellsARefusalFromAServerThatDoesNotAccept) {
    std::string refused;
    {
        LoopbackServer gone([](int, const std::string&) {});
        refused = gone.url("/");
    }
    EXPECT_EQ(fetch(refused), kURLUnreachableError);

    const platform::FileDescriptor listener(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    auto* generic = reinterpret_cast<sockaddr*>(&address);
    socklen_t length = sizeof address;
    ASSERT_EQ(bind(listener.get(), generic, length), 0);
    ASSERT_EQ(listen(listener.get(), 0), 0);
    ASSERT_EQ(getsockname(listener.get(), generic, &length), 0);
    std::vector<platform::FileDescriptor> queue;
    for (int i = 0; i < 4; ++i) {
        queue.emplace_back(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
        static_cast<void>(connect(queue.back().get(), generic, length));
    }
    EXPECT_EQ(fetch("http://127.0.0.1:" + std::to_string(ntohs(address.sin_port)) + "/", impatient),
              kURLTimedOutError);
}

TEST_F(Download, RefusesWhatIsNoPlainHttpUrl) {
    const std::pair<const char*, OSStatus> urls[] = {
        {"", kURLUnsupportedSchemeError},
        {"https://127.0.0.1/", kURLUnsupportedSchemeError},
        {"file:///etc/passwd", kURLUnsupportedSchemeError},
        {"http:/127.0.0.1/", kURLUnsupportedSchemeError},
        {"http://", kURLInvalidURLError},
        {"http:///x", kURLInvalidURLError},
        {"http://localhost/", kURLInvalidURLError},
        {"http://user@127.0.0.1/", kURLInvalidURLError},
        {"http://127.0.0.1:0/", kURLInvalidURLError},
        {"http://127.0.0.1:65536/", kURLInvalidURLError},
        {"http://127.0.0.1:/", kURLInvalidURLError},
        {"http://127.0.0.1:8x/", kURLInvalidURLError},
        {"http://127.0.0.1:-8/", kURLInvalidURLError},
        {"http://127.1/", kURLInvalidURLError},
        {"http://[::1/", kURLInvalidURLError},
        {"http://[::1]x/", kURLInvalidURLError},
        {"http://::1/", kURLInvalidURLError},
        {"http://[127.0.0.1]/", kURLInvalidURLError},
        {"http://127.0.0.1/a b", kURLInvalidURLError},
        {"http://127.0.0.1/\r\nX: y", kURLInvalidURLError},
        {"http://127.0.0.1/\xC3\xA9", kURLInvalidURLError},
    };
    for (const auto& [url, status] : urls) {
        EXPECT_EQ(fetch(url), status) << url;
    }
    EXPECT_EQ(fetch("http://127.0.0.1/" + std::string(3000, 'x')), kURLInvalidURLError);
}

TEST(Buffer, IsKnownOnlyBetweenItsMakingAndItsDisposal) {
    EXPECT_EQ(NewHandle(-1), nullptr);
    const Handle buffer = NewHandle(2);
    ASSERT_NE(buffer, nullptr);
    EXPECT_EQ(std::string(GetHandleData(buffer), 2), std::string(2, '\0'));
    EXPECT_EQ(URLSimpleDownload("http://x/", "file", buffer, 0, nullptr, nullptr), paramErr);
    EXPECT_EQ(URLSimpleDownload(nullptr, nullptr, buffer, 0, nullptr, nullptr), paramErr);
    EXPECT_EQ(GetHandleSize(buffer), 2);
    DisposeHandle(buffer);
    EXPECT_EQ(URLSimpleDownload("http://x/", nullptr, buffer, 0, nullptr, nullptr), paramErr);
}

}  // namespace
