// SPDX-License-Identifier: Apache-2.0
// Sets of packets, as far as the firewall's rules tell packets apart.
#ifndef VELDFWCTL_PACKETSET_H
#define VELDFWCTL_PACKETSET_H

#include <array>
#include <string>
#include <vector>

#include "model/numberSet.h"

namespace veldfwctl {

/// What rules look at, those that part most packets first. Packets without ports count as having any, and so with the
/// type of ICMPv6: rules that name these name the protocol too.
enum PacketField : size_t {
    FIELD_IN_INTERFACE,
    FIELD_OUT_INTERFACE,
    FIELD_PROTOCOL,
    FIELD_DESTINATION_PORT,
    FIELD_SOURCE_PORT,
    FIELD_STATE,
    FIELD_ICMP_TYPE,
    FIELD_SOURCE,
    FIELD_DESTINATION,
    FIELD_COUNT,
};

/// States of connections, the numbers of FIELD_STATE.
enum PacketState : uint64_t { STATE_NEW, STATE_ESTABLISHED, STATE_RELATED, STATE_INVALID };

/// All combinations of the fields' values.
struct PacketSet {
    std::array<NumberSet, FIELD_COUNT> fields;

    NumberSet &operator[](PacketField field) { return fields[field]; }
    const NumberSet &operator[](PacketField field) const { return fields[field]; }
    bool isEmpty() const;
    bool meets(const PacketSet &other) const;
    PacketSet intersect(const PacketSet &other) const;
    static PacketSet all();
};

/// The packets of `packets` that are not in `removed`, as sets without common packets.
std::vector<PacketSet> packetsWithout(const PacketSet &packets, const PacketSet &removed);

/// Numbers for the names of interfaces. A packet that enters this machine leaves by interface 0, which is none;
/// 1 stands for all interfaces that no rule names.
class InterfaceNumbers {
public:
    static constexpr uint64_t NONE = 0;
    static constexpr uint64_t OTHER = 1;

    explicit InterfaceNumbers(std::vector<std::string> names) : m_names(std::move(names)) {}

    uint64_t number(const std::string &name) const;
    /// The interfaces that iptables means by a name; one that ends in "+" stands for all that begin so.
    NumberSet match(const std::string &name) const;
    NumberSet any() const { return NumberSet::range(OTHER, OTHER + m_names.size()); }

private:
    std::vector<std::string> m_names;
};

/// All packets that a chain can see. @param isForwarded for FORWARD, otherwise INPUT
PacketSet packetUniverse(bool isV6, bool isForwarded, const InterfaceNumbers &interfaces);

}  // namespace veldfwctl

#endif
