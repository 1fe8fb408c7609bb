// SPDX-License-Identifier: Apache-2.0
// Translates the rules of a profile into iptables and ip6tables commands.
#ifndef VELDFIREWALL_FWIPTABLES_H
#define VELDFIREWALL_FWIPTABLES_H

#include <json/value.h>

#include <map>
#include <string>
#include <vector>

#include "veldfirewall/export.h"
#include "veldfirewall/fwRecords.h"

struct VELDFWServiceList;

namespace FW {

/// The translator. It asks the system for interfaces, services and tunnels on first use and keeps the answers for its
/// own life: make a fresh one for each build. Not to be shared between threads. Runs no iptables; nothing in the kernel
/// changes. Failures are logged at error priority.
///
/// The command list that it builds is {"v4": {group: [arguments...]}, "v6": {...}}: every string holds the arguments of
/// one iptables (ip6tables) run, every group is "global", an adapter or an interface name.
///
/// The argument set of one rule, filled by the builders, is {"adapter": [], "port": [], "chain": [], "table": [],
/// "policy": [], "ip": {"v4": [], "v6": []}}, all arrays of fragments; an empty fragment restricts nothing, an empty
/// array means that the rule yields no command.
class VELDFIREWALL_API VELDFW_IPTABLES_RULES {
public:
    VELDFW_IPTABLES_RULES();
    ~VELDFW_IPTABLES_RULES();
    VELDFW_IPTABLES_RULES(const VELDFW_IPTABLES_RULES &) = delete;
    VELDFW_IPTABLES_RULES &operator=(const VELDFW_IPTABLES_RULES &) = delete;

    // Adapter discovery

    /// Reads the system's interfaces (at most 32, "wlan0" added where the system supports wireless), once.
    bool enabledAdapterEnum();
    /// Reads the name of the PPPoE interface; no PPPoE link leaves it empty, noted at debug priority only.
    void pppoeAdaterGet();
    /// Picks the VPN interfaces: ppp* but not the PPPoE one, tun* but not "tun1000".
    bool vpnAdatperEnum();
    /// Whether rules stored under `adapter` ("global", "pppoe", "vpn" or an interface name) have something to act on.
    bool adapterIsEnabled(const std::string &adapter);

    // Rule argument builders: each appends the fragments of one aspect of `rule` to `args`

    /// Makes `args` a fresh argument set with all arrays empty.
    void iptablesRulesInit(Json::Value &args);
    /// Runs all builders; stops at the first that fails.
    bool FwRuleToIptablesArg(const std::string &adapter, const FWRULE &rule, Json::Value &args);
    /// "-i eth0" or "-o eth0". @return false for "pppoe" without a PPPoE link, or when the interfaces cannot be read
    bool adapterToIptablesArg(const std::string &adapter, const FWRULE &rule, Json::Value &args);
    /// "-s ...", "-d ...", "-m iprange ..." or "-m geoip ..." for each family of ipType. An unknown ipGroup is logged
    /// and adds nothing, and so is an ipList that is too short for its ipGroup.
    bool ipToIptablesArg(const FWRULE &rule, Json::Value &args);
    /// Protocol and ports. An unknown portGroup is logged and adds nothing. @return false when the services cannot be
    /// read
    bool portToIptablesArg(const FWRULE &rule, Json::Value &args);
    /// "-A " + chain for each chain.
    bool chainToIptablesArg(const FWRULE &rule, Json::Value &args);
    /// "-t " + table.
    bool tableToIptablesArg(const FWRULE &rule, Json::Value &args);
    /// "-j RETURN", "-j DROP" or nothing (FW_POLICY_NONE). @return false for an unknown policy
    bool policyToIptablesArg(const FWRULE &rule, Json::Value &args);
    /// Protocol and port fragments, seven ports or ranges at most in each.
    /// @param protocol a FW_PORT_PROTOCOL number; others add nothing
    /// @param portDirect non-zero: source ports; 0: destination ports
    void portListToIptablesArg(int protocol, int portDirect, const std::vector<std::string> &ports, Json::Value &args);

    // Services

    /// Appends the ports of the named services; unknown and unusable ones add nothing.
    /// @return false when the service registry cannot be opened
    bool servToPorts(const std::vector<std::string> &services, ServPort &ports);
    /// Appends the services' port fragments, and the raw protocols that VPN services need.
    bool servPortToCmd(const std::vector<std::string> &services, Json::Value &args);

    // Commands

    /// Sets "v4" and "v6" of `cmdList` to null. @return always true
    bool jIptablesCmdInit(Json::Value &cmdList);
    /// Appends the commands of one rule to cmdList[family][adapter]: one per combination of the fragments in `args`,
    /// each preceded by its "-j LOG" twin when the rule logs.
    void iptablesArgToCmd(const std::string &adapter, const FWRULE &rule, const Json::Value &args,
                          Json::Value &cmdList);
    /// Appends the rule's IPv6 commands for the 6in4 tunnel of the adapter's interface, when it has one. The network
    /// tool is run once per interface. Failures are logged and add nothing.
    void iptables6in4ToCmd(const std::string &adapter, FWRULE rule, Json::Value &cmdList);

    /// Builds the whole command list of a profile: loopback, connection tracking and neighbour discovery, then each
    /// adapter's rules followed by its default policy. Rules that are disabled, have no target or whose adapter is
    /// absent are left out.
    /// @param keepEstablished accept packets of established connections
    /// @param cmdList prepared with jIptablesCmdInit(); commands are appended; not to be run after a failure
    /// @param clientAddress IPv4 or IPv6 address that is excluded from keepEstablished, or empty
    /// @return false for an address that is none, or a rule that cannot be converted
    bool fwRulesToIptablesRules(const bool &keepEstablished,
                                const std::map<std::string, std::vector<FWRULE>> &adapterRules,
                                const std::map<std::string, FW_POLICY> &adapterPolicyMap, Json::Value &cmdList,
                                const std::string &clientAddress);
    /// The same without a client address.
    bool fwRulesToIptablesRules(const bool &keepEstablished,
                                const std::map<std::string, std::vector<FWRULE>> &adapterRules,
                                const std::map<std::string, FW_POLICY> &adapterPolicyMap, Json::Value &cmdList);

private:
    VELDFWServiceList *serviceList = nullptr;  // owned
    std::vector<std::string> enabledAdapters;
    std::vector<std::string> vpnAdapters;
    std::string pppoeIfName;
    std::map<std::string, std::string> tunnelInterfaces;  // interface to its 6in4 tunnel, or to itself

    const std::string &tunnelInterfaceGet(const std::string &interfaceName);
};

}  // namespace FW

#endif
