#include "platform/base/Host.h"

#include <utility>

namespace platform {
namespace {

const Host*& inForce() {
    static const Host production;
    static const Host* host = &production;
    return host;
}

}  // namespace

const Host& currentHost() {
    return *inForce();
}

HostOverride::HostOverride(Host host) : host_(std::move(host)), previous_(std::exchange(inForce(), nullptr)) {
    inForce() = &host_;
}

HostOverride::~HostOverride() {
    inForce() = previous_;
}

}  // namespace platform
