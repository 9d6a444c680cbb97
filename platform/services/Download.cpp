// Fetching a document by HTTP from a server that may do anything: be silent, break off, talk for ever.
//
// HTTP/1.1 by libcurl, one connection for each document, directly to the server: no proxy, no redirect, no
// credentials, no cookies. The library is loaded by the first download, not at the start of every program.
//
// A URL is "http://", a numeric IPv4 address or an IPv6 address in brackets, an optional port, path and
// query; user names are refused, fragments dropped. Names of hosts are not looked up: a resolver cannot be
// bounded in time, and obeys the environment.
//
// The status of an answer that is no 2xx counts as soon as its status line is there, and the transfer ends
// with it: header fields that contradict each other, a connection that breaks, a body that never ends change
// nothing about a 404. A status line that does not end is none, and neither is a document without one. The
// body of a 2xx has to arrive whole and within the bounds, else the transfer failed.
#include <arpa/inet.h>
#include <curl/curl.h>
#include <dlfcn.h>

#include <algorithm>
#include <array>
#include <charconv>
#include <chrono>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/CoreServices.h"
#include "platform/base/Host.h"
#include "platform/base/Log.h"

struct HandleBlock {
    std::string content;
};

namespace {

// The buffers that were not disposed of. A buffer may live until the process ends, and is then freed with it.
std::map<Handle, std::unique_ptr<HandleBlock>>& buffers() {
    static std::map<Handle, std::unique_ptr<HandleBlock>> ofThisProcess;
    return ofThisProcess;
}

}  // namespace

Handle NewHandle(long size) noexcept {
    if (size < 0) {
        return nullptr;
    }
    auto block = std::make_unique<HandleBlock>();
    block->content.resize(static_cast<std::size_t>(size));
    const Handle handle = block.get();
    buffers().emplace(handle, std::move(block));
    return handle;
}

void DisposeHandle(Handle handle) noexcept {
    buffers().erase(handle);
}

long GetHandleSize(Handle handle) noexcept {
    return static_cast<long>(handle->content.size());
}

const char* GetHandleData(Handle handle) noexcept {
    return handle->content.data();
}

