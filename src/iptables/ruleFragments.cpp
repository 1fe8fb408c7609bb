// SPDX-License-Identifier: Apache-2.0
// The pieces of iptables text that the fields of a rule turn into.
#include "iptables/ruleFragments.h"

#include <boost/algorithm/string/join.hpp>

#include <algorithm>
#include <array>

namespace FW {

namespace {

constexpr size_t PORTS_PER_FRAGMENT = 7;

struct RawProtocols {
    const char *service;
    std::array<int, 4> numbers;  // a zero ends the list early
};

constexpr std::array<RawProtocols, 2> RAW_PROTOCOLS = {{
    {"vpn_server_pptp", {47, 0, 0, 0}},    // GRE
    {"vpn_server_ipsec", {50, 51, 0, 0}},  // ESP, AH
}};

std::vector<std::string> protocolNames(int protocol) {
    switch (protocol) {
    case FW_PROTO_TCP:
        return {"tcp"};
    case FW_PROTO_UDP:
        return {"udp"};
    case FW_PROTO_TCP_UDP:
        return {"tcp", "udp"};
    default:
        return {};
    }
}

bool isRange(const std::string &port) {
    return port.find('-') != std::string::npos;
}

/// iptables writes ranges with a colon; a range of one port becomes that port.
std::string portText(const std::string &port) {
    const size_t dash = port.find('-');
    if (dash != std::string::npos && port.compare(0, dash, port, dash + 1, std::string::npos) == 0) {
        return port.substr(0, dash);
    }
    std::string text = port;
    std::replace(text.begin(), text.end(), '-', ':');
    return text;
}

}  // namespace

bool ruleHasV4(const FWRULE &rule) {
    return rule.ipType == FW_IP_TYPE_V4 || rule.ipType == FW_IP_TYPE_BOTH;
}

bool ruleHasV6(const FWRULE &rule) {
    return rule.ipType == FW_IP_TYPE_V6 || rule.ipType == FW_IP_TYPE_BOTH;
}

std::string adapterFragment(const std::string &interfaceName, const FWRULE &rule) {
    return (rule.adapterDirect != 0 ? "-i " : "-o ") + interfaceName;
}

std::optional<std::string> addressFragment(const FWRULE &rule) {
    const bool source = rule.ipDirect != 0;
    const std::vector<std::string> &list = rule.ipList;
    if (list.size() < (rule.ipGroup == FW_IP_GROUP_ADDRESS ? 1 : 2)) {
        return std::nullopt;
    }
    switch (rule.ipGroup) {
    case FW_IP_GROUP_ADDRESS:
        return (source ? "-s " : "-d ") + list[0];
    case FW_IP_GROUP_NETWORK:
        return (source ? "-s " : "-d ") + list[0] + "/" + list[1];
    case FW_IP_GROUP_RANGE:
        return (source ? "-m iprange --src-range " : "-m iprange --dst-range ") + list[0] + "-" + list[1];
    default:
        return std::nullopt;
    }
}

std::string countryFragment(const std::vector<std::string> &countries, const FWRULE &rule) {
    return (rule.ipDirect != 0 ? "-m geoip --source-country " : "-m geoip --destination-country ") +
           boost::algorithm::join(countries, ",");
}

std::vector<std::string> portFragments(int protocol, int portDirect, const std::vector<std::string> &ports) {
    if (protocol == FW_PROTO_ICMP) {
        return {ICMP_FRAGMENT, ICMPV6_FRAGMENT};
    }
    if (protocol == FW_PROTO_IGMP) {
        return {"-p igmp "};
    }
    // Decided by the raw entries: a sole range of one port still takes the multiport form.
    const bool single = ports.size() < 2 && std::none_of(ports.begin(), ports.end(), isRange);
    std::string option = single ? "" : "-m multiport ";
    option += portDirect != 0 ? "--sport" : "--dport";
    option += single ? " " : "s ";
    std::vector<std::string> fragments;
    for (const std::string &name : protocolNames(protocol)) {
        const std::string head = "-p " + name + " " + option;
        for (size_t first = 0; first < ports.size(); first += PORTS_PER_FRAGMENT) {
            std::string fragment = head;
            const size_t end = std::min(first + PORTS_PER_FRAGMENT, ports.size());
            for (size_t i = first; i < end; ++i) {
                fragment += (i == first ? "" : ",") + portText(ports[i]);
            }
            fragments.push_back(std::move(fragment));
        }
    }
    return fragments;
}

std::vector<std::string> rawProtocolFragments(const std::string &service) {
    std::vector<std::string> fragments;
    for (const RawProtocols &entry : RAW_PROTOCOLS) {
        if (service != entry.service) {
            continue;
        }
        for (const int number : entry.numbers) {
            if (number == 0) {
                break;
            }
            fragments.push_back("-p " + std::to_string(number) + " ");
        }
    }
    return fragments;
}

}  // namespace FW
