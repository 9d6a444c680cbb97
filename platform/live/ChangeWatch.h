// One descriptor that tells when the live state may have changed: news from the kernel or a commit of the
// preferences, paced.
#pragma once

#include <chrono>
#include <string>

#include "platform/base/FileDescriptor.h"
#include "platform/base/Outcome.h"
#include "platform/live/NetworkState.h"

namespace platform::live {

// Between two looks there is a pause in which news is left where it is: ten thousand changes in a second cost
// some thirty looks, not ten thousand, in bounded memory. A look after the pause follows every piece of news,
// because the kernel reports some changes before it makes them.
class ChangeWatch {
  public:
    static constexpr std::chrono::milliseconds pause{30};
    // After a look that failed.
    static constexpr std::chrono::milliseconds longPause{1000};

    // Subscribes. Whoever reads the state after that misses nothing. The directory of the preferences need
    // not exist; one that this process may not watch is not watched.
    Outcome open(NetworkState& state, const std::string& preferencesDirectory);

    // Readable when take is to be called.
    [[nodiscard]] int descriptor() const noexcept { return poll_.get(); }
    // Takes the news away. Whether it is time to look.
    bool take();
    // Looks again after the long pause, news or none.
    void retryLater();

  private:
    void listen(bool on);
    void pauseFor(std::chrono::milliseconds time);
    void watchPreferences();
    bool watchNearest();

    FileDescriptor poll_;
    FileDescriptor timer_;
    FileDescriptor kernel_;
    FileDescriptor files_;
    std::string directory_;
};

}  // namespace platform::live
