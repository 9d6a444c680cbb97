#include "platform/apply/direct/Snapshot.h"

#include <fcntl.h>
#include <sys/random.h>
#include <unistd.h>

#include <algorithm>

#include "platform/FileDescriptor.h"
#include "platform/apply/Digest.h"
#include "platform/apply/Properties.h"
#include "platform/apply/StateFile.h"

namespace platform::apply {
namespace {

std::string notesPath(const std::string& interface) {
    return runtimePath("direct-" + interface + ".plist");
}

std::string switchPath(const std::string& interface) {
    return "/proc/sys/net/ipv6/conf/" + interface + "/disable_ipv6";
}

values::Owned<CFDictionaryRef> encodeAddress(const Address& address) {
    DictionaryBuilder dictionary;
    dictionary.setData(CFSTR("Message"), address.key)
        .setInteger(CFSTR("Protocol"), address.protocol)
        .setInteger(CFSTR("Valid"), address.valid)
        .setInteger(CFSTR("Preferred"), address.preferred)
        .setBoolean(CFSTR("ComesByItself"), address.comesByItself);
    return dictionary.take();
}

values::Owned<CFDictionaryRef> encodeRoute(const Route& route) {
    DictionaryBuilder dictionary;
    dictionary.setData(CFSTR("Message"), route.key)
        .setBoolean(CFSTR("Preceded"), route.preceded)
        .setBoolean(CFSTR("ComesByItself"), route.comesByItself)
        .setBoolean(CFSTR("Shared"), route.isShared)
        .setBoolean(CFSTR("Elsewhere"), route.isElsewhere);
    return dictionary.take();
}

template <class Family>
std::optional<netlink::Bytes> decodeKey(CFDictionaryRef dictionary) {
    const auto key = dataIn(dictionary, CFSTR("Message"));
    if (!key || key->size() < sizeof(Family)) {
        return std::nullopt;
    }
    return netlink::Bytes(key->begin(), key->end());
}

std::optional<Address> parseAddress(CFDictionaryRef dictionary) {
    auto key = decodeKey<ifaddrmsg>(dictionary);
    if (!key) {
        return std::nullopt;
    }
    return Address{std::move(*key),
                   static_cast<std::uint8_t>(integerIn(dictionary, CFSTR("Protocol")).value_or(0)),
                   static_cast<std::uint32_t>(integerIn(dictionary, CFSTR("Valid")).value_or(forever)),
                   static_cast<std::uint32_t>(integerIn(dictionary, CFSTR("Preferred")).value_or(forever)),
                   booleanIn(dictionary, CFSTR("ComesByItself")).value_or(false)};
}

std::optional<Route> parseRoute(CFDictionaryRef dictionary) {
    auto key = decodeKey<rtmsg>(dictionary);
    if (!key) {
        return std::nullopt;
    }
    return Route{std::move(*key), booleanIn(dictionary, CFSTR("Preceded")).value_or(false),
                 booleanIn(dictionary, CFSTR("ComesByItself")).value_or(false),
                 booleanIn(dictionary, CFSTR("Shared")).value_or(false),
                 booleanIn(dictionary, CFSTR("Elsewhere")).value_or(false)};
}

// False when the list is missing or one of its entries is of the wrong form.
template <class T, class Decode>
bool decodeList(CFDictionaryRef dictionary, CFStringRef key, std::vector<T>& list, const Decode& decode) {
    CFArrayRef const array = arrayIn(dictionary, key);
    if (array == nullptr) {
        return false;
    }
    for (CFIndex i = 0; i < CFArrayGetCount(array); ++i) {
        std::optional<T> one = decode(asDictionary(CFArrayGetValueAtIndex(array, i)));
        if (!one) {
            return false;
        }
        list.push_back(std::move(*one));
    }
    return true;
}

values::Owned<CFDataRef> encodeNumbers(const std::vector<int>& numbers) {
    return makeData(std::as_bytes(std::span(numbers)));
}

std::vector<int> decodeNumbers(CFDictionaryRef dictionary, CFStringRef key) {
    std::vector<int> numbers;
    if (const auto data = dataIn(dictionary, key)) {
        numbers.resize(data->size() / sizeof(int));
        std::copy_n(data->begin(), numbers.size() * sizeof(int),
                    std::as_writable_bytes(std::span(numbers)).begin());
    }
    return numbers;
}

std::uint32_t checkOf(const WirelessSettings& settings, const Salt& salt) {
    const std::string text = settings.network.value_or("") + '\0' + settings.key.value_or("");
    return static_cast<std::uint32_t>(sipHash(salt, text) & 0xFFFFU);
}

}  // namespace

JoinedNetwork makeJoinedNetwork(const WirelessSettings& settings) {
    JoinedNetwork joined;
    // Without random bytes the check is still right, only easier to guess from.
    (void)!::getrandom(joined.salt.data(), joined.salt.size(), 0);
    joined.check = checkOf(settings, joined.salt);
    return joined;
}

bool isSameNetwork(const JoinedNetwork& joined, const WirelessSettings& settings) {
    return joined.check == checkOf(settings, joined.salt);
}

values::Owned<CFDictionaryRef> encodeSnapshot(const Snapshot& snapshot) {
    ArrayBuilder addresses;
    for (const Address& address : snapshot.state.addresses) {
        addresses.add(encodeAddress(address).get());
    }
    ArrayBuilder routes;
    for (const Route& route : snapshot.state.routes) {
        routes.add(encodeRoute(route).get());
    }
    DictionaryBuilder dictionary;
    dictionary.setBoolean(CFSTR("Up"), snapshot.up)
        .setInteger(CFSTR("TakenAt"), snapshot.takenAt)
        .set(CFSTR("Addresses"), addresses.get())
        .set(CFSTR("Routes"), routes.get());
    if (snapshot.ipv6Disabled) {
        dictionary.setBoolean(CFSTR("IPv6Disabled"), *snapshot.ipv6Disabled);
    }
    if (snapshot.networks) {
        dictionary.set(CFSTR("Networks"), encodeNumbers(snapshot.networks->all).get())
            .set(CFSTR("EnabledNetworks"), encodeNumbers(snapshot.networks->enabled).get());
    }
    return dictionary.take();
}

std::optional<Snapshot> decodeSnapshot(CFDictionaryRef dictionary) {
    Snapshot snapshot;
    const auto up = booleanIn(dictionary, CFSTR("Up"));
    const auto takenAt = integerIn(dictionary, CFSTR("TakenAt"));
    if (!up || !takenAt ||
        !decodeList(dictionary, CFSTR("Addresses"), snapshot.state.addresses, parseAddress) ||
        !decodeList(dictionary, CFSTR("Routes"), snapshot.state.routes, parseRoute)) {
        return std::nullopt;
    }
    snapshot.up = *up;
    snapshot.takenAt = *takenAt;
    snapshot.ipv6Disabled = booleanIn(dictionary, CFSTR("IPv6Disabled"));
    if (dataIn(dictionary, CFSTR("Networks"))) {
        snapshot.networks = KnownNetworks{decodeNumbers(dictionary, CFSTR("Networks")),
                                          decodeNumbers(dictionary, CFSTR("EnabledNetworks"))};
    }
    return snapshot;
}

std::optional<bool> isIPv6Disabled(const std::string& interface) {
    std::string text;
    if (!readWholeFile(switchPath(interface), text).ok() || text.empty()) {
        return std::nullopt;
    }
    return text[0] != '0';
}

Outcome disableIPv6(const std::string& interface, bool disabled) {
    const std::string path = switchPath(interface);
    const FileDescriptor file(::open(path.c_str(), O_WRONLY | O_CLOEXEC));
    if (!file.isOpen() || ::write(file.get(), disabled ? "1" : "0", 1) != 1) {
        return Outcome::fromErrno("cannot write " + path);
    }
    return {};
}

Outcome readNotes(const std::string& interface, std::optional<Notes>& notes) {
    notes.reset();
    values::Owned<CFDictionaryRef> file;
    Outcome read = readStateFile(notesPath(interface), file);
    if (!read.ok() || !file) {
        return read;
    }
    const auto phase = integerIn(file.get(), CFSTR("Phase"));
    const auto off = booleanIn(file.get(), CFSTR("Off"));
    Notes found;
    if (!phase || *phase < 0 || *phase > static_cast<int>(Notes::Phase::returning) || !off ||
        !decodeList(file.get(), CFSTR("Addresses"), found.addresses, parseAddress)) {
        return {kSCStatusFailed, notesPath(interface) + " is not what this system wrote"};
    }
    found.phase = static_cast<Notes::Phase>(*phase);
    found.off = *off;
    const auto salt = dataIn(file.get(), CFSTR("NetworkSalt"));
    const auto check = integerIn(file.get(), CFSTR("NetworkCheck"));
    if (salt && check && salt->size() == sizeof(Salt)) {
        found.joined.emplace().check = static_cast<std::uint32_t>(*check);
        std::transform(salt->begin(), salt->end(), found.joined->salt.begin(),
                       [](std::byte b) { return std::to_integer<std::uint8_t>(b); });
    }
    notes = std::move(found);
    return {};
}

Outcome writeNotes(const std::string& interface, const Notes& notes) {
    ArrayBuilder addresses;
    for (const Address& address : notes.addresses) {
        addresses.add(encodeAddress(address).get());
    }
    DictionaryBuilder file;
    file.setInteger(CFSTR("Phase"), static_cast<int>(notes.phase))
        .setBoolean(CFSTR("Off"), notes.off)
        .set(CFSTR("Addresses"), addresses.get());
    if (notes.joined) {
        file.setData(CFSTR("NetworkSalt"), std::as_bytes(std::span(notes.joined->salt)))
            .setInteger(CFSTR("NetworkCheck"), notes.joined->check);
    }
    return writeStateFile(notesPath(interface), file.take().get());
}

Outcome removeNotes(const std::string& interface) {
    return removeStateFile(notesPath(interface));
}

}  // namespace platform::apply
