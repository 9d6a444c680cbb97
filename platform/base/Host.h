// The one seam of the platform: where it finds things on this machine, and the few parts of it that touch the
// world.
//
// Production code takes the defaults. A test installs a host of its own for one scope with HostOverride, and
// everything below the faces uses that one until the scope ends.
#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace platform {

namespace apply {
class Agent;
}
namespace live {
class NetworkState;
}

struct Host {
    // Holds preferences.plist and its lock file.
    std::string preferencesDirectory = "/var/lib/location-assistant";
    // Holds the record of what was applied and of how the machine was before; lives as long as one boot.
    std::string runtimeDirectory = "/run/location-assistant";
    std::string sysfsRoot = "/sys";
    // The name servers' file.
    std::string resolverFile = "/etc/resolv.conf";
    // The system bus, as a path of a socket.
    std::string systemBusSocket = "/run/dbus/system_bus_socket";
    // Holds one control socket of the wireless supplicant for each interface.
    std::string supplicantDirectory = "/run/wpa_supplicant";
    // Of systemd-networkd: what it knows of each link, and the configuration that lives as long as one boot.
    std::string networkdStateDirectory = "/run/systemd/netif/links";
    std::string networkdDirectory = "/run/systemd/network";

    // The DHCP client, and the program that it runs when a lease comes and goes.
    std::string dhcpClient = "/usr/bin/busybox";
    // Empty: beside this program's file, or where the program was installed.
    std::string dhcpHook;

    // The modem-script folders of the four domains. An empty user folder means
    // <home from the password database>/.local/share/modem-scripts.
    std::string userModemScripts;
    std::string networkModemScripts = "/net/share/modem-scripts";
    std::string localModemScripts = "/usr/local/share/modem-scripts";
    std::string systemModemScripts = "/usr/share/modem-scripts";

    // How long one download may take, connecting included. Three tries at a silent server take 15 seconds.
    std::chrono::milliseconds downloadBound{5000};
    // The HTTP client's library: the first that is there. Debian has one for each TLS library, of which
    // nothing is used here.
    std::vector<std::string> httpLibraries = {"libcurl-gnutls.so.4", "libcurl.so.4"};

    // Holds one folder for each user with a session, with the user's own bus in it.
    std::string userRuntimeRoot = "/run/user";
    // What opens a URL the way the user wants it, with the arguments before the URL: the first that is
    // installed.
    std::vector<std::vector<std::string>> openingPrograms = {{"/usr/bin/xdg-open"}, {"/usr/bin/gio", "open"}};

    // A BCD version number; nothing: the question fails.
    std::optional<std::int32_t> systemVersion = 0x1040;

    // In the order in which they are asked who leads an interface; none: the platform's own.
    std::vector<std::shared_ptr<apply::Agent>> agents;
    // Told of each step by which a file is about to change on disk ("mkdir", "open", "write", "fsync",
    // "close", "rename", "unlink"); false, with errno set, fails the step. Null: nothing but the system can.
    std::function<bool(const char* step, const std::string& path)> fileStep;
    // Null: the platform's own, chosen at the call.
    std::shared_ptr<live::NetworkState> networkState;
};

// The host in force.
[[nodiscard]] const Host& currentHost();

// Puts a host in force until the end of its scope, then the one before it again.
class HostOverride {
  public:
    explicit HostOverride(Host host);
    ~HostOverride();
    HostOverride(const HostOverride&) = delete;
    HostOverride& operator=(const HostOverride&) = delete;

  private:
    Host host_;
    const Host* previous_;
};

}  // namespace platform
