#include <dirent.h>
#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <iterator>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/CoreServices.h"
#include "platform/base/DeviceText.h"
#include "platform/base/Host.h"
#include "platform/values/Values.h"

// A folder being read.
struct OpaqueFSIterator {
    struct Closer {
        void operator()(DIR* open) const noexcept { closedir(open); }
    };
    std::string path;
    std::unique_ptr<DIR, Closer> directory;
    std::size_t delivered = 0;
};

namespace platform::services {
namespace {

OSErr errorFor(int error) {
    switch (error) {
        case ENOENT:
        case ENOTDIR:
            return fnfErr;
        case EACCES:
        case EPERM:
            return permErr;
        default:
            return ioErr;
    }
}

// The paths that references name. They are never dropped, because nobody gives a reference back.
class Paths {
  public:
    FSRef referenceTo(const std::string& path) {
        const auto [place, isNew] = numbers_.try_emplace(path, paths_.size());
        if (isNew) {
            paths_.push_back(&place->first);
        }
        const Content content{mark, place->second};
        FSRef reference{};
        std::memcpy(reference.hidden, &content, sizeof content);
        return reference;
    }
    // Null for a reference that was not made here.
    [[nodiscard]] const std::string* pathOf(const FSRef& reference) const {
        Content content{};
        std::memcpy(&content, reference.hidden, sizeof content);
        return content.mark == mark && content.number < paths_.size() ? paths_[content.number] : nullptr;
    }

  private:
    struct Content {
        std::uint64_t mark;
        std::uint64_t number;
    };
    // Tells a reference from memory that never became one.
    static constexpr std::uint64_t mark = 0x6C612066736F6264;

    std::map<std::string, std::uint64_t> numbers_;
    std::vector<const std::string*> paths_;
};

Paths& paths() {
    static Paths ofThisProcess;
    return ofThisProcess;
}

// "?" when the password database does not say.
std::string homeOfUser() {
    const passwd* const user = getpwuid(getuid());
    return user != nullptr ? user->pw_dir : "?";
}

OSErr findModemScripts(SInt16 domain, std::string& path) {
    const Host& host = currentHost();
    switch (domain) {
        case kUserDomain:
            path = host.userModemScripts.empty() ? homeOfUser() + "/.local/share/modem-scripts"
                                                 : host.userModemScripts;
            return path.starts_with('/') ? noErr : fnfErr;
        case kNetworkDomain:
            path = host.networkModemScripts;
            return noErr;
        case kLocalDomain:
            path = host.localModemScripts;
            return noErr;
        case kSystemDomain:
            path = host.systemModemScripts;
            return noErr;
        default:
            return paramErr;
    }
}

// The open iterators; one that is not here was closed, or never was one.
std::map<FSIterator, std::unique_ptr<OpaqueFSIterator>>& iterators() {
    static std::map<FSIterator, std::unique_ptr<OpaqueFSIterator>> open;
    return open;
}

// The name must be one that may be shown, which is also short enough.
void toUnicode(std::string_view name, HFSUniStr255& unicode) {
    const values::Owned<CFStringRef> string = values::makeString(name);
    const CFIndex length = CFStringGetLength(string.get());
    static_assert(longestDeviceText <= std::size(HFSUniStr255{}.unicode));
    unicode.length = static_cast<UInt16>(length);
    CFStringGetCharacters(string.get(), CFRangeMake(0, length), unicode.unicode);
}

constexpr std::size_t mostItems = 4096;

// The next item that can be named; noErr, errFSNoMoreItems, or a failure.
OSErr nextItem(OpaqueFSIterator& iterator, std::string& name, HFSUniStr255& unicode) {
    for (;;) {
        errno = 0;
        const dirent* entry = readdir(iterator.directory.get());
        if (entry == nullptr) {
            return errno == 0 ? errFSNoMoreItems : errorFor(errno);
        }
        name = entry->d_name;
        if (name == "." || name == ".." || !isDeviceText(name)) {
            continue;
        }
        if (iterator.delivered == mostItems) {
            return ioErr;
        }
        ++iterator.delivered;
        toUnicode(name, unicode);
        return noErr;
    }
}

}  // namespace
}  // namespace platform::services

