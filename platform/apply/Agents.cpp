#include "platform/apply/Agents.h"

#include <string>

#include "platform/base/Host.h"

namespace platform::apply {

Outcome findAgents(Agents& agents) {
    agents = currentHost().agents;
    if (!agents.empty()) {
        return {};
    }
    std::shared_ptr<Agent> daemon;
    RETURN_IF_FAILED(findNetworkManagerAgent(daemon));
    if (daemon != nullptr) {
        agents.push_back(std::move(daemon));
    }
    agents.push_back(makeDirectAgent());
    return {};
}

Outcome findAgent(std::string_view name, std::shared_ptr<Agent>& agent) {
    for (const std::shared_ptr<Agent>& own : currentHost().agents) {
        if (own->name() == name) {
            agent = own;
            return {};
        }
    }
    agent = name == "direct"           ? makeDirectAgent()
            : name == "networkmanager" ? makeNetworkManagerAgent()
                                       : nullptr;
    return agent != nullptr
               ? Outcome()
               : Outcome(kSCStatusFailed, "there is no agent \"" + std::string(name) + "\" to give it back");
}

}  // namespace platform::apply
