// SPDX-License-Identifier: Apache-2.0
// "explain": the rule that decides about a packet.
#include <algorithm>
#include <memory>

#include "frame/verb.h"
#include "model/packetQuery.h"
#include "model/packetWalk.h"
#include "system/ruleset.h"
#include "system/store.h"

namespace veldfwctl {

namespace {

struct Options {
    PacketQuery query;
    std::string profile;
};

/// One decision, ready to be shown.
struct Explanation {
    bool isDropped = false;
    bool isCertain = true;
    std::string by;
    std::string condition;  ///< which of the packets; empty for all that are left
    const PlannedCommand *planned = nullptr;
};

std::vector<Explanation> explanationsMake(const PacketSet &packets, const Ruleset &ruleset, const PacketQuery &query) {
    const char *chain = query.isForwarded() ? FW::FW_CHAIN_FORWARD : FW::FW_CHAIN_INPUT;
    std::vector<Explanation> explanations;
    for (const Decision &decision : packetsDecide(packets, ruleset.rules, query.isV6(), chain)) {
        Explanation explanation;
        explanation.isCertain = decision.isCertain;
        if (decision.rule == Decision::CHAIN_END) {
            explanation.by = "no rule and no default policy";
        } else {
            const PacketRule &rule = ruleset.rules[decision.rule];
            explanation.planned = &ruleset.plan[decision.rule];
            explanation.isDropped = rule.target == "DROP";
            explanation.by = plannedText(*explanation.planned);
            explanation.condition =
                packetDifferenceText(packets.intersect(rule.packets), packets, query.isV6(), ruleset.interfaceNames);
        }
        explanations.push_back(std::move(explanation));
    }
    return explanations;
}

/// "drop", "accept", or "depends".
std::string verdictOf(const std::vector<Explanation> &explanations) {
    const auto isDropped = [](const Explanation &explanation) { return explanation.isDropped; };
    return std::all_of(explanations.begin(), explanations.end(), isDropped)    ? "drop"
           : std::none_of(explanations.begin(), explanations.end(), isDropped) ? "accept"
                                                                               : "depends";
}

void explanationsPrint(const Context &context, const std::vector<Explanation> &explanations) {
    const bool isOne = explanations.size() == 1;
    if (verdictOf(explanations) == "depends") {
        context.print("It depends on more than was said of the packet:");
    }
    for (const Explanation &explanation : explanations) {
        const std::string verdict = explanation.isDropped ? "Dropped" : "Accepted";
        const std::string doubt = explanation.isCertain ? "" : ", perhaps";
        const std::string which =
            isOne ? "" : " (" + (explanation.condition.empty() ? "all others" : explanation.condition) + ")";
        context.print(verdict + which + doubt + ": " + explanation.by);
        if (explanation.planned != nullptr) {
            context.print("  " + explanation.planned->command);
        }
    }
}

Json::Value explanationsJson(const std::vector<Explanation> &explanations) {
    Json::Value json;
    json["verdict"] = verdictOf(explanations);
    json["decisions"] = Json::arrayValue;
    for (const Explanation &explanation : explanations) {
        Json::Value entry;
        entry["verdict"] = explanation.isDropped ? "drop" : "accept";
        entry["by"] = explanation.by;
        entry["condition"] = explanation.condition;
        entry["certain"] = explanation.isCertain;
        entry["rule"] = explanation.planned != nullptr ? originJson(*explanation.planned) : Json::Value();
        entry["command"] = explanation.planned != nullptr ? explanation.planned->command : "";
        json["decisions"].append(entry);
    }
    return json;
}

int explain(const Context &context, const Options &options) {
    const PacketQuery &query = options.query;
    if (!query.toPort.empty() && !query.protocol.empty()) {
        throw UsageError("--to-port names its protocol itself; leave --protocol out");
    }
    query.packets(InterfaceNumbers({}));  // a wrong value is refused before anything is read
    const std::set<std::string> known = adapterNames();
    for (const std::string &name : {query.in, query.out}) {
        if (!name.empty() && name != "lo" && known.count(name) == 0) {
            context.warn("there is no interface \"" + name + "\" now");
        }
    }
    const Settings settings = settingsRead();
    const std::string profile = options.profile.empty() ? settings.profile : options.profile;
    Ruleset ruleset;
    std::vector<Explanation> explanations;
    if (options.profile.empty() && !settings.enabled) {
        explanations.push_back({false, true, "the firewall is off", "", nullptr});
    } else {
        ruleset = rulesetBuild(planBuild(profile), {query.in, query.out});
        explanations = explanationsMake(query.packets(ruleset.interfaces), ruleset, query);
    }
    explanationsPrint(context, explanations);
    if (context.json) {
        Json::Value json = explanationsJson(explanations);
        json["profile"] = profile;
        json["enabled"] = settings.enabled;
        context.printJson(json);
    }
    return verdictOf(explanations) == "accept" ? STATUS_DONE : STATUS_NO;
}

}  // namespace

void registerExplain(CLI::App &app, Context &context) {
    const auto options = std::make_shared<Options>();
    CLI::App *verb =
        verbAdd(app, context,
                {"explain", "Name the rule that decides about a packet",
                 "veldfwctl explain --from 203.0.113.7 --to-port 445/tcp --in eth0",
                 [&context, options] { return explain(context, *options); }, false,
                 "Follows a packet that opens a connection through the firewall's chain as the kernel does. What is "
                 "not said\nabout it is left open, and the answer tells what it depends on. Rules that others have put "
                 "into the kernel\nare not looked at: see \"veldfwctl diff\". Exit status 1 unless all such packets "
                 "are accepted."});
    PacketQuery &query = options->query;
    verb->add_option("--from", query.from, "Source address")->required();
    verb->add_option("--to-port", query.toPort, "445/tcp, 8000-8010/udp; 53 is tcp and udp");
    verb->add_option("--in", query.in, "Interface by which it arrives");
    verb->add_option("--to", query.to, "Destination address");
    verb->add_option("--from-port", query.fromPort, "Source port");
    verb->add_option("--protocol", query.protocol, "For packets without ports: icmp, igmp or a number");
    verb->add_option("--out", query.out, "Interface by which it is forwarded; left out, it is for this machine");
    verb->add_flag("--established", query.isEstablished, "It belongs to a connection that exists already");
    verb->add_option("--profile", options->profile, "As if this profile were in force; the active one when left out");
}

}  // namespace veldfwctl
