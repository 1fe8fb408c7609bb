// SPDX-License-Identifier: Apache-2.0
// The way of packets through the rules of a chain: which rule decides, and which never can.
#include "model/packetWalk.h"

#include <algorithm>
#include <iterator>

namespace veldfwctl {

namespace {

/// Beyond that many pieces the question is left open: what is left of the packets is then not nothing anyway.
constexpr size_t MOST_PIECES = 300;
constexpr size_t MOST_TO_CHOOSE_FROM = 40;  // beyond that, all are named

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
std::vector<PacketSet> piecesWithout(std::vector<PacketSet> pieces, const PacketSet &removed) {
    std::vector<PacketSet> rest;
    rest.reserve(pieces.size());
    for (PacketSet &piece : pieces) {
        if (!piece.meets(removed)) {
            rest.push_back(std::move(piece));
            continue;
        }
        std::vector<PacketSet> parts = packetsWithout(piece, removed);
        std::move(parts.begin(), parts.end(), std::back_inserter(rest));
    }
    return rest;
}

/// How many of the rules, from the first, it needs to take all the packets; 0 when they leave some.
size_t countTaking(const PacketSet &packets, const std::vector<PacketRule> &rules, const std::vector<size_t> &indices) {
    std::vector<PacketSet> rest = {packets};
    for (size_t i = 0; i < indices.size() && rest.size() <= MOST_PIECES; ++i) {
        rest = piecesWithout(std::move(rest), rules[indices[i]].packets);
        if (rest.empty()) {
            return i + 1;
        }
    }
    return 0;
}

/// Of rules that together take all the packets, those that it takes: the firewall's own rules take a little of most.
std::vector<size_t> fewestTaking(const PacketSet &packets, const std::vector<PacketRule> &rules,
                                 std::vector<size_t> indices) {
    const auto one = std::find_if(indices.begin(), indices.end(),
                                  [&](size_t index) { return packetsWithout(packets, rules[index].packets).empty(); });
    if (one != indices.end()) {
        return {*one};
    }
    for (size_t at = 0; at < indices.size() && indices.size() <= MOST_TO_CHOOSE_FROM;) {
        std::vector<size_t> fewer = indices;
        fewer.erase(fewer.begin() + static_cast<std::ptrdiff_t>(at));
        if (countTaking(packets, rules, fewer) > 0) {
            indices = std::move(fewer);
        } else {
            ++at;
        }
    }
    return indices;
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
            rest = piecesWithout(std::move(rest), rule.packets);
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
    const size_t count = countTaking(packets, rules, candidates);
    shadow.isShadowed = count > 0;
    candidates.resize(count);
    shadow.by = fewestTaking(packets, rules, std::move(candidates));
    return shadow;
}

}  // namespace veldfwctl
