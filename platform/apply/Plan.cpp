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
    const auto topKey = makeString(top);
    const auto key = makeString(path.substr(prefix.size()));
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

void appendUTF8(std::string& text, std::uint32_t c) {
    if (c < 0x80) {
        text += static_cast<char>(c);
    } else if (c < 0x800) {
        text += static_cast<char>(0xC0U | (c >> 6U));
        text += static_cast<char>(0x80U | (c & 0x3FU));
    } else if (c < 0x10000) {
        text += static_cast<char>(0xE0U | (c >> 12U));
        text += static_cast<char>(0x80U | ((c >> 6U) & 0x3FU));
        text += static_cast<char>(0x80U | (c & 0x3FU));
    } else {
        text += static_cast<char>(0xF0U | (c >> 18U));
        text += static_cast<char>(0x80U | ((c >> 12U) & 0x3FU));
        text += static_cast<char>(0x80U | ((c >> 6U) & 0x3FU));
        text += static_cast<char>(0x80U | (c & 0x3FU));
    }
}

// The stored form of a password: UTF-16 units, the high byte first.
std::optional<std::string> decodeKey(std::span<const std::byte> data) {
    if (data.size() % 2 != 0 || data.size() > longestKey) {
        return std::nullopt;
    }
    std::string text;
    std::uint32_t high = 0;
    for (std::size_t i = 0; i < data.size(); i += 2) {
        const std::uint32_t unit =
            (std::to_integer<std::uint32_t>(data[i]) << 8U) | std::to_integer<std::uint32_t>(data[i + 1]);
        const bool isLow = unit >= 0xDC00 && unit < 0xE000;
        if (isLow != (high != 0)) {
            return std::nullopt;
        }
        if (unit >= 0xD800 && unit < 0xDC00) {
            high = unit;
            continue;
        }
        appendUTF8(text, high == 0 ? unit : 0x10000U + ((high - 0xD800U) << 10U) + (unit - 0xDC00U));
        high = 0;
    }
    return high == 0 ? std::optional(text) : std::nullopt;
}

bool canBeDomain(const std::string& name) {
    return !name.empty() && name.size() <= 253 && std::all_of(name.begin(), name.end(), [](unsigned char c) {
        return std::isalnum(c) != 0 || c == '.' || c == '-' || c == '_';
    });
}

// Walks an array that may be absent; anything else than an array of a bearable size fails.
template <class Each>
bool forEach(CFDictionaryRef entity, CFStringRef key, const Each& each) {
    if (valueIn(entity, key) == nullptr) {
        return true;
    }
    CFArrayRef const array = arrayIn(entity, key);
    if (array == nullptr || CFArrayGetCount(array) > mostAddresses) {
        return false;
    }
    for (CFIndex i = 0; i < CFArrayGetCount(array); ++i) {
        if (!each(CFArrayGetValueAtIndex(array, i))) {
            return false;
        }
    }
    return true;
}

// Each of these fills its part of the plan, and returns what is wrong with the entity, or null.

const char* readManual(CFDictionaryRef entity, InterfacePlan& plan) {
    if (!forEach(entity, CFSTR("Addresses"), [&plan](CFTypeRef value) {
            const std::optional<IPv4Address> address = parseHostAddress(value);
            if (address) {
                plan.addresses.push_back({*address, classPrefix(*address)});
            }
            return address.has_value();
        })) {
        return "an entry of \"Addresses\" is not an address of a machine";
    }
    std::size_t next = 0;
    if (!forEach(entity, CFSTR("SubnetMasks"), [&plan, &next](CFTypeRef value) {
            const std::optional<unsigned> length = parseMask(value);
            if (length && next < plan.addresses.size()) {
                plan.addresses[next++].prefixLength = *length;
            }
            return length.has_value();
        })) {
        return "an entry of \"SubnetMasks\" is not a subnet mask";
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
    if (!forEach(entity, CFSTR("ServerAddresses"), [&plan](CFTypeRef value) {
            const std::optional<IPv4Address> address = parseHostAddress(value);
            if (address) {
                plan.nameServers.push_back(*address);
            }
            return address.has_value();
        })) {
        return "an entry of \"ServerAddresses\" is not an address of a machine";
    }
    if (!forEach(entity, CFSTR("SearchDomains"), [&plan](CFTypeRef value) {
            const std::optional<std::string> domain = asText(value);
            const bool usable = domain && canBeDomain(*domain);
            if (usable) {
                plan.searchDomains.push_back(*domain);
            }
            return usable;
        })) {
        return "an entry of \"SearchDomains\" is not a domain name";
    }
    return nullptr;
}

const char* readAirPort(CFDictionaryRef entity, InterfacePlan& plan) {
    if (entity == nullptr) {
        return nullptr;
    }
    WirelessSettings& settings = plan.wireless.emplace();
    if (valueIn(entity, CFSTR("PowerEnabled")) != nullptr) {
        settings.powerEnabled = booleanIn(entity, CFSTR("PowerEnabled"));
        if (const auto number = integerIn(entity, CFSTR("PowerEnabled"))) {
            settings.powerEnabled = *number != 0;
        }
        if (!settings.powerEnabled) {
            return "\"PowerEnabled\" is neither a boolean nor a number";
        }
    }
    if (valueIn(entity, CFSTR("PreferredNetwork")) != nullptr) {
        settings.network = textIn(entity, CFSTR("PreferredNetwork"));
        if (!settings.network || settings.network->empty() || settings.network->size() > longestNetworkName) {
            return "\"PreferredNetwork\" is not a network name, which has 1 to 32 bytes";
        }
    }
    if (valueIn(entity, CFSTR("AuthPassword")) != nullptr) {
        const auto data = dataIn(entity, CFSTR("AuthPassword"));
        settings.key = data ? decodeKey(*data) : std::nullopt;
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
    CFArrayRef const order =
        arrayIn(dictionaryIn(dictionaryIn(network, CFSTR("Global")), CFSTR("IPv4")), CFSTR("ServiceOrder"));

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
