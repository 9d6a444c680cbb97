#include "platform/apply/networkmanager/Iwd.h"

#include <algorithm>

namespace platform::apply {
namespace {

constexpr const char* serviceName = "net.connman.iwd";
constexpr const char* knownNetworkInterface = "net.connman.iwd.KnownNetwork";
constexpr const char* autoconnectProperty = "AutoConnect";

}  // namespace

Outcome Iwd::isRunning(bool& running) {
    running = isRunning_.value_or(false);
    if (!isRunning_) {
        RETURN_IF_FAILED(bus_.connect(serviceName, running));
        isRunning_ = running;
    }
    return {};
}

Outcome Iwd::readKnown(std::vector<KnownNetwork>& known) {
    known.clear();
    bool running = false;
    RETURN_IF_FAILED(isRunning(running));
    if (!running) {
        return {};
    }
    bus::MessageRef reply;
    RETURN_IF_FAILED(
        bus_.call({"/", "org.freedesktop.DBus.ObjectManager", "GetManagedObjects", {}, {}}, reply));
    bus::Objects objects;
    if (bus::readValue(reply.get(), objects) < 0) {
        return {kSCStatusFailed, "the networks that iwd knows cannot be read"};
    }
    for (const auto& [path, interfaces] : objects) {
        if (const auto found = interfaces.find(knownNetworkInterface); found != interfaces.end()) {
            known.push_back({path, bus::valueOf<std::string>(found->second, "Name").value_or(""),
                             bus::valueOf<bool>(found->second, autoconnectProperty).value_or(false)});
        }
    }
    return {};
}

Outcome Iwd::readAutoconnect(std::vector<std::string>& networks) {
    networks.clear();
    std::vector<KnownNetwork> known;
    RETURN_IF_FAILED(readKnown(known));
    for (KnownNetwork& each : known) {
        if (each.autoconnect) {
            networks.push_back(std::move(each.path));
        }
    }
    return {};
}

Outcome Iwd::limitAutoconnect(const std::vector<std::string>& networks,
                              const std::optional<std::string>& name) {
    std::vector<KnownNetwork> known;
    if (!networks.empty()) {
        RETURN_IF_FAILED(readKnown(known));
    }
    for (const KnownNetwork& each : known) {
        const bool isWanted = !name || each.name == *name;
        if (each.autoconnect != isWanted && std::ranges::find(networks, each.path) != networks.end()) {
            RETURN_IF_FAILED(
                bus_.setProperty(each.path, knownNetworkInterface, autoconnectProperty, {isWanted}));
        }
    }
    return {};
}

}  // namespace platform::apply
