#include "platform/apply/direct/DhcpHookPath.h"

#include <dlfcn.h>
#include <link.h>
#include <unistd.h>

#include <filesystem>

#include "platform/base/Host.h"

namespace platform::apply {
namespace {

std::string folderOf(const std::string& path) {
    return path.substr(0, path.find_last_of('/') + 1);
}

std::string folderOfThisProgram() {
    std::error_code ignored;
    return folderOf(std::filesystem::read_symlink("/proc/self/exe", ignored));
}

// Of the shared library; empty when this code is a part of the program. The dynamic linker has no name for
// the program.
std::string folderOfThisLibrary() {
    Dl_info file{};
    void* entry = nullptr;
    if (::dladdr1(reinterpret_cast<const void*>(&findDhcpHook), &file, &entry, RTLD_DL_LINKMAP) == 0 ||
        entry == nullptr) {
        return "";
    }
    const std::string path = static_cast<const link_map*>(entry)->l_name;
    return path.find('/') == std::string::npos ? "" : folderOf(path);
}

}  // namespace

bool isProgram(const std::string& path) {
    return ::access(path.c_str(), X_OK) == 0;
}

Outcome findDhcpHook(std::string& hook) {
    constexpr const char* name = "location-assistant-dhcp-hook";
    hook = currentHost().dhcpHook;
    if (!hook.empty()) {
        return isProgram(hook) ? Outcome()
                               : Outcome::fromErrno("cannot run the DHCP client's program " + hook);
    }
    const std::string program = folderOfThisProgram();
    const std::string library = folderOfThisLibrary();
    const std::string installed =
        library.empty() ? program + LA_HOOK_FROM_PROGRAM : library + LA_HOOK_FROM_LIBRARY;
    for (const std::string& candidate :
         {program + name, installed + "/" + name, std::string(LA_HOOK_DIRECTORY "/") + name}) {
        hook = candidate;
        if (isProgram(hook)) {
            return {};
        }
    }
    return Outcome::fromErrno("cannot run the DHCP client's program " + hook);
}

}  // namespace platform::apply
