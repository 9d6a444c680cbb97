#include "platform/apply/networkmanager/Daemon.h"

#include <algorithm>
#include <cerrno>
#include <limits>
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
constexpr std::chrono::seconds settleBound{5};
constexpr std::chrono::seconds scanBound{10};
// What a card says about its failure comes right after what its profile says.
constexpr std::chrono::milliseconds reasonBound{250};

constexpr std::uint32_t typeEthernet = 1;
constexpr std::uint32_t typeWireless = 2;
constexpr std::uint32_t typeVirtualEthernet = 20;

constexpr std::uint32_t activeActivated = 2;
constexpr std::uint32_t activeDeactivated = 4;
constexpr std::uint32_t activeIsExternal = 0x80;

constexpr std::uint32_t profileIsVolatile = 0x4;
// In memory, and not to be activated until somebody asks for it.
constexpr std::uint32_t profileFlags = 0x2 | 0x20;

constexpr std::uint32_t reasonNone = 0;
constexpr std::uint32_t reasonNewActivation = 60;

constexpr std::uint32_t capabilityAdHoc = 0x80;
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

bool isGone(const std::string& error) {
    return error == SD_BUS_ERROR_UNKNOWN_OBJECT || error == SD_BUS_ERROR_UNKNOWN_METHOD ||
           error == SD_BUS_ERROR_UNKNOWN_INTERFACE;
}

Arguments textArgument(const std::string& text) {
    return [text](sd_bus_message* message) { return sd_bus_message_append(message, "s", text.c_str()); };
}

Outcome unreadable(const char* what) {
    return {kSCStatusFailed, std::string(what) + ": the answer of NetworkManager cannot be read"};
}

Outcome readPath(const char* what, const Message& reply, std::string& path) {
    const char* borrowed = nullptr;
    if (sd_bus_message_read(reply.get(), "o", &borrowed) < 0) {
        return unreadable(what);
    }
    path = borrowed;
    return {};
}

}  // namespace

std::string describeFailure(std::uint32_t reason) {
    switch (reason) {
        case 4:
            return "the card could not be configured";
        case 5:
        case 6:
        case 15:
        case 16:
        case 17:
            return "no address was had";
        case 7:
            return "the network's key is wrong or missing";
        case 8:
        case 9:
        case 10:
        case 11:
            return "the network broke off the joining";
        case 35:
            return "the card's firmware is missing";
        case 36:
            return "the card was taken out";
        case 37:
            return "the computer went to sleep";
        case 38:
            return "the profile was deleted meanwhile";
        case 39:
            return "somebody disconnected the card meanwhile";
        case 40:
            return "the cable is out, or the network went away";
        case 53:
            return "the network was not found";
        case reasonNewActivation:
            return "somebody else took over the card";
        case 64:
            return "somebody else uses the address";
        default:
            return "NetworkManager gives the reason " + std::to_string(reason);
    }
}

// What the signals have told of one activation.
struct Daemon::Progress {
    std::string path;    // of the active profile
    std::string device;  // of the card
    std::uint32_t state = 0;
    std::uint32_t failure = reasonNone;
    std::unique_ptr<Bus::Watch> activeWatch;
    std::unique_ptr<Bus::Watch> deviceWatch;
};

Outcome Daemon::call(const std::string& path, const char* interface, const char* member, Arguments arguments,
                     Message& reply, std::string* error, std::string_view secret) {
    return bus_.call({path, interface, member, std::move(arguments), secret}, reply, error);
}

