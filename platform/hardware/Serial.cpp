#include <algorithm>
#include <sstream>

#include "platform/base/DeviceText.h"
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

// A device's product text; empty when there is none.
std::string productOf(const std::string& device, const std::string& root) {
    for (const std::string& above : upwards(device, root)) {
        // The first one with an ID is the USB device itself: beyond it are the hubs that it is plugged into.
        if (exists(above + "/idVendor")) {
            return deviceText(readAttribute(above + "/product").value_or(""));
        }
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
    properties.setText(CFSTR("IOTTYDevice"), name);
    properties.setText(CFSTR("IOTTYBaseName"), stream.baseName);
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

std::optional<std::vector<EntryRef>> scanSerial(const std::string& sysfsRoot) {
    std::vector<EntryRef> entries;
    const auto root = resolved(sysfsRoot);
    if (!root) {
        return entries;
    }
    const auto names = namesInClass(*root + "/class/tty");
    if (!names) {
        return std::nullopt;
    }
    const std::vector<std::string> consoles = activeConsoles(*root);
    for (const std::string& name : *names) {
        const std::string node = *root + "/class/tty/" + name;
        const auto device = resolved(node + "/device");
        constexpr std::string_view noUart = "0";
        if (!device || readAttribute(node + "/type") == noUart ||
            std::find(consoles.begin(), consoles.end(), name) != consoles.end()) {
            continue;
        }
        entries.push_back(serialEntry(name, *device, *root));
    }
    return entries;
}

}  // namespace platform::hardware
