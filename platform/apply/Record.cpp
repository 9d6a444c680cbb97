#include "platform/apply/Record.h"

#include <sys/random.h>

#include <algorithm>
#include <set>
#include <utility>

#include "platform/apply/StateFile.h"

namespace platform::apply {
namespace {

std::string recordPath() {
    return runtimePath("applied.plist");
}

}  // namespace

RecordEntry* Record::find(const std::string& interface) noexcept {
    return const_cast<RecordEntry*>(std::as_const(*this).find(interface));
}

const RecordEntry* Record::find(const std::string& interface) const noexcept {
    const auto found = std::ranges::find(
        entries, interface, [](const RecordEntry& entry) -> const auto& { return entry.snapshot.interface; });
    return found == entries.end() ? nullptr : &*found;
}

bool Record::isOf(const Plan& plan) const {
    return entries.size() == plan.size() && std::ranges::all_of(plan, [this](const InterfacePlan& interface) {
               const RecordEntry* const entry = find(interface.name);
               return entry != nullptr && entry->completed && entry->plan == withoutKey(interface, salt);
           });
}

Outcome readRecord(Record& record) {
    record = {};
    std::optional<Record> file;
    RETURN_IF_FAILED(readState(recordPath(), file));
    if (!file) {
        const auto size = static_cast<ssize_t>(record.salt.size());
        return ::getrandom(record.salt.data(), record.salt.size(), 0) == size
                   ? Outcome()
                   : Outcome::fromErrno("cannot get random bytes");
    }
    std::set<std::string> names;
    for (const RecordEntry& entry : file->entries) {
        if (entry.snapshot.interface.empty() || !names.insert(entry.snapshot.interface).second) {
            return {kSCStatusFailed, recordPath() + " is not what this system wrote"};
        }
    }
    record = std::move(*file);
    return {};
}

Outcome writeRecord(const Record& record) {
    return record.entries.empty() ? removeFile(recordPath()) : writeState(recordPath(), record);
}

}  // namespace platform::apply
