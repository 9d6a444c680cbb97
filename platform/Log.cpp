#include "platform/Log.h"

#include <syslog.h>

#include <utility>

#include "platform/CoreServices.h"

namespace platform {
namespace {

std::function<void(LogLevel, std::string_view)>& sink() {
    static std::function<void(LogLevel, std::string_view)> instead;
    return instead;
}

int priorityOf(LogLevel level) {
    switch (level) {
        case LogLevel::error:
            return LOG_ERR;
        case LogLevel::warning:
            return LOG_WARNING;
        case LogLevel::notice:
            return LOG_NOTICE;
        case LogLevel::debug:
            return LOG_DEBUG;
    }
    return LOG_ERR;
}

}  // namespace

void logLine(LogLevel level, std::string_view text) {
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
    static const bool opened = [] {
        openlog("location-assistant", LOG_PID | LOG_NDELAY, LOG_DAEMON);
        return true;
    }();
    static_cast<void>(opened);
    syslog(priorityOf(level), "%s", line.c_str());
}

LogCapture::LogCapture(std::function<void(LogLevel, std::string_view)> newSink)
    : previous_(std::exchange(sink(), std::move(newSink))) {}

LogCapture::~LogCapture() {
    sink() = std::move(previous_);
}

}  // namespace platform

void SystemLog(const char* line) {
    platform::logLine(platform::LogLevel::warning, line);
}
