#include "platform/apply/Radio.h"

#include <fcntl.h>
#include <linux/rfkill.h>
#include <unistd.h>

#include <charconv>
#include <filesystem>
#include <system_error>

#include "platform/apply/StateFile.h"
#include "platform/base/FileDescriptor.h"
#include "platform/base/Host.h"

namespace platform::apply {
namespace {

// The folder of the switch in sysfs, and its number; empty when there is none.
std::filesystem::path findSwitch(const std::string& interface, std::uint32_t& number) {
    const std::string prefix = "rfkill";
    const std::filesystem::path card = currentHost().sysfsRoot + "/class/net/" + interface + "/phy80211";
    std::error_code error;
    // A card may be pulled out in the middle of this, and nothing here throws.
    for (std::filesystem::directory_iterator entry(card, error), end; !error && entry != end;
         entry.increment(error)) {
        const std::string name = entry->path().filename();
        if (name.starts_with(prefix) &&
            std::from_chars(name.data() + prefix.size(), name.data() + name.size(), number).ec ==
                std::errc()) {
            return entry->path();
        }
    }
    return {};
}

Outcome readFlag(const std::filesystem::path& path, bool& flag) {
    std::string text;
    RETURN_IF_FAILED(readWholeFile(path, text));
    flag = text.starts_with('1');
    return {};
}

}  // namespace

std::optional<Radio> readRadio(const std::string& interface) {
    std::uint32_t number = 0;
    const std::filesystem::path folder = findSwitch(interface, number);
    Radio found;
    const bool isThere = !folder.empty() && readFlag(folder / "soft", found.isOff).ok() &&
                         readFlag(folder / "hard", found.isBlocked).ok();
    return isThere ? std::optional(found) : std::nullopt;
}

Outcome switchRadio(const std::string& interface, bool on) {
    std::uint32_t number = 0;
    if (findSwitch(interface, number).empty()) {
        return {};
    }
    rfkill_event event{};
    event.idx = number;
    event.op = RFKILL_OP_CHANGE;
    event.soft = on ? 0 : 1;
    const FileDescriptor device(::open("/dev/rfkill", O_RDWR | O_NONBLOCK | O_CLOEXEC));
    // The size of the first version, which every kernel takes.
    if (!device.isOpen() || ::write(device.get(), &event, RFKILL_EVENT_SIZE_V1) != RFKILL_EVENT_SIZE_V1) {
        return Outcome::fromErrno("cannot switch the radio");
    }
    return {};
}

}  // namespace platform::apply