Outcome Daemon::connect() {
    bool found = false;
    Outcome outcome = bus_.connect(serviceName, found);
    bool owned = false;
    if (outcome.ok() && found) {
        outcome = bus_.hasOwner(owned);
    }
    if (outcome.ok() && !owned) {
        outcome = {kSCStatusFailed, "NetworkManager does not run"};
    }
    if (outcome.ok()) {
        outcome = readManager();
    }
    return outcome.ok() && starting_ ? awaitStartup() : outcome;
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
    bool changed = true;
    std::unique_ptr<Bus::Watch> watch;
    Outcome outcome = bus_.watch(
        propertiesInterface, "PropertiesChanged",
        [&changed](const char* path, sd_bus_message* /*message*/) {
            changed = changed || std::string_view(path) == managerPath;
        },
        watch);
    const Clock::time_point deadline = Clock::now() + startupBound;
    while (outcome.ok() && starting_ && Clock::now() < deadline) {
        changed = false;
        outcome = readManager();
        if (outcome.ok() && starting_) {
            // A daemon that takes longer, because a card waits for an address, can be worked with.
            outcome = bus_.waitUntil([&changed] { return changed; }, deadline, {});
        }
    }
    return outcome;
}

Outcome Daemon::findDevice(const std::string& interface, std::optional<Device>& device) {
    device.reset();
    Message reply;
    std::string error;
    Outcome outcome =
        call(managerPath, managerInterface, "GetDeviceByIpIface", textArgument(interface), reply, &error);
    if (error == "org.freedesktop.NetworkManager.UnknownDevice") {
        return {};
    }
    Device found;
    if (outcome.ok()) {
        outcome = readPath("GetDeviceByIpIface", reply, found.path);
    }
    Dictionary properties;
    if (outcome.ok()) {
        outcome = bus_.readProperties(found.path, deviceInterface, properties, &error);
        if (isGone(error)) {
            return {};
        }
    }
    if (outcome.ok()) {
        const std::uint32_t type = numberIn(properties, "DeviceType");
        if (type == typeEthernet || type == typeVirtualEthernet) {
            found.kind = Device::Kind::wired;
        } else if (type == typeWireless) {
            found.kind = Device::Kind::wireless;
        }
        found.state = numberIn(properties, "State");
        found.managed = valueOf<bool>(properties, "Managed").value_or(false);
        found.autoconnect = valueOf<bool>(properties, "Autoconnect").value_or(false);
        found.active = pathIn(properties, "ActiveConnection");
        found.addresses = pathIn(properties, "Ip4Config");
        device = std::move(found);
    }
    return outcome;
}

Outcome Daemon::findActive(const Device& device, std::optional<Active>& active) {
    active.reset();
    if (device.active.empty()) {
        return {};
    }
    Dictionary properties;
    std::string error;
    Outcome outcome = bus_.readProperties(device.active, activeInterface, properties, &error);
    const std::uint32_t state = numberIn(properties, "State");
    if (isGone(error) || (outcome.ok() && state > activeActivated)) {
        return {};
    }
    if (outcome.ok()) {
        active = {device.active, pathIn(properties, "Connection"),
                  valueOf<std::string>(properties, "Uuid").value_or(""), state == activeActivated,
                  (numberIn(properties, "StateFlags") & activeIsExternal) != 0};
    }
    return outcome;
}

Outcome Daemon::readProfile(const std::string& path, std::optional<Profile>& profile) {
    Message reply;
    std::string error;
    Outcome outcome = call(path, profileInterface, "GetSettings", {}, reply, &error);
    if (isGone(error)) {
        return {};
    }
    if (outcome.ok()) {
        profile.emplace().path = path;
        if (readSections(reply.get(), profile->sections) < 0) {
            return unreadable("GetSettings");
        }
    }
    return outcome;
}

