// SPDX-License-Identifier: Apache-2.0
// Sets of numbers of up to 128 bits: addresses, ports, protocols.
#include "model/numberSet.h"

#include <algorithm>
#include <limits>

namespace veldfwctl {

namespace {

constexpr uint64_t HIGHEST_HALF = std::numeric_limits<uint64_t>::max();
constexpr Number LOWEST = {0, 0};
constexpr Number HIGHEST = {HIGHEST_HALF, HIGHEST_HALF};

/// Not for HIGHEST.
Number next(const Number &number) {
    return number.second == HIGHEST_HALF ? Number(number.first + 1, 0) : Number(number.first, number.second + 1);
}

/// Not for LOWEST.
Number previous(const Number &number) {
    return number.second == 0 ? Number(number.first - 1, HIGHEST_HALF) : Number(number.first, number.second - 1);
}

}  // namespace

NumberSet::NumberSet(std::vector<NumberRange> ranges) {
    std::sort(ranges.begin(), ranges.end(),
              [](const NumberRange &a, const NumberRange &b) { return a.first < b.first; });
    for (const NumberRange &range : ranges) {
        if (range.first > range.last) {
            continue;
        }
        const bool touches =
            !m_ranges.empty() && (m_ranges.back().last == HIGHEST || range.first <= next(m_ranges.back().last));
        if (touches) {
            m_ranges.back().last = std::max(m_ranges.back().last, range.last);
        } else {
            m_ranges.push_back(range);
        }
    }
}

NumberSet NumberSet::all() {
    return NumberSet({{LOWEST, HIGHEST}});
}

bool NumberSet::meets(const NumberSet &other) const {
    auto mine = m_ranges.begin();
    auto theirs = other.m_ranges.begin();
    while (mine != m_ranges.end() && theirs != other.m_ranges.end()) {
        if (mine->last < theirs->first) {
            ++mine;
        } else if (theirs->last < mine->first) {
            ++theirs;
        } else {
            return true;
        }
    }
    return false;
}

NumberSet NumberSet::complement() const {
    NumberSet result;
    Number first = LOWEST;
    for (const NumberRange &range : m_ranges) {
        if (first < range.first) {
            result.m_ranges.push_back({first, previous(range.first)});
        }
        if (range.last == HIGHEST) {
            return result;
        }
        first = next(range.last);
    }
    result.m_ranges.push_back({first, HIGHEST});
    return result;
}

NumberSet NumberSet::intersect(const NumberSet &other) const {
    NumberSet result;
    auto mine = m_ranges.begin();
    auto theirs = other.m_ranges.begin();
    while (mine != m_ranges.end() && theirs != other.m_ranges.end()) {
        const Number first = std::max(mine->first, theirs->first);
        const Number last = std::min(mine->last, theirs->last);
        if (first <= last) {
            result.m_ranges.push_back({first, last});
        }
        mine->last < theirs->last ? ++mine : ++theirs;
    }
    return result;
}

NumberSet NumberSet::unite(const NumberSet &other) const {
    std::vector<NumberRange> ranges = m_ranges;
    ranges.insert(ranges.end(), other.m_ranges.begin(), other.m_ranges.end());
    return NumberSet(std::move(ranges));
}

bool NumberSet::operator==(const NumberSet &other) const {
    return std::equal(
        m_ranges.begin(), m_ranges.end(), other.m_ranges.begin(), other.m_ranges.end(),
        [](const NumberRange &a, const NumberRange &b) { return a.first == b.first && a.last == b.last; });
}

Number addressNumber(const Address &address) {
    Number number = {0, 0};
    for (size_t i = 0; i < (address.isV6 ? 16U : 4U); ++i) {
        uint64_t &half = address.isV6 && i < 8 ? number.first : number.second;
        half = half << 8 | address.bytes[i];
    }
    return number;
}

Address addressOfNumber(const Number &number, bool isV6) {
    Address address;
    address.isV6 = isV6;
    for (size_t i = 0; i < (isV6 ? 16U : 4U); ++i) {
        const uint64_t half = isV6 && i < 8 ? number.first : number.second;
        const size_t place = isV6 ? 7 - i % 8 : 3 - i;
        address.bytes[i] = static_cast<uint8_t>(half >> (8 * place));
    }
    return address;
}

}  // namespace veldfwctl
