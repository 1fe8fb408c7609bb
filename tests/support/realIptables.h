// SPDX-License-Identifier: Apache-2.0
// The machine's own iptables, used on the sandbox's network.
#ifndef VELD_TEST_REAL_IPTABLES_H
#define VELD_TEST_REAL_IPTABLES_H

#include <string>
#include <vector>

namespace veldtest {

/// Whether /sbin/iptables and /sbin/ip6tables work here, that is can list and fill chains. When not, `reason` says why.
bool realIptables(std::string *reason = nullptr);
/// Makes /sbin/iptables and /sbin/ip6tables of the sandbox, with their -restore and -save, those of a backend, "nft" or
/// "legacy".
/// @return false when the machine does not have it
bool useIptablesBackend(const std::string &backend);
/// Creates the chains INPUT_FIREWALL and FORWARD_FIREWALL and the jumps to them, for IPv4 and IPv6, as the system's
/// start-up does. Throws std::runtime_error with what iptables said.
void createFirewallChains();
/// What "iptables -S" (or "ip6tables -S") prints, optionally of one chain, a rule per entry.
std::vector<std::string> listRules(const std::string &program = "/sbin/iptables", const std::string &chain = "");

}  // namespace veldtest

#endif