Outcome Daemon::findProfile(const std::string& uuid, std::optional<Profile>& profile) {
    profile.reset();
    Message reply;
    std::string error;
    Outcome outcome =
        call(settingsPath, settingsInterface, "GetConnectionByUuid", textArgument(uuid), reply, &error);
    if (error == "org.freedesktop.NetworkManager.Settings.InvalidConnection") {
        return {};
    }
    std::string path;
    if (outcome.ok()) {
        outcome = readPath("GetConnectionByUuid", reply, path);
    }
    return outcome.ok() ? readProfile(path, profile) : outcome;
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
        Message reply;
        std::string error;
        Outcome outcome = call(profile, profileInterface, "GetSecrets", textArgument(name), reply, &error);
        Sections secrets;
        if (error == "org.freedesktop.NetworkManager.AgentManager.NoSecrets") {
            continue;
        }
        if (!outcome.ok()) {
            return outcome;
        }
        if (readSections(reply.get(), secrets) < 0) {
            return unreadable("GetSecrets");
        }
        if (const auto found = secrets.find(name); found != secrets.end()) {
            section->second.insert(found->second.begin(), found->second.end());
        }
    }
    return {};
}

Outcome Daemon::addProfile(const Sections& sections, std::string_view secret, std::string& path) {
    Message reply;
    // Not AddAndActivateConnection, which completes what is missing or wrong instead of refusing it.
    Outcome outcome = call(
        settingsPath, settingsInterface, "AddConnection2",
        [&sections](sd_bus_message* message) {
            const int result = appendSections(message, sections);
            return result < 0 ? result : sd_bus_message_append(message, "ua{sv}", profileFlags, 0);
        },
        reply, nullptr, secret);
    return outcome.ok() ? readPath("AddConnection2", reply, path) : outcome;
}

Outcome Daemon::updateProfile(const std::string& path, const Sections& sections, std::string_view secret) {
    Message reply;
    return call(
        path, profileInterface, "Update2",
        [&sections](sd_bus_message* message) {
            const int result = appendSections(message, sections);
            return result < 0 ? result : sd_bus_message_append(message, "ua{sv}", profileFlags, 0);
        },
        reply, nullptr, secret);
}

Outcome Daemon::deleteProfile(const std::string& path) {
    Message reply;
    std::string error;
    Outcome outcome = call(path, profileInterface, "Delete", {}, reply, &error);
    return isGone(error) ? Outcome() : outcome;
}

Outcome Daemon::follow(Progress& progress, const Device& device) {
    progress.device = device.path;
    Outcome outcome = bus_.watch(
        activeInterface, "StateChanged",
        [&progress](const char* path, sd_bus_message* message) {
            std::uint32_t state = 0;
            if (sd_bus_message_read(message, "uu", &state, nullptr) >= 0 && progress.path == path) {
                progress.state = state;
            }
        },
        progress.activeWatch);
    if (!outcome.ok()) {
        return outcome;
    }
    return bus_.watch(
        deviceInterface, "StateChanged",
        [&progress](const char* path, sd_bus_message* message) {
            std::uint32_t state = 0;
            std::uint32_t reason = 0;
            if (progress.device != path ||
                sd_bus_message_read(message, "uuu", &state, nullptr, &reason) < 0) {
                return;
            }
            if (state == deviceDeactivating || state == deviceFailed) {
                progress.failure = reason;
            } else if (state > deviceDisconnected) {
                // What was before made way for this one.
                progress.failure = reasonNone;
            }
        },
        progress.deviceWatch);
}

Outcome Daemon::await(Progress& progress) {
    // The signals tell changes only; it may be up already, or gone.
    Dictionary properties;
    std::string error;
    Outcome outcome = bus_.readProperties(progress.path, activeInterface, properties, &error);
    progress.state = numberIn(properties, "State");
    if (isGone(error)) {
        outcome = {};
        progress.state = activeDeactivated;
    }
    if (outcome.ok()) {
        outcome = bus_.waitUntil(
            [&progress] { return progress.state == activeActivated || progress.state == activeDeactivated; },
            Clock::now() + activationBound,
            {kSCStatusFailed, "it was not up after " + std::to_string(activationBound.count()) + " s"});
    }
    if (!outcome.ok() || progress.state == activeActivated) {
        return outcome;
    }
    // All of what came: an earlier signal tells how the profile before made way.
    outcome = bus_.drain();
    if (outcome.ok()) {
        outcome = bus_.waitUntil([&progress] { return progress.failure != reasonNone; },
                                 Clock::now() + reasonBound, {});
    }
    return outcome.ok() ? Outcome(kSCStatusFailed, describeFailure(progress.failure)) : outcome;
}

