#include "tests/unit/networkmanager/StandInDaemon.h"

#include <algorithm>
#include <chrono>
#include <ctime>
#include <stdexcept>
#include <utility>

namespace testing_support {

using namespace platform::apply;

namespace {

const std::string prefix = "org.freedesktop.NetworkManager";

std::string readText(sd_bus_message* message, const char* type = "s") {
    const char* text = nullptr;
    return sd_bus_message_read(message, type, &text) > 0 ? text : "";
}

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

sd_bus* PrivateBus::connect() const {
    sd_bus* bus = nullptr;
    for (int i = 0; i < 500; ++i) {
        if (sd_bus_new(&bus) >= 0 && sd_bus_set_address(bus, ("unix:path=" + socket()).c_str()) >= 0 &&
            sd_bus_set_bus_client(bus, 1) >= 0 && sd_bus_start(bus) >= 0) {
            return bus;
        }
        sd_bus_unref(bus);
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    throw std::runtime_error("the bus is not up");
}

StandInDaemon::StandInDaemon(const PrivateBus& bus) : bus_(bus.connect()) {
    objects[manager] = {
        {"Startup", {false}}, {"WirelessEnabled", {true}}, {"WirelessHardwareEnabled", {true}}};
    objects[card] = {
        {"DeviceType", {2U}}, {"State", {deviceDisconnected}}, {"Managed", {true}}, {"Autoconnect", {true}}};
    sd_bus_add_filter(bus_, nullptr, handle, this);
    if (sd_bus_request_name(bus_, prefix.c_str(), 0) < 0) {
        throw std::runtime_error("no place on the bus");
    }
    thread_ = std::thread([this] {
        while (!isOver_ && sd_bus_wait(bus_, 10'000) >= 0) {
            while (sd_bus_process(bus_, nullptr) > 0) {
            }
        }
    });
}

StandInDaemon::~StandInDaemon() {
    isOver_ = true;
    thread_.join();
    sd_bus_flush_close_unref(bus_);
}

void StandInDaemon::offer(const std::string& network, std::uint32_t mode, std::uint32_t privacy,
                          std::uint32_t protection, bool isQuiet) {
    timespec now{};
    clock_gettime(CLOCK_BOOTTIME, &now);
    const std::string path = manager + "/AccessPoint/" + std::to_string(++next_);
    objects[path] = {{"Ssid", {Bytes(network.begin(), network.end())}},
                     {"Mode", {mode}},
                     {"Flags", {privacy}},
                     {"RsnFlags", {protection}},
                     {"Frequency", {2412U}},
                     {"LastSeen", {static_cast<std::int32_t>(now.tv_sec)}}};
    (isQuiet ? quietPoints_ : points_).push_back(path);
}

int StandInDaemon::handle(sd_bus_message* call, void* daemon, sd_bus_error* /*error*/) {
    auto& self = *static_cast<StandInDaemon*>(daemon);
    sd_bus_message* made = nullptr;
    if (sd_bus_message_is_method_call(call, nullptr, nullptr) <= 0 ||
        sd_bus_message_new_method_return(call, &made) < 0) {
        return 0;
    }
    const Message reply(made);
    if (const std::string error = self.answer(call, made); !error.empty()) {
        return sd_bus_reply_method_errorf(call, (error[0] == '.' ? prefix + error : error).c_str(), "no: %s",
                                          self.refusal.c_str());
    }
    sd_bus_send(nullptr, made, nullptr);
    for (const Message& signal : std::exchange(self.signals_, {})) {
        sd_bus_send(self.bus_, signal.get(), nullptr);
    }
    return 1;
}

std::string StandInDaemon::answer(sd_bus_message* call, sd_bus_message* reply) {
    const std::string path = sd_bus_message_get_path(call);
    const std::string member = sd_bus_message_get_member(call);
    if (member == "GetAll" && objects.contains(path)) {
        appendValue(reply, objects[path]);
    } else if (member == "GetDeviceByIpIface") {
        if (readText(call) != "wlan0") {
            return ".UnknownDevice";
        }
        sd_bus_message_append(reply, "o", card.c_str());
    } else if (member == "GetConnectionByUuid") {
        const std::string uuid = readText(call);
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
        return refusal.empty() ? change(member, path, call, reply) : ".PermissionDenied";
    }
    return "";
}

std::string StandInDaemon::change(const std::string& member, const std::string& path, sd_bus_message* call,
                                  sd_bus_message* reply) {
    changes.push_back(member);
    if (member == "Set") {
        int flag = 0;
        readText(call);
        const std::string name = readText(call);
        sd_bus_message_read(call, "v", "b", &flag);
        objects[path][name] = {flag != 0};
        changes.back() = name + (flag != 0 ? " on" : " off");
        if (name != "Autoconnect") {
            moveCard(flag != 0 ? deviceDisconnected : 10);
        }
    } else if (member == "AddConnection2") {
        std::uint32_t flags = 0;
        const std::string added = manager + "/Settings/" + std::to_string(++next_);
        objects[added];
        readValue(call, profiles[added]);
        sd_bus_message_read(call, "u", &flags);
        changes.back() += (flags & 0x20U) != 0 ? " held back" : "";
        sd_bus_message_append(reply, "oa{sv}", added.c_str(), 0);
    } else if (member == "Update2") {
        profiles[path].clear();
        readValue(call, profiles[path]);
        sd_bus_message_append(reply, "a{sv}", 0);
    } else if (member == "Delete") {
        profiles.erase(path);
    } else if (member == "ActivateConnection") {
        const std::string profile = readText(call, "o");
        changes.back() = "Activate " + textIn(profiles.at(profile), "id");
        activate(profile, reply);
    } else if (member == "Disconnect") {
        objects[card]["Autoconnect"] = {false};
        if (!objects[card].contains("ActiveConnection")) {
            changes.pop_back();
            return ".Device.NotActive";
        }
        leave(39);
    } else if (member != "RequestScan") {
        changes.pop_back();
        return SD_BUS_ERROR_UNKNOWN_METHOD;
    }
    return "";
}

void StandInDaemon::activate(const std::string& profile, sd_bus_message* reply) {
    if (objects[card].contains("ActiveConnection")) {
        leave(60);
    }
    const std::string path = manager + "/ActiveConnection/" + std::to_string(++next_);
    objects[path] = {{"Connection", {profile}}, {"Uuid", {textIn(profiles[profile], "uuid")}}};
    objects[card]["ActiveConnection"] = {path};
    objects[card]["Autoconnect"] = {true};
    sd_bus_message_append(reply, "o", path.c_str());
    const bool isLooking = !quietPoints_.empty();
    for (const std::string& point : std::exchange(quietPoints_, {})) {
        points_.push_back(point);
        objects[card]["LastScan"] = {std::int64_t{++next_}};
        sd_bus_message* made = nullptr;
        sd_bus_message_new_signal(bus_, &made, card.c_str(), (prefix + ".Device.Wireless").c_str(),
                                  "AccessPointAdded");
        signals_.emplace_back(made);
    }
    moveCard(40);
    moveActive(path, 1);
    if (failure != 0) {
        moveActive(path, activeDeactivated);
        moveCard(deviceFailed, failure);
        objects[card].erase("ActiveConnection");
        moveCard(deviceDisconnected);
    } else if (!isLooking) {
        moveCard(deviceGetsAddresses);
        if (!hangs) {
            moveCard(deviceActivated);
            moveActive(path, activeActivated);
        }
    }
}

void StandInDaemon::leave(std::uint32_t reason) {
    moveCard(deviceDeactivating, reason);
    moveActive(valueOf<std::string>(objects[card], "ActiveConnection").value_or(""), activeDeactivated);
    objects[card].erase("ActiveConnection");
    moveCard(deviceDisconnected);
}

void StandInDaemon::tell(const std::string& path, const char* interface, const char* types,
                         std::uint32_t state, std::uint32_t reason) {
    objects[path]["State"] = {state};
    sd_bus_message* made = nullptr;
    sd_bus_message_new_signal(bus_, &made, path.c_str(), (prefix + interface).c_str(), "StateChanged");
    sd_bus_message_append(made, types, state, 0U, reason);
    signals_.emplace_back(made);
}

}  // namespace testing_support
