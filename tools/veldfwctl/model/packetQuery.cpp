// SPDX-License-Identifier: Apache-2.0
// A packet as an administrator describes it.
#include "model/packetQuery.h"

#include <algorithm>
#include <array>

#include "frame/errors.h"
#include "model/numbers.h"
#include "model/packetRules.h"
#include "model/ports.h"

namespace veldfwctl {

namespace {

constexpr uint64_t TCP = 6;
constexpr uint64_t UDP = 17;
constexpr size_t MOST_RANGES_SHOWN = 3;
constexpr std::array<const char *, FIELD_COUNT> FIELD_NAMES = {
    "interface",        "outgoing interface", "protocol", "port",       "source port",
    "connection state", "ICMPv6 type",        "source",   "destination"};

Address addressParse(const std::string &text) {
    if (const std::optional<Address> address = addressFromText(text)) {
        return *address;
    }
    throw UsageError("\"" + text + "\" is no IPv4 or IPv6 address; write it in numbers, like 192.0.2.7 or 2001:db8::7");
}

NumberSet portNumbers(const std::vector<std::string> &ports) {
    NumberSet numbers;
    for (const std::string &port : ports) {
        const size_t dash = port.find('-');
        const uint64_t first = std::stoul(port);
        numbers = numbers.unite(
            NumberSet::range(first, dash == std::string::npos ? first : std::stoul(port.substr(dash + 1))));
    }
    return numbers;
}

std::string numberText(size_t field, const Number &number, bool isV6, const std::vector<std::string> &interfaces) {
    static const std::array<const char *, 4> states = {"new", "established", "related", "invalid"};
    switch (field) {
    case FIELD_SOURCE:
    case FIELD_DESTINATION:
        return addressText(addressOfNumber(number, isV6));
    case FIELD_IN_INTERFACE:
    case FIELD_OUT_INTERFACE:
        if (number.second == InterfaceNumbers::NONE) {
            return "none";
        }
        return number.second == InterfaceNumbers::OTHER ? "any other"
                                                        : interfaces[number.second - InterfaceNumbers::OTHER - 1];
    case FIELD_PROTOCOL:
        for (const char *name : {"tcp", "udp", "icmp", "igmp", "icmpv6"}) {
            if (protocolNumber(name) == number.second) {
                return name;
            }
        }
        return std::to_string(number.second);
    case FIELD_STATE:
        return states.at(number.second);
    default:
        return std::to_string(number.second);
    }
}

}  // namespace

bool PacketQuery::isV6() const {
    return addressParse(from).isV6;
}

PacketSet PacketQuery::packets(const InterfaceNumbers &interfaces) const {
    PacketSet packets = packetUniverse(isV6(), isForwarded(), interfaces);
    const auto addressSet = [&](PacketField field, const std::string &text) {
        const Address address = addressParse(text);
        if (address.isV6 != isV6()) {
            throw UsageError("\"" + from + "\" and \"" + text + "\" mix IPv4 and IPv6");
        }
        packets[field] = NumberSet({{addressNumber(address), addressNumber(address)}});
    };
    addressSet(FIELD_SOURCE, from);
    if (!to.empty()) {
        addressSet(FIELD_DESTINATION, to);
    }
    if (!in.empty()) {
        packets[FIELD_IN_INTERFACE] = NumberSet::one(interfaces.number(in));
    }
    if (!out.empty()) {
        packets[FIELD_OUT_INTERFACE] = NumberSet::one(interfaces.number(out));
    }
    if (!toPort.empty()) {
        const PortMatch match = portMatchParse({toPort});
        packets[FIELD_DESTINATION_PORT] = portNumbers(match.ports);
        NumberSet protocols;
        if ((match.protocol & FW::FW_PROTO_TCP) != 0) {
            protocols = protocols.unite(NumberSet::one(TCP));
        }
        if ((match.protocol & FW::FW_PROTO_UDP) != 0) {
            protocols = protocols.unite(NumberSet::one(UDP));
        }
        packets[FIELD_PROTOCOL] = protocols;
    }
    if (!fromPort.empty()) {
        packets[FIELD_SOURCE_PORT] = portNumbers(portMatchParse({fromPort}).ports);
    }
    if (!protocol.empty()) {
        const std::optional<uint64_t> number = protocolNumber(protocol == "icmp" && isV6() ? "icmpv6" : protocol);
        if (!number) {
            throw UsageError("\"" + protocol + "\" is no protocol; use icmp, igmp, tcp, udp or a number up to 255");
        }
        packets[FIELD_PROTOCOL] = NumberSet::one(*number);
    }
    packets[FIELD_STATE] = NumberSet::one(isEstablished ? STATE_ESTABLISHED : STATE_NEW);
    return packets;
}

std::string packetDifferenceText(const PacketSet &some, const PacketSet &whole, bool isV6,
                                 const std::vector<std::string> &interfaces) {
    std::string text;
    for (size_t field = 0; field < FIELD_COUNT; ++field) {
        if (some.fields[field] == whole.fields[field]) {
            continue;
        }
        const auto &ranges = some.fields[field].ranges();
        std::string values;
        for (size_t i = 0; i < std::min(ranges.size(), MOST_RANGES_SHOWN); ++i) {
            const std::string first = numberText(field, ranges[i].first, isV6, interfaces);
            const std::string last = numberText(field, ranges[i].last, isV6, interfaces);
            values += (i == 0 ? " " : ",") + first + (first == last ? "" : "-" + last);
        }
        text += (text.empty() ? "" : ", ") + std::string(FIELD_NAMES[field]) + values +
                (ranges.size() > MOST_RANGES_SHOWN ? ",..." : "");
    }
    return text;
}

}  // namespace veldfwctl
