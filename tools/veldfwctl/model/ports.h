// SPDX-License-Identifier: Apache-2.0
// Ports and protocols as an administrator writes them.
#ifndef VELDFWCTL_PORTS_H
#define VELDFWCTL_PORTS_H

#include <veldfirewall/fwRecords.h>

#include <string>
#include <vector>

namespace veldfwctl {

/// Ports of one protocol: what one rule can hold.
struct PortMatch {
    int32_t protocol = FW::FW_PROTO_TCP_UDP;  ///< a FW_PORT_PROTOCOL number
    std::vector<std::string> ports;           ///< "80" and "1000-2000"
};

/// Understands entries such as "445/tcp", "8000-8010/udp", "80,443/tcp", "53" (tcp and udp), "53/tcp+udp".
/// @throws UsageError that names the entry and what is wrong with it, also when the entries need several rules
PortMatch portMatchParse(const std::vector<std::string> &entries);

/// "icmp" and "igmp", the protocols that a rule can name without ports.
/// @throws UsageError for another text
int32_t plainProtocolParse(const std::string &text);

/// "tcp", "udp", "tcp+udp", "icmp", "igmp", or "protocol 7" for a number that is none of them.
std::string protocolText(int32_t protocol);

/// "80,1000-2000/tcp".
std::string portsText(int32_t protocol, const std::vector<std::string> &ports);

/// Both lists of a service: "139,445/tcp, from 68/udp".
std::string sidesText(const PortMatch &source, const PortMatch &destination);

}  // namespace veldfwctl

#endif
