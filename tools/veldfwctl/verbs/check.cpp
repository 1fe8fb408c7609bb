// SPDX-License-Identifier: Apache-2.0
// "check": whether the active profile blocks a port or a service.
#include <veldfirewall/veldFW.h>

#include <memory>

#include "frame/libraryCall.h"
#include "frame/verb.h"
#include "model/numbers.h"
#include "model/ports.h"
#include "model/ruleText.h"
#include "system/services.h"
#include "system/store.h"

namespace veldfwctl {

namespace {

using Verdicts = std::map<std::string, FW::FW_POLICY>;

struct Options {
    std::string what;
    std::string adapter;
    bool source = false;
};

/// The graver of two verdicts: what a caller of several ports has to reckon with.
FW::FW_POLICY graver(FW::FW_POLICY one, FW::FW_POLICY other) {
    for (const FW::FW_POLICY policy : {FW::FW_POLICY_DENY, FW::FW_POLICY_PARTIAL, FW::FW_POLICY_ALLOW}) {
        if (one == policy || other == policy) {
            return policy;
        }
    }
    return one;
}

const char *verdictText(FW::FW_POLICY policy) {
    switch (policy) {
    case FW::FW_POLICY_ALLOW:
        return "open";
    case FW::FW_POLICY_DENY:
        return "blocked";
    case FW::FW_POLICY_PARTIAL:
        return "blocked for some addresses";
    default:
        return "not decided";
    }
}

int verdictsReport(const Context &context, const std::string &what, bool enabled, const Verdicts &verdicts) {
    Json::Value json;
    json["query"] = what;
    json["enabled"] = enabled;
    json["adapters"] = Json::objectValue;
    bool isBlocked = false;
    Table table{{"ADAPTER", "VERDICT"}, {}};
    for (const auto &[adapter, policy] : verdicts) {
        isBlocked = isBlocked || policy == FW::FW_POLICY_DENY || policy == FW::FW_POLICY_PARTIAL;
        json["adapters"][adapter] = policyText(policy);
        table.rows.push_back({adapter, {verdictText(policy), policyShade(policy)}});
    }
    json["blocked"] = isBlocked;
    if (context.json) {
        context.printJson(json);
    } else if (!enabled) {
        context.print("The firewall is off: " + what + " is open.");
    } else {
        context.printTable(table);
    }
    return isBlocked ? STATUS_NO : STATUS_DONE;
}

void adapterCheck(const Context &context, const std::string &adapter) {
    if (!adapter.empty() && adapterNames().count(adapter) == 0) {
        context.warn("there is no adapter \"" + adapter + "\" now; what the profile says about it is shown");
    }
}

int checkPort(const Context &context, const Options &options) {
    const PortMatch match = portMatchParse({options.what});
    const bool enabled = settingsRead().enabled;
    adapterCheck(context, options.adapter);
    Verdicts verdicts;
    for (const std::string &port : match.ports) {
        const FW::PortCompareST query{options.source ? 1 : 0, static_cast<FW::FW_PORT_PROTOCOL>(match.protocol), port};
        Verdicts result;
        require("Cannot check port " + port, "run \"veldfwctl doctor\"",
                [&] { return FW::VELDFW().fwPortIsBlocked(query, options.adapter, result); });
        for (const auto &[adapter, policy] : result) {
            const auto [known, isNew] = verdicts.try_emplace(adapter, policy);
            known->second = isNew ? policy : graver(known->second, policy);
        }
    }
    return verdictsReport(context, "port " + portsText(match.protocol, match.ports), enabled, verdicts);
}

int checkService(const Context &context, const Options &options) {
    if (!ServiceRegistry().isUsable(options.what)) {
        throw UsageError("Service \"" + options.what + "\" is not known; see \"veldfwctl service list\"");
    }
    const bool enabled = settingsRead().enabled;
    adapterCheck(context, options.adapter);
    Verdicts verdicts;
    require("Cannot check service \"" + options.what + "\"", "run \"veldfwctl doctor\"",
            [&] { return FW::VELDFW().fwServIsBlocked(options.what, options.adapter, verdicts); });
    return verdictsReport(context, "service " + options.what, enabled, verdicts);
}

}  // namespace

void registerCheck(CLI::App &app, Context &context) {
    CLI::App *group = verbGroupAdd(app, "check", "Ask whether something is blocked: port, service");
    const auto options = std::make_shared<Options>();
    const std::string description =
        "The answer is what the active profile says, per adapter, without a look at the kernel. Exit status 1 when it "
        "is\nblocked on one of them, for some or all addresses.";
    CLI::App *port = verbAdd(*group, context,
                             {"port", "Whether a port is blocked", "veldfwctl check port 445/tcp --adapter eth0",
                              [&context, options] { return checkPort(context, *options); }, false, description});
    port->add_option("PORT", options->what, "445/tcp, 8000-8010/udp; 53 is tcp and udp")->required();
    port->add_flag("--source", options->source, "Ask about source ports");
    CLI::App *service = verbAdd(*group, context,
                                {"service", "Whether a service is blocked", "veldfwctl check service smb",
                                 [&context, options] { return checkService(context, *options); }, false, description});
    service->add_option("SERVICE", options->what, "Name of the service")->required();
    for (CLI::App *verb : {port, service}) {
        verb->add_option("-a,--adapter", options->adapter, "Only this adapter; all of the profile when left out");
    }
}

}  // namespace veldfwctl
