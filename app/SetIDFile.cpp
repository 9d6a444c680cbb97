#include "app/SetIDFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

namespace {

// A descriptor, or -1. Does not truncate: nothing may happen to a file before it is known to be ours.
int OpenOwnFile(const char* path, int flags) {
    const int descriptor =
        open(path, flags | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC, S_IRUSR | S_IWUSR);
    if (descriptor < 0) {
        return -1;
    }
    struct stat status = {};
    if (fstat(descriptor, &status) != 0 || !S_ISREG(status.st_mode) || status.st_uid != geteuid() ||
        status.st_nlink != 1) {
        close(descriptor);
        return -1;
    }
    return descriptor;
}

}  // namespace

void WriteSetIDFile(const char* path, const char* text) {
    const int descriptor = OpenOwnFile(path, O_WRONLY | O_CREAT);
    if (descriptor < 0) {
        return;
    }
    if (ftruncate(descriptor, 0) == 0) {
        size_t left = std::strlen(text);
        while (left > 0) {
            const ssize_t written = write(descriptor, text, left);
            if (written < 0) {
                if (errno == EINTR) {
                    continue;
                }
                break;
            }
            text += written;
            left -= static_cast<size_t>(written);
        }
    }
    close(descriptor);
}

bool CopySetIDFromFile(const char* path, CFStringRef* setID) {
    const int descriptor = OpenOwnFile(path, O_RDONLY);
    if (descriptor < 0) {
        return false;
    }
    std::FILE* file = fdopen(descriptor, "r");
    if (file == nullptr) {
        close(descriptor);
        return false;
    }
    char line[1024];
    if (std::fgets(line, sizeof line, file) != nullptr) {
        *setID = CFStringCreateWithCString(kCFAllocatorDefault, line, CFStringGetSystemEncoding());
    } else {
        *setID = nullptr;
    }
    std::fclose(file);
    return true;
}
