// A server on loopback that treats each connection as a test wants it to.
#pragma once

#include <arpa/inet.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstdint>
#include <functional>
#include <stdexcept>
#include <string>
#include <string_view>
#include <thread>
#include <utility>

#include "platform/FileDescriptor.h"

namespace testing_support {

class LoopbackServer {
  public:
    // talk gets each connection in turn, after the request's header was read into it.
    using Talk = std::function<void(int connection, const std::string& request)>;

    explicit LoopbackServer(Talk talk, const char* address = "::ffff:127.0.0.1")
        : listener_(socket(AF_INET6, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
        sockaddr_in6 place{};
        place.sin6_family = AF_INET6;
        auto* generic = reinterpret_cast<sockaddr*>(&place);
        socklen_t length = sizeof place;
        if (inet_pton(AF_INET6, address, &place.sin6_addr) != 1 ||
            bind(listener_.get(), generic, length) != 0 || listen(listener_.get(), 8) != 0 ||
            getsockname(listener_.get(), generic, &length) != 0) {
            throw std::runtime_error("no server on loopback");
        }
        port_ = ntohs(place.sin6_port);
        thread_ = std::thread([this, talk = std::move(talk)] { serve(talk); });
    }
    ~LoopbackServer() {
        shutdown(listener_.get(), SHUT_RDWR);
        thread_.join();
    }
    LoopbackServer(const LoopbackServer&) = delete;
    LoopbackServer& operator=(const LoopbackServer&) = delete;

    [[nodiscard]] std::uint16_t port() const noexcept { return port_; }
    [[nodiscard]] std::string url(std::string_view target) const {
        return "http://127.0.0.1:" + std::to_string(port_) + std::string(target);
    }

    // False when the client is gone.
    static bool say(int connection, std::string_view text) {
        while (!text.empty()) {
            const ssize_t sent = send(connection, text.data(), text.size(), MSG_NOSIGNAL);
            if (sent <= 0) {
                return false;
            }
            text.remove_prefix(static_cast<std::size_t>(sent));
        }
        return true;
    }
    // Says nothing until the client goes away.
    static void waitForEnd(int connection) {
        char byte = 0;
        while (recv(connection, &byte, 1, 0) > 0) {
        }
    }
    // Ends the connection with a reset instead of a farewell.
    static void resetConnection(int connection) {
        const linger atOnce{1, 0};
        setsockopt(connection, SOL_SOCKET, SO_LINGER, &atOnce, sizeof atOnce);
    }

  private:
    void serve(const Talk& talk) const {
        for (;;) {
            const platform::FileDescriptor connection(
                accept4(listener_.get(), nullptr, nullptr, SOCK_CLOEXEC));
            if (!connection.isOpen()) {
                return;
            }
            std::string request;
            char byte = 0;
            while (!request.ends_with("\r\n\r\n") && recv(connection.get(), &byte, 1, 0) == 1) {
                request += byte;
            }
            talk(connection.get(), request);
        }
    }

    platform::FileDescriptor listener_;
    std::uint16_t port_ = 0;
    std::thread thread_;
};

}  // namespace testing_support
