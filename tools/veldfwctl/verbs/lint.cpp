// SPDX-License-Identifier: Apache-2.0
// "lint": faults of a profile.
#include <algorithm>
#include <iterator>
#include <memory>

#include "frame/libraryCall.h"
#include "frame/verb.h"
#include "system/client.h"
#include "system/commandLint.h"
#include "system/countries.h"
#include "system/services.h"
#include "system/store.h"

namespace veldfwctl {

namespace {

struct Options {
    std::string profile;
    std::string client;
};

std::vector<Finding> findingsMake(const FW::FWPROFILE &profile, const std::optional<PacketQuery> &client) {
    const ServiceRegistry services;
    const auto serviceState = [&services](const std::string &name) {
        const std::optional<Service> service = services.find(name);
        return !service ? ServiceState::UNKNOWN : service->isUsable ? ServiceState::USABLE : ServiceState::SWITCHED_OFF;
    };
    std::vector<RuleCommands> rules;
    // What the library logs about single rules is found again below, with their numbers.
    libraryCall([&] {
        rules = ruleCommandsBuild(profile);
        return true;
    });
    std::vector<Finding> findings = recordsLint(profile, rules, {adapterNames(), serviceState, countryDataGet});
    if (std::any_of(rules.begin(), rules.end(), [](const RuleCommands &rule) { return !rule.isTranslated; })) {
        return findings;  // there is no plan
    }
    const Ruleset ruleset = rulesetBuild(planBuild(profile.name), {client ? client->in : ""});
    for (std::vector<Finding> more : {limitsLint(ruleset.plan), shadowsLint(ruleset),
                                      client ? clientLint(ruleset, *client) : std::vector<Finding>()}) {
        std::move(more.begin(), more.end(), std::back_inserter(findings));
    }
    return findings;
}

int lint(const Context &context, const Options &options) {
    const std::optional<PacketQuery> client =
        options.client.empty() ? clientOfSession() : std::optional<PacketQuery>(clientParse(options.client));
    const std::string name = options.profile.empty() ? settingsRead().profile : options.profile;
    const std::vector<Finding> findings = findingsMake(profileRead(name), client);
    Json::Value json;
    json["profile"] = name;
    json["findings"] = Json::arrayValue;
    for (const Finding &finding : findings) {
        Json::Value entry;
        entry["kind"] = finding.kind;
        entry["adapter"] = finding.adapter;
        entry["number"] = static_cast<Json::UInt64>(finding.number);
        entry["name"] = finding.name;
        entry["why"] = finding.why;
        entry["mend"] = finding.mend;
        json["findings"].append(entry);
        context.print(finding.where + ": " + finding.why + "; " + finding.mend);
    }
    if (context.json) {
        context.printJson(json);
    } else if (findings.empty()) {
        context.print("Profile \"" + name + "\" has no faults that can be seen.");
    }
    return findings.empty() ? STATUS_DONE : STATUS_NO;
}

}  // namespace

void registerLint(CLI::App &app, Context &context) {
    const auto options = std::make_shared<Options>();
    CLI::App *verb = verbAdd(
        app, context,
        {"lint", "Look for faults in a profile", "veldfwctl lint office\nveldfwctl lint office --client 192.0.2.7:22",
         [&context, options] { return lint(context, *options); }, false,
         "Finds rules that can never match, that yield no command or one that iptables refuses, names that nothing is\n"
         "known of, and what would drop new connections like the one over which you work (SSH_CONNECTION, or "
         "--client).\nRules that are switched off are passed over. Exit status 1 when there is a fault."});
    verb->add_option("PROFILE", options->profile, "Name of the profile; the active one when left out");
    verb->add_option("--client", options->client, "Address of the administrator, with this machine's port unless 22");
}

}  // namespace veldfwctl
