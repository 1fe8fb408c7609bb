// SPDX-License-Identifier: Apache-2.0
// Tells by a profile's rules alone, without iptables, what happens to one new connection.
#include "profileDecision.h"

#include <veldfirewall/fwIptables.h>

#include <arpa/inet.h>

#include <algorithm>
#include <array>
#include <stdexcept>
#include <vector>

namespace demo {
namespace {

using Bytes = std::vector<uint8_t>;

/// 4 or 16 bytes.
Bytes parseAddress(const std::string &text) {
    std::array<uint8_t, 16> buffer = {};
    if (inet_pton(AF_INET, text.c_str(), buffer.data()) == 1)
        return {buffer.begin(), buffer.begin() + 4};
    if (inet_pton(AF_INET6, text.c_str(), buffer.data()) == 1)
        return {buffer.begin(), buffer.end()};
    throw std::runtime_error("not an address: " + text);
}

bool inNetwork(const Bytes &address, const Bytes &network, size_t prefix) {
    if (address.size() != network.size())
        return false;
    for (size_t bit = 0; bit < prefix; ++bit) {
        const auto mask = static_cast<uint8_t>(0x80U >> (bit % 8));
        if ((address[bit / 8] & mask) != (network[bit / 8] & mask))
            return false;
    }
    return true;
}

bool sourceMatches(const FW::FWRULE &rule, const std::string &source) {
    const Bytes address = parseAddress(source);
    const int family = address.size() == 4 ? FW::FW_IP_TYPE_V4 : FW::FW_IP_TYPE_V6;
    if (rule.ipType != FW::FW_IP_TYPE_BOTH && rule.ipType != family)
        return false;
    switch (rule.ipGroup) {
    case FW::FW_IP_GROUP_ANY:
        return true;
    case FW::FW_IP_GROUP_ADDRESS:
        return address == parseAddress(rule.ipList.at(0));
    case FW::FW_IP_GROUP_NETWORK:
        return inNetwork(address, parseAddress(rule.ipList.at(0)), std::stoul(rule.ipList.at(1)));
    default:
        throw std::runtime_error("rule \"" + rule.name + "\": kind of address match unknown to the demonstration");
    }
}

bool holdsPort(const std::vector<std::string> &ports, long port) {
    return std::any_of(ports.begin(), ports.end(), [&](const std::string &entry) {
        const size_t dash = entry.find('-');
        const long low = std::stol(entry);
        const long high = dash == std::string::npos ? low : std::stol(entry.substr(dash + 1));
        return low <= port && port <= high;
    });
}

bool sameProtocol(int rule, int connection) {
    return rule == connection || rule == FW::FW_PROTO_TCP_UDP;
}

bool portMatches(const FW::FWRULE &rule, const NewConnection &connection) {
    if (rule.portGroup == FW::FW_PORT_GROUP_ANY)
        return true;
    if (rule.portGroup == FW::FW_PORT_GROUP_PORT)
        return sameProtocol(rule.protocol, connection.protocol) && holdsPort(rule.portList, connection.port);
    FW::VELDFW_IPTABLES_RULES translator;
    FW::ServPort services;
    if (!translator.servToPorts(rule.portList, services))
        throw std::runtime_error("the service registry cannot be read");
    return std::any_of(services.dstPorts.begin(), services.dstPorts.end(), [&](const auto &entry) {
        return sameProtocol(entry.first, connection.protocol) && holdsPort(entry.second, connection.port);
    });
}

}  // namespace

Decision decide(const FW::FWPROFILE &profile, const NewConnection &connection) {
    const auto list = profile.rules.find(FW::FW_ADAPTER_GLOBAL);
    if (list == profile.rules.end())
        return {};
    for (const auto &rule : list->second) {
        if (rule.enable && rule.policy != FW::FW_POLICY_NONE && sourceMatches(rule, connection.source) &&
            portMatches(rule, connection))
            return {rule.policy == FW::FW_POLICY_ALLOW, rule.name};
    }
    return {};
}

}  // namespace demo
