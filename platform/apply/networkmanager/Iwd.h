// iwd, where NetworkManager leaves the radio to it.
//
// It joins the networks that it knows of its own accord, whatever priority NetworkManager's profiles have.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "platform/base/Outcome.h"
#include "platform/bus/Bus.h"

namespace platform::apply {

// Where iwd does not run it knows no network, and every operation is a success.
class Iwd {
  public:
    // Never starts it.
    Outcome isRunning(bool& running);
    // The networks that it joins of its own accord, by what stays the same as long as it knows them.
    Outcome readAutoconnect(std::vector<std::string>& networks);
    // Of these networks it joins of its own accord only the one of this name, or all of them without a name.
    // The others, and those that it no longer knows, are left alone.
    Outcome limitAutoconnect(const std::vector<std::string>& networks,
                             const std::optional<std::string>& name);

  private:
    struct KnownNetwork {
        std::string path;
        std::string name;
        bool autoconnect = false;
    };
    Outcome readKnown(std::vector<KnownNetwork>& known);

    bus::Bus bus_;
    std::optional<bool> isRunning_;
};

}  // namespace platform::apply
