#include <algorithm>
#include <array>
#include <boost/asio/buffer.hpp>
#include <boost/asio/io_context.hpp>
#include <boost/asio/ip/address.hpp>
#include <boost/asio/ip/tcp.hpp>
#include <boost/beast/core/flat_buffer.hpp>
#include <boost/beast/http/empty_body.hpp>
#include <boost/beast/http/error.hpp>
#include <boost/beast/http/message.hpp>
#include <boost/beast/http/parser.hpp>
#include <boost/beast/http/read.hpp>
#include <boost/beast/http/string_body.hpp>
#include <boost/beast/http/write.hpp>
#include <charconv>
#include <cstdint>
#include <limits>
#include <optional>
#include <utility>

#include "platform/Log.h"
#include "platform/services/Download.h"

namespace platform::services {
namespace {

namespace asio = boost::asio;
namespace http = boost::beast::http;
using Error = boost::system::error_code;
using Clock = std::chrono::steady_clock;

struct Address {
    asio::ip::tcp::endpoint endpoint;
    std::string authority;  // as the Host field wants it
    std::string target;
};

// 0, or a status of the download with the address unset.
OSStatus parse(std::string_view url, Address& address) {
    constexpr std::size_t longest = 2048;
    constexpr std::string_view scheme = "http://";
    const bool isPlain = url.size() <= longest &&
                         std::all_of(url.begin(), url.end(), [](char c) { return c > 0x20 && c < 0x7F; });
    if (!isPlain) {
        return kURLInvalidURLError;
    }
    const auto sameLetter = [](char lhs, char rhs) {
        return (lhs >= 'A' && lhs <= 'Z' ? lhs + 32 : lhs) == rhs;
    };
    if (url.size() < scheme.size() || !std::equal(scheme.begin(), scheme.end(), url.begin(),
                                                  [&](char lhs, char rhs) { return sameLetter(rhs, lhs); })) {
        return kURLUnsupportedSchemeError;
    }
    url.remove_prefix(scheme.size());
    url = url.substr(0, url.find('#'));
    const std::size_t authorityEnd = std::min(url.find_first_of("/?"), url.size());
    const std::string_view authority = url.substr(0, authorityEnd);
    const std::string_view rest = url.substr(authorityEnd);

    const bool isBracketed = authority.starts_with('[');
    const std::size_t hostEnd =
        isBracketed ? authority.find(']') : std::min(authority.find(':'), authority.size());
    if (hostEnd == std::string_view::npos) {
        return kURLInvalidURLError;
    }
    const std::string_view host = authority.substr(isBracketed ? 1 : 0, hostEnd - (isBracketed ? 1 : 0));
    std::string_view port = authority.substr(hostEnd + (isBracketed ? 1 : 0));
    std::uint16_t portNumber = 80;
    if (!port.empty()) {
        const char* end = port.data() + port.size();
        const auto [stop, error] = std::from_chars(port.data() + 1, end, portNumber);
        if (port.front() != ':' || error != std::errc() || stop != end || portNumber == 0) {
            return kURLInvalidURLError;
        }
    }
    Error error;
    const asio::ip::address ip = isBracketed
                                     ? asio::ip::address(asio::ip::make_address_v6(std::string(host), error))
                                     : asio::ip::address(asio::ip::make_address_v4(std::string(host), error));
    if (error) {
        return kURLInvalidURLError;
    }
    address.endpoint = {ip, portNumber};
    address.authority = authority;
    address.target = rest.starts_with('/') ? rest : "/" + std::string(rest);
    return 0;
}

OSStatus statusFor(const Error& error) {
    if (error == asio::error::timed_out) {
        return kURLTimedOutError;
    }
    if (error == http::error::header_limit || error == http::error::body_limit ||
        error == http::error::buffer_overflow) {
        return kURLAnswerTooLargeError;
    }
    if (error == http::error::end_of_stream || error == http::error::partial_message ||
        error == asio::error::connection_reset || error == asio::error::eof ||
        error == asio::error::broken_pipe) {
        return kURLConnectionLostError;
    }
    if (error.category() == make_error_code(http::error::bad_version).category()) {
        return kURLMalformedAnswerError;
    }
    return kURLUnreachableError;
}

// One document over one connection. Every step is given up at its deadline.
class Transfer {
  public:
    Transfer(const Address& address, const DownloadBounds& bounds)
        : address_(address),
          bounds_(bounds),
          end_(Clock::now() + bounds.whole),
          buffer_(bounds.headerBytes) {}

