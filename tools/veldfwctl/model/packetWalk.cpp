// SPDX-License-Identifier: Apache-2.0
// The way of packets through the rules of a chain: which rule decides, and which never can.
#include "model/packetWalk.h"

#include <algorithm>
#include <iterator>

namespace veldfwctl {

namespace {

/// Beyond that many pieces the question is left open: what is left of the packets is then not nothing anyway.
constexpr size_t MOST_PIECES = 2000;

enum class Answer { YES, NO, UNKNOWN };

/// Whether addresses with holes between them hold the packets' address.
Answer masksHold(const PacketRule &rule, const PacketSet &packets) {
    Answer answer = Answer::YES;
    for (const AddressMask &mask : rule.masks) {
        const NumberSet &addresses = packets[mask.field];
        if (!addresses.isOne()) {
            answer = Answer::UNKNOWN;
            continue;
        }
        const Number &number = addresses.ranges().front().first;
        if (Number(number.first & mask.mask.first, number.second & mask.mask.second) != mask.value) {
            return Answer::NO;
        }
    }
    return answer;
}

/// Takes the packets of `removed` out of each piece.
std::vector<PacketSet> piecesWithout(const std::vector<PacketSet> &pieces, const PacketSet &removed) {
    std::vector<PacketSet> rest;
    for (const PacketSet &piece : pieces) {
        std::vector<PacketSet> parts = packetsWithout(piece, removed);
        std::move(parts.begin(), parts.end(), std::back_inserter(rest));
    }
    return rest;
}

/// Whether the rules together take all the packets.
bool areTakenBy(const PacketSet &packets, const std::vector<PacketRule> &rules, const std::vector<size_t> &indices) {
    std::vector<PacketSet> rest = {packets};
    for (const size_t index : indices) {
        rest = piecesWithout(rest, rules[index].packets);
        if (rest.empty() || rest.size() > MOST_PIECES) {
            break;
        }
    }
    return rest.empty();
}

}  // namespace

std::vector<Decision> packetsDecide(const PacketSet &packets, const std::vector<PacketRule> &rules, bool isV6,
                                    const std::string &chain) {
    std::vector<Decision> decisions;
    std::vector<PacketSet> rest = {packets};
    for (size_t i = 0; i < rules.size() && !rest.empty(); ++i) {
        const PacketRule &rule = rules[i];
        if (rule.isV6 != isV6 || rule.chain != chain || rule.table != "filter" || !rule.isFinal()) {
            continue;
        }
        Decision decision{i, {}, rule.notUnderstood.empty()};
        for (const PacketSet &piece : rest) {
            const PacketSet taken = piece.intersect(rule.packets);
            const Answer held = taken.isEmpty() ? Answer::NO : masksHold(rule, piece);
            if (held != Answer::NO) {
                decision.packets.push_back(taken);
                decision.isCertain = decision.isCertain && held == Answer::YES;
            }
        }
        if (decision.packets.empty()) {
            continue;
        }
        if (decision.isCertain) {
            rest = piecesWithout(rest, rule.packets);
        }
        decisions.push_back(std::move(decision));
    }
    if (!rest.empty()) {
        decisions.push_back({Decision::CHAIN_END, rest, true});
    }
    return decisions;
}

Shadow shadowFind(const std::vector<PacketRule> &rules, size_t index, const PacketSet &universe) {
    const PacketRule &rule = rules[index];
    Shadow shadow;
    if (!rule.notUnderstood.empty()) {
        return shadow;
    }
    const PacketSet packets = rule.packets.intersect(universe);
    if (packets.isEmpty()) {
        shadow.isShadowed = shadow.isImpossible = true;
        return shadow;
    }
    std::vector<size_t> candidates;
    for (size_t i = 0; i < index; ++i) {
        const PacketRule &earlier = rules[i];
        const bool counts = earlier.isV6 == rule.isV6 && earlier.chain == rule.chain && earlier.table == rule.table &&
                            earlier.isFinal() && earlier.notUnderstood.empty() && earlier.masks.empty();
        if (counts && earlier.packets.meets(packets)) {
            candidates.push_back(i);
        }
    }
    shadow.isShadowed = areTakenBy(packets, rules, candidates);
    if (shadow.isShadowed) {
        // Only those that it takes: the firewall's own rules take something of most.
        for (size_t at = 0; at < candidates.size();) {
            std::vector<size_t> fewer = candidates;
            fewer.erase(fewer.begin() + static_cast<std::ptrdiff_t>(at));
            if (areTakenBy(packets, rules, fewer)) {
                candidates = std::move(fewer);
            } else {
                ++at;
            }
        }
        shadow.by = std::move(candidates);
    }
    return shadow;
}

}  // namespace veldfwctl
