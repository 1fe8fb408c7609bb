// SPDX-License-Identifier: Apache-2.0
// Rules as iptables lists them: those in the kernel, and what a plan would look like there.
#ifndef VELDFWCTL_RULELISTING_H
#define VELDFWCTL_RULELISTING_H

#include <string>
#include <vector>

namespace veldfwctl {

/// What "iptables -S" prints, or "ip6tables -S". @throws Failure
std::string liveListing(bool isV6);

/// What it would print after the commands: iptables puts them into a network namespace made for that, which lasts as
/// long as the call. The machine's own rules are not touched.
/// @param commands of one family
/// @throws Failure with what iptables said when it refuses one
std::string plannedListing(const std::vector<std::string> &commands, bool isV6);

}  // namespace veldfwctl

#endif
