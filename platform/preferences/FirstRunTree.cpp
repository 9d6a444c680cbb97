#include "platform/preferences/FirstRunTree.h"

#include "platform/values/PropertyListXML.h"
#include "platform/values/Values.h"

namespace platform::preferences {
namespace {

// The IDs are decimal numbers: whoever makes locations and services counts on from the largest one.
constexpr std::string_view document = R"(<plist version="1.0"><dict>
    <key>CurrentSet</key><string>/Sets/0</string>
    <key>NetworkServices</key><dict><key>0</key><dict>
        <key>UserDefinedName</key><string>Managed by the system</string>
        <key>Interface</key><dict>
            <key>DeviceName</key><string>*</string>
            <key>Hardware</key><string>System</string>
            <key>Type</key><string>System</string>
        </dict>
    </dict></dict>
    <key>Sets</key><dict><key>0</key><dict>
        <key>UserDefinedName</key><string>Automatic</string>
        <key>Network</key><dict>
            <key>Global</key><dict>
                <key>IPv4</key><dict>
                    <key>PPPOverridePrimary</key><integer>0</integer>
                    <key>ServiceOrder</key><array><string>0</string></array>
                </dict>
                <key>NetInfo</key><dict/>
            </dict>
            <key>Service</key><dict>
                <key>0</key><dict><key>__LINK__</key><string>/NetworkServices/0</string></dict>
            </dict>
        </dict>
    </dict></dict>
</dict></plist>)";

}  // namespace

values::Owned<CFDictionaryRef> makeFirstRunTree() {
    values::ParseError error;
    return values::Owned<CFDictionaryRef>::retained(
        values::as<CFDictionaryRef>(values::parsePropertyListXML(document, error).get()));
}

}  // namespace platform::preferences
