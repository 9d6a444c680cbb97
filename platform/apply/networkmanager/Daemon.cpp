#include "platform/apply/networkmanager/Daemon.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <ctime>
#include <utility>

namespace platform::apply {
namespace {

constexpr const char* serviceName = "org.freedesktop.NetworkManager";
constexpr const char* managerPath = "/org/freedesktop/NetworkManager";
constexpr const char* settingsPath = "/org/freedesktop/NetworkManager/Settings";
constexpr const char* managerInterface = "org.freedesktop.NetworkManager";
constexpr const char* settingsInterface = "org.freedesktop.NetworkManager.Settings";
constexpr const char* profileInterface = "org.freedesktop.NetworkManager.Settings.Connection";
constexpr const char* deviceInterface = "org.freedesktop.NetworkManager.Device";
constexpr const char* wirelessInterface = "org.freedesktop.NetworkManager.Device.Wireless";
constexpr const char* activeInterface = "org.freedesktop.NetworkManager.Connection.Active";
constexpr const char* addressesInterface = "org.freedesktop.NetworkManager.IP4Config";
constexpr const char* accessPointInterface = "org.freedesktop.NetworkManager.AccessPoint";
constexpr const char* propertiesInterface = "org.freedesktop.DBus.Properties";

constexpr std::chrono::seconds startupBound{10};

// Errors that are answers: the object is gone; there is none of that name; there is nothing to do.
constexpr std::array<std::string_view, 3> objectGone = {
    SD_BUS_ERROR_UNKNOWN_OBJECT, SD_BUS_ERROR_UNKNOWN_METHOD, SD_BUS_ERROR_UNKNOWN_INTERFACE};
constexpr std::array<std::string_view, 1> unknownDevice = {"org.freedesktop.NetworkManager.UnknownDevice"};
constexpr std::array<std::string_view, 1> unknownProfile = {
    "org.freedesktop.NetworkManager.Settings.InvalidConnection"};
constexpr std::array<std::string_view, 1> noSecrets = {
    "org.freedesktop.NetworkManager.AgentManager.NoSecrets"};
constexpr std::array<std::string_view, 4> atRest = {"org.freedesktop.NetworkManager.Device.NotActive",
                                                    objectGone[0], objectGone[1], objectGone[2]};

constexpr std::uint32_t typeEthernet = 1;
constexpr std::uint32_t typeWireless = 2;
constexpr std::uint32_t typeVirtualEthernet = 20;

constexpr std::uint32_t activeIsExternal = 0x80;

constexpr std::uint32_t profileIsVolatile = 0x4;
constexpr std::uint32_t inMemory = 0x2;
constexpr std::uint32_t blockAutoconnect = 0x20;

constexpr std::uint32_t reasonNone = 0;

constexpr std::uint32_t modeAdHoc = 1;
constexpr std::uint32_t accessPrivacy = 0x1;
constexpr std::uint32_t keyManagementShared = 0x100;
constexpr std::uint32_t keyManagementSAE = 0x400;
constexpr std::size_t mostAccessPoints = 500;

std::uint32_t numberIn(const Dictionary& properties, const char* key) {
    return valueOf<std::uint32_t>(properties, key).value_or(0);
}

std::string pathIn(const Dictionary& properties, const char* key) {
    const std::string path = valueOf<std::string>(properties, key).value_or("");
    return path == "/" ? "" : path;
}

Security securityOf(const Dictionary& point) {
    const std::uint32_t protection = numberIn(point, "WpaFlags") | numberIn(point, "RsnFlags");
    if (protection == 0) {
        return (numberIn(point, "Flags") & accessPrivacy) != 0 ? Security::wep : Security::open;
    }
    return (protection & keyManagementShared) != 0 ? Security::wpa
           : (protection & keyManagementSAE) != 0  ? Security::sae
                                                   : Security::enterprise;
}

// Nothing is read, and that is a success, without a reply.
template <class T>
Outcome readReply(const char* what, const MessageRef& reply, T& value) {
    return reply != nullptr && readValue(reply.get(), value) < 0
               ? Outcome(kSCStatusFailed, std::string(what) + ": the answer of NetworkManager cannot be read")
               : Outcome();
}

}  // namespace

Outcome Daemon::call(const std::string& path, const char* interface, const char* member, Arguments arguments,
                     MessageRef& reply, Answers answers, std::string_view secret) {
    std::string error;
    Outcome outcome = bus_.call({path, interface, member, std::move(arguments), secret}, reply, &error);
    return std::ranges::find(answers, error) != answers.end() ? Outcome() : outcome;
}

Outcome Daemon::open(bool& running) {
    running = isConnected_;
    if (!isConnected_) {
        RETURN_IF_FAILED(bus_.connect(serviceName, running));
        isConnected_ = running;
    }
    return {};
}

Outcome Daemon::connect() {
    bool running = false;
    RETURN_IF_FAILED(open(running));
    if (!running) {
        return {kSCStatusFailed, "NetworkManager does not run"};
    }
    RETURN_IF_FAILED(readManager());
    return starting_ ? awaitStartup() : Outcome();
}

Outcome Daemon::readManager() {
    Dictionary manager;
    Outcome outcome = bus_.readProperties(managerPath, managerInterface, manager);
    if (outcome.ok()) {
        starting_ = valueOf<bool>(manager, "Startup").value_or(false);
        radio_ = valueOf<bool>(manager, "WirelessEnabled").value_or(true);
        radioHardware_ = valueOf<bool>(manager, "WirelessHardwareEnabled").value_or(true);
    }
    return outcome;
}

Outcome Daemon::awaitStartup() {
    RETURN_IF_FAILED(bus_.watch(
        propertiesInterface, "PropertiesChanged",
        [this](const char* /*path*/, sd_bus_message* /*message*/) { managerChanged_ = true; },
        managerInterface));
    const Clock::time_point deadline = Clock::now() + startupBound;
    // A daemon that takes longer, because a card waits for an address, can be worked with.
    while (starting_ && Clock::now() < deadline) {
        managerChanged_ = false;
        RETURN_IF_FAILED(readManager());
        while (starting_ && !managerChanged_ && Clock::now() < deadline) {
            RETURN_IF_FAILED(bus_.handleSignals(deadline));
        }
    }
    return {};
}

Outcome Daemon::readObject(const std::string& path, const char* interface,
                           std::optional<Dictionary>& properties) {
    std::string error;
    Outcome outcome = bus_.readProperties(path, interface, properties.emplace(), &error);
    if (std::ranges::find(objectGone, error) != objectGone.end()) {
        properties.reset();
        return {};
    }
    return outcome;
}

Outcome Daemon::findPath(const std::string& object, const char* interface, const char* member,
                         const std::string& name, Answers unknown, std::string& path) {
    path.clear();
    MessageRef reply;
    RETURN_IF_FAILED(call(object, interface, member, arguments(name), reply, unknown));
    return readReply(member, reply, path);
}

Outcome Daemon::findDevice(const std::string& interface, std::optional<Device>& device) {
    device.reset();
    Device found;
    std::optional<Dictionary> properties;
    // Where it was the last time: another card of this name would be another object.
    if (const auto known = paths_.find(interface); known != paths_.end()) {
        found.path = known->second;
        RETURN_IF_FAILED(readObject(found.path, deviceInterface, properties));
    }
    if (!properties || valueOf<std::string>(*properties, "Interface").value_or(interface) != interface) {
        RETURN_IF_FAILED(findPath(managerPath, managerInterface, "GetDeviceByIpIface", interface,
                                  unknownDevice, found.path));
        properties.reset();
        if (!found.path.empty()) {
            RETURN_IF_FAILED(readObject(found.path, deviceInterface, properties));
        }
    }
    if (!properties) {
        return {};
    }
    paths_[interface] = found.path;
    const std::uint32_t type = numberIn(*properties, "DeviceType");
    if (type == typeEthernet || type == typeVirtualEthernet) {
        found.kind = Device::Kind::wired;
    } else if (type == typeWireless) {
        found.kind = Device::Kind::wireless;
    }
    devices_[found.path] = numberIn(*properties, "State");
    found.managed = valueOf<bool>(*properties, "Managed").value_or(false);
    found.autoconnect = valueOf<bool>(*properties, "Autoconnect").value_or(false);
    found.active = pathIn(*properties, "ActiveConnection");
    found.addresses = pathIn(*properties, "Ip4Config");
    device = std::move(found);
    return {};
}

Outcome Daemon::findActive(const Device& device, std::optional<Active>& active) {
    active.reset();
    std::optional<Dictionary> properties;
    if (!device.active.empty()) {
        RETURN_IF_FAILED(readObject(device.active, activeInterface, properties));
    }
    if (properties && numberIn(*properties, "State") <= activeActivated) {
        active = {device.active, pathIn(*properties, "Connection"),
                  valueOf<std::string>(*properties, "Uuid").value_or(""),
                  numberIn(*properties, "State") == activeActivated,
                  (numberIn(*properties, "StateFlags") & activeIsExternal) != 0};
    }
    return {};
}

Outcome Daemon::findProfile(const std::string& uuid, std::optional<Profile>& profile) {
    profile.reset();
    std::string path;
    RETURN_IF_FAILED(
        findPath(settingsPath, settingsInterface, "GetConnectionByUuid", uuid, unknownProfile, path));
    if (path.empty()) {
        return {};
    }
    MessageRef reply;
    RETURN_IF_FAILED(call(path, profileInterface, "GetSettings", {}, reply, objectGone));
    if (reply != nullptr) {
        profile.emplace().path = path;
        return readReply("GetSettings", reply, profile->sections);
    }
    return {};
}

Outcome Daemon::isVolatile(const std::string& profile, bool& result) {
    Dictionary properties;
    Outcome outcome = bus_.readProperties(profile, profileInterface, properties);
    result = (numberIn(properties, "Flags") & profileIsVolatile) != 0;
    return outcome;
}

Outcome Daemon::readSecrets(const std::string& profile, Sections& sections) {
    for (const char* const name : {"802-11-wireless-security", "802-1x"}) {
        const auto section = sections.find(name);
        if (section == sections.end()) {
            continue;
        }
        MessageRef reply;
        Sections secrets;
        RETURN_IF_FAILED(call(profile, profileInterface, "GetSecrets", arguments(name), reply, noSecrets));
        RETURN_IF_FAILED(readReply("GetSecrets", reply, secrets));
        section->second.merge(secrets[name]);
    }
    return {};
}

Outcome Daemon::addProfile(const Sections& sections, Adding adding, std::string_view secret,
                           std::string& path) {
    MessageRef reply;
    const std::uint32_t flags = inMemory | (adding == Adding::heldBack ? blockAutoconnect : 0);
    // Not AddAndActivateConnection, which completes what is missing or wrong instead of refusing it.
    RETURN_IF_FAILED(call(settingsPath, settingsInterface, "AddConnection2",
                          arguments(sections, flags, Dictionary()), reply, {}, secret));
    return readReply("AddConnection2", reply, path);
}

Outcome Daemon::updateProfile(const std::string& path, const Sections& sections, std::string_view secret) {
    MessageRef reply;
    return call(path, profileInterface, "Update2",
                arguments(sections, inMemory | blockAutoconnect, Dictionary()), reply, {}, secret);
}

Outcome Daemon::deleteProfile(const std::string& path) {
    MessageRef reply;
    return call(path, profileInterface, "Delete", {}, reply, objectGone);
}

Outcome Daemon::activate(const std::string& profile, const Device& device, std::string& active) {
    MessageRef reply;
    failures_.erase(device.path);
    // Until a signal tells how far the new one is.
    devices_[device.path] = deviceDisconnected;
    RETURN_IF_FAILED(call(managerPath, managerInterface, "ActivateConnection",
                          arguments(Path{profile}, Path{device.path}, Path{"/"}), reply));
    return readReply("ActivateConnection", reply, active);
}

Outcome Daemon::disconnect(const Device& device) {
    MessageRef reply;
    RETURN_IF_FAILED(call(device.path, deviceInterface, "Disconnect", {}, reply, atRest));
    if (reply == nullptr) {
        // No signal will tell of a card that is gone: its state is asked for again.
        devices_.erase(device.path);
    }
    return {};
}

Outcome Daemon::setManaged(const Device& device, bool managed) {
    return bus_.setProperty(device.path, deviceInterface, "Managed", {managed});
}

Outcome Daemon::setAutoconnect(const Device& device, bool autoconnect) {
    return bus_.setProperty(device.path, deviceInterface, "Autoconnect", {autoconnect});
}

Outcome Daemon::readMetric(const Device& device, std::uint32_t& metric) {
    metric = 0;
    std::optional<Dictionary> properties;
    if (!device.addresses.empty()) {
        RETURN_IF_FAILED(readObject(device.addresses, addressesInterface, properties));
    }
    const auto routes = valueOf<std::vector<Dictionary>>(properties.value_or(Dictionary()), "RouteData");
    bool hasDefault = false;
    for (const Dictionary& route : routes.value_or(std::vector<Dictionary>())) {
        const std::uint32_t own = numberIn(route, "metric");
        const bool isDefault =
            valueOf<std::string>(route, "dest") == "0.0.0.0" && numberIn(route, "prefix") == 0;
        if (metric == 0 || (isDefault && !hasDefault) || (isDefault == hasDefault && own < metric)) {
            metric = own;
        }
        hasDefault = hasDefault || isDefault;
    }
    return {};
}

Outcome Daemon::setRadio(bool on) {
    Outcome outcome = bus_.setProperty(managerPath, managerInterface, "WirelessEnabled", {on});
    if (outcome.ok()) {
        radio_ = on;
    }
    return outcome;
}

Outcome Daemon::readHeard(const Device& device, const std::string& network,
                          std::vector<HeardNetwork>& heard) {
    heard.clear();
    MessageRef reply;
    RETURN_IF_FAILED(call(device.path, wirelessInterface, "GetAllAccessPoints", {}, reply));
    Texts paths;
    RETURN_IF_FAILED(readReply("GetAllAccessPoints", reply, paths));
    paths.resize(std::min(paths.size(), mostAccessPoints));
    timespec now{};
    ::clock_gettime(CLOCK_BOOTTIME, &now);
    for (const std::string& path : paths) {
        std::optional<Dictionary> found;
        RETURN_IF_FAILED(readObject(path, accessPointInterface, found));
        const Dictionary point = found.value_or(Dictionary());
        // One that was never heard is the daemon's own note of a network that it is to join.
        const std::int32_t lastHeard = valueOf<std::int32_t>(point, "LastSeen").value_or(-1);
        if (valueOf<ByteArray>(point, "Ssid") != ByteArray(network.begin(), network.end()) || lastHeard < 0) {
            continue;
        }
        heard.push_back({numberIn(point, "Mode") == modeAdHoc, securityOf(point),
                         static_cast<int>(numberIn(point, "Strength")),
                         static_cast<int>(numberIn(point, "Frequency")),
                         valueOf<std::string>(point, "HwAddress").value_or(""),
                         std::chrono::seconds(std::max<std::int64_t>(now.tv_sec - lastHeard, 0))});
    }
    return {};
}

Outcome Daemon::readLastScan(const Device& device, std::int64_t& time) {
    Dictionary card;
    RETURN_IF_FAILED(bus_.readProperties(device.path, wirelessInterface, card));
    time = valueOf<std::int64_t>(card, "LastScan").value_or(-1);
    return {};
}

Outcome Daemon::scanFor(const Device& device, const std::string& network) {
    const Dictionary byName{{"ssids", {std::vector<ByteArray>{ByteArray(network.begin(), network.end())}}}};
    Outcome outcome;
    std::string error;
    // Not every daemon below it can call out for a name.
    for (const Dictionary& options : {byName, Dictionary()}) {
        MessageRef reply;
        const auto append = [&options](sd_bus_message* message) { return appendValue(message, options); };
        outcome = bus_.call({device.path, wirelessInterface, "RequestScan", append, {}}, reply, &error);
        if (error.empty()) {
            return outcome;
        }
    }
    // It has just looked, or is busy with joining, for which it looks by itself.
    return {};
}

Outcome Daemon::listen() {
    if (std::exchange(isListening_, true)) {
        return {};
    }
    RETURN_IF_FAILED(
        bus_.watch(activeInterface, "StateChanged", [this](const char* path, sd_bus_message* message) {
            std::uint32_t state = 0;
            if (sd_bus_message_read(message, "uu", &state, nullptr) >= 0) {
                actives_[path] = state;
            }
        }));
    return bus_.watch(deviceInterface, "StateChanged", [this](const char* path, sd_bus_message* message) {
        std::uint32_t state = 0;
        std::uint32_t reason = 0;
        if (sd_bus_message_read(message, "uuu", &state, nullptr, &reason) >= 0) {
            noteDevice(path, state, reason);
        }
    });
}

Outcome Daemon::listenToAir() {
    if (std::exchange(isListeningToAir_, true)) {
        return {};
    }
    const auto noteAir = [this](const char* /*path*/, sd_bus_message* /*message*/) { ++changesOnAir_; };
    RETURN_IF_FAILED(bus_.watch(propertiesInterface, "PropertiesChanged", noteAir, wirelessInterface));
    return bus_.watch(wirelessInterface, "AccessPointAdded", noteAir);
}

void Daemon::noteDevice(const char* path, std::uint32_t state, std::uint32_t reason) {
    devices_[path] = state;
    if (state == deviceDeactivating || state == deviceFailed) {
        failures_[path] = reason;
    } else if (state > deviceDisconnected) {
        // What was before made way for this one.
        failures_.erase(path);
    }
}

Outcome Daemon::deviceState(const std::string& path, std::uint32_t& state) {
    return readState(devices_, path, deviceInterface, 0, state);
}

Outcome Daemon::activeState(const std::string& path, std::uint32_t& state) {
    return readState(actives_, path, activeInterface, activeDeactivated, state);
}

Outcome Daemon::readState(States& known, const std::string& path, const char* interface, std::uint32_t gone,
                          std::uint32_t& state) {
    if (!known.contains(path)) {
        std::optional<Dictionary> properties;
        RETURN_IF_FAILED(readObject(path, interface, properties));
        known[path] = properties ? numberIn(*properties, "State") : gone;
    }
    state = known[path];
    return {};
}

std::uint32_t Daemon::failureOf(const std::string& device) const {
    const auto found = failures_.find(device);
    return found == failures_.end() ? reasonNone : found->second;
}

}  // namespace platform::apply