using namespace platform::services;

OSErr FSFindFolder(SInt16 domain, OSType folderType, Boolean createFolder, FSRef* folder) noexcept {
    if (folderType != kModemScriptsFolderType || createFolder != 0 || folder == nullptr) {
        return paramErr;
    }
    std::string path;
    if (const OSErr err = findModemScripts(domain, path); err != noErr) {
        return err;
    }
    struct stat status {};
    if (stat(path.c_str(), &status) != 0) {
        return errorFor(errno);
    }
    if (!S_ISDIR(status.st_mode)) {
        return fnfErr;
    }
    *folder = paths().referenceTo(path);
    return noErr;
}

OSErr FSOpenIterator(const FSRef* folder, UInt32 flags, FSIterator* iterator) noexcept {
    if (iterator == nullptr) {
        return paramErr;
    }
    *iterator = nullptr;
    const std::string* path = folder == nullptr ? nullptr : paths().pathOf(*folder);
    if (path == nullptr || flags != kFSIterateFlat) {
        return paramErr;
    }
    auto made = std::make_unique<OpaqueFSIterator>();
    made->path = *path;
    made->directory.reset(opendir(path->c_str()));
    if (!made->directory) {
        return errorFor(errno);
    }
    *iterator = made.get();
    iterators().emplace(*iterator, std::move(made));
    return noErr;
}

OSErr FSGetCatalogInfoBulk(FSIterator iterator, UInt32 maximumItems, UInt32* actualItems,
                           Boolean* containerChanged, UInt32 whichInfo, void* catalogInfos, FSRef* refs,
                           void* specs, HFSUniStr255* names) noexcept {
    if (actualItems == nullptr) {
        return paramErr;
    }
    *actualItems = 0;
    if (iterators().count(iterator) == 0 || maximumItems == 0 || containerChanged != nullptr ||
        whichInfo != kFSCatInfoNone || catalogInfos != nullptr || specs != nullptr) {
        return paramErr;
    }
    std::string name;
    HFSUniStr255 unicode{};
    while (*actualItems < maximumItems) {
        if (const OSErr err = nextItem(*iterator, name, unicode); err != noErr) {
            return err;
        }
        if (refs != nullptr) {
            refs[*actualItems] = paths().referenceTo(iterator->path + "/" + name);
        }
        if (names != nullptr) {
            names[*actualItems] = unicode;
        }
        ++*actualItems;
    }
    return noErr;
}

OSErr FSCloseIterator(FSIterator iterator) noexcept {
    return iterators().erase(iterator) != 0 ? noErr : paramErr;
}

OSStatus LSCopyItemInfoForRef(const FSRef* item, UInt32 requestedInfo, LSItemInfoRecord* info) noexcept {
    const std::string* path = item == nullptr ? nullptr : paths().pathOf(*item);
    if (path == nullptr || requestedInfo != kLSRequestBasicFlagsOnly || info == nullptr) {
        return paramErr;
    }
    UInt32 flags = 0;
    struct stat status {};
    if (stat(path->c_str(), &status) == 0) {
        flags |= S_ISREG(status.st_mode) ? kLSItemInfoIsPlainFile : 0;
        flags |= S_ISDIR(status.st_mode) ? kLSItemInfoIsContainer : 0;
    } else if (errno != ENOENT && errno != ENOTDIR && errno != ELOOP) {
        return errorFor(errno);
    }
    const std::size_t slash = path->rfind('/');
    if (slash != std::string::npos && path->compare(slash + 1, 1, ".") == 0) {
        flags |= kLSItemInfoIsInvisible;
    }
    info->flags = flags;
    return noErr;
}
