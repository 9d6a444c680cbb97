// Preferences trees for the tests, written as property lists.
#pragma once

#include <gtest/gtest.h>

#include <string>
#include <utility>
#include <vector>

#include "platform/values/Object.h"
#include "platform/values/PropertyListXML.h"

namespace platform::apply {

inline constexpr const char* switchedOff = "<key>__INACTIVE__</key><integer>1</integer>";

struct Service {
    std::string device;
    std::string entries;  // of the service, beside its "Interface"
};

// A service that is on, with a fixed address.
inline Service fixedService(const std::string& device, const std::string& address = "192.0.0.199") {
    return {device,
            "<key>IPv4</key><dict><key>ConfigMethod</key><string>Manual</string><key>Addresses</"
            "key><array><string>" +
                address +
                "</string></array><key>SubnetMasks</key><array><string>255.255.255.0</string></array>"
                "<key>Router</key><string>192.0.0.192</string></dict>"};
}

inline values::Owned<CFDictionaryRef> parseTree(const std::string& body) {
    values::ParseError error;
    const auto value =
        values::parsePropertyListXML("<plist version=\"1.0\"><dict>" + body + "</dict></plist>", error);
    EXPECT_TRUE(value) << error.reason << " in " << body;
    return values::Owned<CFDictionaryRef>::retained(static_cast<CFDictionaryRef>(value.get()));
}

// One location, "7", current, with these services in this order.
inline values::Owned<CFDictionaryRef> makeTree(const std::vector<Service>& services) {
    std::string all;
    std::string links;
    std::string order;
    for (std::size_t i = 0; i < services.size(); ++i) {
        const Service& service = services[i];
        const std::string id = std::to_string(100 + i);
        all += "<key>" + id + "</key><dict><key>Interface</key><dict><key>DeviceName</key><string>" +
               service.device + "</string><key>Type</key><string>Ethernet</string></dict>" + service.entries +
               "</dict>";
        links += "<key>" + id + "</key><dict><key>__LINK__</key><string>/NetworkServices/" + id +
                 "</string></dict>";
        order += "<string>" + id + "</string>";
    }
    return parseTree(
        "<key>CurrentSet</key><string>/Sets/7</string><key>Sets</key><dict><key>7</key><dict><key>Network"
        "</key><dict><key>Service</key><dict>" +
        links + "</dict><key>Global</key><dict><key>IPv4</key><dict><key>ServiceOrder</key><array>" + order +
        "</array></dict></dict></dict></dict></dict><key>NetworkServices</key><dict>" + all + "</dict>");
}

}  // namespace platform::apply
