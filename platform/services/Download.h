// Fetching a document by HTTP from a server that may do anything: be silent, break off, talk for ever.
#pragma once

#include <chrono>
#include <cstddef>
#include <memory>
#include <string>
#include <string_view>

#include "platform/CoreServices.h"

namespace platform::services {

// What one transfer may cost at most. Three tries at a silent server take 15 seconds by these.
struct DownloadBounds {
    std::chrono::milliseconds connecting{3000};
    // From the first step to the last, connecting included.
    std::chrono::milliseconds whole{5000};
    // The status line and the header fields together, for each answer on the connection.
    std::size_t headerBytes = std::size_t{16} * 1024;
    std::size_t bodyBytes = std::size_t{1024} * 1024;
    // Interim answers (1xx) before the real one.
    int interimAnswers = 8;
};

class Downloader {
  public:
    virtual ~Downloader() = default;

    // The contract of URLSimpleDownload. The body is that of a 2xx answer, and empty in every other case.
    virtual OSStatus fetch(std::string_view url, std::string& body) = 0;
};

// A downloader that talks HTTP/1.1 over TCP, one connection for each document, directly to the server: it
// looks at no environment variable and no configuration file.
//
// A URL is "http://", a numeric IPv4 address or an IPv6 address in brackets, an optional port, path and
// query; user names are refused, fragments dropped. Names of hosts are not looked up: a resolver cannot be
// bounded in time, and obeys the environment.
//
// The status of an answer counts as soon as its header is complete. What is no 2xx ends there, so a body that
// never ends or is beyond the bound changes nothing about a 404; the body of a 2xx has to arrive whole and
// within the bounds, else the transfer failed.
[[nodiscard]] std::shared_ptr<Downloader> makeHttpDownloader(const DownloadBounds& bounds = {});

}  // namespace platform::services
