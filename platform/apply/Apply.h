// From the committed tree to the machine: plan, difference to what was last applied, agents.
#pragma once

#include "platform/CoreFoundation.h"
#include "platform/base/Outcome.h"

namespace platform::apply {

// Makes the current location of the tree the active configuration. `replaced` is the tree that the commit
// took the place of: the one tree again when it changed nothing, null when nothing was committed.
//
// Another current location, another plan, or a commit that changes nothing (whoever commits so asks for just
// this) is made so whatever the record says: every interface is looked at, and one that is what it is to be
// is not changed. Interfaces are given back first, in the order in which they were captured, then taken over
// in service order, all at once and under one deadline: 20 s, and 15 s for a way back.
//
// Any other commit leaves the machine alone and is a success, and so is no commit at all. Both finish what an
// earlier run left undone, as far as there is a record of it; what comes of that is in the log only.
//
// The outcome says whether this machine took the configuration. 1003 without the rights to keep a record;
// 1001 when the record cannot be read or written (nothing is changed then, since without it there is no way
// back), or when the kernel, a daemon or the bus refuses or hangs; every interface is tried all the same.
// What a network, a cable, a key, a switch or a missing card does is a line in the log and a success. A run
// that was ended half-way, at any point, is finished by the next one.
Outcome applyTree(CFDictionaryRef root, CFDictionaryRef replaced);

}  // namespace platform::apply
