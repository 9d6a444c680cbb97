#include "platform/services/Opener.h"

#include <strings.h>

#include <new>
#include <string>

#include "platform/CoreServices.h"
#include "platform/base/Host.h"
#include "platform/values/Values.h"

OSStatus LSOpenCFURLRef(CFURLRef url, CFURLRef* openedURL) noexcept {
    if (url == nullptr || openedURL != nullptr) {
        return paramErr;
    }
    try {
        const std::string text(platform::values::textOf(CFURLGetString(url)));
        const auto begins = [&text](const char* scheme, std::size_t length) {
            return strncasecmp(text.c_str(), scheme, length) == 0;
        };
        // A page, never a file or whatever else the desktop would know how to run.
        if (!begins("http://", 7) && !begins("https://", 8)) {
            return paramErr;
        }
        std::shared_ptr<platform::services::Opener> opener = platform::currentHost().opener;
        if (!opener) {
            opener = platform::services::makeDesktopOpener();
        }
        return opener->open(text);
    } catch (const std::bad_alloc&) {
        return memFullErr;
    } catch (const std::exception&) {
        return ioErr;
    }
}
