#include "app/SetIDFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include "platform/CoreServices.h"

namespace {

int OpenOwnFile(const char* path) {
    const int descriptor = open(path, O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC);
    if (descriptor < 0) {
        return -1;
    }
    struct stat status = {};
    if (fstat(descriptor, &status) != 0 || !S_ISREG(status.st_mode) || status.st_uid != geteuid() ||
        status.st_nlink != 1 || (status.st_mode & (S_IWGRP | S_IWOTH)) != 0) {
        close(descriptor);
        return -1;
    }
    return descriptor;
}

// False with errno set when not all of it is written.
bool WriteText(int descriptor, const char* text) {
    size_t left = std::strlen(text);
    while (left > 0) {
        const ssize_t written = write(descriptor, text, left);
        if (written < 0 && errno != EINTR) {
            return false;
        }
        if (written > 0) {
            text += written;
            left -= static_cast<size_t>(written);
        }
    }
    return true;
}

}  // namespace

void WriteSetIDFile(const char* path, const char* text) {
    // Beside it under a name that nobody can foresee, and moved into its place when it is whole.
    std::string beside = std::string(path) + ".XXXXXX";
    const int descriptor = mkostemp(beside.data(), O_CLOEXEC);
    bool isDone = descriptor >= 0 && WriteText(descriptor, text);
    int error = isDone ? 0 : errno;
    if (descriptor >= 0 && close(descriptor) != 0 && isDone) {
        isDone = false;
        error = errno;
    }
    if (isDone && rename(beside.c_str(), path) != 0) {
        // A directory there, which anybody can make, is moved aside: no file can take its place.
        std::string aside = std::string(path) + ".XXXXXX";
        isDone = errno == EISDIR && mkdtemp(aside.data()) != nullptr && rename(path, aside.c_str()) == 0 &&
                 rename(beside.c_str(), path) == 0;
        error = errno;
    }
    if (!isDone) {
        if (descriptor >= 0) {
            unlink(beside.c_str());
        }
        SystemLog((std::string("the location to return to cannot be remembered in ") + path + ": " +
                   std::strerror(error))
                      .c_str());
    }
}

bool CopySetIDFromFile(const char* path, CFStringRef* setID) {
    const int descriptor = OpenOwnFile(path);
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
