// Who else configures an interface by itself, and leaves it alone as long as this system holds it.
//
// A host's own DHCP client takes the addresses of an interface away when its lease ends, and brings new ones
// with routes and name servers whenever it meets a server. systemd-networkd is asked by a run-time .network
// file with Unmanaged=yes (systemd.network(5)) to let go of the link. A DHCP client of one interface
// (dhclient, udhcpc), which knows no such wish, is stopped as by job control (SIGSTOP) and goes on (SIGCONT)
// on the way back: ended, it would give its lease back to a server that it does not reach any more.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "platform/apply/direct/Process.h"
#include "platform/base/Outcome.h"

namespace platform::apply {

struct OtherDaemons {
    bool networkd = false;             // systemd-networkd leads the link
    std::vector<Process> dhcpClients;  // serve this interface and no other

    template <class Self, class Fields>
    static void listFields(Self& self, Fields& fields) {
        fields("Networkd", self.networkd);
        fields("DHCPClients", self.dhcpClients);
    }
};

// Changes nothing. The index is the kernel's. What runs in another network namespace leads other interfaces
// of the same name.
[[nodiscard]] OtherDaemons findOtherDaemons(const std::string& interface, int index);

// Again is nothing. One that can't be asked stays as it is, with a line in the log.
void suspendOtherDaemons(const std::string& interface, int index, const OtherDaemons& daemons);
// The same for interfaces that are gone. Fails when networkd's file can't be removed.
Outcome resumeOtherDaemons(const std::string& interface, const OtherDaemons& daemons);
// Whether systemd-networkd has configured the link once more, or has failed to.
[[nodiscard]] bool isNetworkdSettled(int index);

}  // namespace platform::apply
