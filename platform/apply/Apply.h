// From the committed tree to the machine: plan, difference to what was last applied, agent.
#pragma once

#include "platform/CoreFoundation.h"
#include "platform/Outcome.h"

namespace platform::apply {

// Makes the current location of the tree the active configuration. The same plan as last time touches nothing
// and asks nobody. Interfaces are given back first, then taken over in service order; every interface is
// tried, and the first failure is the outcome. 1004 when "CurrentSet" names no location: everything is then
// given back.
Outcome applyTree(CFDictionaryRef root);

}  // namespace platform::apply
