// The system log, for the reasons behind a status. One line a message; secrets never go here.
#pragma once

#include <syslog.h>

#include <functional>
#include <string>
#include <string_view>

namespace platform {

// The severities of syslog(3).
enum class LogLevel { error = LOG_ERR, warning = LOG_WARNING, notice = LOG_NOTICE, debug = LOG_DEBUG };

// Writes one line to the system log under the name "location-assistant". Control bytes are shown as '?', and
// a line is cut at 1000 bytes, so that a file's content cannot forge lines of its own. It never waits: a line
// that the log daemon cannot take at once (none runs, or its queue is full) is lost.
void logLine(LogLevel level, std::string_view text);

// Takes the lines instead of the system log for one scope, for tests.
class LogCapture {
  public:
    explicit LogCapture(std::function<void(LogLevel, std::string_view)> sink);
    ~LogCapture();
    LogCapture(const LogCapture&) = delete;
    LogCapture& operator=(const LogCapture&) = delete;

  private:
    std::function<void(LogLevel, std::string_view)> previous_;
};

}  // namespace platform
