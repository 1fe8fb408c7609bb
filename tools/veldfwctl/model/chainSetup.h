// SPDX-License-Identifier: Apache-2.0
// What the firewall's chains lack, and the transaction that mends it.
#ifndef VELDFWCTL_CHAINSETUP_H
#define VELDFWCTL_CHAINSETUP_H

#include <string>
#include <vector>

namespace veldfwctl {

/// A chain of the firewall, or the jump to it.
struct ChainItem {
    std::string name;  ///< "chain INPUT_FIREWALL", "jump from INPUT to INPUT_FIREWALL"
    std::string lack;  ///< "missing", "at position 3", "2 times"; empty when all is well
};

struct ChainPlan {
    std::vector<ChainItem> items;
    std::string restoreInput;  ///< for "iptables-restore --noflush"; empty when nothing is lacking
};

/// The jump belongs in front of all other rules, once and without conditions: what other managers accept must pass the
/// firewall first, and its own verdict "allow" returns to their rules.
/// @param listing what "iptables -S" prints
ChainPlan chainPlanMake(const std::string &listing);

}  // namespace veldfwctl

#endif
