// SPDX-License-Identifier: Apache-2.0
// Sets of numbers of up to 128 bits: addresses, ports, protocols.
#ifndef VELDFWCTL_NUMBERSET_H
#define VELDFWCTL_NUMBERSET_H

#include <cstdint>
#include <utility>
#include <vector>

#include "model/addresses.h"

namespace veldfwctl {

/// The high and the low half.
using Number = std::pair<uint64_t, uint64_t>;

/// First and last number, both included.
struct NumberRange {
    Number first;
    Number last;
};

/// A value; ranges are kept sorted and apart.
class NumberSet {
public:
    NumberSet() = default;  ///< the empty set
    /// @param ranges in any order; one that ends before it begins holds nothing
    explicit NumberSet(std::vector<NumberRange> ranges);
    static NumberSet all();
    static NumberSet range(uint64_t first, uint64_t last) { return NumberSet({{{0, first}, {0, last}}}); }
    static NumberSet one(uint64_t number) { return range(number, number); }

    bool isEmpty() const { return m_ranges.empty(); }
    bool isOne() const { return m_ranges.size() == 1 && m_ranges[0].first == m_ranges[0].last; }
    const std::vector<NumberRange> &ranges() const { return m_ranges; }
    bool meets(const NumberSet &other) const;
    NumberSet complement() const;
    NumberSet intersect(const NumberSet &other) const;
    NumberSet without(const NumberSet &other) const { return intersect(other.complement()); }
    NumberSet unite(const NumberSet &other) const;
    bool operator==(const NumberSet &other) const;
    bool operator!=(const NumberSet &other) const { return !(*this == other); }

private:
    std::vector<NumberRange> m_ranges;
};

/// The number of an address; that of an IPv4 address has 32 bits.
Number addressNumber(const Address &address);
Address addressOfNumber(const Number &number, bool isV6);

}  // namespace veldfwctl

#endif
