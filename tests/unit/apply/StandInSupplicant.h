// A wireless supplicant without a radio: it answers what the test writes, and keeps what changes its
// networks.
#pragma once

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <atomic>
#include <map>
#include <thread>
#include <utility>

#include "tests/unit/apply/Trees.h"

namespace platform::apply {

class StandInSupplicant {
  public:
    // All of this is written before a command and read after its answer. By the first two words of a command
    // its answer, nothing for one that does not come; else it is "OK".
    std::map<std::string, std::string> answers{{"BSS FIRST", "\n"}, {"GET_NETWORK 0", "FAIL"}};
    std::string notice = "CTRL-EVENT-CONNECTED";  // what choosing a network comes to
    std::string heardLater;                       // what is on the air from then on
    int next = 0;                                 // the number of the network that is added next

    explicit StandInSupplicant(const std::string& path) : path_(path) {
        sockaddr_un address{AF_UNIX, {}};
        path.copy(address.sun_path, sizeof address.sun_path - 1);
        EXPECT_EQ(0, bind(socket_, reinterpret_cast<const sockaddr*>(&address), sizeof address));
        thread_ = std::thread([this] { serve(); });
    }
    ~StandInSupplicant() {
        isOver_ = true;
        thread_.join();
        close(socket_);
        unlink(path_.c_str());
    }
    StandInSupplicant(const StandInSupplicant&) = delete;
    StandInSupplicant& operator=(const StandInSupplicant&) = delete;

    // One network on the air: its flags and its name.
    void hear(const std::string& network) {
        const std::size_t space = network.find(' ');
        answers["BSS FIRST"] =
            "id=7\nbssid=02:00:00:00:00:01\nfreq=2462\nlevel=-50\nage=0\nflags=" + network.substr(0, space) +
            "\nssid=" + network.substr(space + 1) + "\n";
    }
    // The card is on the network of that number.
    void join(int number, const std::string& bssid = "02:00:00:00:00:01") {
        answers["STATUS"] = "bssid=" + bssid + "\nid=" + std::to_string(number) + "\nwpa_state=COMPLETED\n";
    }
    // The commands that change something, since the last look.
    Lines changes() { return std::exchange(changes_, {}); }

  private:
    void serve() {
        while (!isOver_) {
            pollfd wait{socket_, POLLIN, 0};
            char buffer[4096];
            sockaddr_un from{};
            socklen_t size = sizeof from;
            if (poll(&wait, 1, 20) <= 0) {
                continue;
            }
            const ssize_t length =
                recvfrom(socket_, buffer, sizeof buffer, 0, reinterpret_cast<sockaddr*>(&from), &size);
            const auto send = [&](const std::string& text) {
                sendto(socket_, text.data(), text.size(), 0, reinterpret_cast<const sockaddr*>(&from), size);
            };
            const std::string command(buffer, static_cast<std::size_t>(std::max<ssize_t>(length, 0)));
            send("<3>a notice at any time");
            if (const std::string text = answer(command); !text.empty()) {
                send(text);
            }
            if (command.starts_with("SELECT_NETWORK")) {
                send("<3>CTRL-EVENT-SCAN-RESULTS ");
                send("<3>" + notice);
            }
        }
    }

    std::string answer(const std::string& command) {
        const std::string key =
            command.substr(0, command.find(' ', std::min(command.find(' '), command.size() - 1) + 1));
        if (command == "SCAN" ||
            (command.find("_NETWORK") != std::string::npos && command[0] != 'G' && command[0] != 'L')) {
            changes_.push_back(command);
        }
        if (command.starts_with("SELECT_NETWORK") && !heardLater.empty()) {
            hear(std::exchange(heardLater, ""));
        }
        return answers.contains(key)      ? answers[key]
               : command == "ADD_NETWORK" ? std::to_string(next++)
                                          : "OK\n";
    }

    std::string path_;
    int socket_ = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
    std::atomic<bool> isOver_ = false;
    Lines changes_;
    std::thread thread_;
};

}  // namespace platform::apply
