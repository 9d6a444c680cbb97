// The control socket of an interface's wireless supplicant: a request and its answer, and the notices that
// come in between.
#pragma once

#include <chrono>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/apply/WirelessChoice.h"
#include "platform/base/FileDescriptor.h"
#include "platform/base/Outcome.h"

namespace platform::apply {

// A network that the supplicant is configured for.
struct ConfiguredNetwork {
    int number = 0;
    bool isDisabled = false;
    bool isNameless = false;
    bool isOurs = false;  // it carries this system's tag
};
// The values of an answer that has them in lines, by their names.
using SupplicantValues = std::map<std::string, std::string, std::less<>>;

// Requests hold the key, so none of them ever goes into a reason. Every answer is waited for two seconds.
class SupplicantSocket {
  public:
    // False, and success, when there is nobody to talk to.
    Outcome open(const std::string& interface, bool& isThere);

    // Sends a request and takes its answer; notices that come in between are kept. `what` names it in a
    // reason.
    Outcome ask(const std::string& request, const char* what, std::string& answer);
    // A request whose only good answer is "OK".
    Outcome order(const std::string& request, const char* what);

    Outcome listNetworks(std::vector<ConfiguredNetwork>& networks);
    // Adds a network with the tag and these settings, each the words that follow its number.
    Outcome addNetwork(const std::vector<std::string>& settings, int& number);
    Outcome removeNetwork(int number);
    // "wpa_state", "id", "bssid" and the like.
    Outcome readStatus(SupplicantValues& status);
    // The networks of this name that it heard, with their ages.
    Outcome readHeard(const std::string& name, std::vector<HeardNetwork>& heard);

    // The notices that have come, without waiting for more.
    Outcome takeNotices(std::vector<std::string>& notices);

  private:
    // Nothing when none has come by the deadline.
    Outcome receive(std::chrono::steady_clock::time_point deadline, std::optional<std::string>& message);

    FileDescriptor socket_;
    std::vector<std::string> notices_;
};

}  // namespace platform::apply
