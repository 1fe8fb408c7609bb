// SPDX-License-Identifier: Apache-2.0
// All ways of applying a profile side by side, and a hundred atomic reloads as clients see them.
#ifndef VELD_BENCH_COMPARISON_H
#define VELD_BENCH_COMPARISON_H

#include <json/value.h>

#include <string>
#include <vector>

namespace veldbench {

struct ComparisonPlan {
    std::vector<std::string> backends = {"nft", "legacy"};
    std::vector<size_t> sizes = {10, 100, 1000};  ///< profile rules
    int rounds = 9;                               ///< of each way
    int slowRounds = 3;                           ///< of a way that takes longer than two seconds
    bool oneByOne = true;                         ///< the ways that change rule by rule too
    int continuityReloads = 100;
    size_t continuityRules = 1000;
};

/// Measures, prints tables as it goes, and returns everything as a document. Throws std::runtime_error when a way does
/// not do what it is measured for.
Json::Value compare(const ComparisonPlan &plan);

}  // namespace veldbench

#endif
