// SPDX-License-Identifier: Apache-2.0
// Ports and protocols as an administrator writes them.
#include "model/ports.h"

#include <algorithm>
#include <map>
#include <set>

#include "frame/errors.h"
#include "model/numbers.h"

namespace veldfwctl {

namespace {

int portParse(const std::string &text, const std::string &entry) {
    const std::optional<int> port = numberParse(text, 1, 65535);
    if (!port) {
        throw UsageError("\"" + text + "\" in \"" + entry +
                         "\" is no port; ports are numbers from 1 to 65535 (for names see --service)");
    }
    return *port;
}

std::string portOrRangeParse(const std::string &text, const std::string &entry) {
    const size_t dash = text.find('-');
    if (dash == std::string::npos) {
        return std::to_string(portParse(text, entry));
    }
    const int first = portParse(text.substr(0, dash), entry);
    const int last = portParse(text.substr(dash + 1), entry);
    if (first > last) {
        throw UsageError("\"" + text + "\" in \"" + entry + "\" ends before it begins; write " + std::to_string(last) +
                         "-" + std::to_string(first));
    }
    return first == last ? std::to_string(first) : std::to_string(first) + "-" + std::to_string(last);
}

int32_t portProtocolParse(const std::string &text, const std::string &entry) {
    for (const int32_t protocol : {FW::FW_PROTO_TCP, FW::FW_PROTO_UDP, FW::FW_PROTO_TCP_UDP}) {
        if (text == protocolText(protocol)) {
            return protocol;
        }
    }
    throw UsageError("\"" + text + "\" in \"" + entry + "\" is no protocol with ports; use tcp, udp or tcp+udp");
}

}  // namespace

PortMatch portMatchParse(const std::vector<std::string> &entries) {
    // In the order given, so that the rule reads as it was written.
    std::vector<std::string> order;
    std::map<std::string, int32_t> protocols;
    for (const std::string &entry : entries) {
        const size_t slash = entry.find('/');
        const int32_t protocol = slash == std::string::npos ? static_cast<int32_t>(FW::FW_PROTO_TCP_UDP)
                                                            : portProtocolParse(entry.substr(slash + 1), entry);
        for (const std::string &piece : split(entry.substr(0, slash), ',')) {
            const std::string port = portOrRangeParse(piece, entry);
            if (std::find(order.begin(), order.end(), port) == order.end()) {
                order.push_back(port);
            }
            protocols[port] |= protocol;  // 1 and 2 make 3
        }
    }
    PortMatch match;
    match.ports = order;
    match.protocol = order.empty() ? static_cast<int32_t>(FW::FW_PROTO_TCP_UDP) : protocols[order.front()];
    for (const std::string &port : order) {
        if (protocols[port] != match.protocol) {
            throw UsageError("Ports " + portsText(match.protocol, {order.front()}) + " and " +
                             portsText(protocols[port], {port}) +
                             " have different protocols, and a rule has one; add two rules");
        }
    }
    return match;
}

int32_t plainProtocolParse(const std::string &text) {
    if (text == "icmp") {
        return FW::FW_PROTO_ICMP;
    }
    if (text == "igmp") {
        return FW::FW_PROTO_IGMP;
    }
    const bool hasPorts = text == "tcp" || text == "udp" || text == "tcp+udp";
    throw UsageError("\"" + text + "\" cannot be matched as a whole; " +
                     (hasPorts ? "name its ports, all of them with --port 1-65535/" + text : "use icmp or igmp"));
}

std::string protocolText(int32_t protocol) {
    switch (protocol) {
    case FW::FW_PROTO_TCP:
        return "tcp";
    case FW::FW_PROTO_UDP:
        return "udp";
    case FW::FW_PROTO_TCP_UDP:
        return "tcp+udp";
    case FW::FW_PROTO_ICMP:
        return "icmp";
    case FW::FW_PROTO_IGMP:
        return "igmp";
    default:
        return "protocol " + std::to_string(protocol);
    }
}

std::string portsText(int32_t protocol, const std::vector<std::string> &ports) {
    if (ports.empty()) {
        return protocolText(protocol);
    }
    return join(ports, ",") + "/" + protocolText(protocol);
}

std::string sidesText(const PortMatch &source, const PortMatch &destination) {
    // Entries of a protocol without ports only say that the list counts.
    const bool hasPorts = destination.protocol < FW::FW_PROTO_ICMP;
    std::string text;
    if (!destination.ports.empty() || !hasPorts) {
        text = portsText(destination.protocol, hasPorts ? destination.ports : std::vector<std::string>());
    }
    if (!source.ports.empty()) {
        text += (text.empty() ? "from " : ", from ") + portsText(source.protocol, source.ports);
    }
    return text.empty() ? "none" : text;
}

}  // namespace veldfwctl
