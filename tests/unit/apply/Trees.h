// Preferences trees for the tests, in the notation.
#pragma once

#include <arpa/inet.h>

#include <algorithm>
#include <string>
#include <vector>

#include "platform/apply/Plan.h"
#include "tests/unit/support/Notation.h"

namespace platform::apply {

using Lines = std::vector<std::string>;

struct Service {
    std::string device;
    std::string entries;  // beside its "Interface"
};

inline const std::string switchedOff = "__INACTIVE__ = #1;";

// A service that is on, with a fixed address.
inline Service fixedService(const std::string& device, const std::string& address = "192.0.0.199") {
    return {device, "IPv4 = {ConfigMethod = Manual; Addresses = (" + address +
                        "); SubnetMasks = (255.255.255.0); Router = 192.0.0.192};"};
}

// Of "device entries".
inline Service serviceOf(const std::string& text) {
    const std::size_t space = std::min(text.find(' '), text.size());
    return {text.substr(0, space), text.substr(space)};
}

inline values::Owned<CFDictionaryRef> readTree(const std::string& text) {
    return values::Owned<CFDictionaryRef>::adopt(
        static_cast<CFDictionaryRef>(testing_support::read(text).take()));
}

// One location, current, with these services in this order.
inline values::Owned<CFDictionaryRef> makeTree(const std::vector<Service>& services,
                                               const std::string& location = "7") {
    std::string all;
    std::string links;
    std::string order;
    for (std::size_t i = 0; i < services.size(); ++i) {
        const std::string id = std::to_string(100 + i);
        all += id + " = {Interface = {DeviceName = " + services[i].device + "; Type = Ethernet}; " +
               services[i].entries + "}; ";
        links += id + " = {__LINK__ = /NetworkServices/" + id + "}; ";
        order += id + ", ";
    }
    return readTree("{CurrentSet = /Sets/" + location + "; Sets = {" + location +
                    " = {Network = {Service = {" + links + "}; Global = {IPv4 = {ServiceOrder = (" + order +
                    ")}}}}}; NetworkServices = {" + all + "}}");
}

inline IPv4Address address(const char* text) {
    in_addr address{};
    inet_pton(AF_INET, text, &address);
    return address.s_addr;
}

inline std::string quad(IPv4Address address) {
    char text[INET_ADDRSTRLEN] = "";
    inet_ntop(AF_INET, &address, text, sizeof text);
    return text;
}

}  // namespace platform::apply
