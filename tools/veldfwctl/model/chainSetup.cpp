// SPDX-License-Identifier: Apache-2.0
// What the firewall's chains lack, and the transaction that mends it.
#include "model/chainSetup.h"

#include <veldfirewall/fwRecords.h>

#include <algorithm>
#include <sstream>

namespace veldfwctl {

namespace {

bool jumpsTo(const std::string &rule, const std::string &chain) {
    const std::string jump = " -j " + chain;
    const std::string go = " -g " + chain;
    const auto endsWith = [&rule](const std::string &end) {
        return rule.size() >= end.size() && rule.compare(rule.size() - end.size(), end.size(), end) == 0;
    };
    return endsWith(jump) || endsWith(go);
}

}  // namespace

ChainPlan chainPlanMake(const std::string &listing) {
    std::vector<std::string> lines;
    std::istringstream stream(listing);
    for (std::string line; std::getline(stream, line);) {
        lines.push_back(line);
    }
    ChainPlan plan;
    std::string creations;
    std::string changes;
    for (const auto &[hook, chain] :
         {std::pair<std::string, std::string>("INPUT", FW::FW_CHAIN_INPUT), {"FORWARD", FW::FW_CHAIN_FORWARD}}) {
        const bool exists = std::find(lines.begin(), lines.end(), "-N " + chain) != lines.end();
        plan.items.push_back({"chain " + chain, exists ? "" : "missing"});
        if (!exists) {
            creations += "-N " + chain + "\n";
        }
        size_t position = 0;
        size_t wanted = 0;  // position of the first jump without conditions
        std::vector<std::string> jumps;
        for (const std::string &line : lines) {
            if (line.rfind("-A " + hook + " ", 0) != 0) {
                continue;
            }
            ++position;
            if (jumpsTo(line, chain)) {
                jumps.push_back(line);
                wanted = wanted == 0 && line == "-A " + hook + " -j " + chain ? position : wanted;
            }
        }
        std::string lack;
        if (jumps.empty()) {
            lack = "missing";
        } else if (jumps.size() > 1) {
            lack = std::to_string(jumps.size()) + " times";
        } else if (wanted != 1) {
            lack = wanted == 0 ? "with conditions" : "at position " + std::to_string(wanted);
        }
        plan.items.push_back({"jump from " + hook + " to " + chain, lack});
        if (!lack.empty()) {
            for (const std::string &jump : jumps) {
                changes += "-D" + jump.substr(2) + "\n";
            }
            changes += "-I " + hook + " 1 -j " + chain + "\n";
        }
    }
    if (!creations.empty() || !changes.empty()) {
        plan.restoreInput = "*filter\n" + creations + changes + "COMMIT\n";
    }
    return plan;
}

}  // namespace veldfwctl
