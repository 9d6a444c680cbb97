// The live state as keys and values, computed when asked.
//
//   Setup:/Network/Global/<protocol>               the current location's global entity, as it is stored
//   Setup:/Network/Service/<ID>/<protocol>         the entity of a service that the current location links to
//   State:/Network/Global/IPv4                     there while there is a default route: "PrimaryInterface";
//                                                  "Router", a dotted quad, when the route has one;
//                                                  "PrimaryService", the ID of the first service of the
//                                                  current location that names the interface, if one does
//
// The stored entities are those of the committed preferences. Services and entities that are switched off are
// left out, and so are links that lead nowhere and values that are no dictionaries.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/CoreFoundation.h"
#include "platform/base/Outcome.h"
#include "platform/live/NetworkState.h"
#include "platform/preferences/Tree.h"
#include "platform/values/Object.h"

namespace platform::live {

using Value = values::Owned<CFPropertyListRef>;

// One look: everything that is asked of it is of one moment, as far as the preferences go.
class LiveView {
  public:
    explicit LiveView(NetworkState& state);

    // Null, and success, when there is no such key. Fails when the kernel, or for a key of the setup domain
    // the preferences, could not be read.
    Outcome value(std::string_view key, Value& value) const;
    // Every key there is, sorted by its bytes.
    Outcome keys(std::vector<std::string>& keys) const;

  private:
    struct Service {
        std::string id;
        CFDictionaryRef content;
    };
    [[nodiscard]] CFDictionaryRef dictionaryAt(CFStringRef path) const;
    [[nodiscard]] CFDictionaryRef network() const;
    [[nodiscard]] std::vector<Service> services() const;
    [[nodiscard]] CFDictionaryRef serviceBehind(CFTypeRef link) const;
    // The first one in the order of the services; nothing when none does.
    [[nodiscard]] std::optional<std::string> serviceNaming(const std::string& interface) const;
    Outcome globalIPv4(Value& value) const;

    NetworkState* state_;
    Outcome loaded_;
    preferences::Tree tree_;
};

}  // namespace platform::live
