// From the committed tree to the machine: plan, difference to what was last applied, agent.
#pragma once

#include "platform/CoreFoundation.h"
#include "platform/Outcome.h"

namespace platform::apply {

// Makes the current location of the tree the active configuration. The same plan as last time touches nothing
// and asks nobody: it costs one look into the record. Interfaces are given back first, in the order in which
// they were captured, then taken over in service order; every interface is tried, and the first failure is
// the outcome. Every failure's reason goes to the system log from here.
//
// 1004 when "CurrentSet" names no location: everything is then given back. 1003 without the rights to keep a
// record. 1001 for everything else, a record that cannot be read among it: nothing is changed then, since
// without the record there is no way back. Who is left with such a file moves it away ("applied.plist" in the
// runtime directory) and brings the interfaces up with the system's own tools, or restarts the machine.
//
// A run that was ended half-way, at any point, is finished by the next one: of the same plan or of another.
Outcome applyTree(CFDictionaryRef root);

}  // namespace platform::apply
