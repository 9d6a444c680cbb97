// One interface that the direct agent configures: what is done to it at once, without waiting for anything
// that a network has to do.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/apply/Plan.h"
#include "platform/apply/direct/Kernel.h"
#include "platform/apply/direct/LinkSnapshot.h"
#include "platform/apply/direct/NameServers.h"
#include "platform/apply/direct/WirelessJoin.h"
#include "platform/base/Outcome.h"

namespace platform::apply {

[[nodiscard]] bool joinsNetwork(const InterfacePlan& plan) noexcept;

class DirectInterface {
  public:
    explicit DirectInterface(std::string interface) : interface_(std::move(interface)) {}

    Outcome open() { return kernel_.open(interface_); }
    // Nothing when the interface is gone; brought up to date by refresh().
    [[nodiscard]] const std::optional<Link>& link() const noexcept { return kernel_.link(); }
    Outcome refresh() { return kernel_.refresh(); }

    Outcome takeSnapshot(LinkSnapshot& snapshot);
    // Makes it what the plan says, whatever it is. `join` is the network on its way, null when there is none
    // to wait for. trouble is told when settings stand that help nothing.
    Outcome apply(const InterfacePlan& plan, const std::optional<LinkSnapshot>& before,
                  std::unique_ptr<WirelessJoin>& join, std::string& trouble);
    // Makes it as it was, and compares. The same for `join`. `obstacle` is told, and it is no failure, when
    // that cannot be done until somebody has turned a switch. Once this was begun, letOthersIn ends it, also
    // after a failure.
    Outcome giveBack(const LinkSnapshot& before, std::unique_ptr<WirelessJoin>& join, std::string& obstacle);
    // Lets those lead it again who did before. With isBack, nothing is left to be given back.
    Outcome letOthersIn(const LinkSnapshot& before, bool isBack);
    // Whether it has an IPv4 address that reaches further than its link.
    Outcome hasAddress(bool& has);

    // The card has got onto its network: who was asked for in vain before can answer now.
    void noteJoined();

  private:
    Outcome switchOff(std::string& trouble);
    Outcome switchOn(const InterfacePlan& plan, std::string& trouble);
    Outcome switchRadioOn(const InterfacePlan& plan, bool& isUsable);
    Outcome startClient(const InterfacePlan& plan, std::string& trouble);
    Outcome startJoin(const InterfacePlan& plan, bool mayStay, std::unique_ptr<WirelessJoin>& join,
                      std::string& trouble);
    Outcome leaveNetwork(const LinkSnapshot& before, std::unique_ptr<WirelessJoin>& join);
    // Whether somebody else has configured the interface since: it has addresses that it neither had nor got
    // from here, or was switched off here and is on.
    Outcome isTakenOver(const AppliedLink& applied, const LinkSnapshot& before, bool& taken);
    Outcome removeOurs(const AppliedLink& applied, const LinkSnapshot& before);
    Outcome restore(const LinkSnapshot& before, std::string& obstacle);
    Outcome compare(const LinkSnapshot& before);

    std::string interface_;
    Kernel kernel_;
};

}  // namespace platform::apply
