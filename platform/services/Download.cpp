#include "platform/services/Download.h"

#include <map>
#include <utility>

#include "platform/CoreServices.h"
#include "platform/base/Host.h"

struct HandleBlock {
    std::string content;
};

namespace {

// The buffers that were not disposed of. A buffer may live until the process ends, and is then freed with it.
std::map<Handle, std::unique_ptr<HandleBlock>>& buffers() {
    static std::map<Handle, std::unique_ptr<HandleBlock>> ofThisProcess;
    return ofThisProcess;
}

}  // namespace

Handle NewHandle(long size) noexcept {
    if (size < 0) {
        return nullptr;
    }
    auto block = std::make_unique<HandleBlock>();
    block->content.resize(static_cast<std::size_t>(size));
    const Handle handle = block.get();
    buffers().emplace(handle, std::move(block));
    return handle;
}

void DisposeHandle(Handle handle) noexcept {
    buffers().erase(handle);
}

long GetHandleSize(Handle handle) noexcept {
    return static_cast<long>(handle->content.size());
}

const char* GetHandleData(Handle handle) noexcept {
    return handle->content.data();
}

OSStatus URLSimpleDownload(const char* url, const void* destination, Handle buffer, UInt32 flags,
                           const void* eventProc, void* context) noexcept {
    if (url == nullptr || buffers().count(buffer) == 0 || destination != nullptr || flags != 0 ||
        eventProc != nullptr || context != nullptr) {
        return paramErr;
    }
    std::shared_ptr<platform::services::Downloader> downloader = platform::currentHost().downloader;
    if (!downloader) {
        downloader = platform::services::makeHttpDownloader();
    }
    return downloader->fetch(url, buffer->content);
}
