#include <algorithm>
#include <sstream>
#include <utility>

#include "platform/hardware/Entry.h"
#include "platform/hardware/Properties.h"
#include "platform/hardware/Sysfs.h"

namespace platform::hardware {
namespace {

struct Stream {
    const char* type;
    std::string baseName;
};

Stream streamOf(const std::string& name) {
    if (name.starts_with("ttyACM")) {
        return {"IOModemSerialStream", "usbmodem"};
    }
    if (name.starts_with("rfcomm")) {
        return {"IOModemSerialStream", "Bluetooth-Modem"};
    }
    return {"IORS232SerialStream", name};
}

// A device's product text, with the blanks that firmware pads it with taken off; empty when there is none.
std::string productOf(const std::string& device, const std::string& root) {
    for (const std::string& above : upwards(device, root)) {
        // The first one with an ID is the USB device itself: beyond it are the hubs that it is plugged into.
        if (!exists(above + "/idVendor")) {
            continue;
        }
        const std::string text = readAttribute(above + "/product").value_or("");
        const std::size_t first = text.find_first_not_of(" \t");
        return first == std::string::npos ? "" : text.substr(first, text.find_last_not_of(" \t") - first + 1);
    }
    return {};
}

std::vector<std::string> activeConsoles(const std::string& root) {
    std::istringstream text(readAttribute(root + "/class/tty/console/active").value_or(""));
    std::vector<std::string> names;
    for (std::string name; text >> name;) {
        names.push_back(name);
    }
    return names;
}

EntryRef serialEntry(const std::string& name, const std::string& device, const std::string& root) {
    const Stream stream = streamOf(name);
    Properties properties;
    if (!properties.setText(CFSTR("IOTTYDevice"), name) ||
        !properties.setText(CFSTR("IOTTYBaseName"), stream.baseName)) {
        return nullptr;
    }
    properties.setText(CFSTR("IOSerialBSDClientType"), stream.type);
    Properties deviceProperties;
    if (const std::string product = productOf(device, root); !product.empty()) {
        deviceProperties.setText(CFSTR("Product Name"), product);
    }
    return std::make_shared<const Entry>(
        Entry{serialClass, properties.take(),
              std::make_shared<const Entry>(Entry{{}, deviceProperties.take(), nullptr})});
}

}  // namespace

std::vector<EntryRef> scanSerial(const std::string& sysfsRoot) {
    std::vector<EntryRef> entries;
    const auto root = resolved(sysfsRoot);
    if (!root) {
        return entries;
    }
    const std::vector<std::string> consoles = activeConsoles(*root);
    for (const std::string& name : namesIn(*root + "/class/tty")) {
        const std::string node = *root + "/class/tty/" + name;
        // Most terminals have no hardware, and asking is cheaper than following every link on the way.
        if (!exists(node + "/device")) {
            continue;
        }
        const auto device = resolved(node + "/device");
        constexpr std::string_view noUart = "0";
        if (!device || readAttribute(node + "/type") == noUart ||
            std::find(consoles.begin(), consoles.end(), name) != consoles.end()) {
            continue;
        }
        if (EntryRef entry = serialEntry(name, *device, *root)) {
            entries.push_back(std::move(entry));
        }
    }
    return entries;
}

}  // namespace platform::hardware
