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

inline values::Owned<CFDictionaryRef> readTree(const std::string& text) {
    return values::Owned<CFDictionaryRef>::adopt(
        static_cast<CFDictionaryRef>(testing_support::read(text).take()));
}

// One location, current, with these services in this order, each "DEVICE ENTRIES".
inline values::Owned<CFDictionaryRef> makeTree(const Lines& services, const std::string& location = "7") {
    std::string all;
    std::string links;
    std::string order;
    for (const std::string& service : services) {
        const std::string id = std::to_string(100 + (&service - services.data()));
        const std::size_t space = std::min(service.find(' '), service.size());
        all += id + " = {Interface = {DeviceName = " + service.substr(0, space) + "; Type = Ethernet}; " +
               service.substr(space) + "}; ";
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
