// The network state as the kernel of this machine, or of this process's namespace, tells it over rtnetlink.
#pragma once

#include "platform/live/NetworkState.h"

namespace platform::live {

// Holds no socket between two questions.
class KernelNetworkState final : public NetworkState {
  public:
    Outcome primaryRoute(std::optional<PrimaryRoute>& route) override;
    Outcome reach(const Destination& destination, Reach& reach) override;
    Outcome subscribe(std::unique_ptr<Notices>& notices) override;
};

}  // namespace platform::live
