// The record of what was applied: which interfaces this system holds, how each was before, and what it was
// made.
//
// It lives in "applied.plist" in the runtime directory, and so as long as what it describes: after a restart
// of the machine the interfaces come up as the system has them, and there is nothing to give back.
#pragma once

#include <string>
#include <vector>

#include "platform/CoreFoundation.h"
#include "platform/Outcome.h"
#include "platform/apply/Agent.h"
#include "platform/apply/Plan.h"
#include "platform/values/Object.h"

namespace platform::apply {

struct RecordEntry {
    std::string
        agent;  // the name of the one that captured the interface; empty when there was none to capture
    Captured captured;
    values::Owned<CFDictionaryRef> plan;  // what the interface was last to become (copyPlanAsPropertyList)
    bool completed = false;               // and whether it became so

    // An interface that was to be switched off and did not exist: nothing was changed and nothing is to be
    // undone.
    [[nodiscard]] bool isAbsent() const noexcept { return agent.empty(); }
};

struct Record {
    Salt salt{};
    std::vector<RecordEntry> entries;  // in the order in which they are given back

    [[nodiscard]] RecordEntry* find(const std::string& interface) noexcept;
    [[nodiscard]] const RecordEntry* find(const std::string& interface) const noexcept;
};

// Without a file the record is empty and gets a new salt. Strict: a file that is not a record as writeRecord
// makes it fails with 1001 rather than losing an entry.
Outcome readRecord(Record& record);
// On the disk when it returns. An empty record removes the file.
Outcome writeRecord(const Record& record);

}  // namespace platform::apply
