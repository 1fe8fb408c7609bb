// SPDX-License-Identifier: Apache-2.0
// The value records of the firewall: rules, profiles, service ports and port queries. No behaviour.
#ifndef VELDFIREWALL_FWRECORDS_H
#define VELDFIREWALL_FWRECORDS_H

#include <cstdint>
#include <map>
#include <set>
#include <string>
#include <vector>

namespace FW {

/// What happens to a packet, or the verdict of a block query. Stored in files as its number.
enum FW_POLICY : int32_t {
    FW_POLICY_ALLOW = 0,    ///< leave the firewall chain unharmed ("-j RETURN")
    FW_POLICY_DENY = 1,     ///< "-j DROP"
    FW_POLICY_NONE = 2,     ///< no target: a rule or default with it produces no command
    FW_POLICY_PARTIAL = 3,  ///< only a query's verdict: blocked for some source addresses, open for others
};

/// Protocol of a rule or of a service's port list. The numbers are those of the stored profiles.
enum FW_PORT_PROTOCOL : int32_t {
    FW_PROTO_TCP = 1,
    FW_PROTO_UDP = 2,
    FW_PROTO_TCP_UDP = 3,  ///< expands to one tcp and one udp match
    FW_PROTO_ICMP = 4,     ///< "icmp" for IPv4, "icmpv6" for IPv6
    FW_PROTO_IGMP = 32,
};

/// One rule of an adapter's list. The defaults are those of a new rule; the field names are the keys of a stored rule.
struct FWRULE {
    int32_t ruleIndex = 0;      ///< number given by the document ("ruleID"); a stored rule's number is its position
    bool enable = true;         ///< a disabled rule produces no command and answers no query
    int32_t adapterDirect = 1;  ///< non-zero: incoming interface ("-i "); 0: outgoing ("-o ")
    FW_POLICY policy = FW_POLICY_ALLOW;
    bool blLog = false;  ///< log matching packets as well
    std::vector<std::string> labelList;
    std::string name;
    std::string table = "filter";
    std::set<std::string> chainList = {"FORWARD_FIREWALL", "INPUT_FIREWALL"};
    int32_t ipType = 0;    ///< 0 IPv4 only, 1 IPv6 only, 2 both
    int32_t ipDirect = 1;  ///< non-zero: source address; 0: destination
    int32_t ipGroup = 0;   ///< 0 one address, 1 network, 2 none (yields no command), 3 countries, 4 range, 5 any
    /// By ipGroup: {address}; {address, prefix or mask}; country codes; {first, last}.
    std::vector<std::string> ipList;
    int32_t portDirect = 0;           ///< non-zero: source ports; 0: destination ports
    int32_t portGroup = 0;            ///< 0 services, 1 explicit ports, 2 services reserved by a component, 3 any port
    int32_t protocol = FW_PROTO_TCP;  ///< a FW_PORT_PROTOCOL number; read for portGroup 1
    std::vector<std::string> portList;  ///< service names (portGroup 0, 2), or ports "80" and ranges "1000-2000" (1)
};

/// One named rule set.
struct FWPROFILE {
    std::string name;
    /// Adapter ("global", "pppoe", "vpn" or an interface name) to its rules, first match wins.
    std::map<std::string, std::vector<FWRULE>> rules;
    /// Adapter to the policy of traffic that none of its rules matched.
    std::map<std::string, FW_POLICY> adapterPolicyMap;
};

/// The ports of a set of services, by side and protocol.
struct ServPort {
    std::map<FW_PORT_PROTOCOL, std::vector<std::string>> srcPorts;
    std::map<FW_PORT_PROTOCOL, std::vector<std::string>> dstPorts;
};

/// One port, or range of ports, to be tested against a profile.
struct PortCompareST {
    int32_t portDirect = 0;  ///< 1 source port, 0 destination port
    FW_PORT_PROTOCOL protocol = FW_PROTO_TCP;
    std::string port;  ///< "80" or "1000-2000"
};

}  // namespace FW

#endif