Outcome Daemon::activate(const std::string& profile, const Device& device) {
    Progress progress;
    Outcome outcome = follow(progress, device);
    Message reply;
    if (outcome.ok()) {
        outcome = call(
            managerPath, managerInterface, "ActivateConnection",
            [&](sd_bus_message* message) {
                return sd_bus_message_append(message, "ooo", profile.c_str(), device.path.c_str(), "/");
            },
            reply);
    }
    if (outcome.ok()) {
        outcome = readPath("ActivateConnection", reply, progress.path);
    }
    return outcome.ok() ? await(progress) : outcome;
}

Outcome Daemon::awaitActive(const Active& active, const Device& device) {
    Progress progress;
    progress.path = active.path;
    Outcome outcome = follow(progress, device);
    return outcome.ok() ? await(progress) : outcome;
}

Outcome Daemon::awaitState(Device& device, std::uint32_t lowest, std::uint32_t highest,
                           std::chrono::seconds bound, const char* late) {
    const Clock::time_point deadline = Clock::now() + bound;
    std::unique_ptr<Bus::Watch> watch;
    Outcome outcome = bus_.watch(
        deviceInterface, "StateChanged",
        [&device](const char* path, sd_bus_message* message) {
            std::uint32_t state = 0;
            if (device.path == path && sd_bus_message_read(message, "uuu", &state, nullptr, nullptr) >= 0) {
                device.state = state;
            }
        },
        watch);
    Dictionary properties;
    if (outcome.ok()) {
        outcome = bus_.readProperties(device.path, deviceInterface, properties);
    }
    if (outcome.ok()) {
        device.state = numberIn(properties, "State");
        outcome = bus_.waitUntil(
            [&device, lowest, highest] { return device.state >= lowest && device.state <= highest; },
            deadline, late == nullptr ? Outcome() : Outcome(kSCStatusFailed, late));
    }
    return outcome;
}

Outcome Daemon::disconnect(const Device& device) {
    Message reply;
    std::string error;
    Outcome outcome = call(device.path, deviceInterface, "Disconnect", {}, reply, &error);
    if (!outcome.ok() && error != "org.freedesktop.NetworkManager.Device.NotActive") {
        return outcome;
    }
    Device now = device;
    return awaitState(now, 0, deviceDisconnected, activationBound, "the card did not come to rest in 45 s");
}

Outcome Daemon::setManaged(const Device& device, bool managed) {
    return bus_.setProperty(device.path, deviceInterface, "Managed", {managed});
}

Outcome Daemon::setAutoconnect(const Device& device, bool autoconnect) {
    return bus_.setProperty(device.path, deviceInterface, "Autoconnect", {autoconnect});
}

Outcome Daemon::settle(Device& device) {
    return awaitState(device, deviceDisconnected, std::numeric_limits<std::uint32_t>::max(), settleBound,
                      nullptr);
}

Outcome Daemon::readMetric(const Device& device, std::uint32_t& metric) {
    metric = 0;
    Dictionary properties;
    std::string error;
    if (device.addresses.empty()) {
        return {};
    }
    Outcome outcome = bus_.readProperties(device.addresses, addressesInterface, properties, &error);
    const auto routes = valueOf<std::vector<Dictionary>>(properties, "RouteData");
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
    return isGone(error) ? Outcome() : outcome;
}

Outcome Daemon::setRadio(bool on) {
    Outcome outcome = bus_.setProperty(managerPath, managerInterface, "WirelessEnabled", {on});
    if (outcome.ok()) {
        radio_ = on;
    }
    return outcome;
}

