#include "platform/apply/direct/Supplicant.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cstring>
#include <map>
#include <string_view>

#include "platform/FileDescriptor.h"
#include "platform/Host.h"
#include "platform/apply/WirelessKey.h"

namespace platform::apply {
namespace {

using std::chrono::milliseconds;
using std::chrono::steady_clock;

constexpr milliseconds answerTime{2000};
constexpr milliseconds scanTime{6000};
constexpr milliseconds lookAgain{500};
constexpr int firstChannel = 2412;
constexpr std::size_t largestAnswer = std::size_t{64} << 10U;
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

std::string hexOf(std::string_view bytes) {
    constexpr const char* digits = "0123456789abcdef";
    std::string text;
    for (const char c : bytes) {
        const auto byte = static_cast<unsigned char>(c);
        text += digits[byte >> 4U];
        text += digits[byte & 0xFU];
    }
    return text;
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

struct Network {
    int number = 0;
    bool isCurrent = false;
    bool isDisabled = false;
    bool isNameless = false;
};

// One conversation. Commands hold the key, so none of them ever goes into a reason.
class Conversation {
  public:
    // False, and success, when there is nobody to talk to.
    Outcome open(const std::string& interface, bool& isThere);
    // Sends a command and takes its answer; notices that come in between are kept. `what` names it in a
    // reason.
    Outcome ask(const std::string& command, const char* what, std::string& answer);
    // A command whose only good answer is "OK".
    Outcome tell(const std::string& command, const char* what);
    Outcome listNetworks(std::vector<Network>& networks);
    Outcome findOurs(const std::vector<Network>& networks, std::vector<Network>& ours);
    // "wpa_state", "id" and the like.
    Outcome status(std::map<std::string, std::string, std::less<>>& values);
    // Waits for notices, and gives back the ones that have come.
    Outcome notices(steady_clock::time_point deadline, std::vector<std::string>& taken);

  private:
    Outcome receive(steady_clock::time_point deadline, std::string& message, bool& received);

    FileDescriptor socket_;
    std::vector<std::string> notices_;
};

Outcome Conversation::open(const std::string& interface, bool& isThere) {
    isThere = false;
    const std::string path = currentHost().supplicantDirectory + "/" + interface;
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (path.size() >= sizeof address.sun_path) {
        return {kSCStatusFailed, "the path of the supplicant's socket is too long"};
    }
    std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
    FileDescriptor socket(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    // With the family alone the kernel gives the socket an address of its own for the answers, without a
    // file.
    sockaddr_un own{};
    own.sun_family = AF_UNIX;
    if (!socket.isOpen() ||
        ::bind(socket.get(), reinterpret_cast<const sockaddr*>(&own), sizeof own.sun_family) != 0) {
        return Outcome::fromErrno("cannot make a socket for the wireless supplicant");
    }
    if (::connect(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
        const bool nobody = errno == ENOENT || errno == ENOTDIR || errno == ECONNREFUSED;
        return nobody ? Outcome() : Outcome::fromErrno("cannot reach the wireless supplicant");
    }
    isThere = true;
    socket_ = std::move(socket);
    return {};
}

Outcome Conversation::receive(steady_clock::time_point deadline, std::string& message, bool& received) {
    received = false;
    for (;;) {
        const auto left = std::chrono::duration_cast<milliseconds>(deadline - steady_clock::now());
        pollfd wait{socket_.get(), POLLIN, 0};
        const int ready = ::poll(&wait, 1, static_cast<int>(std::max<std::int64_t>(left.count(), 0)));
        if (ready == 0 || (ready < 0 && errno != EINTR)) {
            return ready == 0 ? Outcome() : Outcome::fromErrno("cannot wait for the wireless supplicant");
        }
        message.resize(largestAnswer);
        const ssize_t size = ::recv(socket_.get(), message.data(), message.size(), 0);
        if (size >= 0) {
            message.resize(static_cast<std::size_t>(size));
            received = true;
            return {};
        }
        if (errno != EINTR && errno != EAGAIN) {
            return Outcome::fromErrno("cannot hear the wireless supplicant");
        }
    }
}

Outcome Conversation::ask(const std::string& command, const char* what, std::string& answer) {
    if (::send(socket_.get(), command.data(), command.size(), MSG_NOSIGNAL) < 0) {
        return Outcome::fromErrno(std::string("cannot ask the wireless supplicant to ") + what);
    }
    const auto deadline = steady_clock::now() + answerTime;
    for (;;) {
        bool received = false;
        Outcome done = receive(deadline, answer, received);
        if (!done.ok()) {
            return done;
        }
        if (!received) {
            return {kSCStatusFailed,
                    std::string("the wireless supplicant does not answer when asked to ") + what};
        }
        if (answer.empty() || answer.front() != '<') {
            return {};
        }
        notices_.push_back(answer);
    }
}

Outcome Conversation::tell(const std::string& command, const char* what) {
    std::string answer;
    Outcome done = ask(command, what, answer);
    if (done.ok() && answer.substr(0, 2) != "OK") {
        return {kSCStatusFailed, std::string("the wireless supplicant refused to ") + what};
    }
    return done;
}

Outcome Conversation::listNetworks(std::vector<Network>& networks) {
    networks.clear();
    std::string answer;
    Outcome done = ask("LIST_NETWORKS", "list its networks", answer);
    for (const std::string_view line : split(answer, '\n')) {
        const std::vector<std::string_view> fields = split(line, '\t');
        const auto number = fields.size() >= 3 ? parseNumber(fields[0]) : std::nullopt;
        if (done.ok() && number) {
            const std::string_view flags = fields.size() > 3 ? fields[3] : "";
            const auto has = [flags](const char* flag) { return flags.find(flag) != std::string_view::npos; };
            networks.push_back({*number, has("[CURRENT]"), has("[DISABLED]"), fields[1].empty()});
        }
    }
    return done;
}

Outcome Conversation::findOurs(const std::vector<Network>& networks, std::vector<Network>& ours) {
    ours.clear();
    for (const Network& network : networks) {
        std::string tag;
        Outcome done =
            ask("GET_NETWORK " + std::to_string(network.number) + " id_str", "show a network", tag);
        if (!done.ok()) {
            return done;
        }
        if (tag == ourTag) {
            ours.push_back(network);
        }
    }
    return {};
}

Outcome Conversation::status(std::map<std::string, std::string, std::less<>>& values) {
    values.clear();
    std::string answer;
    Outcome done = ask("STATUS", "tell its state", answer);
    for (const std::string_view line : split(answer, '\n')) {
        if (const std::size_t equals = line.find('='); equals != std::string_view::npos) {
            values[std::string(line.substr(0, equals))] = line.substr(equals + 1);
        }
    }
    return done;
}

Outcome Conversation::notices(steady_clock::time_point deadline, std::vector<std::string>& taken) {
    std::string message;
    bool received = false;
    Outcome done;
    if (notices_.empty()) {
        done = receive(deadline, message, received);
    }
    taken = std::move(notices_);
    notices_.clear();
    if (received) {
        taken.push_back(std::move(message));
    }
    return done;
}

// What the supplicant has seen of a network.
struct Seen {
    std::optional<Security> security;  // nothing when it was not seen
    bool isAdHoc = false;
    int frequency = 0;
};

Outcome lookFor(Conversation& supplicant, const std::string& name, Seen& seen) {
    std::string answer;
    Outcome done = supplicant.ask("SCAN_RESULTS", "list what it sees", answer);
    for (const std::string_view line : split(answer, '\n')) {
        // bssid, frequency, signal level, flags, name
        const std::vector<std::string_view> fields = split(line, '\t');
        if (!done.ok() || fields.size() != 5 || unescape(fields[4]) != name || seen.security) {
            continue;
        }
        const auto has = [&fields](const char* flag) {
            return fields[3].find(flag) != std::string_view::npos;
        };
        if (has("WPA") && !has("-PSK") && !has("SAE")) {
            return {kSCStatusFailed,
                    "the network asks each user for a name and a password, which a location does not hold"};
        }
        seen.security = has("WPA") ? Security::wpa : has("[WEP]") ? Security::wep : Security::open;
        seen.isAdHoc = has("[IBSS]");
        seen.frequency = parseNumber(fields[1]).value_or(0);
    }
    return done;
}

Outcome scanFor(Conversation& supplicant, const std::string& name, steady_clock::time_point deadline,
                Seen& seen) {
    Outcome done = lookFor(supplicant, name, seen);
    std::string answer;
    if (done.ok() && !seen.security) {
        done = supplicant.ask("SCAN", "look around", answer);
    }
    // One that cannot look around now is joined as its key says.
    const auto end = std::min(deadline, steady_clock::now() + scanTime);
    while (done.ok() && !seen.security && answer.substr(0, 2) == "OK" && steady_clock::now() < end) {
        std::vector<std::string> notices;
        done = supplicant.notices(end, notices);
        const bool isOver = std::any_of(notices.begin(), notices.end(), [](const std::string& notice) {
            return notice.find("CTRL-EVENT-SCAN-") != std::string::npos &&
                   notice.find("CTRL-EVENT-SCAN-STARTED") == std::string::npos;
        });
        if (isOver && done.ok()) {
            return lookFor(supplicant, name, seen);
        }
    }
    return done;
}

// The settings of the network to add, each as the words that follow its number.
std::vector<std::string> settingsFor(const WirelessSettings& settings, const Seen& seen, Security security) {
    std::vector<std::string> commands{"ssid " + hexOf(*settings.network), "scan_ssid 1"};
    if (seen.isAdHoc) {
        commands.emplace_back("mode 1");
        // A cell that was not seen may have to be started, and that takes a channel.
        commands.push_back("frequency " +
                           std::to_string(seen.frequency != 0 ? seen.frequency : firstChannel));
    }
    const std::string key = settings.key.value_or("");
    const std::string value = isInDigits(key) ? key : "\"" + key + "\"";
    switch (security) {
        case Security::open:
            commands.emplace_back("key_mgmt NONE");
            break;
        case Security::wep:
            commands.emplace_back("key_mgmt NONE");
            commands.push_back("wep_key0 " + value);
            commands.emplace_back("wep_tx_keyidx 0");
            break;
        case Security::wpa:
            commands.emplace_back("key_mgmt WPA-PSK");
            // Ten digits are a WEP key, and characters here.
            commands.push_back("psk " + (key.size() == 64 ? key : "\"" + key + "\""));
            break;
    }
    return commands;
}

Outcome addNetwork(Conversation& supplicant, const std::vector<std::string>& settings, std::string& number) {
    std::string answer;
    Outcome done = supplicant.ask("ADD_NETWORK", "add a network", answer);
    const auto added = parseNumber(answer);
    if (done.ok() && !added) {
        done = {kSCStatusFailed, "the wireless supplicant refused to add a network"};
    }
    if (!done.ok()) {
        return done;
    }
    number = std::to_string(*added);
    // The tag first, so that a run that ends here leaves nothing that is not found.
    done = supplicant.tell("SET_NETWORK " + number + " id_str " + std::string(ourTag), "mark a network");
    for (const std::string& setting : settings) {
        if (done.ok()) {
            const std::string what = "take the network's \"" + setting.substr(0, setting.find(' ')) + "\"";
            std::string command = "SET_NETWORK ";
            command += number;
            command += ' ';
            command += setting;
            done = supplicant.tell(command, what.c_str());
        }
    }
    return done;
}

Outcome awaitNetwork(Conversation& supplicant, const std::string& number, steady_clock::time_point deadline) {
    const char* reason = "the wireless supplicant did not get onto the network in time";
    for (;;) {
        std::map<std::string, std::string, std::less<>> status;
        Outcome done = supplicant.status(status);
        if (!done.ok() || (status["wpa_state"] == "COMPLETED" && status["id"] == number)) {
            return done;
        }
        if (steady_clock::now() >= deadline) {
            return {kSCStatusFailed, reason};
        }
        std::vector<std::string> notices;
        done = supplicant.notices(std::min(deadline, steady_clock::now() + lookAgain), notices);
        if (!done.ok()) {
            return done;
        }
        for (const std::string& notice : notices) {
            const auto has = [&notice](const char* text) { return notice.find(text) != std::string::npos; };
            if (has("reason=WRONG_KEY") || has("pre-shared key may be incorrect")) {
                return {kSCStatusFailed, "the network refused the key"};
            }
            if (has("CTRL-EVENT-NETWORK-NOT-FOUND")) {
                reason = "the network was not found";
            } else if (has("CTRL-EVENT-ASSOC-REJECT") || has("CTRL-EVENT-AUTH-REJECT")) {
                reason = "the network refused the card";
            }
        }
    }
}

}  // namespace

Outcome readKnownNetworks(const std::string& interface, std::optional<KnownNetworks>& networks) {
    networks.reset();
    Conversation supplicant;
    bool isThere = false;
    Outcome done = supplicant.open(interface, isThere);
    if (!done.ok() || !isThere) {
        return done;
    }
    std::vector<Network> list;
    done = supplicant.listNetworks(list);
    KnownNetworks& known = networks.emplace();
    for (const Network& network : list) {
        known.all.push_back(network.number);
        if (!network.isDisabled) {
            known.enabled.push_back(network.number);
        }
    }
    return done;
}

Outcome joinNetwork(const std::string& interface, const WirelessSettings& settings, bool mayStay,
                    steady_clock::time_point deadline) {
    Conversation supplicant;
    bool isThere = false;
    Outcome done = supplicant.open(interface, isThere);
    if (done.ok() && !isThere) {
        return {kSCStatusFailed, "joining a wireless network needs NetworkManager or a wireless supplicant"};
    }
    std::vector<Network> networks;
    std::vector<Network> ours;
    if (done.ok()) {
        done = supplicant.listNetworks(networks);
    }
    if (done.ok()) {
        done = supplicant.findOurs(networks, ours);
    }
    std::map<std::string, std::string, std::less<>> status;
    if (done.ok() && mayStay && ours.size() == 1) {
        done = supplicant.status(status);
        if (done.ok() && status["wpa_state"] == "COMPLETED" &&
            status["id"] == std::to_string(ours[0].number)) {
            return {};
        }
    }
    Seen seen;
    Security security = Security::open;
    std::string number;
    if (done.ok()) {
        done = supplicant.tell("ATTACH", "tell what happens");
    }
    if (done.ok()) {
        done = scanFor(supplicant, *settings.network, deadline, seen);
    }
    if (done.ok()) {
        done = chooseSecurity(seen.security, settings.key, security);
    }
    if (done.ok() && !seen.security && security != Security::wpa) {
        // A network that nobody announces is more likely one of the machines themselves.
        std::string modes;
        done = supplicant.ask("GET_CAPABILITY modes", "tell what the card can", modes);
        seen.isAdHoc = modes.find("IBSS") != std::string::npos;
    }
    if (done.ok()) {
        done = addNetwork(supplicant, settingsFor(settings, seen, security), number);
    }
    if (done.ok()) {
        done = supplicant.tell("SELECT_NETWORK " + number, "choose a network");
    }
    // Not before: the card may be on an earlier one of ours.
    for (const Network& network : ours) {
        if (done.ok()) {
            done = supplicant.tell("REMOVE_NETWORK " + std::to_string(network.number), "remove a network");
        }
    }
    return done.ok() ? awaitNetwork(supplicant, number, deadline) : done;
}

Outcome leaveNetwork(const std::string& interface, const std::optional<KnownNetworks>& before) {
    Conversation supplicant;
    bool isThere = false;
    Outcome done = supplicant.open(interface, isThere);
    if (!done.ok() || !isThere) {
        return done;
    }
    std::vector<Network> networks;
    std::vector<Network> ours;
    done = supplicant.listNetworks(networks);
    if (done.ok()) {
        done = supplicant.findOurs(networks, ours);
    }
    const auto contains = [](const std::vector<int>& list, int number) {
        return std::find(list.begin(), list.end(), number) != list.end();
    };
    for (const Network& network : networks) {
        // A run that ended between adding one and marking it.
        const bool isMarked = std::any_of(
            ours.begin(), ours.end(), [&network](const Network& o) { return o.number == network.number; });
        if (before && network.isNameless && network.isDisabled && !isMarked &&
            !contains(before->all, network.number)) {
            ours.push_back(network);
        }
    }
    // With another network chosen since, ours is off, and what is on or off is somebody else's choice.
    const bool isOursChosen =
        std::any_of(ours.begin(), ours.end(), [](const Network& network) { return !network.isDisabled; });
    for (const Network& network : networks) {
        if (done.ok() && before && isOursChosen && network.isDisabled &&
            contains(before->enabled, network.number)) {
            done = supplicant.tell("ENABLE_NETWORK " + std::to_string(network.number), "switch on a network");
        }
    }
    // Last, because their being there is what says that something is to be undone.
    for (const Network& network : ours) {
        if (done.ok()) {
            done = supplicant.tell("REMOVE_NETWORK " + std::to_string(network.number), "remove a network");
        }
    }
    return done;
}

}  // namespace platform::apply
