#include "platform/apply/Plan.h"

#include <arpa/inet.h>

#include <algorithm>
#include <bit>
#include <cctype>
#include <string_view>

#include "platform/apply/Digest.h"
#include "platform/apply/Properties.h"

namespace platform::apply {
namespace {

constexpr std::size_t longestInterfaceName = 15;
constexpr std::size_t longestNetworkName = 32;
constexpr std::size_t longestClientID = 254;
constexpr std::size_t longestKey = 1024;
constexpr CFIndex mostAddresses = 64;

bool isActive(CFDictionaryRef dictionary) {
    return valueIn(dictionary, CFSTR("__INACTIVE__")) == nullptr;
}

// An entity that is there and switched on; else null.
CFDictionaryRef activeEntity(CFDictionaryRef service, CFStringRef protocol) {
    CFDictionaryRef const entity = dictionaryIn(service, protocol);
    return entity != nullptr && isActive(entity) ? entity : nullptr;
}

// The dictionary at "/<top>/<key>"; null when the path is another or leads nowhere.
CFDictionaryRef memberAtPath(CFDictionaryRef root, const std::string& path, const std::string& top) {
    const std::string prefix = "/" + top + "/";
    if (path.compare(0, prefix.size(), prefix) != 0 || path.find('/', prefix.size()) != std::string::npos) {
        return nullptr;
    }
    const auto topKey = values::makeString(top);
    const auto key = values::makeString(path.substr(prefix.size()));
    return topKey && key ? dictionaryIn(dictionaryIn(root, topKey.get()), key.get()) : nullptr;
}

// The kernel's own rule for names.
bool canNameInterface(const std::string& name) {
    return !name.empty() && name.size() <= longestInterfaceName && name != "." && name != ".." &&
           std::none_of(name.begin(), name.end(),
                        [](unsigned char c) { return c == '/' || c == ':' || c <= ' ' || c == 0x7F; });
}

std::optional<IPv4Address> parseAddress(CFTypeRef value) {
    const std::optional<std::string> text = asText(value);
    in_addr address{};
    if (!text || ::inet_pton(AF_INET, text->c_str(), &address) != 1) {
        return std::nullopt;
    }
    return address.s_addr;
}

// One that a single machine can have.
std::optional<IPv4Address> parseHostAddress(CFTypeRef value) {
    const std::optional<IPv4Address> address = parseAddress(value);
    const std::uint32_t number = ntohl(address.value_or(0));
    return number == 0 || number >= 0xE0000000U ? std::nullopt : address;
}

std::optional<unsigned> parseMask(CFTypeRef value) {
    const std::optional<IPv4Address> mask = parseAddress(value);
    if (!mask) {
        return std::nullopt;
    }
    const std::uint32_t bits = ntohl(*mask);
    const auto length = static_cast<unsigned>(std::countl_one(bits));
    return length < 32 && (bits << length) != 0 ? std::nullopt : std::optional(length);
}

unsigned classPrefix(IPv4Address address) {
    const std::uint32_t number = ntohl(address);
    return number < 0x80000000U ? 8 : number < 0xC0000000U ? 16 : 24;
}

// The stored form of a password: UTF-16 units, the high byte first.
std::optional<std::string> decodeKey(CFDataRef data) {
    const auto size = data == nullptr ? 1 : static_cast<std::size_t>(CFDataGetLength(data));
    if (size % 2 != 0 || size > longestKey) {
        return std::nullopt;
    }
    const UInt8* const bytes = CFDataGetBytePtr(data);
    std::vector<UniChar> units;
    for (std::size_t i = 0; i < size; i += 2) {
        units.push_back(static_cast<UniChar>((bytes[i] << 8U) | bytes[i + 1]));
    }
    const auto text = values::Owned<CFStringRef>::adopt(
        CFStringCreateWithCharacters(nullptr, units.data(), static_cast<CFIndex>(units.size())));
    return asText(text.get());
}

std::optional<std::string> parseDomain(CFTypeRef value) {
    std::optional<std::string> name = asText(value);
    const bool isUsable =
        name && !name->empty() && name->size() <= 253 && std::ranges::all_of(*name, [](unsigned char c) {
            return std::isalnum(c) != 0 || c == '.' || c == '-' || c == '_';
        });
    return isUsable ? name : std::nullopt;
}

// Reads an array that may be absent. False for anything else, for one of an unbearable size, and when one of
// its values cannot be read.
template <class T>
bool readList(CFDictionaryRef entity, CFStringRef key, std::optional<T> (*parse)(CFTypeRef),
              std::vector<T>& list) {
    const auto array = values::as<CFArrayRef>(valueIn(entity, key));
    if (array == nullptr || CFArrayGetCount(array) > mostAddresses) {
        return valueIn(entity, key) == nullptr;
    }
    return std::ranges::all_of(values::itemsOf(array), [&](CFTypeRef item) {
        std::optional<T> value = parse(item);
        if (value) {
            list.push_back(std::move(*value));
        }
        return value.has_value();
    });
}

// Each of these fills its part of the plan, and returns what is wrong with the entity, or null.

const char* readManual(CFDictionaryRef entity, InterfacePlan& plan) {
    std::vector<IPv4Address> addresses;
    std::vector<unsigned> lengths;
    if (!readList(entity, CFSTR("Addresses"), parseHostAddress, addresses)) {
        return "an entry of \"Addresses\" is not an address of a machine";
    }
    if (!readList(entity, CFSTR("SubnetMasks"), parseMask, lengths)) {
        return "an entry of \"SubnetMasks\" is not a subnet mask";
    }
    for (std::size_t i = 0; i < addresses.size(); ++i) {
        plan.addresses.push_back({addresses[i], i < lengths.size() ? lengths[i] : classPrefix(addresses[i])});
    }
    const CFTypeRef router = valueIn(entity, CFSTR("Router"));
    const std::optional<IPv4Address> address = parseHostAddress(router);
    if (router != nullptr && !address) {
        return "\"Router\" is not an address of a machine";
    }
    plan.router = address.value_or(0);
    return nullptr;
}

const char* readIPv4(CFDictionaryRef entity, InterfacePlan& plan) {
    if (entity == nullptr || valueIn(entity, CFSTR("ConfigMethod")) == nullptr) {
        return nullptr;
    }
    const std::optional<std::string> method = textIn(entity, CFSTR("ConfigMethod"));
    if (!method) {
        return "\"ConfigMethod\" is not a string";
    }
    if (*method == "Manual") {
        plan.method = IPv4Method::manual;
        return readManual(entity, plan);
    }
    if (*method == "DHCP") {
        plan.method = IPv4Method::dhcp;
        const std::optional<std::string> clientID = textIn(entity, CFSTR("DHCPClientID"));
        if (valueIn(entity, CFSTR("DHCPClientID")) != nullptr &&
            (!clientID || clientID->size() > longestClientID)) {
            return "\"DHCPClientID\" is not a string of up to 254 bytes";
        }
        plan.dhcpClientID = clientID.value_or("");
    }
    return nullptr;
}

const char* readDNS(CFDictionaryRef entity, InterfacePlan& plan) {
    if (!readList(entity, CFSTR("ServerAddresses"), parseHostAddress, plan.nameServers)) {
        return "an entry of \"ServerAddresses\" is not an address of a machine";
    }
    if (!readList(entity, CFSTR("SearchDomains"), parseDomain, plan.searchDomains)) {
        return "an entry of \"SearchDomains\" is not a domain name";
    }
    return nullptr;
}

const char* readAirPort(CFDictionaryRef entity, InterfacePlan& plan) {
    if (entity == nullptr) {
        return nullptr;
    }
    WirelessSettings& settings = plan.wireless.emplace();
    if (const CFTypeRef power = valueIn(entity, CFSTR("PowerEnabled"))) {
        const auto flag = values::as<CFBooleanRef>(power);
        const auto number = values::as<CFNumberRef>(power);
        if (flag != nullptr) {
            settings.powerEnabled = flag == kCFBooleanTrue;
        } else if (const auto on = number != nullptr ? values::integerOf(number) : std::nullopt) {
            settings.powerEnabled = *on != 0;
        } else {
            return "\"PowerEnabled\" is neither a boolean nor a number";
        }
    }
    if (valueIn(entity, CFSTR("PreferredNetwork")) != nullptr) {
        settings.network = textIn(entity, CFSTR("PreferredNetwork"));
        if (!settings.network || settings.network->empty() || settings.network->size() > longestNetworkName) {
            return "\"PreferredNetwork\" is not a network name, which has 1 to 32 bytes";
        }
    }
    if (const CFTypeRef password = valueIn(entity, CFSTR("AuthPassword"))) {
        settings.key = decodeKey(values::as<CFDataRef>(password));
        if (!settings.key) {
            return "\"AuthPassword\" is not a password in its stored form";
        }
        if (settings.key->empty()) {
            settings.key.reset();
        }
    }
    return nullptr;
}

const char* readService(CFDictionaryRef service, InterfacePlan& plan) {
    const char* wrong = readIPv4(activeEntity(service, CFSTR("IPv4")), plan);
    if (wrong == nullptr) {
        wrong = readDNS(activeEntity(service, CFSTR("DNS")), plan);
    }
    if (wrong == nullptr) {
        wrong = readAirPort(activeEntity(service, CFSTR("AirPort")), plan);
    }
    return wrong;
}

// The service that a location's ID stands for; null when the location does not link to one that is there.
CFDictionaryRef resolveService(CFDictionaryRef root, CFDictionaryRef links, CFTypeRef id) {
    if (!asText(id)) {
        return nullptr;
    }
    CFDictionaryRef const link = dictionaryIn(links, static_cast<CFStringRef>(id));
    const std::optional<std::string> target = textIn(link, CFSTR("__LINK__"));
    return target ? memberAtPath(root, *target, "NetworkServices") : nullptr;
}

}  // namespace

Plan makePlan(CFDictionaryRef root, std::vector<Trouble>& troubles) {
    Plan plan;
    const std::optional<std::string> current = textIn(root, CFSTR("CurrentSet"));
    CFDictionaryRef const location = current ? memberAtPath(root, *current, "Sets") : nullptr;
    if (location == nullptr) {
        troubles.push_back(
            {"", "\"CurrentSet\" names no location, so every interface is left to the system"});
        return plan;
    }
    CFDictionaryRef const network = dictionaryIn(location, CFSTR("Network"));
    CFDictionaryRef const links = dictionaryIn(network, CFSTR("Service"));
    const auto order = values::as<CFArrayRef>(
        valueIn(dictionaryIn(dictionaryIn(network, CFSTR("Global")), CFSTR("IPv4")), CFSTR("ServiceOrder")));

    const auto reject = [&troubles](const std::string& name, const char* wrong) {
        troubles.push_back(
            {name, std::string("its settings cannot be used, and it is left to the system: ") + wrong});
    };
    // Interfaces whose first active service has bad settings: a later service does not get them instead.
    std::vector<std::string> rejected;
    for (CFIndex i = 0; order != nullptr && i < CFArrayGetCount(order); ++i) {
        CFDictionaryRef const service = resolveService(root, links, CFArrayGetValueAtIndex(order, i));
        CFDictionaryRef const port = activeEntity(service, CFSTR("Interface"));
        const std::optional<std::string> name = textIn(port, CFSTR("DeviceName"));
        if (!name || *name == "*" || textIn(port, CFSTR("Type")) == "PPP") {
            continue;
        }
        if (!canNameInterface(*name) || *name == "lo") {
            reject(*name, "\"DeviceName\" is not the name of a network card");
            continue;
        }
        const auto same = std::find_if(plan.begin(), plan.end(),
                                       [&name](const InterfacePlan& known) { return known.name == *name; });
        const bool known = same != plan.end();
        if ((known && (same->active || !isActive(service))) ||
            std::find(rejected.begin(), rejected.end(), *name) != rejected.end()) {
            continue;
        }
        InterfacePlan interface;
        interface.name = *name;
        interface.active = isActive(service);
        const char* const wrong = interface.active ? readService(service, interface) : nullptr;
        if (known) {
            plan.erase(same);
        }
        if (wrong != nullptr) {
            reject(*name, wrong);
            rejected.push_back(*name);
            continue;
        }
        interface.rank = interface.active
                             ? static_cast<unsigned>(std::count_if(plan.begin(), plan.end(),
                                                                   [](const auto& p) { return p.active; }))
                             : 0;
        plan.push_back(std::move(interface));
    }
    return plan;
}

InterfacePlan withoutKey(InterfacePlan plan, const Salt& salt) {
    if (plan.wireless && plan.wireless->key) {
        // 16 bits: a key that was changed is noticed, a list of likely keys cannot be narrowed to one.
        plan.wireless->key = std::to_string(sipHash(salt, *plan.wireless->key) & 0xFFFFU);
    }
    return plan;
}

}  // namespace platform::apply
