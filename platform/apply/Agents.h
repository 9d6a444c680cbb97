// The agents there are, and which one leads.
#pragma once

#include <memory>
#include <string_view>

#include "platform/Outcome.h"
#include "platform/apply/Agent.h"

namespace platform::apply {

// The agent for interfaces that are taken over now: the host's own when it has one; NetworkManager when it
// runs; else the direct agent. Fails when that cannot be found out: a bus that does not answer is no reason
// to write behind the back of a daemon that may be running.
Outcome chooseAgent(std::shared_ptr<Agent>& agent);

// The agent of a name that a record holds, for the way back. Fails when there is none of that name.
Outcome agentNamed(std::string_view name, std::shared_ptr<Agent>& agent);

// rtnetlink, with the DHCP client and the wireless supplicant. Its name is "direct".
[[nodiscard]] std::shared_ptr<Agent> makeDirectAgent();

// NetworkManager over the system bus. Its name is "networkmanager".
[[nodiscard]] std::shared_ptr<Agent> makeNetworkManagerAgent();

// Whether NetworkManager owns its name on the host's system bus. No bus socket, or no owner, is a no;
// everything else that goes wrong is a failure. It never starts the daemon.
Outcome isNetworkManagerRunning(bool& running);

}  // namespace platform::apply
