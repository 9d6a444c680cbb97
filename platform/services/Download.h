// Fetching a document by HTTP from a server that may do anything: be silent, break off, talk for ever.
#pragma once

#include <chrono>
#include <cstddef>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "platform/CoreServices.h"

namespace platform::services {

// What one transfer may cost at most. Three tries at a silent server take 15 seconds by these.
struct DownloadBounds {
    std::chrono::milliseconds connecting{3000};
    // From the first step to the last, connecting included.
    std::chrono::milliseconds whole{5000};
    // Status lines and header fields together, those of interim answers (1xx) included.
    std::size_t headerBytes = std::size_t{256} * 1024;
    std::size_t bodyBytes = std::size_t{1024} * 1024;
};

class Downloader {
  public:
    virtual ~Downloader() = default;

    // The contract of URLSimpleDownload. The body is that of a 2xx answer, and empty in every other case.
    virtual OSStatus fetch(std::string_view url, std::string& body) = 0;
};

// A downloader that talks HTTP/1.1 by libcurl, one connection for each document, directly to the server: no
// proxy, no redirect, no credentials, no cookies. The library is loaded by the first download, not at the
// start of every program; the first of the libraries that is there is taken (Debian has one for each TLS
// library, of which nothing is used here).
//
// A URL is "http://", a numeric IPv4 address or an IPv6 address in brackets, an optional port, path and
// query; user names are refused, fragments dropped. Names of hosts are not looked up: a resolver cannot be
// bounded in time, and obeys the environment.
//
// The status of an answer that is no 2xx counts as soon as its status line is there, and the transfer ends
// with it: header fields that contradict each other, a connection that breaks, a body that never ends change
// nothing about a 404. A status line that does not end is none, and neither is a document without one. The
// body of a 2xx has to arrive whole and within the bounds, else the transfer failed.
[[nodiscard]] std::shared_ptr<Downloader> makeHttpDownloader(const DownloadBounds& bounds = {},
                                                             std::vector<std::string> libraries = {
                                                                 "libcurl-gnutls.so.4", "libcurl.so.4"});

}  // namespace platform::services
