#include "platform/apply/direct/SupplicantSocket.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cstring>
#include <utility>

#include "platform/base/Host.h"

namespace platform::apply {
namespace {

using std::chrono::milliseconds;
using std::chrono::steady_clock;

constexpr milliseconds answerTime{2000};
constexpr std::size_t largestAnswer = std::size_t{64} << 10U;
constexpr std::size_t mostEntries = 1000;
// The value of a network's "id_str", which is a note for whoever configures it.
constexpr std::string_view ourTag = "\"location-assistant\"";

std::vector<std::string_view> split(std::string_view text, char separator) {
    std::vector<std::string_view> pieces;
    while (!text.empty()) {
        const std::size_t end = std::min(text.find(separator), text.size());
        pieces.push_back(text.substr(0, end));
        text.remove_prefix(std::min(end + 1, text.size()));
    }
    return pieces;
}

std::optional<int> parseNumber(std::string_view text) {
    int number = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    return error == std::errc() && end != text.data() && number >= 0 ? std::optional(number) : std::nullopt;
}

// The bytes of a network's name from the escaped form that the supplicant prints.
std::string unescape(std::string_view text) {
    const std::map<char, char> letters{{'n', '\n'},   {'r', '\r'}, {'t', '\t'},
                                       {'e', '\033'}, {'"', '"'},  {'\\', '\\'}};
    std::string bytes;
    for (std::size_t i = 0; i < text.size(); ++i) {
        if (text[i] != '\\' || i + 1 == text.size()) {
            bytes += text[i];
            continue;
        }
        const char letter = text[++i];
        unsigned value = 0;
        if (const auto known = letters.find(letter); known != letters.end()) {
            bytes += known->second;
        } else if (letter == 'x' && i + 2 < text.size() &&
                   std::from_chars(text.data() + i + 1, text.data() + i + 3, value, 16).ec == std::errc()) {
            bytes += static_cast<char>(value);
            i += 2;
        }
    }
    return bytes;
}

SupplicantValues valuesIn(std::string_view answer) {
    SupplicantValues values;
    for (const std::string_view line : split(answer, '\n')) {
        if (const std::size_t equals = line.find('='); equals != std::string_view::npos) {
            values.emplace(line.substr(0, equals), line.substr(equals + 1));
        }
    }
    return values;
}

// The protection that the flags of a scan result tell of.
Security securityOf(std::string_view flags) {
    const auto has = [flags](const char* flag) { return flags.find(flag) != std::string_view::npos; };
    // Of several ways the supplicant tells all; that of a network which hands over its members is another
    // one.
    if (has("-PSK") || has("+PSK")) {
        return Security::wpa;
    }
    if (has("SAE")) {
        return Security::sae;
    }
    return has("WPA") || has("RSN") ? Security::enterprise : has("[WEP]") ? Security::wep : Security::open;
}

}  // namespace

Outcome SupplicantSocket::open(const std::string& interface, bool& isThere) {
    isThere = false;
    const std::string path = currentHost().supplicantDirectory + "/" + interface;
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (path.size() >= sizeof address.sun_path) {
        return {kSCStatusFailed, "the path of the supplicant's socket is too long"};
    }
    std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
    FileDescriptor socket(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    if (!socket.isOpen()) {
        return Outcome::fromErrno("cannot make a socket for the wireless supplicant");
    }
    // Connected before it has an address of its own, so that nobody else ever reaches it.
    if (::connect(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
        const bool nobody = errno == ENOENT || errno == ENOTDIR || errno == ECONNREFUSED;
        return nobody ? Outcome() : Outcome::fromErrno("cannot reach the wireless supplicant");
    }
    // With the family alone the kernel gives the socket an address for the answers, without a file.
    sockaddr_un own{};
    own.sun_family = AF_UNIX;
    if (::bind(socket.get(), reinterpret_cast<const sockaddr*>(&own), sizeof own.sun_family) != 0) {
        return Outcome::fromErrno("cannot make a socket for the wireless supplicant");
    }
    isThere = true;
    socket_ = std::move(socket);
    return {};
}

Outcome SupplicantSocket::receive(steady_clock::time_point deadline, std::optional<std::string>& message) {
    message.reset();
    for (;;) {
        const auto left = std::chrono::duration_cast<milliseconds>(deadline - steady_clock::now());
        pollfd wait{socket_.get(), POLLIN, 0};
        const int ready = ::poll(&wait, 1, static_cast<int>(std::max<std::int64_t>(left.count(), 0)));
        if (ready == 0 || (ready < 0 && errno != EINTR)) {
            return ready == 0 ? Outcome() : Outcome::fromErrno("cannot wait for the wireless supplicant");
        }
        std::string text(largestAnswer, '\0');
        const ssize_t size = ::recv(socket_.get(), text.data(), text.size(), 0);
        if (size >= 0) {
            message = text.substr(0, static_cast<std::size_t>(size));
            return {};
        }
        if (errno != EINTR && errno != EAGAIN) {
            return Outcome::fromErrno("cannot hear the wireless supplicant");
        }
    }
}

Outcome SupplicantSocket::ask(const std::string& request, const char* what, std::string& answer) {
    if (::send(socket_.get(), request.data(), request.size(), MSG_NOSIGNAL) < 0) {
        return Outcome::fromErrno(std::string("cannot ask the wireless supplicant to ") + what);
    }
    const auto deadline = steady_clock::now() + answerTime;
    for (;;) {
        std::optional<std::string> message;
        RETURN_IF_FAILED(receive(deadline, message));
        if (!message) {
            return {kSCStatusFailed,
                    std::string("the wireless supplicant does not answer when asked to ") + what};
        }
        if (!message->starts_with('<')) {
            answer = std::move(*message);
            return {};
        }
        notices_.push_back(std::move(*message));
    }
}

Outcome SupplicantSocket::order(const std::string& request, const char* what) {
    std::string answer;
    RETURN_IF_FAILED(ask(request, what, answer));
    return answer.starts_with("OK")
               ? Outcome()
               : Outcome(kSCStatusFailed, std::string("the wireless supplicant refused to ") + what);
}

Outcome SupplicantSocket::listNetworks(std::vector<ConfiguredNetwork>& networks) {
    networks.clear();
    // One answer holds a few dozen at most; the next ones come behind the last of it.
    for (std::size_t before = 1; networks.size() != before && networks.size() < mostEntries;) {
        before = networks.size();
        const std::string behind =
            networks.empty() ? "" : " LAST_ID=" + std::to_string(networks.back().number);
        std::string answer;
        RETURN_IF_FAILED(ask("LIST_NETWORKS" + behind, "list its networks", answer));
        for (const std::string_view line : split(answer, '\n')) {
            // number, name, bssid, flags
            const std::vector<std::string_view> fields = split(line, '\t');
            const auto number = fields.size() >= 3 ? parseNumber(fields[0]) : std::nullopt;
            if (!number || (!networks.empty() && *number <= networks.back().number)) {
                continue;
            }
            const bool isDisabled =
                fields.size() > 3 && fields[3].find("[DISABLED]") != std::string_view::npos;
            networks.push_back({*number, isDisabled, fields[1].empty(), false});
        }
        if (networks.empty()) {
            break;
        }
    }
    for (ConfiguredNetwork& network : networks) {
        std::string tag;
        RETURN_IF_FAILED(
            ask("GET_NETWORK " + std::to_string(network.number) + " id_str", "show a network", tag));
        network.isOurs = tag == ourTag;
    }
    return {};
}

Outcome SupplicantSocket::addNetwork(const std::vector<std::string>& settings, int& number) {
    std::string answer;
    RETURN_IF_FAILED(ask("ADD_NETWORK", "add a network", answer));
    const auto added = parseNumber(answer.substr(0, answer.find('\n')));
    if (!added) {
        return {kSCStatusFailed, "the wireless supplicant refused to add a network"};
    }
    number = *added;
    const std::string set = "SET_NETWORK " + std::to_string(number) + " ";
    // The tag first, so that a run that ends here leaves nothing that is not found.
    RETURN_IF_FAILED(order(set + "id_str " + std::string(ourTag), "mark a network"));
    for (const std::string& setting : settings) {
        const std::string what = "take the network's \"" + setting.substr(0, setting.find(' ')) + "\"";
        RETURN_IF_FAILED(order(set + setting, what.c_str()));
    }
    return {};
}

Outcome SupplicantSocket::removeNetwork(int number) {
    return order("REMOVE_NETWORK " + std::to_string(number), "remove a network");
}

Outcome SupplicantSocket::readStatus(SupplicantValues& status) {
    std::string answer;
    RETURN_IF_FAILED(ask("STATUS", "tell its state", answer));
    status = valuesIn(answer);
    return {};
}

Outcome SupplicantSocket::readHeard(const std::string& name, std::vector<HeardNetwork>& heard) {
    heard.clear();
    // One by one, since one answer would not hold them all. The mask asks for what is read here.
    std::string which = "FIRST";
    for (std::size_t i = 0; i < mostEntries; ++i) {
        std::string answer;
        RETURN_IF_FAILED(ask("BSS " + which + " MASK=0x1a87", "list what it hears", answer));
        SupplicantValues entry = valuesIn(answer);
        if (entry["id"].empty()) {
            break;
        }
        which = "NEXT-" + entry["id"];
        if (unescape(entry["ssid"]) != name) {
            continue;
        }
        const std::string& level = entry["level"];
        HeardNetwork network;
        network.bssid = entry["bssid"];
        network.frequency = parseNumber(entry["freq"]).value_or(0);
        // In dBm, below zero.
        std::from_chars(level.data(), level.data() + level.size(), network.strength);
        network.security = securityOf(entry["flags"]);
        network.isAdHoc = entry["flags"].find("[IBSS]") != std::string::npos;
        network.age = std::chrono::seconds(parseNumber(entry["age"]).value_or(0));
        heard.push_back(std::move(network));
    }
    return {};
}

Outcome SupplicantSocket::takeNotices(std::vector<std::string>& notices) {
    notices = std::exchange(notices_, {});
    for (std::optional<std::string> message;;) {
        RETURN_IF_FAILED(receive(steady_clock::now(), message));
        if (!message) {
            return {};
        }
        if (message->starts_with('<')) {
            notices.push_back(std::move(*message));
        }
    }
}

}  // namespace platform::apply