namespace platform::services {
namespace {

constexpr std::chrono::milliseconds connectBound{3000};
// Status lines and header fields together, those of interim answers (1xx) included.
constexpr std::size_t mostHeaderBytes = std::size_t{256} * 1024;
constexpr std::size_t mostBodyBytes = std::size_t{1024} * 1024;

// The operations of libcurl. It stays loaded until the process ends, as whatever it brought along has to.
struct Curl {
    decltype(&curl_global_init) globalInit = nullptr;
    decltype(&curl_easy_init) init = nullptr;
    decltype(&curl_easy_setopt) setOption = nullptr;
    decltype(&curl_easy_perform) perform = nullptr;
    decltype(&curl_easy_getinfo) getInfo = nullptr;
    decltype(&curl_easy_strerror) textOf = nullptr;
    decltype(&curl_easy_cleanup) cleanup = nullptr;
};

template <class Function>
bool find(void* library, const char* name, Function& function) {
    function = reinterpret_cast<Function>(dlsym(library, name));
    return function != nullptr;
}

// Nothing, with the reason, when none of the libraries is there.
std::optional<Curl> load(const std::vector<std::string>& libraries, std::string& reason) {
    for (const std::string& name : libraries) {
        void* const library = dlopen(name.c_str(), RTLD_NOW | RTLD_LOCAL | RTLD_NODELETE);
        Curl curl;
        if (library != nullptr && find(library, "curl_global_init", curl.globalInit) &&
            find(library, "curl_easy_init", curl.init) && find(library, "curl_easy_setopt", curl.setOption) &&
            find(library, "curl_easy_perform", curl.perform) &&
            find(library, "curl_easy_getinfo", curl.getInfo) &&
            find(library, "curl_easy_strerror", curl.textOf) &&
            find(library, "curl_easy_cleanup", curl.cleanup) &&
            curl.globalInit(CURL_GLOBAL_NOTHING) == CURLE_OK) {
            return curl;
        }
        const char* const error = dlerror();
        reason = error != nullptr ? error : name + " cannot be started";
    }
    return std::nullopt;
}

// Whether the text is the numeric address of a host, a port of 1 to 65535 where one is given, or both.
bool isNumericAuthority(std::string_view text) {
    const bool isBracketed = text.starts_with('[');
    const std::size_t hostEnd = isBracketed ? text.find(']') : std::min(text.find(':'), text.size());
    if (hostEnd == std::string_view::npos) {
        return false;
    }
    const std::string host(text.substr(isBracketed ? 1 : 0, hostEnd - (isBracketed ? 1 : 0)));
    const std::string_view port = text.substr(hostEnd + (isBracketed ? 1 : 0));
    if (!port.empty()) {
        std::uint16_t number = 0;
        const char* const end = port.data() + port.size();
        const auto [stop, error] = std::from_chars(port.data() + 1, end, number);
        if (port.front() != ':' || error != std::errc() || stop != end || number == 0) {
            return false;
        }
    }
    in6_addr address{};
    return inet_pton(isBracketed ? AF_INET6 : AF_INET, host.c_str(), &address) == 1;
}

// 0 for a URL that may be fetched.
OSStatus judge(std::string_view url) {
    constexpr std::size_t longest = 2048;
    constexpr std::string_view scheme = "http://";
    const bool isPlain = url.size() <= longest &&
                         std::all_of(url.begin(), url.end(), [](char c) { return c > 0x20 && c < 0x7F; });
    if (!isPlain) {
        return kURLInvalidURLError;
    }
    const auto isLetter = [](char wanted, char c) { return (c >= 'A' && c <= 'Z' ? c + 32 : c) == wanted; };
    if (url.size() < scheme.size() || !std::equal(scheme.begin(), scheme.end(), url.begin(), isLetter)) {
        return kURLUnsupportedSchemeError;
    }
    url.remove_prefix(scheme.size());
    return isNumericAuthority(url.substr(0, url.find_first_of("/?#"))) ? 0 : kURLInvalidURLError;
}

// One document over one connection.
class Transfer {
  public:
    Transfer(const Curl& curl, std::string& body)
        : curl_(curl), body_(body), easy_(curl.init(), curl.cleanup) {}

    // The HTTP status, or nothing with the status of the download and the reason.
    std::optional<long> run(const std::string& url, OSStatus& failure, std::string& reason) {
        CURLcode result = prepare(url);
        if (result != CURLE_OK) {
            failure = kURLClientError;
        } else {
            result = curl_.perform(easy_.get());
            const long status = statusNow();
            if (isFinal(status) || (result == CURLE_OK && status != 0)) {
                return status;
            }
            failure = statusFor(result);
        }
        reason = isTooLarge_        ? "the answer is too large"
                 : text_[0] != '\0' ? text_.data()
                                    : curl_.textOf(result);
        return std::nullopt;
    }

  private:
    template <class Value>
    void set(CURLcode& result, CURLoption option, Value value) {
        if (result == CURLE_OK) {
            result = curl_.setOption(easy_.get(), option, value);
        }
    }
    CURLcode prepare(const std::string& url) {
        CURLcode result = easy_ ? CURLE_OK : CURLE_OUT_OF_MEMORY;
        set(result, CURLOPT_ERRORBUFFER, text_.data());
        set(result, CURLOPT_URL, url.c_str());
        set(result, CURLOPT_PROTOCOLS_STR, "http");
        set(result, CURLOPT_USERAGENT, "location-assistant");
        set(result, CURLOPT_HTTP_VERSION, long{CURL_HTTP_VERSION_1_1});
        // The server is asked directly, whatever the environment says, and nowhere else than here.
        set(result, CURLOPT_PROXY, "");
        set(result, CURLOPT_FOLLOWLOCATION, 0L);
        set(result, CURLOPT_NETRC, long{CURL_NETRC_IGNORED});
        set(result, CURLOPT_NOSIGNAL, 1L);
        set(result, CURLOPT_CONNECTTIMEOUT_MS, static_cast<long>(connectBound.count()));
        set(result, CURLOPT_TIMEOUT_MS, static_cast<long>(currentHost().downloadBound.count()));
        set(result, CURLOPT_MAXFILESIZE_LARGE, static_cast<curl_off_t>(mostBodyBytes));
        set(result, CURLOPT_HEADERFUNCTION, &Transfer::takeHeader);
        set(result, CURLOPT_HEADERDATA, this);
        set(result, CURLOPT_WRITEFUNCTION, &Transfer::takeBody);
        set(result, CURLOPT_WRITEDATA, this);
        return result;
    }

