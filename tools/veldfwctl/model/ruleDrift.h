// SPDX-License-Identifier: Apache-2.0
// Compares the rules that a chain should hold with those that it holds.
#ifndef VELDFWCTL_RULEDRIFT_H
#define VELDFWCTL_RULEDRIFT_H

#include <cstddef>
#include <string>
#include <vector>

namespace veldfwctl {

/// One difference.
struct Drift {
    enum class Kind { MISSING, FOREIGN, MOVED };
    Kind kind = Kind::MISSING;
    std::string rule;     ///< as the listing has it
    size_t expected = 0;  ///< number in the expected rules, from 1; 0 for a foreign one
    size_t live = 0;      ///< number in the live rules, from 1; 0 for a missing one
};

/// The fewest rules that account for all differences: missing and moved ones as they are expected, then foreign ones as
/// they are found. Empty when both are the same.
std::vector<Drift> driftFind(const std::vector<std::string> &expected, const std::vector<std::string> &live);

/// The rules of one chain in what "iptables -S" printed.
std::vector<std::string> chainRules(const std::string &listing, const std::string &chain);

}  // namespace veldfwctl

#endif
