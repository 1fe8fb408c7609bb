// SPDX-License-Identifier: Apache-2.0
// Faults of a profile that only its commands show.
#include "system/commandLint.h"

#include <algorithm>
#include <map>

#include "model/numbers.h"
#include "model/packetWalk.h"
#include "model/restoreText.h"

namespace veldfwctl {

namespace {

constexpr size_t MOST_ARGUMENTS = 255;  // program included
constexpr size_t MOST_BYTES = 1024;     // one more for the end of each argument

constexpr size_t MOST_NAMED = 5;  // rules that shadow another

using Place = std::pair<std::string, size_t>;  // adapter and number

bool isOurs(const PacketRule &rule) {
    return rule.table == "filter" && (rule.chain == FW::FW_CHAIN_INPUT || rule.chain == FW::FW_CHAIN_FORWARD);
}

/// The commands of each rule that decide, by their index in the plan.
std::map<Place, std::vector<size_t>> decidingCommands(const Ruleset &ruleset) {
    std::map<Place, std::vector<size_t>> commands;
    for (size_t i = 0; i < ruleset.rules.size(); ++i) {
        const auto &origin = ruleset.plan[i].origin;
        if (origin && origin->number != 0 && ruleset.rules[i].isFinal()) {
            commands[{origin->adapter, origin->number}].push_back(i);
        }
    }
    return commands;
}

}  // namespace

std::vector<Finding> limitsLint(const Plan &plan) {
    std::vector<Finding> findings;
    std::map<Place, bool> isReported;
    for (const PlannedCommand &planned : plan) {
        size_t arguments = 0;
        size_t bytes = 0;
        for (const std::string &word : split(planned.command, ' ')) {
            arguments += word.empty() ? 0 : 1;
            bytes += word.empty() ? 0 : word.size() + 1;
        }
        if (!planned.origin || (arguments <= MOST_ARGUMENTS && bytes <= MOST_BYTES)) {
            continue;
        }
        if (bool &known = isReported[{planned.origin->adapter, planned.origin->number}]; !known) {
            known = true;
            findings.push_back(findingAt("limit", *planned.origin,
                                         "yields a command of " + std::to_string(arguments) + " arguments and " +
                                             std::to_string(bytes) +
                                             " bytes, which is not run: " + std::to_string(MOST_ARGUMENTS) + " and " +
                                             std::to_string(MOST_BYTES) + " are the most",
                                         "spread what it names over several rules"));
        }
    }
    return findings;
}

std::vector<Finding> shadowsLint(const Ruleset &ruleset) {
    std::vector<Finding> findings;
    for (const auto &[place, commands] : decidingCommands(ruleset)) {
        std::vector<size_t> by;
        bool isShadowed = true;
        for (const size_t command : commands) {
            const PacketRule &rule = ruleset.rules[command];
            const Shadow shadow =
                isOurs(rule)
                    ? shadowFind(ruleset.rules, command,
                                 packetUniverse(rule.isV6, rule.chain == FW::FW_CHAIN_FORWARD, ruleset.interfaces))
                    : Shadow();
            isShadowed = isShadowed && shadow.isShadowed;
            if (!isShadowed) {
                break;
            }
            by.insert(by.end(), shadow.by.begin(), shadow.by.end());
        }
        if (!isShadowed) {
            continue;
        }
        std::sort(by.begin(), by.end());
        std::vector<std::string> names;
        for (const size_t index : by) {
            const PlannedCommand &earlier = ruleset.plan[index];
            const bool isItself = earlier.origin && Place(earlier.origin->adapter, earlier.origin->number) == place;
            if (!isItself && std::find(names.begin(), names.end(), plannedText(earlier)) == names.end()) {
                names.push_back(plannedText(earlier));
            }
        }
        if (names.size() > MOST_NAMED) {
            const size_t more = names.size() - MOST_NAMED;
            names.resize(MOST_NAMED);
            names.push_back(std::to_string(more) + " more");
        }
        const RuleCommands &rule = *ruleset.plan[commands.front()].origin;
        if (names.empty()) {
            findings.push_back(findingAt("impossible", rule, "can never match: no packet of its chain is as it asks",
                                         "look at its addresses, its direction and its chains"));
        } else {
            findings.push_back(findingAt("shadowed", rule,
                                         "can never match: all its packets are taken before by " + join(names, " and "),
                                         "remove it, or move it before"));
        }
    }
    return findings;
}

std::vector<Finding> clientLint(const Ruleset &ruleset, const PacketQuery &query) {
    std::vector<Finding> findings;
    for (const Decision &decision : packetsDecide(query.packets(ruleset.interfaces), ruleset.rules, query.isV6(),
                                                  query.isForwarded() ? FW::FW_CHAIN_FORWARD : FW::FW_CHAIN_INPUT)) {
        if (decision.rule == Decision::CHAIN_END || ruleset.rules[decision.rule].target != "DROP") {
            continue;
        }
        const PlannedCommand &planned = ruleset.plan[decision.rule];
        const RuleCommands place = planned.origin.value_or(RuleCommands{});
        findings.push_back(findingAt("connection", place,
                                     std::string(decision.isCertain ? "drops" : "may drop") + " new connections from " +
                                         query.from + " to port " + query.toPort +
                                         (query.in.empty() ? "" : " on " + query.in) +
                                         ", by which this machine is being administered",
                                     "allow them in an earlier rule, or use \"veldfwctl try\""));
    }
    return findings;
}

}  // namespace veldfwctl
