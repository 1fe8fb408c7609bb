// SPDX-License-Identifier: Apache-2.0
// The way of packets through the rules of a chain: which rule decides, and which never can.
#ifndef VELDFWCTL_PACKETWALK_H
#define VELDFWCTL_PACKETWALK_H

#include <string>
#include <vector>

#include "model/packetRules.h"

namespace veldfwctl {

/// A rule that decides for packets, or the end of the chain.
struct Decision {
    static constexpr size_t CHAIN_END = static_cast<size_t>(-1);
    size_t rule = CHAIN_END;
    std::vector<PacketSet> packets;  ///< those that it decides for
    bool isCertain = true;           ///< false: whether it takes them cannot be told; it may leave them to later ones
};

/// Who decides for each of the packets, in the order of the rules.
/// @param rules in kernel order; those of other chains, tables and families are passed over
std::vector<Decision> packetsDecide(const PacketSet &packets, const std::vector<PacketRule> &rules, bool isV6,
                                    const std::string &chain);

/// Why a rule never decides.
struct Shadow {
    bool isShadowed = false;
    bool isImpossible = false;  ///< no packet in its chain is as it asks; `by` is empty
    std::vector<size_t> by;     ///< the earlier rules that together take all its packets
};

/// Looks at the rules before rules[index] in its chain. A doubtful rule is not shadowed, and shadows none.
/// @param universe the packets that the chain sees
Shadow shadowFind(const std::vector<PacketRule> &rules, size_t index, const PacketSet &universe);

}  // namespace veldfwctl

#endif
