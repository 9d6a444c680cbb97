#include "platform/apply/Agents.h"

#include <string>

#include "platform/Host.h"

namespace platform::apply {

Outcome chooseAgent(std::shared_ptr<Agent>& agent) {
    agent = currentHost().agent;
    if (agent != nullptr) {
        return {};
    }
    bool running = false;
    Outcome outcome = isNetworkManagerRunning(running);
    if (outcome.ok()) {
        agent = running ? makeNetworkManagerAgent() : makeDirectAgent();
    }
    return outcome;
}

Outcome agentNamed(std::string_view name, std::shared_ptr<Agent>& agent) {
    agent = currentHost().agent;
    if (agent != nullptr && agent->name() == name) {
        return {};
    }
    agent = name == "direct"           ? makeDirectAgent()
            : name == "networkmanager" ? makeNetworkManagerAgent()
                                       : nullptr;
    if (agent == nullptr) {
        return {kSCStatusFailed, "there is no agent \"" + std::string(name) + "\" to give it back"};
    }
    return {};
}

}  // namespace platform::apply
