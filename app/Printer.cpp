#include "app/Printer.h"

#include <netdb.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <csignal>
#include <cstdio>
#include <cstring>

#include "app/Trace.h"
#include "morecfq/MoreCFQ.h"
#include "platform/CoreServices.h"
#include "platform/SystemConfiguration.h"

char gQF_config_URL1[] = "http://" LA_PRINTER_ADDRESS "/dot11_config_start.htm";

namespace {

constexpr std::uint16_t kPrinterPort = 80;
// The printer has no such page: that it says so proves that its web server is up.
constexpr const char* kProbeURL = "http://" LA_PRINTER_ADDRESS "/mactestfoo.html";
constexpr OSStatus kHTTPNotFound = 404;
// A query asks the kernel alone and is answered at once, so this is no time for a network to come up:
// whoever activated the location waited for that.
constexpr useconds_t kPauseBetweenQueries = 30;  // microseconds

bool LookUpPrinter(sockaddr_in* address) {
    const hostent* host = gethostbyname(kPrinterAddress);
    if (host == nullptr || host->h_addr_list[0] == nullptr || host->h_length <= 0) {
        return false;
    }
    *address = {};
    address->sin_family = AF_INET;
    address->sin_port = htons(kPrinterPort);
    const auto length = std::min(static_cast<std::size_t>(host->h_length), sizeof address->sin_addr);
    std::memcpy(&address->sin_addr, host->h_addr_list[0], length);
    return true;
}

int IsReachable(Boolean checked, SCNetworkConnectionFlags flags) {
    return checked != 0 && (flags & kSCNetworkFlagsReachable) != 0 ? 1 : 0;
}

}  // namespace

int IsWirelessPrinterReachableViaSCF(int maxtries) {
    int reachable = 0;
    int counter = 0;
    SCNetworkConnectionFlags flags = 0;
    sockaddr_in address = {};
    const bool lookedUp = LookUpPrinter(&address);

    for (;;) {
        TRACE("IsWirelessPrinterReachableViaSCF() try %d\n", counter);
        Boolean checked = SCNetworkCheckReachabilityByName(kPrinterAddress, &flags);
        TRACE("from SCNetworkCheckReachabilityByName(), flags = %d\n", static_cast<int>(flags));
        reachable = IsReachable(checked, flags);
        if (reachable == 0 && lookedUp) {
            checked = SCNetworkCheckReachabilityByAddress(reinterpret_cast<const sockaddr*>(&address),
                                                          static_cast<int>(sizeof address), &flags);
            reachable = IsReachable(checked, flags);
            TRACE("from SCNetworkCheckReachabilityByAddress(), flags = %d\n", static_cast<int>(flags));
        }
        ++counter;
        if (counter >= maxtries || reachable != 0) {
            break;
        }
        usleep(kPauseBetweenQueries);
    }

    TRACE("IsWirelessPrinterReachableViaSCF(): reachable=%d\n", reachable);
    return reachable;
}

int IsWirelessPrinterReachableViaHTTP(int maxtries) {
    TRACE("Looking for the device at %s\n", kPrinterAddress);
    const Handle buffer = NewHandle(0);
    OSStatus result = 0;
    int tries = 0;

    for (;;) {
        TRACE("IsWirelessPrinterReachableViaHTTP() try %d\n", tries);
        result = URLSimpleDownload(kProbeURL, nullptr, buffer, 0, nullptr, nullptr);
        if (result == kHTTPNotFound) {
            TRACE("Device found (result = %d)\n", static_cast<int>(result));
            break;
        }
        TRACE("*** Device NOT found (result = %d) ****\n", static_cast<int>(result));
        ++tries;
        if (tries >= maxtries) {
            TRACE("*** Bailing out (tries = %d) ****\n", tries);
            break;
        }
        sleep(1);
    }

    DisposeHandle(buffer);
    return result == kHTTPNotFound ? 1 : 0;
}

void OpenConfigurationPage() {
    const CFStringRef text =
        CFStringCreateWithCString(kCFAllocatorDefault, gQF_config_URL1, CFStringGetSystemEncoding());
    const CFURLRef url =
        text != nullptr ? CFURLCreateWithString(kCFAllocatorDefault, text, nullptr) : nullptr;
    if (url != nullptr) {
        LSOpenCFURLRef(url, nullptr);
    }
    CFQRelease(url);
    CFQRelease(text);
}

OSStatus WaitForUserToBeDone() {
    // At the end of the input it asks for ever, so a reader who goes has to end it: nobody else would.
    const auto atBrokenPipe = std::signal(SIGPIPE, SIG_DFL);
    bool done = false;
    while (!done) {
        std::printf("Done yet? <y/n>");
        std::fflush(stdout);
        const int answer = std::getchar();
        if (answer == EOF && std::ferror(stdout) != 0) {
            break;  // nobody answers, and nobody reads the question
        }
        if (answer == '\r' || answer == '\n') {
            continue;
        }
        if (answer == 'y') {
            done = true;
        } else if (answer != 'n') {
            std::printf("bad character entered: %c\n", answer);
        }
        // The line break that ends the answer.
        std::getchar();
    }
    std::signal(SIGPIPE, atBrokenPipe);
    return 0;
}
