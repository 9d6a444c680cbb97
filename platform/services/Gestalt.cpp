#include "platform/CoreServices.h"
#include "platform/base/Host.h"

OSErr Gestalt(OSType selector, SInt32* response) noexcept {
    if (response == nullptr) {
        return paramErr;
    }
    const std::optional<std::int32_t>& version = platform::currentHost().systemVersion;
    if (selector != gestaltSystemVersion || !version) {
        return gestaltUndefSelectorErr;
    }
    *response = *version;
    return noErr;
}
