// SPDX-License-Identifier: Apache-2.0
// "diff": whether the kernel holds what the active profile says.
#include <memory>

#include "frame/verb.h"
#include "model/restoreText.h"
#include "model/ruleDrift.h"
#include "system/plan.h"
#include "system/ruleListing.h"
#include "system/store.h"

namespace veldfwctl {

namespace {

/// The planned commands that append to one chain of the table "filter".
std::vector<const PlannedCommand *> plannedFor(const Plan &plan, bool isV6, const std::string &chain) {
    std::vector<const PlannedCommand *> commands;
    for (const PlannedCommand &planned : plan) {
        const CommandWords words = commandWordsSplit(planned.command);
        if (planned.isV6 == isV6 && words.table == "filter" && words.chain == chain) {
            commands.push_back(&planned);
        }
    }
    return commands;
}

class Report {
public:
    explicit Report(const Context &context) : m_context(context) {}

    void add(bool isV6, const Drift &drift, const PlannedCommand *planned) {
        const std::string family = isV6 ? "IPv6" : "IPv4";
        const std::string origin = planned != nullptr ? ", from " + plannedText(*planned) : "";
        Json::Value entry;
        entry["family"] = family;
        entry["rule"] = drift.rule;
        if (planned != nullptr) {
            entry["origin"] = originJson(*planned);
        }
        std::string line;
        switch (drift.kind) {
        case Drift::Kind::MISSING:
            entry["kind"] = "missing";
            line = "- missing " + family + " " + drift.rule + "  (rule " + std::to_string(drift.expected) + origin;
            break;
        case Drift::Kind::FOREIGN:
            entry["kind"] = "foreign";
            line = "+ foreign " + family + " " + drift.rule + "  (is rule " + std::to_string(drift.live);
            break;
        case Drift::Kind::MOVED:
            entry["kind"] = "moved";
            line = "~ moved   " + family + " " + drift.rule + "  (is rule " + std::to_string(drift.live) +
                   ", should be rule " + std::to_string(drift.expected) + origin;
            break;
        }
        entry["expected"] = static_cast<Json::UInt64>(drift.expected);
        entry["live"] = static_cast<Json::UInt64>(drift.live);
        m_drifts.append(entry);
        m_context.print(line + ")");
    }

    const Json::Value &drifts() const { return m_drifts; }

private:
    const Context &m_context;
    Json::Value m_drifts = Json::arrayValue;
};

int diff(const Context &context) {
    const Settings settings = settingsRead();
    const Plan plan = settings.enabled ? planBuild(settings.profile) : Plan();
    Report report(context);
    for (const bool isV6 : {false, true}) {
        const std::string live = liveListing(isV6);
        const std::string expected = settings.enabled ? plannedListing(familyCommands(plan, isV6), isV6) : "";
        for (const char *chain : {FW::FW_CHAIN_INPUT, FW::FW_CHAIN_FORWARD}) {
            const std::vector<std::string> rules = chainRules(expected, chain);
            const std::vector<const PlannedCommand *> commands = plannedFor(plan, isV6, chain);
            for (const Drift &drift : driftFind(rules, chainRules(live, chain))) {
                // A rule that iptables made several of leaves no way to count.
                const bool isKnown = drift.expected > 0 && commands.size() == rules.size();
                report.add(isV6, drift, isKnown ? commands[drift.expected - 1] : nullptr);
            }
        }
    }
    if (context.json) {
        Json::Value json;
        json["enabled"] = settings.enabled;
        json["profile"] = settings.profile;
        json["drift"] = report.drifts();
        context.printJson(json);
    }
    if (!report.drifts().empty()) {
        return STATUS_NO;
    }
    context.print(settings.enabled ? "The kernel holds what profile \"" + settings.profile + "\" says."
                                   : "The firewall is off, and its chains are empty.");
    return STATUS_DONE;
}

}  // namespace

void registerDiff(CLI::App &app, Context &context) {
    verbAdd(app, context,
            {"diff", "Compare the kernel's rules with the active profile", "veldfwctl diff || veldfwctl reload",
             [&context] { return diff(context); }, false,
             "Lists the rules in the firewall's chains that are missing, foreign or in another place; with the "
             "firewall off\nthe chains must be empty. Counters do not matter. Exit status 1 when anything differs."});
}

}  // namespace veldfwctl
