#include "platform/apply/Record.h"

#include <sys/random.h>

#include <algorithm>
#include <cerrno>
#include <utility>

#include "platform/apply/Properties.h"
#include "platform/apply/StateFile.h"

namespace platform::apply {
namespace {

constexpr std::int64_t recordVersion = 1;

std::string recordPath() {
    return runtimePath("applied.plist");
}

bool readEntry(CFDictionaryRef dictionary, RecordEntry& entry) {
    const auto interface = textIn(dictionary, CFSTR("Interface"));
    const auto agent = textIn(dictionary, CFSTR("Agent"));
    const auto completed = booleanIn(dictionary, CFSTR("Completed"));
    CFDictionaryRef const before = dictionaryIn(dictionary, CFSTR("Before"));
    if (!interface || interface->empty() || !agent || !completed || before == nullptr) {
        return false;
    }
    entry.agent = *agent;
    entry.completed = *completed;
    entry.captured = {*interface, values::Owned<CFDictionaryRef>::retained(before)};
    entry.plan = values::Owned<CFDictionaryRef>::retained(dictionaryIn(dictionary, CFSTR("Plan")));
    return true;
}

bool readEntries(CFDictionaryRef file, Record& record) {
    const auto salt = dataIn(file, CFSTR("Salt"));
    CFArrayRef const entries = arrayIn(file, CFSTR("Interfaces"));
    if (integerIn(file, CFSTR("Version")) != recordVersion || !salt || salt->size() != record.salt.size() ||
        entries == nullptr) {
        return false;
    }
    std::transform(salt->begin(), salt->end(), record.salt.begin(),
                   [](std::byte b) { return std::to_integer<std::uint8_t>(b); });
    for (CFIndex i = 0; i < CFArrayGetCount(entries); ++i) {
        RecordEntry entry;
        if (!readEntry(asDictionary(CFArrayGetValueAtIndex(entries, i)), entry) ||
            record.find(entry.captured.interface) != nullptr) {
            return false;
        }
        record.entries.push_back(std::move(entry));
    }
    return true;
}

}  // namespace

RecordEntry* Record::find(const std::string& interface) noexcept {
    return const_cast<RecordEntry*>(std::as_const(*this).find(interface));
}

const RecordEntry* Record::find(const std::string& interface) const noexcept {
    const auto found = std::find_if(entries.begin(), entries.end(), [&interface](const RecordEntry& entry) {
        return entry.captured.interface == interface;
    });
    return found == entries.end() ? nullptr : &*found;
}

Outcome readRecord(Record& record) {
    record = {};
    values::Owned<CFDictionaryRef> file;
    Outcome read = readStateFile(recordPath(), file);
    if (!read.ok()) {
        return read;
    }
    if (!file) {
        if (::getrandom(record.salt.data(), record.salt.size(), 0) !=
            static_cast<ssize_t>(record.salt.size())) {
            return Outcome::fromErrno("cannot get random bytes");
        }
        return {};
    }
    if (!readEntries(file.get(), record)) {
        return {kSCStatusFailed, recordPath() + " is not a record of this system"};
    }
    return {};
}

Outcome writeRecord(const Record& record) {
    if (record.entries.empty()) {
        return removeStateFile(recordPath());
    }
    ArrayBuilder entries;
    for (const RecordEntry& entry : record.entries) {
        DictionaryBuilder dictionary;
        dictionary.setText(CFSTR("Interface"), entry.captured.interface)
            .setText(CFSTR("Agent"), entry.agent)
            .setBoolean(CFSTR("Completed"), entry.completed)
            .set(CFSTR("Before"), entry.captured.state.get())
            .set(CFSTR("Plan"), entry.plan.get());
        entries.add(dictionary.take().get());
    }
    DictionaryBuilder file;
    file.setInteger(CFSTR("Version"), recordVersion)
        .setData(CFSTR("Salt"), std::as_bytes(std::span(record.salt)))
        .set(CFSTR("Interfaces"), entries.get());
    return writeStateFile(recordPath(), file.take().get());
}

}  // namespace platform::apply
