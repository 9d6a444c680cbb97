#include "tests/unit/networkmanager/StandInDaemon.h"

#include <spawn.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>

#include <algorithm>
#include <chrono>
#include <csignal>
#include <ctime>
#include <stdexcept>
#include <utility>

#include "platform/base/FileDescriptor.h"
#include "tests/unit/networkmanager/Verify.h"

namespace testing_support {
namespace {

using namespace platform::apply;
using namespace platform::bus;

const std::string root = "/org/freedesktop/NetworkManager";
const std::string prefix = "org.freedesktop.NetworkManager";

std::string readText(sd_bus_message* message, const char* type = "s") {
    const char* text = nullptr;
    return sd_bus_message_read(message, type, &text) > 0 ? text : "";
}

bool isSecret(const std::string& key) {
    return key == "psk" || key == "wep-key0";
}

Sections pick(const Sections& sections, bool secrets) {
    Sections picked;
    for (const auto& [name, section] : sections) {
        for (const auto& [key, value] : section) {
            if (isSecret(key) == secrets) {
                picked[name].emplace(key, value);
            }
        }
    }
    return picked;
}

std::string idOf(const Sections& sections) {
    return valueOf<std::string>(sections.at("connection"), "id").value_or("");
}

std::int64_t secondsSinceStart() {
    timespec now{};
    clock_gettime(CLOCK_BOOTTIME, &now);
    return now.tv_sec;
}

int fail(sd_bus_message* call, const std::string& name, const std::string& message) {
    return sd_bus_reply_method_errorf(call, name.c_str(), "%s", message.c_str());
}

std::string pathOf(const char* kind, std::size_t number) {
    return root + "/" + kind + "/" + std::to_string(number);
}

std::size_t numberOf(const std::string& path) {
    return std::stoul(path.substr(path.rfind('/') + 1));
}

}  // namespace

PrivateBus::PrivateBus() {
    const std::string file =
        "--config-file=" +
        directory_.write("bus.conf",
                         "<busconfig><type>system</type><listen>unix:path=" + socket() +
                             "</listen><policy context=\"default\"><allow user=\"*\"/><allow own=\"*\"/>"
                             "<allow send_destination=\"*\"/><allow receive_sender=\"*\"/></policy>"
                             "</busconfig>\n");
    const char* arguments[] = {"dbus-daemon", file.c_str(), "--nofork", "--nopidfile", "--nosyslog", nullptr};
    char* environment[] = {nullptr};
    posix_spawn_file_actions_t quietly;
    posix_spawn_file_actions_init(&quietly);
    posix_spawn_file_actions_addopen(&quietly, 2, "/dev/null", 1, 0);
    if (posix_spawn(&process_, "/usr/bin/dbus-daemon", &quietly, nullptr, const_cast<char**>(arguments),
                    environment) != 0) {
        throw std::runtime_error("no dbus-daemon");
    }
    posix_spawn_file_actions_destroy(&quietly);
    // Its socket is there a moment before it can be connected to.
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    socket().copy(address.sun_path, sizeof address.sun_path - 1);
    for (int i = 0; i < 500; ++i) {
        const platform::FileDescriptor probe(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
        if (connect(probe.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0) {
            return;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    throw std::runtime_error("the bus is not up");
}

PrivateBus::~PrivateBus() {
    kill(process_, SIGKILL);
    waitpid(process_, nullptr, 0);
}

StandInDaemon::Forger::Forger(const std::string& socket) {
    if (sd_bus_new(&bus_) < 0 || sd_bus_set_address(bus_, ("unix:path=" + socket).c_str()) < 0 ||
        sd_bus_set_bus_client(bus_, 1) < 0 || sd_bus_start(bus_) < 0) {
        throw std::runtime_error("no place on the bus");
    }
    thread_ = std::thread([this] {
        while (!stop_) {
            for (std::size_t number = 1; number < 6; ++number) {
                sd_bus_emit_signal(bus_, pathOf("ActiveConnection", number).c_str(),
                                   (prefix + ".Connection.Active").c_str(), "StateChanged", "uu", 2U, 0U);
            }
            sd_bus_flush(bus_);
            while (sd_bus_process(bus_, nullptr) > 0) {
            }
            std::this_thread::sleep_for(std::chrono::milliseconds(20));
        }
    });
}

StandInDaemon::Forger::~Forger() {
    stop_ = true;
    thread_.join();
    sd_bus_flush_close_unref(bus_);
}

StandInDaemon::StandInDaemon(const std::string& socket, std::vector<Card> theCards)
    : cards(std::move(theCards)) {
    if (sd_bus_new(&bus_) < 0 || sd_bus_set_address(bus_, ("unix:path=" + socket).c_str()) < 0 ||
        sd_bus_set_bus_client(bus_, 1) < 0 || sd_bus_start(bus_) < 0 ||
        sd_bus_add_filter(bus_, nullptr, handle, this) < 0 ||
        sd_bus_request_name(bus_, prefix.c_str(), 0) < 0) {
        throw std::runtime_error("no place on the bus");
    }
    thread_ = std::thread([this] {
        int result = 0;
        while (!stop_ && result >= 0) {
            bool patient = false;
            {
                const std::lock_guard lock(mutex_);
                result = sd_bus_process(bus_, nullptr);
                patient = leavesAtActivation;
            }
            if (result != 0) {
                continue;
            }
            // What comes later comes as soon as nothing is asked, or after a while in which nothing was.
            const int heard = patient ? sd_bus_wait(bus_, 20'000) : 0;
            if (heard == 0) {
                const std::lock_guard lock(mutex_);
                for (const auto& step : std::exchange(later_, {})) {
                    step();
                }
            }
            result = heard == 0 ? sd_bus_wait(bus_, 10'000) : heard;
        }
    });
}

StandInDaemon::~StandInDaemon() {
    stop_ = true;
    thread_.join();
    sd_bus_flush_close_unref(bus_);
}

Sections StandInDaemon::profile(const std::string& uuid) const {
    const std::lock_guard lock(mutex_);
    for (const auto& [path, profile] : profiles_) {
        if (profile.uuid == uuid) {
            return profile.sections;
        }
    }
    return {};
}

int StandInDaemon::handle(sd_bus_message* call, void* self, sd_bus_error* /*error*/) {
    std::uint8_t type = 0;
    sd_bus_message_get_type(call, &type);
    return type == SD_BUS_MESSAGE_METHOD_CALL ? static_cast<StandInDaemon*>(self)->answer(call) : 0;
}

int StandInDaemon::reply(sd_bus_message* call, const Answer& append) {
    sd_bus_message* made = nullptr;
    int result = sd_bus_message_new_method_return(call, &made);
    if (result >= 0 && append) {
        result = append(made);
    }
    result = result < 0 ? result : sd_bus_send(nullptr, made, nullptr);
    sd_bus_message_unref(made);
    return result < 0 ? result : 1;
}

int StandInDaemon::answer(sd_bus_message* call) {
    const std::string path = sd_bus_message_get_path(call);
    const std::string member = sd_bus_message_get_member(call);
    if (member == "GetAll") {
        return properties(call, path);
    }
    if (member == "Set") {
        return setProperty(call, path);
    }
    if (path == root) {
        return manager(call, member);
    }
    if (path == root + "/Settings") {
        return settings(call, member);
    }
    if (const auto profile = profiles_.find(path); profile != profiles_.end()) {
        return profileCall(call, member, profile->second);
    }
    if (path.find("/Devices/") != std::string::npos && numberOf(path) < cards.size()) {
        return cardCall(call, member, numberOf(path));
    }
    return fail(call, SD_BUS_ERROR_UNKNOWN_METHOD, "No such object " + path);
}

int StandInDaemon::manager(sd_bus_message* call, const std::string& member) {
    if (member == "ActivateConnection") {
        return activate(call);
    }
    const std::string name = readText(call);
    for (std::size_t i = 0; i < cards.size(); ++i) {
        if (cards[i].name == name) {
            return reply(call, [i](sd_bus_message* m) {
                return sd_bus_message_append(m, "o", pathOf("Devices", i).c_str());
            });
        }
    }
    return fail(call, prefix + ".UnknownDevice", "No device found for the requested iface.");
}

int StandInDaemon::settings(sd_bus_message* call, const std::string& member) {
    if (member == "GetConnectionByUuid") {
        const std::string uuid = readText(call);
        for (const auto& each : profiles_) {
            if (each.second.uuid == uuid) {
                return reply(call, [&each](sd_bus_message* m) {
                    return sd_bus_message_append(m, "o", each.first.c_str());
                });
            }
        }
        return fail(call, prefix + ".Settings.InvalidConnection", "No connection with the UUID was found.");
    }
    Sections sections;
    std::uint32_t flags = 0;
    if (member != "AddConnection2" || readSections(call, sections) < 0 ||
        sd_bus_message_read(call, "u", &flags) < 0) {
        return fail(call, SD_BUS_ERROR_INVALID_ARGS, member);
    }
    if (forbidsChanges) {
        return fail(call, prefix + ".Settings.PermissionDenied", "Insufficient privileges");
    }
    const std::string wrong = verifyProfile(sections);
    const std::string uuid = valueOf<std::string>(sections["connection"], "uuid").value_or("");
    const bool known = std::any_of(profiles_.begin(), profiles_.end(),
                                   [&uuid](const auto& each) { return each.second.uuid == uuid; });
    if (!wrong.empty() || known || (flags & ~0x20U) != 0x2) {
        return fail(call, prefix + ".Settings.Connection.InvalidProperty", known ? "the UUID exists" : wrong);
    }
    changes.push_back("AddConnection2 " + idOf(sections));
    const std::string path = pathOf("Settings", ++next_);
    profiles_[path] = {uuid, std::move(sections)};
    return reply(call,
                 [&](sd_bus_message* m) { return sd_bus_message_append(m, "oa{sv}", path.c_str(), 0); });
}

int StandInDaemon::profileCall(sd_bus_message* call, const std::string& member, Profile& profile) {
    if (member == "GetSettings") {
        return reply(call,
                     [&](sd_bus_message* m) { return appendSections(m, pick(profile.sections, false)); });
    }
    if (member == "GetSecrets") {
        return reply(call,
                     [&](sd_bus_message* m) { return appendSections(m, pick(profile.sections, true)); });
    }
    changes.push_back(member + " " + idOf(profile.sections));
    if (member == "Update2") {
        Sections sections;
        readSections(call, sections);
        if (const std::string wrong = verifyProfile(sections); !wrong.empty()) {
            return fail(call, prefix + ".Settings.Connection.InvalidProperty", wrong);
        }
        profile.sections = std::move(sections);
        return reply(call, [](sd_bus_message* m) { return sd_bus_message_append(m, "a{sv}", 0); });
    }
    if (forbidsChanges) {
        return fail(call, prefix + ".Settings.PermissionDenied", "Insufficient privileges");
    }
    const std::string path = sd_bus_message_get_path(call);
    for (std::size_t i = 0; i < cards.size(); ++i) {
        if (!cards[i].active.empty() && actives_[cards[i].active].profile == path) {
            leave(i, 38);
        }
    }
    profiles_.erase(path);
    return reply(call);
}

int StandInDaemon::cardCall(sd_bus_message* call, const std::string& member, std::size_t number) {
    Card& card = cards[number];
    if (member == "GetAllAccessPoints") {
        return reply(call, [&](sd_bus_message* m) {
            int result = sd_bus_message_open_container(m, 'a', "o");
            for (std::size_t i = 0; i < card.points.size(); ++i) {
                if (card.points[i].announced) {
                    result = sd_bus_message_append(m, "o", pathOf("AccessPoint", number * 100 + i).c_str());
                }
            }
            return result < 0 ? result : sd_bus_message_close_container(m);
        });
    }
    if (card.active.empty()) {
        return fail(call, prefix + ".Device.NotActive", "This device is not active");
    }
    changes.push_back("Disconnect " + card.name);
    card.autoconnect = false;
    reply(call);
    later_.emplace_back([this, number] { leave(number, 39); });
    return 1;
}

int StandInDaemon::activate(sd_bus_message* call) {
    const std::string profile = readText(call, "o");
    const std::size_t number = numberOf(readText(call, "o"));
    Card& card = cards[number];
    if (card.state < 30) {
        return fail(call, prefix + ".UnknownConnection", "Connection is not available on device");
    }
    changes.push_back("ActivateConnection " + idOf(profiles_.at(profile).sections) + " on " + card.name);
    if (!card.active.empty()) {
        leave(number, 60);
    }
    const std::string path = pathOf("ActiveConnection", ++next_);
    actives_[path] = {number, profile, 1};
    card.active = path;
    card.autoconnect = true;
    // A network that keeps quiet is heard once it is asked for.
    for (Point& point : card.points) {
        point.announced = true;
    }
    const int result =
        reply(call, [&](sd_bus_message* m) { return sd_bus_message_append(m, "o", path.c_str()); });
    signalCard(number, 40, 0);
    signalActive(path, 1);
    later_.emplace_back([this, path] { finish(path); });
    return result;
}

void StandInDaemon::finish(const std::string& path) {
    const std::size_t number = actives_[path].card;
    Card& card = cards[number];
    if (leavesAtActivation) {
        sd_bus_release_name(bus_, prefix.c_str());
        return;
    }
    if (card.active != path) {
        return;
    }
    if (card.failure != 0) {
        signalCard(number, 120, card.failure);
        signalActive(path, 4);
        actives_.erase(path);
        card.active.clear();
        signalCard(number, 30, 0);
        return;
    }
    unsigned highest = 99;
    for (const Card& each : cards) {
        highest = std::max(highest, each.metric);
    }
    const auto own =
        valueOf<std::int64_t>(profiles_[actives_[path].profile].sections["ipv4"], "route-metric");
    card.metric = own && *own >= 0 ? static_cast<unsigned>(*own) : highest + 1;
    signalCard(number, 70, 0);
    if (card.hangs) {
        return;
    }
    signalCard(number, 100, 0);
    signalActive(path, 2);
}

void StandInDaemon::leave(std::size_t number, std::uint32_t reason) {
    Card& card = cards[number];
    signalCard(number, 110, reason);
    signalActive(card.active, 4);
    actives_.erase(card.active);
    card.active.clear();
    card.metric = 0;
    signalCard(number, 30, 0);
}

void StandInDaemon::signalCard(std::size_t card, std::uint32_t state, std::uint32_t reason) {
    sd_bus_emit_signal(bus_, pathOf("Devices", card).c_str(), (prefix + ".Device").c_str(), "StateChanged",
                       "uuu", state, cards[card].state, reason);
    cards[card].state = state;
}

void StandInDaemon::signalActive(const std::string& path, std::uint32_t state) {
    actives_[path].state = state;
    sd_bus_emit_signal(bus_, path.c_str(), (prefix + ".Connection.Active").c_str(), "StateChanged", "uu",
                       state, 0U);
}

Dictionary StandInDaemon::describe(const std::string& path, const std::string& interface) {
    if (path == root) {
        return {
            {"Startup", {false}}, {"WirelessEnabled", {radio}}, {"WirelessHardwareEnabled", {radioHardware}}};
    }
    if (profiles_.count(path) != 0) {
        return {{"Flags", {profileFlags}}};
    }
    if (const auto active = actives_.find(path); active != actives_.end()) {
        const Card& card = cards[active->second.card];
        return {{"State", {active->second.state}},
                {"Uuid", {profiles_[active->second.profile].uuid}},
                {"Connection", {active->second.profile}},
                {"StateFlags", {card.external ? 0x80U : 0U}}};
    }
    if (path.find("/AccessPoint/") != std::string::npos) {
        const Point& point = cards[numberOf(path) / 100].points[numberOf(path) % 100];
        return {{"Ssid", {Bytes(point.network.begin(), point.network.end())}},
                {"Mode", {point.adHoc ? 1U : 2U}},
                {"Flags", {point.privacy ? 1U : 0U}},
                {"RsnFlags", {point.protection}},
                {"LastSeen", {static_cast<std::int32_t>(secondsSinceStart() - point.age)}},
                {"Frequency", {2412U}},
                {"Strength", {50U}}};
    }
    if (path.find("/Devices/") == std::string::npos && path.find("/IP4Config/") == std::string::npos) {
        return {};
    }
    const Card& card = cards[numberOf(path)];
    if (interface == prefix + ".IP4Config") {
        return {{"RouteData",
                 {std::vector<Dictionary>{{{"dest", {std::string("0.0.0.0")}},
                                           {"prefix", {0U}},
                                           {"metric", {std::uint32_t{card.metric}}}}}}}};
    }
    if (interface == prefix + ".Device.Wireless") {
        return {{"WirelessCapabilities", {card.capabilities}}, {"LastScan", {std::int64_t{1}}}};
    }
    return {{"DeviceType", {card.type}},
            {"State", {card.state}},
            {"Managed", {card.managed}},
            {"Autoconnect", {card.autoconnect}},
            {"ActiveConnection", {card.active.empty() ? std::string("/") : card.active}},
            {"Ip4Config", {card.metric == 0 ? std::string("/") : pathOf("IP4Config", numberOf(path))}}};
}

int StandInDaemon::properties(sd_bus_message* call, const std::string& path) {
    const Dictionary described = describe(path, readText(call));
    if (described.empty()) {
        return fail(call, SD_BUS_ERROR_UNKNOWN_METHOD, "No such object " + path);
    }
    return reply(call, [&](sd_bus_message* m) { return appendDictionary(m, described); });
}

int StandInDaemon::setProperty(sd_bus_message* call, const std::string& path) {
    readText(call);
    const std::string name = readText(call);
    int flag = 0;
    sd_bus_message_read(call, "v", "b", &flag);
    const bool on = flag != 0;
    if (forbidsChanges) {
        return fail(call, prefix + ".PermissionDenied", "Not authorized");
    }
    if (path == root) {
        changes.push_back("Set " + name + (on ? " on" : " off"));
        radio = on;
        for (std::size_t i = 0; i < cards.size(); ++i) {
            if (cards[i].type == 2) {
                signalCard(i, on ? 30 : 20, 0);
            }
        }
        return reply(call);
    }
    Card& card = cards[numberOf(path)];
    changes.push_back("Set " + name + " of " + card.name + (on ? " on" : " off"));
    (name == "Managed" ? card.managed : card.autoconnect) = on;
    if (name == "Managed") {
        signalCard(numberOf(path), on ? 30 : 10, 0);
    }
    return reply(call);
}

Task run(Agent& agent, const Captured& before, const InterfacePlan* plan, std::chrono::milliseconds bound) {
    std::vector<Task> tasks{{&before, plan, {}, {}}};
    const Clock::time_point deadline = Clock::now() + bound;
    agent.start(tasks, deadline);
    while (!agent.settle(deadline)) {
    }
    return tasks[0];
}

}  // namespace testing_support
