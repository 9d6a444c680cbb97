#include "platform/base/Log.h"

#include <sys/socket.h>
#include <sys/un.h>
#include <syslog.h>
#include <unistd.h>

#include <array>
#include <ctime>
#include <utility>

#include "platform/CoreServices.h"
#include "platform/base/FileDescriptor.h"

namespace platform {
namespace {

std::function<void(LogLevel, std::string_view)>& sink() {
    static std::function<void(LogLevel, std::string_view)> instead;
    return instead;
}

// "Nov  3 09:05:07": of Greenwich, because the local zone is a file that the environment chooses. The daemons
// put their own time.
std::string timeStamp() {
    const std::time_t now = std::time(nullptr);
    std::tm time{};
    gmtime_r(&now, &time);
    // asctime's "Tue Nov  3 09:05:07 2026" is the same in every locale.
    std::array<char, 64> text{};
    return std::string(asctime_r(&time, text.data())).substr(4, 15);
}

// What syslog(3) would send, but without waiting: a daemon that reads nothing, or a queue that somebody else
// filled, would otherwise hold a run for ever. A socket for each line, because the daemon may be started
// anew.
void send(LogLevel level, const std::string& text) {
    const std::string datagram = "<" + std::to_string(LOG_DAEMON | static_cast<int>(level)) + ">" +
                                 timeStamp() + " location-assistant[" + std::to_string(getpid()) +
                                 "]: " + text;
    const FileDescriptor daemon(socket(AF_UNIX, SOCK_DGRAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
    const sockaddr_un address{AF_UNIX, "/dev/log"};
    if (connect(daemon.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0) {
        static_cast<void>(
            ::send(daemon.get(), datagram.data(), datagram.size(), MSG_DONTWAIT | MSG_NOSIGNAL));
    }
}

}  // namespace

void logLine(LogLevel level, std::string_view text) {
    // RFC 3164 lets a daemon cut what is longer than 1,024 bytes, the time and the name included.
    constexpr std::size_t longest = 1000;
    std::string line(text.substr(0, longest));
    for (char& c : line) {
        if (static_cast<unsigned char>(c) < 0x20 || c == 0x7F) {
            c = '?';
        }
    }
    if (sink()) {
        sink()(level, line);
        return;
    }
    send(level, line);
}

LogCapture::LogCapture(std::function<void(LogLevel, std::string_view)> newSink)
    : previous_(std::exchange(sink(), std::move(newSink))) {}

LogCapture::~LogCapture() {
    sink() = std::move(previous_);
}

}  // namespace platform

void SystemLog(const char* line) noexcept {
    platform::logLine(platform::LogLevel::warning, line);
}
