// The tree of a machine on which nothing was ever stored.
#pragma once

#include "platform/CoreFoundation.h"
#include "platform/values/Object.h"

namespace platform::preferences {

// One location, "0", named "Automatic" and current, with its IPv4 and NetInfo globals and one service, "0",
// named "Managed by the system", whose interface "*" means every interface that is left to the system.
// Frozen.
[[nodiscard]] values::Owned<CFDictionaryRef> makeFirstRunTree();

}  // namespace platform::preferences
