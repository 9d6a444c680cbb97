#include "platform/live/NetworkState.h"

#include "platform/base/Host.h"
#include "platform/live/KernelNetworkState.h"

namespace platform::live {

std::shared_ptr<NetworkState> currentNetworkState() {
    if (currentHost().networkState) {
        return currentHost().networkState;
    }
    static const std::shared_ptr<NetworkState> kernel = std::make_shared<KernelNetworkState>();
    return kernel;
}

}  // namespace platform::live
