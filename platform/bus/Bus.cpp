#include "platform/bus/Bus.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <system_error>
#include <utility>

#include "platform/base/Hexadecimal.h"
#include "platform/base/Host.h"

namespace platform::bus {
namespace {

constexpr const char* propertiesInterface = "org.freedesktop.DBus.Properties";
constexpr std::size_t longestText = 300;
constexpr int mostAtOnce = 1000;

std::uint64_t microseconds(Clock::duration duration) {
    const auto count = std::chrono::duration_cast<std::chrono::microseconds>(duration).count();
    // At least one: 0 would stand for the library's own 25 seconds.
    return static_cast<std::uint64_t>(std::max<std::int64_t>(count, 1));
}

// A D-Bus address keeps only these as they are; every other byte is escaped.
std::string addressOf(const std::string& path) {
    std::string address = "unix:path=";
    for (const char c : path) {
        if (std::isalnum(static_cast<unsigned char>(c)) != 0 || std::strchr("-_/.\\*", c) != nullptr) {
            address += c;
        } else {
            address += '%' + hexOf({&c, 1});
        }
    }
    return address;
}

class Error {
  public:
    Error() = default;
    ~Error() { sd_bus_error_free(&error_); }
    Error(const Error&) = delete;
    Error& operator=(const Error&) = delete;
    sd_bus_error* out() noexcept { return &error_; }
    [[nodiscard]] const sd_bus_error& get() const noexcept { return error_; }

