// A message bus that ends with its scope, and a service on it that says what a test has it say.
#pragma once

#include <systemd/sd-bus.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <functional>
#include <map>
#include <stdexcept>
#include <string>
#include <thread>
#include <utility>

#include "platform/bus/Value.h"
#include "tests/unit/support/Child.h"
#include "tests/unit/support/TemporaryDirectory.h"

namespace testing_support {

// Every user may talk to it.
class StandInBus {
  public:
    explicit StandInBus(std::string socket) : socket_(std::move(socket)) {}
    ~StandInBus() { kill(process_.number(), SIGKILL); }
    [[nodiscard]] const std::string& socket() const { return socket_; }
    // A connection, once the bus takes some.
    [[nodiscard]] sd_bus* connect() const {
        for (int i = 0; i < 500; ++i) {
            sd_bus* bus = nullptr;
            if (sd_bus_new(&bus) >= 0 && sd_bus_set_address(bus, ("unix:path=" + socket_).c_str()) >= 0 &&
                sd_bus_set_bus_client(bus, 1) >= 0 && sd_bus_start(bus) >= 0) {
                return bus;
            }
            sd_bus_unref(bus);
            std::this_thread::sleep_for(std::chrono::milliseconds(10));
        }
        throw std::runtime_error("the bus is not up");
    }

  private:
    TemporaryDirectory directory_;
    std::string socket_;
    Child process_{[this] {
        // It complains about limits that only the machine's own bus may have.
        (void)!freopen("/dev/null", "w", stderr);
        const std::string option =
            "--config-file=" +
            directory_.write("bus.conf", "<busconfig><listen>unix:path=" + socket_ +
                                             "</listen><policy context=\"default\"><allow user=\"*\"/>"
                                             "<allow own=\"*\"/><allow send_destination=\"*\"/>"
                                             "<allow receive_sender=\"*\"/></policy></busconfig>\n");
        return execl("/usr/bin/dbus-daemon", "dbus-daemon", option.c_str(), "--nofork", "--nopidfile",
                     "--nosyslog", nullptr);
    }};
};

class StandInService {
  public:
    // Writes into the reply; the name of an error, behind the service's own when it begins with a dot, or
    // nothing.
    using Answer = std::function<std::string(sd_bus_message* call, sd_bus_message* reply)>;
    StandInService(const StandInBus& bus, std::string name, Answer answer = {})
        : bus_(bus.connect()), name_(std::move(name)), answer_(std::move(answer)) {
        sd_bus_add_filter(bus_, nullptr, handle, this);
        if (sd_bus_request_name(bus_, name_.c_str(), 0) < 0) {
            throw std::runtime_error("no place on the bus");
        }
        thread_ = std::thread([this] {
            while (!isOver_ && sd_bus_wait(bus_, 10'000) >= 0) {
                while (sd_bus_process(bus_, nullptr) > 0) {
                }
            }
        });
    }
    ~StandInService() {
        isOver_ = true;
        thread_.join();
        sd_bus_flush_close_unref(bus_);
    }
    StandInService(const StandInService&) = delete;
    StandInService& operator=(const StandInService&) = delete;

    // The properties of each object, of all its interfaces together. Set these between requests.
    std::map<std::string, platform::bus::Dictionary> objects;
    std::string refusal;           // a part of every error's text
    std::string refused;           // the call, or the object, that is
    std::function<void()> behind;  // what happens behind the next answer about properties

    // A signal that is sent behind the answer; the arguments are as sd_bus_message_append takes them.
    template <class... Arguments>
    void tell(const std::string& path, const char* interface, const char* member, Arguments... arguments) {
        sd_bus_message* made = nullptr;
        const std::string name = (*interface == '.' ? name_ : "") + interface;
        sd_bus_message_new_signal(bus_, &made, path.c_str(), name.c_str(), member);
        sd_bus_message_append(made, arguments...);
        signals_.emplace_back(made);
    }
    static std::string readText(sd_bus_message* message, const char* type = "s") {
        const char* text = nullptr;
        return sd_bus_message_read(message, type, &text) > 0 ? text : "";
    }

  private:
    static int handle(sd_bus_message* call, void* service, sd_bus_error* /*error*/) {
        auto& self = *static_cast<StandInService*>(service);
        sd_bus_message* made = nullptr;
        if (sd_bus_message_is_method_call(call, nullptr, nullptr) <= 0 ||
            sd_bus_message_new_method_return(call, &made) < 0) {
            return 0;
        }
        const platform::bus::MessageRef reply(made);
        if (const std::string error = self.respond(call, made); !error.empty()) {
            return sd_bus_reply_method_errorf(call, (error[0] == '.' ? self.name_ + error : error).c_str(),
                                              "no: %s", self.refusal.c_str());
        }
        sd_bus_send(nullptr, made, nullptr);
        for (const platform::bus::MessageRef& signal : std::exchange(self.signals_, {})) {
            sd_bus_send(self.bus_, signal.get(), nullptr);
        }
        return 1;
    }
    std::string respond(sd_bus_message* call, sd_bus_message* reply) {
        const std::string member = sd_bus_message_get_member(call);
        const auto object = objects.find(sd_bus_message_get_path(call));
        if (member == refused || refused == sd_bus_message_get_path(call)) {
            return ".PermissionDenied";
        }
        if (member == "GetAll" && object != objects.end()) {
            platform::bus::appendValue(reply, object->second);
            if (const std::function<void()> once = std::exchange(behind, nullptr)) {
                once();
            }
            return "";
        }
        if (member == "Get" && object != objects.end()) {
            readText(call);
            const auto property = object->second.find(readText(call));
            if (property != object->second.end()) {
                platform::bus::appendValue(reply, property->second);
                return "";
            }
        }
        return answer_ ? answer_(call, reply) : SD_BUS_ERROR_UNKNOWN_METHOD;
    }

    sd_bus* bus_;
    const std::string name_;
    const Answer answer_;
    std::vector<platform::bus::MessageRef> signals_;
    std::atomic<bool> isOver_ = false;
    std::thread thread_;
};

}  // namespace testing_support