Outcome Daemon::readAccessPoints(const Device& device, const std::string& network,
                                 std::vector<AccessPoint>& seen) {
    seen.clear();
    Message reply;
    Outcome outcome = call(device.path, wirelessInterface, "GetAllAccessPoints", {}, reply);
    if (!outcome.ok()) {
        return outcome;
    }
    Texts paths;
    if (readTexts(reply.get(), paths) < 0) {
        return unreadable("GetAllAccessPoints");
    }
    paths.resize(std::min(paths.size(), mostAccessPoints));
    for (const std::string& path : paths) {
        Dictionary point;
        std::string error;
        Outcome read = bus_.readProperties(path, accessPointInterface, point, &error);
        if (isGone(error)) {
            continue;
        }
        if (!read.ok()) {
            return read;
        }
        if (valueOf<Bytes>(point, "Ssid") != Bytes(network.begin(), network.end())) {
            continue;
        }
        const std::uint32_t protection = numberIn(point, "WpaFlags") | numberIn(point, "RsnFlags");
        seen.push_back({numberIn(point, "Mode") == modeAdHoc, (numberIn(point, "Flags") & accessPrivacy) != 0,
                        protection != 0, (protection & (keyManagementShared | keyManagementSAE)) != 0,
                        numberIn(point, "Strength")});
    }
    return {};
}

Outcome Daemon::look(const Device& device, const std::string& network, WirelessFacts& facts) {
    Dictionary properties;
    Outcome outcome = bus_.readProperties(device.path, wirelessInterface, properties);
    if (!outcome.ok()) {
        return outcome;
    }
    facts.canAdHoc = (numberIn(properties, "WirelessCapabilities") & capabilityAdHoc) != 0;
    facts.seen.clear();
    if (network.empty()) {
        return {};
    }
    bool changed = false;
    std::unique_ptr<Bus::Watch> watch;
    outcome = bus_.watch(
        propertiesInterface, "PropertiesChanged",
        [&](const char* path, sd_bus_message* /*message*/) { changed = changed || device.path == path; },
        watch);
    if (outcome.ok()) {
        outcome = readAccessPoints(device, network, facts.seen);
    }
    if (!outcome.ok() || !facts.seen.empty()) {
        return outcome;
    }
    // By its name, since a network may keep quiet until it is asked for.
    Message reply;
    const Outcome requested = call(
        device.path, wirelessInterface, "RequestScan",
        [&network](sd_bus_message* m) {
            int result = sd_bus_message_open_container(m, 'a', "{sv}");
            result = result < 0 ? result : sd_bus_message_open_container(m, 'e', "sv");
            result = result < 0 ? result : sd_bus_message_append(m, "s", "ssids");
            result = result < 0 ? result : sd_bus_message_open_container(m, 'v', "aay");
            result = result < 0 ? result : sd_bus_message_open_container(m, 'a', "ay");
            result =
                result < 0 ? result : sd_bus_message_append_array(m, 'y', network.data(), network.size());
            for (int depth = 0; depth < 4; ++depth) {
                result = result < 0 ? result : sd_bus_message_close_container(m);
            }
            return result;
        },
        reply);
    const auto lastScan = valueOf<std::int64_t>(properties, "LastScan");
    const Clock::time_point deadline = Clock::now() + scanBound;
    // The daemon refuses when it has just looked: then there is nothing to wait for.
    while (requested.ok() && outcome.ok() && facts.seen.empty() && Clock::now() < deadline) {
        outcome = bus_.waitUntil([&changed] { return changed; }, deadline, {});
        changed = false;
        if (outcome.ok()) {
            outcome = readAccessPoints(device, network, facts.seen);
        }
        if (outcome.ok()) {
            outcome = bus_.readProperties(device.path, wirelessInterface, properties);
        }
        if (valueOf<std::int64_t>(properties, "LastScan") != lastScan) {
            break;
        }
    }
    return outcome;
}

}  // namespace platform::apply
