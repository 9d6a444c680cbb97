#include "platform/preferences/Status.h"

#include <string>

#include "platform/base/Log.h"

namespace platform::preferences {
namespace {

thread_local int lastStatus = kSCStatusOK;

}  // namespace

bool setStatus(int status) noexcept {
    lastStatus = status;
    return status == kSCStatusOK;
}

bool setStatus(const Outcome& outcome, std::string_view who) {
    if (!outcome.ok()) {
        logLine(LogLevel::error, std::string(who) + ": " + outcome.reason());
    }
    return setStatus(outcome.status());
}

namespace {

struct StatusText {
    int status;
    const char* text;
};

constexpr StatusText statusTexts[] = {
    {kSCStatusOK, "Success"},
    {kSCStatusFailed, "Failed: a value has the wrong type, or the reason is in the system log"},
    {kSCStatusInvalidArgument, "Invalid argument"},
    {kSCStatusAccessError, "Permission denied"},
    {kSCStatusNoKey, "No such key"},
    {kSCStatusKeyExists, "The key is there already"},
    {kSCStatusLocked, "Locked already"},
    {kSCStatusNeedLock, "The lock is not held"},
    {kSCStatusNoStoreSession, "No session on the live state"},
    {kSCStatusNoStoreServer, "The live state is not available"},
    {kSCStatusNotifierActive, "Notices are being delivered already"},
    {kSCStatusNoPrefsSession, "No session on the preferences"},
    {kSCStatusPrefsBusy, "Another process is changing the preferences"},
    {kSCStatusNoConfigFile, "No preferences file"},
    {kSCStatusNoLink, "No such link"},
    {kSCStatusStale, "The preferences file was changed by another process"},
    {kSCStatusMaxLink, "Too many links"},
};

}  // namespace
}  // namespace platform::preferences

int SCError() noexcept {
    return platform::preferences::lastStatus;
}

const char* SCErrorString(int status) noexcept {
    for (const auto& entry : platform::preferences::statusTexts) {
        if (entry.status == status) {
            return entry.text;
        }
    }
    return "Unknown status";
}