    // The HTTP status, or nothing with the error set.
    std::optional<unsigned> run(std::string& body, Error& error) {
        error = connect();
        if (!error) {
            error = sendRequest();
        }
        for (int interim = 0; !error && interim <= bounds_.interimAnswers; ++interim) {
            error = readHeader();
            const unsigned status = error ? 0 : parser_->get().result_int();
            constexpr unsigned switchingProtocols = 101;
            if (error || (status >= 100 && status < 200 && status != switchingProtocols)) {
                continue;
            }
            if (status >= 200 && status < 300) {
                error = readBody(body);
            }
            return error ? std::nullopt : std::optional(status);
        }
        if (!error) {
            error = http::error::header_limit;
        }
        return std::nullopt;
    }

  private:
    using Parser = http::response_parser<http::string_body>;

    // Starts an operation and waits until it is done or the deadline has passed.
    template <class Start>
    Error await(Clock::time_point deadline, Start start) {
        std::optional<Error> done;
        start([&done](const Error& error, auto&&...) { done = error; });
        context_.restart();
        context_.run_until(std::min(deadline, end_));
        if (done) {
            return *done;
        }
        // Closing the socket ends the operation, and its handler must have run before what it refers to goes.
        Error ignored;
        socket_.close(ignored);
        context_.restart();
        context_.run();
        return asio::error::timed_out;
    }
    Error connect() {
        return await(Clock::now() + bounds_.connecting,
                     [this](auto handler) { socket_.async_connect(address_.endpoint, std::move(handler)); });
    }
    Error sendRequest() {
        http::request<http::empty_body> request(http::verb::get, address_.target, 11);
        request.set(http::field::host, address_.authority);
        request.set(http::field::user_agent, "location-assistant");
        request.set(http::field::accept, "*/*");
        request.set(http::field::connection, "close");
        return await(end_, [this, &request](auto handler) {
            http::async_write(socket_, request, std::move(handler));
        });
    }
    Error readHeader() {
        const Error error = readHeaderOnce();
        return error && mendStatusLine() ? readHeaderOnce() : error;
    }
    Error readHeaderOnce() {
        parser_.emplace();
        parser_->header_limit(static_cast<std::uint32_t>(bounds_.headerBytes));
        // A large body announced must not hide the status; readBody looks at the length.
        parser_->body_limit(std::numeric_limits<std::uint64_t>::max());
        return await(end_, [this](auto handler) {
            http::async_read_header(socket_, buffer_, *parser_, std::move(handler));
        });
    }
    // The servers in small devices end the line right behind the status; the parser insists on the blank that
    // belongs there even without a reason.
    bool mendStatusLine() {
        constexpr std::string_view example = "HTTP/1.0 404";
        const auto held = buffer_.cdata();
        std::string text(static_cast<const char*>(held.data()), held.size());
        if (text.size() <= example.size() || text.size() == buffer_.max_size() ||
            !text.starts_with("HTTP/1.") || text[example.size()] != '\r') {
            return false;
        }
        text.insert(example.size(), 1, ' ');
        buffer_.clear();
        buffer_.commit(asio::buffer_copy(buffer_.prepare(text.size()), asio::buffer(text)));
        return true;
    }
    Error readBody(std::string& body) {
        if (parser_->content_length().value_or(0) > bounds_.bodyBytes) {
            return http::error::body_limit;
        }
        parser_->body_limit(bounds_.bodyBytes);
        const Error error = await(
            end_, [this](auto handler) { http::async_read(socket_, buffer_, *parser_, std::move(handler)); });
        if (!error) {
            body = std::move(parser_->get().body());
        }
        return error;
    }

    const Address& address_;
    const DownloadBounds& bounds_;
    Clock::time_point end_;
    asio::io_context context_{1};
    asio::ip::tcp::socket socket_{context_};
    boost::beast::flat_buffer buffer_;
    std::optional<Parser> parser_;
};

class HttpDownloader : public Downloader {
  public:
    explicit HttpDownloader(const DownloadBounds& bounds) : bounds_(bounds) {}

    OSStatus fetch(std::string_view url, std::string& body) override {
        body.clear();
        Address address;
        if (const OSStatus err = parse(url, address); err != 0) {
            logLine(LogLevel::notice, "download: not an http URL with a numeric address");
            return err;
        }
        Error error;
        const auto status = Transfer(address, bounds_).run(body, error);
        if (!status) {
            logLine(LogLevel::notice, "download from " + address.authority + ": " + error.message());
            return statusFor(error);
        }
        return *status >= 200 && *status < 300 ? 0 : static_cast<OSStatus>(*status);
    }

  private:
    DownloadBounds bounds_;
};

}  // namespace

std::shared_ptr<Downloader> makeHttpDownloader(const DownloadBounds& bounds) {
    return std::make_shared<HttpDownloader>(bounds);
}

}  // namespace platform::services
