// SPDX-License-Identifier: Apache-2.0
// Sets of packets, as far as the firewall's rules tell packets apart.
#include "model/packetSet.h"

#include <algorithm>

namespace veldfwctl {

bool PacketSet::isEmpty() const {
    return std::any_of(fields.begin(), fields.end(), [](const NumberSet &field) { return field.isEmpty(); });
}

bool PacketSet::meets(const PacketSet &other) const {
    return std::equal(fields.begin(), fields.end(), other.fields.begin(),
                      [](const NumberSet &mine, const NumberSet &theirs) { return mine.meets(theirs); });
}

PacketSet PacketSet::intersect(const PacketSet &other) const {
    PacketSet result;
    for (size_t field = 0; field < FIELD_COUNT; ++field) {
        result.fields[field] = fields[field].intersect(other.fields[field]);
    }
    return result;
}

PacketSet PacketSet::all() {
    PacketSet packets;
    packets.fields.fill(NumberSet::all());
    return packets;
}

std::vector<PacketSet> packetsWithout(const PacketSet &packets, const PacketSet &removed) {
    if (!packets.meets(removed)) {
        return {packets};
    }
    std::vector<PacketSet> rest;
    PacketSet inside = packets;  // lies in `removed` as far as the fields looked at go
    for (size_t field = 0; field < FIELD_COUNT; ++field) {
        NumberSet outside = inside.fields[field].without(removed.fields[field]);
        if (outside.isEmpty()) {
            continue;
        }
        rest.push_back(inside);
        rest.back().fields[field] = std::move(outside);
        inside.fields[field] = inside.fields[field].intersect(removed.fields[field]);
    }
    return rest;
}

uint64_t InterfaceNumbers::number(const std::string &name) const {
    const auto found = std::find(m_names.begin(), m_names.end(), name);
    return found == m_names.end() ? OTHER : OTHER + 1 + static_cast<uint64_t>(found - m_names.begin());
}

NumberSet InterfaceNumbers::match(const std::string &name) const {
    if (name.empty() || name.back() != '+') {
        return NumberSet::one(number(name));
    }
    NumberSet numbers;
    for (const std::string &known : m_names) {
        if (known.compare(0, name.size() - 1, name, 0, name.size() - 1) == 0) {
            numbers = numbers.unite(NumberSet::one(number(known)));
        }
    }
    return numbers;
}

PacketSet packetUniverse(bool isV6, bool isForwarded, const InterfaceNumbers &interfaces) {
    PacketSet packets;
    packets[FIELD_IN_INTERFACE] = interfaces.any();
    packets[FIELD_OUT_INTERFACE] = isForwarded ? interfaces.any() : NumberSet::one(InterfaceNumbers::NONE);
    packets[FIELD_PROTOCOL] = NumberSet::range(0, 0xFF);
    packets[FIELD_SOURCE_PORT] = NumberSet::range(0, 0xFFFF);
    packets[FIELD_DESTINATION_PORT] = NumberSet::range(0, 0xFFFF);
    packets[FIELD_STATE] = NumberSet::range(STATE_NEW, STATE_INVALID);
    packets[FIELD_ICMP_TYPE] = NumberSet::range(0, 0xFF);
    packets[FIELD_SOURCE] = isV6 ? NumberSet::all() : NumberSet::range(0, 0xFFFFFFFF);
    packets[FIELD_DESTINATION] = packets[FIELD_SOURCE];
    return packets;
}

}  // namespace veldfwctl
