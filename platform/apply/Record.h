// The record of what was applied: which interfaces this system holds, how each was before, and what it was
// made.
//
// It lives in "applied.plist" in the runtime directory, and so as long as what it describes: after a restart
// of the machine the interfaces come up as the system has them, and there is nothing to give back.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "platform/apply/Agent.h"
#include "platform/apply/Plan.h"
#include "platform/base/Outcome.h"

namespace platform::apply {

struct RecordEntry {
    // The name of the agent that captured the interface; empty for one that is left alone, because it did not
    // exist or is somebody else's: nothing was changed and nothing is to be undone.
    std::string agent;
    Snapshot snapshot;
    std::optional<InterfacePlan> plan;  // what the interface was last to become, without its key
    bool completed = false;             // and whether the machine took it

    [[nodiscard]] bool isLeftAlone() const noexcept { return agent.empty(); }

    template <class Self, class Fields>
    static void listFields(Self& self, Fields& fields) {
        fields("Interface", self.snapshot.interface);
        fields("Agent", self.agent);
        fields("Before", self.snapshot.state);
        fields("Plan", self.plan);
        fields("Completed", self.completed);
    }
};

struct Record {
    Salt salt{};
    std::vector<RecordEntry> entries;  // in the order in which they are given back

    [[nodiscard]] RecordEntry* find(const std::string& interface) noexcept;
    [[nodiscard]] const RecordEntry* find(const std::string& interface) const noexcept;
    // Whether the machine took this plan, all of it and nothing else.
    [[nodiscard]] bool isOf(const Plan& plan) const;

    template <class Self, class Fields>
    static void listFields(Self& self, Fields& fields) {
        fields("Salt", self.salt);
        fields("Interfaces", self.entries);
    }
};

// Without a file the record is empty and gets a new salt. Strict: a file that is not a record as writeRecord
// makes it fails with 1001 rather than losing an entry.
Outcome readRecord(Record& record);
// On the disk when it returns. An empty record removes the file.
Outcome writeRecord(const Record& record);

}  // namespace platform::apply