  private:
    sd_bus_error error_ = {nullptr, nullptr, 0};
};

Outcome fromBus(const std::string& what, int result) {
    return platform::bus::fromBus(what, result, sd_bus_error{}, {});
}

int noteOwner(sd_bus_message* message, void* left, sd_bus_error* /*error*/) {
    const char* before = nullptr;
    const char* const sender = sd_bus_message_get_sender(message);
    // Only the bus itself tells who owns a name; anybody can send such a message to this process alone.
    if (sender == nullptr || std::strcmp(sender, "org.freedesktop.DBus") != 0) {
        return 0;
    }
    if (sd_bus_message_read(message, "sss", nullptr, &before, nullptr) >= 0 && *before != '\0') {
        *static_cast<bool*>(left) = true;
    }
    return 0;
}

}  // namespace

Outcome fromBus(const std::string& what, int result, const sd_bus_error& error, std::string_view secret) {
    const bool named = error.name != nullptr;
    std::string reason = what + ": ";
    if (result == -ETIMEDOUT) {
        reason += "no answer in " + std::to_string(callBound.count()) + " s";
    } else if (named) {
        const std::string_view text = error.message == nullptr ? "" : error.message;
        const bool isSafe = secret.empty() || text.find(secret) == std::string_view::npos;
        reason += error.name;
        if (isSafe && !text.empty()) {
            reason.append(": ").append(text.substr(0, longestText));
        }
    } else {
        reason += std::generic_category().message(-result);
    }
    const bool noRights = result == -EACCES || result == -EPERM ||
                          (named && std::string_view(error.name).ends_with(".PermissionDenied"));
    return {noRights ? kSCStatusAccessError : kSCStatusFailed, reason};
}

Bus::~Bus() = default;

std::uint64_t Bus::timeout() const {
    return microseconds(std::min<Clock::duration>(callBound, end_ - Clock::now()));
}

Outcome Bus::process(Clock::time_point deadline, bool& inTime) {
    int result = sd_bus_process(bus_.get(), nullptr);
    inTime = true;
    if (result == 0) {
        const Clock::duration remaining = deadline - Clock::now();
        inTime = remaining > Clock::duration::zero();
        result = inTime ? sd_bus_wait(bus_.get(), microseconds(remaining)) : 0;
    }
    // A signal that this process caught is no failure of the bus.
    return result < 0 && result != -EINTR ? fromBus("the system bus", result) : Outcome();
}

Outcome Bus::connect(const std::string& service, bool& owned) {
    const std::string what = "connecting to the system bus";
    const Clock::time_point deadline = std::min(Clock::now() + connectBound, end_);
    service_ = service;
    owned = false;
    watches_.clear();
    ownerSlot_.reset();
    ownerLeft_ = false;
    sd_bus* made = nullptr;
    int result = sd_bus_new(&made);
    bus_.reset(made);
    if (result >= 0) {
        result = sd_bus_set_address(
            made, addressOf(socket_.empty() ? currentHost().systemBusSocket : socket_).c_str());
    }
    if (result >= 0) {
        result = sd_bus_set_bus_client(made, 1);
    }
    if (result >= 0) {
        // Of the library's own calls: saying hello, and asking for signals.
        result = sd_bus_set_method_call_timeout(made, timeout());
    }
    if (result >= 0) {
        result = sd_bus_start(made);
    }
    if (result == -ENOENT) {
        // No socket: a machine without a bus, which is no failure.
        bus_.reset();
        return {};
    }
    while (result >= 0 && (result = sd_bus_is_ready(made)) == 0) {
        bool inTime = false;
        RETURN_IF_FAILED(process(deadline, inTime));
        if (!inTime) {
            return {kSCStatusFailed, what + ": no answer in " + std::to_string(connectBound.count()) + " s"};
        }
    }
    if (result >= 0) {
        sd_bus_slot* slot = nullptr;
        const std::string rule =
            "type='signal',sender='org.freedesktop.DBus',interface='org.freedesktop.DBus',"
            "member='NameOwnerChanged',arg0='" +
            service_ + "'";
        result = sd_bus_add_match_async(made, &slot, rule.c_str(), noteOwner, nullptr, &ownerLeft_);
        ownerSlot_.reset(slot);
    }
    return result < 0 ? fromBus(what, result) : readOwner(owned);
}

Outcome Bus::readOwner(bool& owned) {
    sd_bus_creds* credentials = nullptr;
    const int result =
        sd_bus_get_name_creds(bus_.get(), service_.c_str(), SD_BUS_CREDS_UNIQUE_NAME, &credentials);
    const char* name = nullptr;
    if (result >= 0 && sd_bus_creds_get_unique_name(credentials, &name) >= 0) {
        owner_ = name;
    }
    sd_bus_creds_unref(credentials);
    owned = result >= 0;
    return result >= 0 || result == -ENXIO ? Outcome()
                                           : fromBus("asking for the owner of " + service_, result);
}

Outcome Bus::call(const Call& call, MessageRef& reply, std::string* errorName) {
    sd_bus_message* made = nullptr;
    int result = bus_ == nullptr
                     ? -ENOTCONN
                     : sd_bus_message_new_method_call(bus_.get(), &made, service_.c_str(), call.path.c_str(),
                                                      call.interface.c_str(), call.member);
    const MessageRef message(made);
    if (result >= 0) {
        // A daemon that the user has stopped stays so.
        result = sd_bus_message_set_auto_start(made, 0);
    }
    if (result >= 0 && !call.secret.empty()) {
        // The library wipes its copies of the message.
        result = sd_bus_message_sensitive(made);
    }
    if (result >= 0 && call.arguments) {
        result = call.arguments(made);
    }
    Error error;
    sd_bus_message* answer = nullptr;
    if (result >= 0) {
        result = sd_bus_call(bus_.get(), made, timeout(), error.out(), &answer);
    }
    reply.reset(answer);
    if (errorName != nullptr) {
        *errorName = error.get().name == nullptr ? "" : error.get().name;
    }
    return result < 0 ? fromBus(call.member, result, error.get(), call.secret) : Outcome();
}

Outcome Bus::readProperties(const std::string& path, const char* interface, Dictionary& properties,
                            std::string* error) {
    properties.clear();
    MessageRef reply;
    RETURN_IF_FAILED(call({path, propertiesInterface, "GetAll", arguments(interface), {}}, reply, error));
    const int result = readValue(reply.get(), properties);
    return result < 0 ? fromBus("the properties of " + path, result) : Outcome();
}

Outcome Bus::readProperty(const std::string& path, const char* interface, const char* property,
                          Value& value) {
    MessageRef reply;
    RETURN_IF_FAILED(call({path, propertiesInterface, "Get", arguments(interface, property), {}}, reply));
    const int result = readValue(reply.get(), value);
    return result < 0 ? fromBus(property, result) : Outcome();
}

Outcome Bus::setProperty(const std::string& path, const char* interface, const char* property,
                         const Value& value) {
    MessageRef reply;
    Outcome outcome =
        call({path, propertiesInterface, "Set", arguments(interface, property, value), {}}, reply);
    return outcome.ok() ? outcome
                        : Outcome(outcome.status(), std::string(property) + ": " + outcome.reason());
}

int Bus::forwardSignal(sd_bus_message* message, void* watch, sd_bus_error* /*error*/) {
    const auto& self = *static_cast<Watch*>(watch);
    const char* const sender = sd_bus_message_get_sender(message);
    if (sender != nullptr && self.bus->owner_ == sender) {
        self.handler(sd_bus_message_get_path(message), message);
    }
    return 0;
}

Outcome Bus::watch(const std::string& interface, const std::string& member, Handler handler,
                   const std::string& about) {
    watches_.push_back(std::make_unique<Watch>(Watch{this, std::move(handler), nullptr}));
    Watch& made = *watches_.back();
    sd_bus_slot* slot = nullptr;
    // Not waited for: the bus takes requests in order, and this one comes before any call made later.
    const std::string rule = "type='signal',sender='" + service_ + "',interface='" + interface +
                             "',member='" + member + "'" + (about.empty() ? "" : ",arg0='" + about + "'");
    const int result = sd_bus_add_match_async(bus_.get(), &slot, rule.c_str(), forwardSignal, nullptr, &made);
    made.slot.reset(slot);
    return result < 0 ? fromBus("listening to " + member, result) : Outcome();
}

Outcome Bus::handleSignals(Clock::time_point until) {
    bool inTime = true;
    RETURN_IF_FAILED(process(until, inTime));
    int result = 0;
    // All that has come, before anybody decides by a part of it; but every user of the machine may send, and
    // more and more.
    int taken = 0;
    do {
        result = sd_bus_process(bus_.get(), nullptr);
    } while (result > 0 && ++taken < mostAtOnce);
    if (ownerLeft_) {
        return {kSCStatusFailed, service_ + " left the bus while it was waited for"};
    }
    return result < 0 ? fromBus("the system bus", result) : Outcome();
}

}  // namespace platform::bus
