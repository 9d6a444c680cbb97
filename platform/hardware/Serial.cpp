#include <algorithm>
#include <sstream>

#include "platform/base/DeviceText.h"
#include "platform/hardware/Entry.h"
#include "platform/hardware/Sysfs.h"
#include "platform/values/Fields.h"

namespace platform::hardware {
namespace {

struct Stream {
    std::string type;
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
    values::FieldWriter ofDevice;
    if (const std::string product = productOf(device, root); !product.empty()) {
        ofDevice("Product Name", product);
    }
    const Stream stream = streamOf(name);
    values::FieldWriter properties;
    properties("IOTTYDevice", name);
    properties("IOTTYBaseName", stream.baseName);
    properties("IOSerialBSDClientType", stream.type);
    return std::make_shared<const Entry>(Entry{
        serialClass, properties.take(), std::make_shared<const Entry>(Entry{"", ofDevice.take(), nullptr})});
}

}  // namespace

std::optional<std::vector<EntryRef>> scanSerial(const std::string& sysfsRoot) {
    const std::string root = resolved(sysfsRoot).value_or(sysfsRoot);
    const auto names = namesInClass(root + "/class/tty");
    if (!names) {
        return std::nullopt;
    }
    const std::vector<std::string> consoles = activeConsoles(root);
    std::vector<EntryRef> entries;
    for (const std::string& name : *names) {
        const std::string node = root + "/class/tty/" + name;
        const auto device = resolved(node + "/device");
        const bool hasUart = readAttribute(node + "/type") != "0";
        if (device && hasUart && std::find(consoles.begin(), consoles.end(), name) == consoles.end()) {
            entries.push_back(serialEntry(name, *device, root));
        }
    }
    return entries;
}

}  // namespace platform::hardware
