#include "platform/services/Opener.h"

#include <strings.h>

#include <string>

#include "platform/CoreServices.h"
#include "platform/base/Host.h"
#include "platform/values/Values.h"

OSStatus LSOpenCFURLRef(CFURLRef url, CFURLRef* openedURL) noexcept {
    if (url == nullptr || openedURL != nullptr) {
        return paramErr;
    }
    const std::string text(platform::values::textOf(CFURLGetString(url)));
    // A page, never a file or whatever else the desktop would know how to run.
    if (strncasecmp(text.c_str(), "http://", 7) != 0 && strncasecmp(text.c_str(), "https://", 8) != 0) {
        return paramErr;
    }
    std::shared_ptr<platform::services::Opener> opener = platform::currentHost().opener;
    if (!opener) {
        opener = platform::services::makeDesktopOpener();
    }
    return opener->open(text);
}