    [[nodiscard]] long statusNow() const {
        long status = 0;
        return curl_.getInfo(easy_.get(), CURLINFO_RESPONSE_CODE, &status) == CURLE_OK ? status : 0;
    }
    // Whether the status is an answer whatever follows it: neither that of an interim answer nor of one whose
    // body is wanted.
    static bool isFinal(long status) { return status >= 300; }

    // Both take the bytes by returning their number; any other number ends the transfer.
    static std::size_t takeHeader(const char* /*line*/, std::size_t size, std::size_t count, void* transfer) {
        auto& self = *static_cast<Transfer*>(transfer);
        self.headerBytes_ += size * count;
        self.isTooLarge_ = self.headerBytes_ > mostHeaderBytes;
        return isFinal(self.statusNow()) || self.isTooLarge_ ? 0 : size * count;
    }
    static std::size_t takeBody(const char* bytes, std::size_t size, std::size_t count, void* transfer) {
        auto& self = *static_cast<Transfer*>(transfer);
        self.isTooLarge_ = self.body_.size() + size * count > mostBodyBytes;
        if (self.isTooLarge_) {
            return 0;
        }
        self.body_.append(bytes, size * count);
        return size * count;
    }

    [[nodiscard]] OSStatus statusFor(CURLcode result) const {
        switch (result) {
            case CURLE_OPERATION_TIMEDOUT:
                return kURLTimedOutError;
            case CURLE_WRITE_ERROR:
            case CURLE_FILESIZE_EXCEEDED:
            case CURLE_OUT_OF_MEMORY:  // a line of more than 100 KB
                return kURLAnswerTooLargeError;
            case CURLE_OK:  // without a status
            case CURLE_GOT_NOTHING:
            case CURLE_PARTIAL_FILE:
            case CURLE_RECV_ERROR:
            case CURLE_SEND_ERROR:
                return kURLConnectionLostError;
            case CURLE_UNSUPPORTED_PROTOCOL:
            case CURLE_WEIRD_SERVER_REPLY:
            case CURLE_BAD_CONTENT_ENCODING:
                return kURLMalformedAnswerError;
            default:
                return kURLUnreachableError;
        }
    }

    const Curl& curl_;
    std::string& body_;
    // The library may write into it until it is done with.
    std::array<char, CURL_ERROR_SIZE> text_{};
    std::unique_ptr<CURL, void (*)(CURL*)> easy_;
    std::size_t headerBytes_ = 0;
    bool isTooLarge_ = false;
};

// The contract of URLSimpleDownload. The body is that of a 2xx answer, and empty in every other case.
OSStatus fetch(std::string_view url, std::string& body) {
    body.clear();
    if (const OSStatus err = judge(url); err != 0) {
        logLine(LogLevel::notice, "download: not an http URL with a numeric address");
        return err;
    }
    std::string reason;
    const auto curl = load(currentHost().httpLibraries, reason);
    if (!curl) {
        logLine(LogLevel::error, "download: no HTTP client library: " + reason);
        return kURLClientError;
    }
    OSStatus failure = 0;
    const auto status = Transfer(*curl, body).run(std::string(url), failure, reason);
    const bool isWhole = status && *status >= 200 && *status < 300;
    if (!isWhole) {
        body.clear();
    }
    if (!status) {
        logLine(LogLevel::notice, "download: " + reason);
        return failure;
    }
    return isWhole ? 0 : static_cast<OSStatus>(*status);
}

}  // namespace
}  // namespace platform::services

OSStatus URLSimpleDownload(const char* url, const void* destination, Handle buffer, UInt32 flags,
                           const void* eventProc, void* context) noexcept {
    if (url == nullptr || buffers().count(buffer) == 0 || destination != nullptr || flags != 0 ||
        eventProc != nullptr || context != nullptr) {
        return paramErr;
    }
    return platform::services::fetch(url, buffer->content);
}
