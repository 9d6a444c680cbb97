// The agents there are.
#pragma once

#include <memory>
#include <string_view>
#include <vector>

#include "platform/apply/Agent.h"
#include "platform/base/Outcome.h"

namespace platform::apply {

using Agents = std::vector<std::shared_ptr<Agent>>;

// The agents for interfaces that are taken over now, in the order in which they are asked who leads an
// interface: the host's own when it has some; else NetworkManager, when it runs, and the direct agent. Fails
// when it cannot be found out whether NetworkManager runs: a bus that does not answer is no reason to write
// behind the back of a daemon that may be there.
Outcome findAgents(Agents& agents);

// The agent of a name that a record holds, for the way back. Fails when there is none of that name.
Outcome findAgent(std::string_view name, std::shared_ptr<Agent>& agent);

// rtnetlink, with the DHCP client and the wireless supplicant. Its name is "direct".
[[nodiscard]] std::shared_ptr<Agent> makeDirectAgent();

// NetworkManager over the system bus. Its name is "networkmanager".
[[nodiscard]] std::shared_ptr<Agent> makeNetworkManagerAgent();
// The same when NetworkManager runs, on the connection that showed it; else null. Fails when the bus does not
// answer.
Outcome findNetworkManagerAgent(std::shared_ptr<Agent>& agent);

}  // namespace platform::apply
