// SPDX-License-Identifier: Apache-2.0
// Edits of a profile's rule lists: no files, no log.
#ifndef VELDFIREWALL_SRC_RULELISTEDIT_H
#define VELDFIREWALL_SRC_RULELISTEDIT_H

#include <functional>
#include <string>
#include <vector>

#include "veldfirewall/fwRecords.h"

namespace FW {

/// Protocol kind of a service (1 tcp, 2 udp, others), or a negative number when the service is gone.
using ServiceKind = std::function<int(const std::string &service)>;

/// Whether the ports of the rule are given by service names.
bool isServiceRule(const FWRULE &rule);

/// Makes the front rule of the adapter's list a reserved rule of `policy` that names the service; see
/// VELDFW_PROFILE::profileAddServToReserve().
void serviceReserve(FWPROFILE &profile, const std::string &adapter, const std::string &servName, FW_POLICY policy);

/// Takes the service out of all service rules of all adapters and drops rules that are left without one.
void serviceRemove(FWPROFILE &profile, const std::string &servName);

/// Moves default policy and rules of an adapter to another name. @return whether there was a default policy to move
bool adapterRename(FWPROFILE &profile, const std::string &oldAdapter, const std::string &newAdapter);

/// Takes services that are gone out of all service rules, drops rules left without one, and sets the protocol of the
/// others to that of their services, as far as these are tcp or udp.
void servicesRefresh(FWPROFILE &profile, const ServiceKind &kindOf);

}  // namespace FW

#endif
