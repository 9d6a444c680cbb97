#include "tests/unit/networkmanager/StandInDaemon.h"

#include <algorithm>
#include <ctime>
#include <utility>

#include "tests/unit/networkmanager/Show.h"

namespace testing_support {

using namespace platform::apply;

namespace {

// Either the secrets of a profile or all else.
Sections pick(const Sections& sections, bool secrets) {
    Sections picked;
    for (const auto& [name, section] : sections) {
        for (const auto& [key, value] : section) {
            if ((key == "psk" || key == "wep-key0") == secrets) {
                picked[name].emplace(key, value);
            }
        }
    }
    return picked;
}

std::string textIn(const Sections& sections, const char* key) {
    return valueOf<std::string>(sections.at("connection"), key).value_or("");
}

}  // namespace

StandInDaemon::StandInDaemon(const StandInBus& bus)
    : service(bus, "org.freedesktop.NetworkManager",
              [this](sd_bus_message* call, sd_bus_message* reply) { return answer(call, reply); }) {
    service.objects[manager] = {
        {"Startup", {false}}, {"WirelessEnabled", {true}}, {"WirelessHardwareEnabled", {true}}};
    service.objects[card] = {
        {"DeviceType", {2U}}, {"State", {deviceDisconnected}}, {"Managed", {true}}, {"Autoconnect", {true}}};
}

void StandInDaemon::offer(const std::string& network, std::uint32_t mode, std::uint32_t privacy,
                          std::uint32_t protection, bool isQuiet) {
    timespec now{};
    clock_gettime(CLOCK_BOOTTIME, &now);
    const std::string path = manager + "/AccessPoint/" + std::to_string(++next_);
    service.objects[path] = {{"Ssid", {ByteArray(network.begin(), network.end())}},
                             {"Mode", {mode}},
                             {"Flags", {privacy}},
                             {"RsnFlags", {protection}},
                             {"Frequency", {2412U}},
                             {"LastSeen", {static_cast<std::int32_t>(now.tv_sec)}}};
    (isQuiet ? quietPoints_ : points_).push_back(path);
}

void StandInDaemon::starts() {
    service.objects[manager]["Startup"] = {true};
    // Until it was asked twice how far it is.
    service.behind = [this, state = std::exchange(service.objects[card], {})] {
        service.behind = [this, state] {
            service.objects[card] = state;
            service.objects[manager]["Startup"] = {false};
            service.tell(manager, "org.freedesktop.DBus.Properties", "PropertiesChanged", "sa{sv}as",
                         "org.freedesktop.NetworkManager", 0, 0);
        };
    };
}

std::string StandInDaemon::answer(sd_bus_message* call, sd_bus_message* reply) {
    const std::string path = sd_bus_message_get_path(call);
    const std::string member = sd_bus_message_get_member(call);
    if (member == "GetDeviceByIpIface") {
        if (StandInService::readText(call) != "wlan0") {
            return ".UnknownDevice";
        }
        sd_bus_message_append(reply, "o", card.c_str());
    } else if (member == "GetConnectionByUuid") {
        const std::string uuid = StandInService::readText(call);
        const auto found = std::ranges::find_if(
            profiles, [&uuid](const auto& profile) { return textIn(profile.second, "uuid") == uuid; });
        if (found == profiles.end()) {
            return ".Settings.InvalidConnection";
        }
        sd_bus_message_append(reply, "o", found->first.c_str());
    } else if (profiles.contains(path) && (member == "GetSettings" || member == "GetSecrets")) {
        appendValue(reply, pick(profiles[path], member == "GetSecrets"));
    } else if (member == "GetAllAccessPoints") {
        sd_bus_message_open_container(reply, 'a', "o");
        for (const std::string& point : points_) {
            sd_bus_message_append(reply, "o", point.c_str());
        }
        sd_bus_message_close_container(reply);
    } else {
        const bool isRefused = !service.refusal.empty() && service.refused.empty();
        return isRefused ? ".PermissionDenied" : change(member, path, call, reply);
    }
    return "";
}

std::string StandInDaemon::change(const std::string& member, const std::string& path, sd_bus_message* call,
                                  sd_bus_message* reply) {
    changes.push_back(member);
    if (member == "Set") {
        int flag = 0;
        StandInService::readText(call);
        const std::string name = StandInService::readText(call);
        sd_bus_message_read(call, "v", "b", &flag);
        if (name == service.refused) {
            return ".PermissionDenied";
        }
        service.objects[path][name] = {flag != 0};
        changes.back() = name + (flag != 0 ? " on" : " off");
        if (name != "Autoconnect") {
            moveCard(flag != 0 ? deviceDisconnected : 10);
        }
    } else if (member == "AddConnection2") {
        std::uint32_t flags = 0;
        const std::string added = manager + "/Settings/" + std::to_string(++next_);
        service.objects[added];
        readValue(call, profiles[added]);
        sd_bus_message_read(call, "u", &flags);
        changes.back() += (flags & 0x20U) != 0 ? " held back" : "";
        changes.back() += (flags & 0x2U) != 0 ? "" : " on the disk";
        sd_bus_message_append(reply, "oa{sv}", added.c_str(), 0);
    } else if (member == "Update2") {
        profiles[path].clear();
        readValue(call, profiles[path]);
        std::uint32_t flags = 0;
        sd_bus_message_read(call, "u", &flags);
        changes.back() += flags == 0x22U ? "" : " in another way";
        sd_bus_message_append(reply, "a{sv}", 0);
    } else if (member == "Delete") {
        profiles.erase(path);
    } else if (member == "ActivateConnection") {
        const std::string profile = StandInService::readText(call, "o");
        changes.back() = "Activate " + textIn(profiles.at(profile), "id");
        activate(profile, reply);
    } else if (member == "Disconnect") {
        service.objects[card]["Autoconnect"] = {false};
        if (!service.objects[card].contains("ActiveConnection")) {
            changes.pop_back();
            return ".Device.NotActive";
        }
        leave(39);
    } else if (member == "RequestScan") {
        Dictionary options;
        readValue(call, options);
        changes.back() += showValue(options);
    } else {
        changes.pop_back();
        return SD_BUS_ERROR_UNKNOWN_METHOD;
    }
    return "";
}

void StandInDaemon::activate(const std::string& profile, sd_bus_message* reply) {
    if (service.objects[card].contains("ActiveConnection")) {
        leave(60);
    }
    const std::string path = manager + "/ActiveConnection/" + std::to_string(++next_);
    service.objects[path] = {{"Connection", {profile}}, {"Uuid", {textIn(profiles[profile], "uuid")}}};
    service.objects[card]["ActiveConnection"] = {path};
    service.objects[card]["Autoconnect"] = {true};
    sd_bus_message_append(reply, "o", path.c_str());
    const bool isLooking = !quietPoints_.empty();
    if (isLooking) {
        points_.push_back(quietPoints_.front());
        quietPoints_.erase(quietPoints_.begin());
        service.objects[card]["LastScan"] = {std::int64_t{++next_}};
        service.tell(card, ".Device.Wireless", "AccessPointAdded", "");
    }
    moveCard(40);
    moveActive(path, 1);
    if (failure != 0) {
        moveActive(path, activeDeactivated);
        moveCard(deviceFailed, failure);
        service.objects[card].erase("ActiveConnection");
        moveCard(deviceDisconnected);
    } else if (!isLooking) {
        moveCard(deviceGetsAddresses);
        if (forger != nullptr) {
            sd_bus_emit_signal(forger, path.c_str(), "org.freedesktop.NetworkManager.Connection.Active",
                               "StateChanged", "uu", activeActivated, 0U);
            sd_bus_flush(forger);
        }
        if (!hangs) {
            moveCard(deviceActivated);
            moveActive(path, activeActivated);
        }
    }
}

void StandInDaemon::leave(std::uint32_t reason) {
    moveCard(deviceDeactivating, reason);
    moveActive(valueOf<std::string>(service.objects[card], "ActiveConnection").value_or(""),
               activeDeactivated);
    service.objects[card].erase("ActiveConnection");
    moveCard(deviceDisconnected);
}

void StandInDaemon::moveCard(std::uint32_t state, std::uint32_t reason) {
    service.objects[card]["State"] = {state};
    service.tell(card, ".Device", "StateChanged", "uuu", state, 0U, reason);
}

void StandInDaemon::moveActive(const std::string& path, std::uint32_t state) {
    service.objects[path]["State"] = {state};
    service.tell(path, ".Connection.Active", "StateChanged", "uu", state, 0U);
}

}  // namespace testing_support
