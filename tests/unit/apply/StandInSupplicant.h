// A wireless supplicant without a radio: its control socket, its table of networks, and an air that the test
// writes.
#pragma once

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cstring>
#include <functional>
#include <map>
#include <mutex>
#include <sstream>
#include <string>
#include <thread>
#include <utility>
#include <vector>

namespace platform::apply {

class StandInSupplicant {
  public:
    struct Network {
        std::map<std::string, std::string> values;
        bool isDisabled = true;
    };
    // The networks and the air are written before the first command and read after the last.
    std::map<int, Network> networks;
    std::string scanResults = "bssid / frequency / signal level / flags / ssid\n";  // a line each
    std::string heardLater;  // once a network is looked for
    int age = 0;             // of everything heard, in seconds
    // What joining comes to: a notice, and whether the card then is on the network.
    std::string notice = "<3>CTRL-EVENT-CONNECTED";
    std::function<bool(const Network&)> joins = [](const Network&) { return true; };

    explicit StandInSupplicant(const std::string& path) : path_(path) {
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        std::memcpy(address.sun_path, path.c_str(), std::min(path.size(), sizeof address.sun_path - 1));
        socket_ = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
        if (bind(socket_, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0) {
            thread_ = std::thread([this] { serve(); });
        }
    }
    ~StandInSupplicant() {
        isOver_ = true;
        if (thread_.joinable()) {
            thread_.join();
        }
        close(socket_);
        unlink(path_.c_str());
    }
    StandInSupplicant(const StandInSupplicant&) = delete;
    StandInSupplicant& operator=(const StandInSupplicant&) = delete;

    // The commands that change something, since the last look.
    std::vector<std::string> changes() {
        const std::lock_guard lock(mutex_);
        return std::exchange(changes_, {});
    }
    int current() const { return current_; }

  private:
    void serve() {
        while (!isOver_) {
            pollfd wait{socket_, POLLIN, 0};
            if (poll(&wait, 1, 20) <= 0) {
                continue;
            }
            char buffer[4096];
            sockaddr_un from{};
            socklen_t size = sizeof from;
            const ssize_t length =
                recvfrom(socket_, buffer, sizeof buffer, 0, reinterpret_cast<sockaddr*>(&from), &size);
            if (length <= 0) {
                continue;
            }
            const auto send = [&](const std::string& text) {
                sendto(socket_, text.data(), text.size(), 0, reinterpret_cast<const sockaddr*>(&from), size);
            };
            const std::string command(buffer, static_cast<std::size_t>(length));
            send("<3>a notice at any time");
            send(answer(command));
            if (command.compare(0, 14, "SELECT_NETWORK") == 0) {
                scanResults += std::exchange(heardLater, "");
                send("<3>CTRL-EVENT-SCAN-RESULTS ");
                send(notice);
            }
        }
    }

    std::string answer(const std::string& command) {
        std::istringstream words(command);
        std::string name;
        int number = -1;
        words >> name >> number;
        if (name == "ADD_NETWORK") {
            number = networks.empty() ? 0 : networks.rbegin()->first + 1;
            networks[number];
        } else if (command.find("_NETWORK ") != std::string::npos && networks.count(number) == 0) {
            return "FAIL\n";
        }
        if (name.find("_NETWORK") != std::string::npos && name != "GET_NETWORK" && name != "LIST_NETWORKS") {
            const std::lock_guard lock(mutex_);
            changes_.push_back(command);
        }
        if (name == "ADD_NETWORK") {
            return std::to_string(number) + "\n";
        }
        if (name == "SET_NETWORK" || name == "GET_NETWORK") {
            std::string key;
            std::string value;
            words >> key;
            std::getline(words >> std::ws, value);
            auto& values = networks[number].values;
            if (name == "SET_NETWORK") {
                values[key] = value;
                return "OK\n";
            }
            return values.count(key) != 0 ? values[key] : "FAIL\n";
        }
        if (name == "SELECT_NETWORK") {
            for (auto& [other, network] : networks) {
                network.isDisabled = other != number;
            }
            current_ = joins(networks[number]) ? number : -1;
        } else if (name == "ENABLE_NETWORK") {
            networks[number].isDisabled = false;
        } else if (name == "REMOVE_NETWORK") {
            networks.erase(number);
            current_ = current_ == number ? -1 : current_.load();
        } else if (name == "LIST_NETWORKS") {
            std::string list = "network id / ssid / bssid / flags\n";
            for (const auto& [id, network] : networks) {
                const auto ssid = network.values.find("ssid");
                list += std::to_string(id) + "\t" + (ssid == network.values.end() ? "" : ssid->second) +
                        "\tany\t" + (id == current_ ? "[CURRENT]" : "") +
                        (network.isDisabled ? "[DISABLED]" : "") + "\n";
            }
            return list;
        } else if (name == "BSS") {
            // FIRST, or NEXT- and a number: the lines of the air, counted from 1.
            const std::size_t dash = command.find('-');
            int wanted = dash == std::string::npos ? 1 : std::stoi(command.substr(dash + 1)) + 1;
            std::istringstream lines(scanResults);
            std::string line;
            while (wanted-- >= 0 && std::getline(lines, line)) {
            }
            std::istringstream fields(line);
            std::string bssid, frequency, level, flags, ssid;
            if (!lines || !(fields >> bssid >> frequency >> level >> flags)) {
                return "";
            }
            std::getline(fields >> std::ws, ssid);
            return "id=" +
                   std::to_string(dash == std::string::npos ? 1 : std::stoi(command.substr(dash + 1)) + 1) +
                   "\nbssid=" + bssid + "\nfreq=" + frequency + "\nlevel=" + level +
                   "\nage=" + std::to_string(age) + "\nflags=" + flags + "\nssid=" + ssid + "\n";
        } else if (name == "STATUS") {
            return current_ < 0 ? "wpa_state=SCANNING\n"
                                : "bssid=02:00:00:00:00:01\nid=" + std::to_string(current_) +
                                      "\nwpa_state=COMPLETED\n";
        }
        return "OK\n";
    }

    std::string path_;
    int socket_ = -1;
    std::atomic<int> current_{-1};
    std::atomic<bool> isOver_{false};
    std::mutex mutex_;
    std::vector<std::string> changes_;
    std::thread thread_;
};

}  // namespace platform::apply
