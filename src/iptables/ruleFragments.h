// SPDX-License-Identifier: Apache-2.0
// The pieces of iptables text that the fields of a rule turn into. Plain functions of the rule alone.
#ifndef VELDFIREWALL_SRC_RULEFRAGMENTS_H
#define VELDFIREWALL_SRC_RULEFRAGMENTS_H

#include <optional>
#include <string>
#include <vector>

#include "veldfirewall/fwRecords.h"

namespace FW {

constexpr const char *ICMP_FRAGMENT = "-p icmp ";
constexpr const char *ICMPV6_FRAGMENT = "-p icmpv6 ";

/// Whether commands for the family are wanted at all.
bool ruleHasV4(const FWRULE &rule);
bool ruleHasV6(const FWRULE &rule);

/// "-i eth0" or "-o eth0".
std::string adapterFragment(const std::string &interfaceName, const FWRULE &rule);

/// The address match of groups 0, 1 and 4; nothing when ipList is too short. Not for other groups.
std::optional<std::string> addressFragment(const FWRULE &rule);

/// The match of countries that have data.
std::string countryFragment(const std::vector<std::string> &countries, const FWRULE &rule);

/// Protocol and port matches, seven ports or ranges in each at most: the kernel's multiport match takes fifteen ports,
/// and a range counts as two.
std::vector<std::string> portFragments(int protocol, int portDirect, const std::vector<std::string> &ports);

/// "-p 47 " and the like: the IP protocols beside tcp and udp that a VPN service needs.
std::vector<std::string> rawProtocolFragments(const std::string &service);

}  // namespace FW

#endif
