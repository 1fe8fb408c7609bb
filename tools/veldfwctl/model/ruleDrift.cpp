// SPDX-License-Identifier: Apache-2.0
// Compares the rules that a chain should hold with those that it holds.
#include "model/ruleDrift.h"

#include <algorithm>
#include <map>
#include <sstream>

namespace veldfwctl {

namespace {

/// The longest rising subsequence of the positions: which of them are in it.
std::vector<bool> longestRising(const std::vector<size_t> &positions) {
    constexpr auto NONE = static_cast<size_t>(-1);
    std::vector<size_t> ends;  // index of the lowest end of a rising sequence of that length
    std::vector<size_t> before(positions.size(), NONE);
    for (size_t i = 0; i < positions.size(); ++i) {
        const auto place = std::lower_bound(ends.begin(), ends.end(), positions[i],
                                            [&](size_t end, size_t position) { return positions[end] < position; });
        before[i] = place == ends.begin() ? NONE : *(place - 1);
        if (place == ends.end()) {
            ends.push_back(i);
        } else {
            *place = i;
        }
    }
    std::vector<bool> isIn(positions.size(), false);
    for (size_t i = ends.empty() ? NONE : ends.back(); i != NONE; i = before[i]) {
        isIn[i] = true;
    }
    return isIn;
}

}  // namespace

std::vector<Drift> driftFind(const std::vector<std::string> &expected, const std::vector<std::string> &live) {
    // Equal rules at both ends are in place; taken first, so that of equal rules the right one counts as lost.
    const size_t shorter = std::min(expected.size(), live.size());
    size_t head = 0;
    while (head < shorter && expected[head] == live[head]) {
        ++head;
    }
    size_t tail = 0;
    while (tail < shorter - head && expected[expected.size() - 1 - tail] == live[live.size() - 1 - tail]) {
        ++tail;
    }
    std::map<std::string, std::vector<size_t>> places;  // last first
    for (size_t i = live.size() - tail; i > head; --i) {
        places[live[i - 1]].push_back(i - 1);
    }
    std::vector<Drift> drifts;
    std::vector<bool> isPaired(live.size(), false);
    std::vector<Drift> pairs;
    std::vector<size_t> positions;
    for (size_t i = head; i < expected.size() - tail; ++i) {
        std::vector<size_t> &free = places[expected[i]];
        if (free.empty()) {
            drifts.push_back({Drift::Kind::MISSING, expected[i], i + 1, 0});
            continue;
        }
        isPaired[free.back()] = true;
        positions.push_back(free.back());
        pairs.push_back({Drift::Kind::MOVED, expected[i], i + 1, free.back() + 1});
        free.pop_back();
    }
    const std::vector<bool> inOrder = longestRising(positions);
    for (size_t i = 0; i < pairs.size(); ++i) {
        if (!inOrder[i]) {
            drifts.push_back(pairs[i]);
        }
    }
    std::sort(drifts.begin(), drifts.end(), [](const Drift &a, const Drift &b) { return a.expected < b.expected; });
    for (size_t i = head; i < live.size() - tail; ++i) {
        if (!isPaired[i]) {
            drifts.push_back({Drift::Kind::FOREIGN, live[i], 0, i + 1});
        }
    }
    return drifts;
}

std::vector<std::string> chainRules(const std::string &listing, const std::string &chain) {
    const std::string start = "-A " + chain + " ";
    std::vector<std::string> rules;
    std::istringstream lines(listing);
    for (std::string line; std::getline(lines, line);) {
        if ((line + " ").rfind(start, 0) == 0) {
            rules.push_back(line);
        }
    }
    return rules;
}

}  // namespace veldfwctl
