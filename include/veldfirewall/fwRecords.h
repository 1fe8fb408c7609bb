// SPDX-License-Identifier: Apache-2.0
// The value records of the firewall: rules, profiles, service ports and port queries. No behaviour.
#ifndef VELDFIREWALL_FWRECORDS_H
#define VELDFIREWALL_FWRECORDS_H

#include <array>
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

/// Values of FWRULE::ipType.
enum FW_IP_TYPE : int32_t { FW_IP_TYPE_V4 = 0, FW_IP_TYPE_V6 = 1, FW_IP_TYPE_BOTH = 2 };

/// Values of FWRULE::ipGroup: what FWRULE::ipList holds.
enum FW_IP_GROUP : int32_t {
    FW_IP_GROUP_ADDRESS = 0,  ///< {address}
    FW_IP_GROUP_NETWORK = 1,  ///< {address, prefix length or mask}
    FW_IP_GROUP_NONE = 2,     ///< nothing: the rule yields no command
    FW_IP_GROUP_COUNTRY = 3,  ///< country codes
    FW_IP_GROUP_RANGE = 4,    ///< {first address, last address}
    FW_IP_GROUP_ANY = 5,      ///< any address of both families
};

/// Values of FWRULE::portGroup: what FWRULE::portList holds.
enum FW_PORT_GROUP : int32_t {
    FW_PORT_GROUP_SERVICE = 0,   ///< names of services
    FW_PORT_GROUP_PORT = 1,      ///< ports "80" and ranges "1000-2000" of FWRULE::protocol
    FW_PORT_GROUP_RESERVED = 2,  ///< names of services, in a rule that components keep for them
    FW_PORT_GROUP_ANY = 3,       ///< any port and protocol
};

/// Adapter names that stand for no interface of that name: all interfaces, the PPPoE interface, the VPN interfaces.
inline constexpr const char *FW_ADAPTER_GLOBAL = "global";
inline constexpr const char *FW_ADAPTER_PPPOE = "pppoe";
inline constexpr const char *FW_ADAPTER_VPN = "vpn";

/// The chains of the table "filter" that belong to the firewall; INPUT and FORWARD jump to them.
inline constexpr const char *FW_CHAIN_INPUT = "INPUT_FIREWALL";
inline constexpr const char *FW_CHAIN_FORWARD = "FORWARD_FIREWALL";
inline constexpr std::array<const char *, 2> FW_CHAINS = {FW_CHAIN_INPUT, FW_CHAIN_FORWARD};

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
    std::set<std::string> chainList = {FW_CHAIN_FORWARD, FW_CHAIN_INPUT};
    int32_t ipType = FW_IP_TYPE_V4;         ///< the families that get commands
    int32_t ipDirect = 1;                   ///< non-zero: source address; 0: destination
    int32_t ipGroup = FW_IP_GROUP_ADDRESS;  ///< kind of address match
    std::vector<std::string> ipList;
    int32_t portDirect = 0;                     ///< non-zero: source ports; 0: destination ports
    int32_t portGroup = FW_PORT_GROUP_SERVICE;  ///< kind of port match
    int32_t protocol = FW_PROTO_TCP;            ///< a FW_PORT_PROTOCOL number; read for FW_PORT_GROUP_PORT
    std::vector<std::string> portList;
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

/// What stopped an atomic apply (VELDFW::fwReloadAtomic(), VELDFW::fwExecAtomic()).
struct FwApplyFailure {
    std::string profile;  ///< profile that was to be applied; empty for a bare command list
    std::string adapter;  ///< group of the command list; empty when no single command is to blame
    int32_t rulePosition =
        -1;                ///< position in the adapter's rules from 0; -1: none of the profile's own rules, or unknown
    std::string ruleName;  ///< name of that rule
    std::string family;    ///< "v4" or "v6"; empty when neither is to blame
    std::string command;   ///< the whole command, program first; empty when no single command is to blame
    std::string message;   ///< what the program said, or why the command was not handed to it
};

}  // namespace FW

#endif
