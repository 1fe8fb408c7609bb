// SPDX-License-Identifier: Apache-2.0
// Translates the rules of a profile into iptables and ip6tables commands.
#include "veldfirewall/fwIptables.h"

#include <veld/core.h>
#include <veld/net.h>
#include <veld/serviceconf.h>

#include <algorithm>
#include <array>
#include <cstdlib>
#include <memory>
#include <optional>
#include <string_view>

#include "adapters/adapterNames.h"
#include "iptables/ruleFragments.h"
#include "utils/log.h"
#include "utils/platformError.h"
#include "veldfirewall/fwGeoip.h"

namespace FW {

namespace {

constexpr int PPPOE_NAME_SIZE = 256;
constexpr const char *NETWORK_TOOL = "/usr/veld/sbin/veldnetdtool";

constexpr const char *IGNORED_ADAPTER = "ppp0";     // the PPPoE link's raw name: its rules are those of "pppoe"
constexpr const char *RESERVED_TUNNEL = "tun1000";  // the system's own tunnel, no VPN

constexpr std::array<const char *, 3> PREDEFINED_ADAPTERS = {FW_ADAPTER_GLOBAL, FW_ADAPTER_PPPOE, FW_ADAPTER_VPN};

constexpr const char *LOOPBACK_TEXT = " -i lo -j ACCEPT";
constexpr const char *ESTABLISHED_TEXT = " -m state --state ESTABLISHED,RELATED -j ACCEPT";
constexpr const char *EXCEPT_SOURCE_TEXT = " ! -s ";
// Without neighbour discovery no IPv6 host can be reached at all.
constexpr std::array<const char *, 5> NEIGHBOUR_DISCOVERY_TEXTS = {
    " -s fe80::/10 -p icmpv6 --icmpv6-type router-solicitation -j ACCEPT",
    " -s fe80::/10 -p icmpv6 --icmpv6-type router-advertisement -j ACCEPT",
    " -p icmpv6 --icmpv6-type neighbour-solicitation -j ACCEPT",
    " -p icmpv6 --icmpv6-type neighbour-advertisement -j ACCEPT",
    " -s fe80::/10 -p icmpv6 --icmpv6-type 137 -j ACCEPT",
};

/// The connection-tracking accept of one family; `isOfFamily` tells whether the client's address is of that family.
std::string establishedText(const std::string &clientAddress, bool isOfFamily) {
    return isOfFamily ? EXCEPT_SOURCE_TEXT + clientAddress + ESTABLISHED_TEXT : ESTABLISHED_TEXT;
}

void preambleAppend(bool keepEstablished, const std::string &clientAddress, Json::Value &cmdList) {
    const bool clientIsV4 = !clientAddress.empty() && BlVLIBIsIpAddr(clientAddress.c_str()) != 0;
    const bool clientIsV6 = !clientAddress.empty() && BlVLIBIsv6IpAddrValid(clientAddress.c_str()) != 0;
    Json::Value &v4 = cmdList["v4"][FW_ADAPTER_GLOBAL];
    Json::Value &v6 = cmdList["v6"][FW_ADAPTER_GLOBAL];
    for (const char *chain : FW_CHAINS) {
        const std::string append = std::string("-A ") + chain;
        v4.append(append + LOOPBACK_TEXT);
        if (keepEstablished) {
            v4.append(append + establishedText(clientAddress, clientIsV4));
        }
        v6.append(append + LOOPBACK_TEXT);
        for (const char *text : NEIGHBOUR_DISCOVERY_TEXTS) {
            v6.append(append + text);
        }
        if (keepEstablished) {
            v6.append(append + establishedText(clientAddress, clientIsV6));
        }
    }
}

/// The rule that stands behind an adapter's own rules.
FWRULE defaultPolicyRule(FW_POLICY policy) {
    FWRULE rule;
    rule.policy = policy;
    rule.ipType = FW_IP_TYPE_BOTH;
    rule.ipGroup = FW_IP_GROUP_ANY;
    rule.portGroup = FW_PORT_GROUP_ANY;
    return rule;
}

/// An argument set without any fragment. It is copied for every rule: static keys are not.
Json::Value emptyArguments() {
    Json::Value args(Json::objectValue);
    for (const char *key : {"adapter", "port", "chain", "table", "policy"}) {
        args[Json::StaticString(key)] = Json::Value(Json::arrayValue);
    }
    Json::Value &ip = args[Json::StaticString("ip")];
    ip[Json::StaticString("v4")] = Json::Value(Json::arrayValue);
    ip[Json::StaticString("v6")] = Json::Value(Json::arrayValue);
    return args;
}

void append(Json::Value &fragments, const std::vector<std::string> &texts) {
    for (const std::string &text : texts) {
        fragments.append(text);
    }
}

std::vector<std::string> strings(const Json::Value &fragments) {
    std::vector<std::string> texts;
    texts.reserve(fragments.size());
    for (const Json::Value &fragment : fragments) {
        texts.push_back(fragment.asString());
    }
    return texts;
}

}  // namespace

VELDFW_IPTABLES_RULES::VELDFW_IPTABLES_RULES() = default;

VELDFW_IPTABLES_RULES::~VELDFW_IPTABLES_RULES() {
    VELDFwServiceFree(serviceList);
}

bool VELDFW_IPTABLES_RULES::enabledAdapterEnum() {
    if (!enabledAdapters.empty()) {
        return true;
    }
    const int count = adapterNamesRead(enabledAdapters);
    if (count < 0) {
        FW_LOG_ERR("Failed to VLIBNetGetInterfaceInfo(%d) " PLATFORM_ERROR_FORMAT, count, PLATFORM_ERROR_ARGUMENTS);
        return false;
    }
    enabledAdapters.erase(std::unique(enabledAdapters.begin(), enabledAdapters.end()), enabledAdapters.end());
    return true;
}

void VELDFW_IPTABLES_RULES::pppoeAdaterGet() {
    if (!pppoeIfName.empty()) {
        return;
    }
    std::array<char, PPPOE_NAME_SIZE> name = {};
    if (VELDPPPoeIntfGet(name.data(), PPPOE_NAME_SIZE) < 0) {
        FW_LOG_DEBUG("Failed to VELDPPPoeIntfGet()");
        return;
    }
    pppoeIfName = name.data();
}

bool VELDFW_IPTABLES_RULES::vpnAdatperEnum() {
    if (!vpnAdapters.empty()) {
        return true;
    }
    if (!enabledAdapterEnum()) {
        FW_LOG_ERR("Failed to enabledAdapterEnum()");
        return false;
    }
    pppoeAdaterGet();
    for (const std::string &adapter : enabledAdapters) {
        const bool isPpp = adapter.compare(0, 3, "ppp") == 0 && adapter != pppoeIfName;
        const bool isTun = adapter.compare(0, 3, "tun") == 0 && adapter != RESERVED_TUNNEL;
        if (isPpp || isTun) {
            vpnAdapters.push_back(adapter);
        }
    }
    return true;
}

bool VELDFW_IPTABLES_RULES::adapterIsEnabled(const std::string &adapter) {
    if (adapter == FW_ADAPTER_GLOBAL) {
        return true;
    }
    if (adapter == FW_ADAPTER_VPN) {
        vpnAdatperEnum();
        return !vpnAdapters.empty();
    }
    if (adapter == FW_ADAPTER_PPPOE) {
        pppoeAdaterGet();
        return !pppoeIfName.empty();
    }
    if (!enabledAdapterEnum()) {
        FW_LOG_ERR("Failed to enabledAdapterEnum()");
        return false;
    }
    return std::find(enabledAdapters.begin(), enabledAdapters.end(), adapter) != enabledAdapters.end();
}

void VELDFW_IPTABLES_RULES::iptablesRulesInit(Json::Value &args) {
    static const Json::Value empty = emptyArguments();
    args = empty;
}

bool VELDFW_IPTABLES_RULES::FwRuleToIptablesArg(const std::string &adapter, const FWRULE &rule, Json::Value &args) {
    if (!adapterToIptablesArg(adapter, rule, args)) {
        FW_LOG_ERR("Failed to adapterToIptablesArg()");
        return false;
    }
    if (!ipToIptablesArg(rule, args)) {
        FW_LOG_ERR("Failed to ipToIptablesArg()");
        return false;
    }
    if (!portToIptablesArg(rule, args)) {
        FW_LOG_ERR("Failed to portToIptablesArg()");
        return false;
    }
    if (!chainToIptablesArg(rule, args)) {
        FW_LOG_ERR("Failed to chainToIptablesArg()");
        return false;
    }
    if (!tableToIptablesArg(rule, args)) {
        FW_LOG_ERR("Failed to tableToIptablesArg()");
        return false;
    }
    if (!policyToIptablesArg(rule, args)) {
        FW_LOG_ERR("Failed to policyToIptablesArg()");
        return false;
    }
    return true;
}

bool VELDFW_IPTABLES_RULES::adapterToIptablesArg(const std::string &adapter, const FWRULE &rule, Json::Value &args) {
    Json::Value &fragments = args["adapter"];
    for (const std::string_view predefined : PREDEFINED_ADAPTERS) {
        if (predefined != adapter) {
            continue;
        }
        if (predefined == FW_ADAPTER_PPPOE) {
            pppoeAdaterGet();
            if (pppoeIfName.empty()) {
                FW_LOG_ERR("pppoe interface is empty");
                return false;
            }
            fragments.append(adapterFragment(pppoeIfName, rule));
        } else if (predefined == FW_ADAPTER_VPN) {
            if (!vpnAdatperEnum()) {
                FW_LOG_ERR("Failed to vpnAdatperEnum()");
                return false;
            }
            for (const std::string &vpn : vpnAdapters) {
                fragments.append(adapterFragment(vpn, rule));
            }
        } else if (predefined == FW_ADAPTER_GLOBAL) {
            fragments.append("");
        } else {
            FW_LOG_ERR("Failed to convert pre-defined adapter %s", adapter.c_str());
            return false;
        }
    }
    // Also "vpn" without a VPN interface: a match that names no real interface, rather than one that matches them all.
    if (fragments.empty()) {
        fragments.append(adapterFragment(adapter, rule));
    }
    return true;
}

bool VELDFW_IPTABLES_RULES::ipToIptablesArg(const FWRULE &rule, Json::Value &args) {
    Json::Value &v4 = args["ip"]["v4"];
    Json::Value &v6 = args["ip"]["v6"];
    switch (rule.ipGroup) {
    case FW_IP_GROUP_ADDRESS:
    case FW_IP_GROUP_NETWORK:
    case FW_IP_GROUP_RANGE: {
        const std::optional<std::string> fragment = addressFragment(rule);
        if (!fragment) {
            FW_LOG_ERR("Missing address for ip group %d in rule \"%s\"", rule.ipGroup, rule.name.c_str());
            return true;
        }
        if (ruleHasV4(rule)) {
            v4.append(*fragment);
        }
        if (ruleHasV6(rule)) {
            v6.append(*fragment);
        }
        return true;
    }
    case FW_IP_GROUP_NONE:
        return true;
    case FW_IP_GROUP_COUNTRY:
        for (const bool ipv6 : {false, true}) {
            std::vector<std::string> usable;
            if ((ipv6 ? ruleHasV6(rule) : ruleHasV4(rule)) && FW_GEOIP().geoipSanctify(rule.ipList, ipv6, usable)) {
                (ipv6 ? v6 : v4).append(countryFragment(usable, rule));
            }
        }
        return true;
    case FW_IP_GROUP_ANY:
        v4.append("");
        v6.append("");
        return true;
    default:
        // One rule of a kind that is not known must not stop the whole profile.
        FW_LOG_ERR("Unknown ip group %d", rule.ipGroup);
        return true;
    }
}

bool VELDFW_IPTABLES_RULES::portToIptablesArg(const FWRULE &rule, Json::Value &args) {
    switch (rule.portGroup) {
    case FW_PORT_GROUP_SERVICE:
    case FW_PORT_GROUP_RESERVED:
        if (!servPortToCmd(rule.portList, args)) {
            FW_LOG_ERR("Failed to servPortToCmd()");
            return false;
        }
        return true;
    case FW_PORT_GROUP_PORT:
        portListToIptablesArg(rule.protocol, rule.portDirect, rule.portList, args);
        return true;
    case FW_PORT_GROUP_ANY:
        args["port"].append("");
        return true;
    default:
        FW_LOG_ERR("Unknown port group %d", rule.portGroup);
        return true;
    }
}

bool VELDFW_IPTABLES_RULES::chainToIptablesArg(const FWRULE &rule, Json::Value &args) {
    for (const std::string &chain : rule.chainList) {
        args["chain"].append("-A " + chain);
    }
    return true;
}

bool VELDFW_IPTABLES_RULES::tableToIptablesArg(const FWRULE &rule, Json::Value &args) {
    args["table"].append("-t " + rule.table);
    return true;
}

bool VELDFW_IPTABLES_RULES::policyToIptablesArg(const FWRULE &rule, Json::Value &args) {
    switch (rule.policy) {
    case FW_POLICY_ALLOW:
        args["policy"].append("-j RETURN");
        return true;
    case FW_POLICY_DENY:
        args["policy"].append("-j DROP");
        return true;
    case FW_POLICY_NONE:
        return true;
    default:
        FW_LOG_ERR("Unknown policy %d", static_cast<int>(rule.policy));
        return false;
    }
}

void VELDFW_IPTABLES_RULES::portListToIptablesArg(int protocol, int portDirect, const std::vector<std::string> &ports,
                                                  Json::Value &args) {
    append(args["port"], portFragments(protocol, portDirect, ports));
}

bool VELDFW_IPTABLES_RULES::servToPorts(const std::vector<std::string> &services, ServPort &ports) {
    if (serviceList == nullptr && VELDFwServiceEnum(&serviceList) < 1) {
        VELDFwServiceFree(serviceList);
        serviceList = nullptr;
        FW_LOG_ERR("Failed to enum services");
        return false;
    }
    const auto appendPorts = [](const VLIBCSZLIST *list, int protocol,
                                std::map<FW_PORT_PROTOCOL, std::vector<std::string>> &side) {
        for (int i = 0; list != nullptr && i < list->nItem; ++i) {
            const char *port = VLIBCSzListGet(list, i);
            side[static_cast<FW_PORT_PROTOCOL>(protocol)].emplace_back(port != nullptr ? port : "");
        }
    };
    for (const std::string &name : services) {
        const VELDFWSERVICE *service = VELDFWServiceFind(serviceList, name.c_str());
        if (service == nullptr || service->data == 0) {
            continue;
        }
        appendPorts(service->srcPorts, service->srcProtocol, ports.srcPorts);
        appendPorts(service->dstPorts, service->dstProtocol, ports.dstPorts);
    }
    return true;
}

bool VELDFW_IPTABLES_RULES::servPortToCmd(const std::vector<std::string> &services, Json::Value &args) {
    ServPort ports;
    if (!servToPorts(services, ports)) {
        FW_LOG_ERR("Failed to servToPorts()");
        return false;
    }
    for (const auto &[protocol, list] : ports.srcPorts) {
        portListToIptablesArg(protocol, 1, list, args);
    }
    for (const auto &[protocol, list] : ports.dstPorts) {
        portListToIptablesArg(protocol, 0, list, args);
    }
    for (const std::string &service : services) {
        append(args["port"], rawProtocolFragments(service));
    }
    return true;
}

bool VELDFW_IPTABLES_RULES::jIptablesCmdInit(Json::Value &cmdList) {
    cmdList["v4"] = Json::Value();
    cmdList["v6"] = Json::Value();
    return true;
}

void VELDFW_IPTABLES_RULES::iptablesArgToCmd(const std::string &adapter, const FWRULE &rule, const Json::Value &args,
                                             Json::Value &cmdList) {
    const std::string target = args["policy"].empty() ? "" : args["policy"][0].asString();
    const std::vector<std::string> adapters = strings(args["adapter"]);
    const std::vector<std::string> ports = strings(args["port"]);
    const std::vector<std::string> v4 = ruleHasV4(rule) ? strings(args["ip"]["v4"]) : std::vector<std::string>();
    const std::vector<std::string> v6 = ruleHasV6(rule) ? strings(args["ip"]["v6"]) : std::vector<std::string>();

    const auto familyAppend = [&](const char *family, const std::string &tableAndChain,
                                  const std::vector<std::string> &addresses, const char *foreignPort) {
        for (const std::string &adapterText : adapters) {
            for (const std::string &address : addresses) {
                for (const std::string &port : ports) {
                    if (port == foreignPort) {
                        continue;
                    }
                    std::string command = tableAndChain;
                    for (const std::string *part : {&adapterText, &address, &port}) {
                        command += part->empty() ? "" : " ";
                        command += *part;
                    }
                    Json::Value &commands = cmdList[family][adapter];
                    if (rule.blLog) {
                        commands.append(command + " -j LOG");
                    }
                    commands.append(command + " " + target);
                }
            }
        }
    };
    for (const Json::Value &table : args["table"]) {
        for (const Json::Value &chain : args["chain"]) {
            const std::string tableAndChain = table.asString() + " " + chain.asString();
            familyAppend("v4", tableAndChain, v4, ICMPV6_FRAGMENT);
            familyAppend("v6", tableAndChain, v6, ICMP_FRAGMENT);
        }
    }
}

const std::string &VELDFW_IPTABLES_RULES::tunnelInterfaceGet(const std::string &interfaceName) {
    const auto [known, isNew] = tunnelInterfaces.try_emplace(interfaceName, interfaceName);
    if (!isNew) {
        return known->second;
    }
    const std::unique_ptr<FILE, int (*)(FILE *)> pipe(VLIBCPopen(NETWORK_TOOL, "r", "--get-ipv6-router-interface",
                                                                 interfaceName.c_str(), static_cast<char *>(nullptr)),
                                                      VLIBCPclose);
    if (!pipe) {
        FW_LOG_ERR("Failed to exec veldnetdtool with VLIBCPopen().");
        return known->second;
    }
    char *line = nullptr;
    size_t size = 0;
    if (getline(&line, &size, pipe.get()) > 0) {
        known->second = line;
    } else {
        FW_LOG_ERR("Failed to getline after VLIBCPopen().");
    }
    std::free(line);
    return known->second;
}

void VELDFW_IPTABLES_RULES::iptables6in4ToCmd(const std::string &adapter, FWRULE rule, Json::Value &cmdList) {
    const std::string &interfaceName = adapter == FW_ADAPTER_PPPOE ? pppoeIfName : adapter;
    const std::string &tunnel = tunnelInterfaceGet(interfaceName);
    if (tunnel == interfaceName) {
        return;
    }
    rule.ipType = FW_IP_TYPE_V6;
    Json::Value args;
    iptablesRulesInit(args);
    if (!FwRuleToIptablesArg(tunnel, rule, args)) {
        FW_LOG_ERR("Failed to convert rule to iptables arg in 6in4 over PPPoE.");
        return;
    }
    iptablesArgToCmd(tunnel, rule, args, cmdList);
}

bool VELDFW_IPTABLES_RULES::fwRulesToIptablesRules(const bool &keepEstablished,
                                                   const std::map<std::string, std::vector<FWRULE>> &adapterRules,
                                                   const std::map<std::string, FW_POLICY> &adapterPolicyMap,
                                                   Json::Value &cmdList, const std::string &clientAddress) {
    if (!clientAddress.empty() && BlVLIBIsIpAddr(clientAddress.c_str()) == 0 && clientAddress != "127.0.0.1" &&
        BlVLIBIsv6IpAddrValid(clientAddress.c_str()) == 0) {
        FW_LOG_ERR("Invalid input argument '%s' which is not an IP address.", clientAddress.c_str());
        return false;
    }
    preambleAppend(keepEstablished, clientAddress, cmdList);

    // Kept apart from the rules, which may be many: each stands behind those of its adapter.
    std::map<std::string, std::optional<FWRULE>> defaultRules;
    for (const auto &[adapter, rules] : adapterRules) {
        defaultRules[adapter] = std::nullopt;
    }
    for (const auto &[adapter, policy] : adapterPolicyMap) {
        if (adapter != IGNORED_ADAPTER && adapterIsEnabled(adapter)) {
            defaultRules[adapter] = defaultPolicyRule(policy);
        }
    }
    const auto translate = [&](const std::string &adapter, const FWRULE &rule) {
        if (!rule.enable || adapter == IGNORED_ADAPTER || !adapterIsEnabled(adapter) || rule.policy == FW_POLICY_NONE) {
            return true;
        }
        Json::Value args;
        iptablesRulesInit(args);
        if (!FwRuleToIptablesArg(adapter, rule, args)) {
            return false;
        }
        iptablesArgToCmd(adapter, rule, args, cmdList);
        iptables6in4ToCmd(adapter, rule, cmdList);
        return true;
    };
    for (const auto &[adapter, defaultRule] : defaultRules) {
        const auto rules = adapterRules.find(adapter);
        if (rules != adapterRules.end()) {
            for (const FWRULE &rule : rules->second) {
                if (!translate(adapter, rule)) {
                    return false;
                }
            }
        }
        if (defaultRule && !translate(adapter, *defaultRule)) {
            return false;
        }
    }
    return true;
}

bool VELDFW_IPTABLES_RULES::fwRulesToIptablesRules(const bool &keepEstablished,
                                                   const std::map<std::string, std::vector<FWRULE>> &adapterRules,
                                                   const std::map<std::string, FW_POLICY> &adapterPolicyMap,
                                                   Json::Value &cmdList) {
    return fwRulesToIptablesRules(keepEstablished, adapterRules, adapterPolicyMap, cmdList, "");
}

}  // namespace FW
