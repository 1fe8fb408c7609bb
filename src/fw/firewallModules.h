// SPDX-License-Identifier: Apache-2.0
// The firewall's own kernel modules.
#ifndef VELDFIREWALL_SRC_FIREWALLMODULES_H
#define VELDFIREWALL_SRC_FIREWALLMODULES_H

namespace FW {

/// Loads the kernel modules on behalf of the firewall, unless they are. @return false, logged, on failure
bool firewallModLoad();

}  // namespace FW

#endif
