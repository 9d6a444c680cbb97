// What NetworkManager's reasons mean (NMDeviceStateReason).
#include "platform/apply/networkmanager/Daemon.h"

namespace platform::apply {

std::string describeFailure(std::uint32_t reason) {
    switch (reason) {
        case 4:
            return "the card could not be configured";
        case 5:
        case 6:
        case 15:
        case 16:
        case 17:
            return "no DHCP server answered";
        case 7:
            return "the network's key is wrong or missing";
        case 8:
        case 9:
        case 10:
        case 11:
            return "the network broke off the joining";
        case 35:
            return "the card's firmware is missing";
        case 36:
            return "the card was taken out";
        case 37:
            return "the computer went to sleep";
        case 38:
            return "the profile was deleted meanwhile";
        case 39:
            return "somebody disconnected the card meanwhile";
        case 40:
            return "the cable is out, or the network went away";
        case 53:
            return "the network was not found";
        case 60:
            return "somebody else took over the card";
        case 64:
            return "somebody else uses the address";
        default:
            return "NetworkManager gives the reason " + std::to_string(reason);
    }
}

}  // namespace platform::apply
