#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <netinet/in.h>
#include <sys/socket.h>

#include <chrono>
#include <cstdlib>
#include <string>
#include <thread>
#include <vector>

#include "platform/base/FileDescriptor.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"
#include "platform/services/Download.h"

namespace {

using namespace std::chrono_literals;

// Long enough for a busy machine where an answer is expected, short where none will come.
constexpr std::chrono::milliseconds patient = 20s;
constexpr std::chrono::milliseconds impatient = 300ms;

enum class Then { close, reset, silence, repeatLast, drip };

struct Answer {
    const char* what;
    std::vector<std::string> parts;
    Then then;
    OSStatus status;
    std::string body = "";
};

// Treats one connection on loopback as the answer says.
class Server {
  public:
    explicit Server(const Answer& answer) : listener_(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
        sockaddr_in place{};
        place.sin_family = AF_INET;
        place.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        auto* generic = reinterpret_cast<sockaddr*>(&place);
        socklen_t length = sizeof place;
        EXPECT_EQ(bind(listener_.get(), generic, length), 0);
        EXPECT_EQ(listen(listener_.get(), 1), 0);
        EXPECT_EQ(getsockname(listener_.get(), generic, &length), 0);
        url = "http://127.0.0.1:" + std::to_string(ntohs(place.sin_port)) + "/mactestfoo.html";
        thread_ = std::thread([this, &answer] { serve(answer); });
    }
    ~Server() { finish(); }
    Server(const Server&) = delete;
    Server& operator=(const Server&) = delete;

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
    void serve(const Answer& answer) {
        const platform::FileDescriptor client(accept4(listener_.get(), nullptr, nullptr, SOCK_CLOEXEC));
        char byte = 0;
        while (!request_.ends_with("\r\n\r\n") && recv(client.get(), &byte, 1, 0) == 1) {
            request_ += byte;
        }
        const auto say = [&](const std::string& text) {
            return send(client.get(), text.data(), text.size(), MSG_NOSIGNAL) ==
                   static_cast<ssize_t>(text.size());
        };
        bool isThere = true;
        for (const std::string& part : answer.parts) {
            isThere = isThere && say(part);
        }
        while ((answer.then == Then::repeatLast || answer.then == Then::drip) && say(answer.parts.back())) {
            std::this_thread::sleep_for(answer.then == Then::drip ? 60ms : 0ms);
        }
        while (answer.then == Then::silence && recv(client.get(), &byte, 1, 0) > 0) {
        }
        if (answer.then == Then::reset) {
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
                   std::vector<std::string> libraries = {"libcurl-gnutls.so.4", "libcurl.so.4"}) {
        platform::Host host;
        host.downloader =
            platform::services::makeHttpDownloader({.connecting = whole / 2, .whole = whole}, libraries);
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

const std::string ok = "HTTP/1.1 200 OK\r\n";
const std::string notFound = "HTTP/1.1 404 Not Found\r\n";
const std::string more = "HTTP/1.1 100 Continue\r\n\r\n";
const std::string chunked = ok + "Transfer-Encoding: chunked\r\n\r\n";
const std::string kilobyte(1024, 'x');

const Answer answers[] = {
    {"whole", {ok + "Content-Length: 5\r\n\r\nhello"}, Then::silence, 0, "hello"},
    {"until the end", {"HTTP/1.0 200 OK\r\n\r\nhel", "lo"}, Then::close, 0, "hello"},
    {"interim answers first", {more, more + notFound + "\r\n"}, Then::silence, 404},
    {"interim answers only", {more}, Then::repeatLast, kURLAnswerTooLargeError},
    {"redirect", {"HTTP/1.1 302 Found\r\nLocation: /elsewhere\r\n\r\n"}, Then::close, 302},
    // What common clients read a 404 from is one.
    {"404 without a reason", {"HTTP/1.0 404\r\nServer: x\r\n", "\r\n"}, Then::close, 404},
    {"404 and nothing behind it", {notFound}, Then::close, 404},
    {"404 and a reset", {notFound}, Then::reset, 404},
    {"404 and silence", {notFound}, Then::silence, 404},
    {"404 that never ends", {notFound + "\r\n", "more "}, Then::repeatLast, 404},
    {"404 with an endless header", {notFound, "X: y\r\n"}, Then::repeatLast, 404},
    {"404 in chunks that are none", {notFound + "Transfer-Encoding: chunked\r\n\r\nbody"}, Then::close, 404},
    // A status line has to end, and to be there.
    {"farewell in the status line", {"HTTP/1.1 404"}, Then::close, kURLConnectionLostError},
    {"silence in the status line", {"HTTP/1.1 404 Not Fo"}, Then::silence, kURLTimedOutError},
    {"document without one", {"<html>404</html>"}, Then::close, kURLMalformedAnswerError},
    {"farewell at once", {}, Then::close, kURLConnectionLostError},
    {"silence in the body", {ok + "Content-Length: 9\r\n\r\nhello"}, Then::silence, kURLTimedOutError},
    {"body in drips", {ok + "\r\n", "x"}, Then::drip, kURLTimedOutError},
    {"farewell in the body", {ok + "Content-Length: 9\r\n\r\nhel"}, Then::close, kURLConnectionLostError},
    {"endless header", {ok, "X: y\r\n"}, Then::repeatLast, kURLAnswerTooLargeError},
    {"endless body", {ok + "\r\n", kilobyte}, Then::repeatLast, kURLAnswerTooLargeError},
    {"endless chunks", {chunked, "400\r\n" + kilobyte + "\r\n"}, Then::repeatLast, kURLAnswerTooLargeError},
    {"10 MB", {ok + "Content-Length: 10485760\r\n\r\n"}, Then::repeatLast, kURLAnswerTooLargeError},
};

TEST_F(Download, EndsWithinItsBoundsWhateverTheServerDoes) {
    setenv("http_proxy", "http://127.0.0.1:9", 1);
    for (const Answer& answer : answers) {
        SCOPED_TRACE(answer.what);
        Server server(answer);
        log.clear();
        EXPECT_EQ(fetch(server.url, answer.status == kURLTimedOutError ? impatient : patient), answer.status);
        EXPECT_EQ(content(), answer.body);
        EXPECT_EQ(log.size(), answer.status < 0 ? 1U : 0U);
        EXPECT_TRUE(server.finish().starts_with("GET /mactestfoo.html HTTP/1.1\r\nHost: 127.0.0.1:"));
    }
}

TEST_F(Download, SaysThatThereIsNoLibrary) {
    EXPECT_EQ(fetch("http://127.0.0.1:9/", patient, {"libc.so.6", "libnothere.so.4"}), kURLClientError);
    ASSERT_EQ(log.size(), 1U);
    EXPECT_NE(log[0].find("libnothere.so.4"), std::string::npos) << log[0];
}

TEST_F(Download, RefusesWhatIsNoPlainHttpUrl) {
    for (const char* url : {"", "https://127.0.0.1/", "file:///etc/passwd"}) {
        EXPECT_EQ(fetch(url, patient), kURLUnsupportedSchemeError) << url;
    }
    for (const char* url :
         {"http:///x", "http://localhost/", "http://user@127.0.0.1/", "http://127.0.0.1:0/",
          "http://127.0.0.1:65536/", "http://127.0.0.1:8x/", "http://127.1/", "http://[::1]x/", "http://::1/",
          "http://127.0.0.1/a b", "http://127.0.0.1/\r\nX: y", "http://127.0.0.1/\xC3\xA9"}) {
        EXPECT_EQ(fetch(url, patient), kURLInvalidURLError) << url;
    }
}

}  // namespace
