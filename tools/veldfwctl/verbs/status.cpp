// SPDX-License-Identifier: Apache-2.0
// "status": the switch, the active profile, its rules and what is in the kernel.
#include <veldfirewall/veldFW.h>

#include <algorithm>

#include "frame/libraryCall.h"
#include "frame/verb.h"
#include "model/ruleText.h"
#include "system/kernelState.h"
#include "system/store.h"

namespace veldfwctl {

namespace {

/// What a profile says about one adapter.
struct AdapterSummary {
    std::string adapter;
    size_t rules = 0;
    size_t disabled = 0;
    FW::FW_POLICY defaultPolicy = FW::FW_POLICY_NONE;
};

std::vector<AdapterSummary> adapterSummaries(const FW::FWPROFILE &profile) {
    std::map<std::string, AdapterSummary> summaries;
    for (const auto &[adapter, rules] : profile.rules) {
        AdapterSummary &summary = summaries[adapter];
        summary.rules = rules.size();
        summary.disabled = static_cast<size_t>(
            std::count_if(rules.begin(), rules.end(), [](const FW::FWRULE &rule) { return !rule.enable; }));
    }
    for (const auto &[adapter, policy] : profile.adapterPolicyMap) {
        summaries[adapter].defaultPolicy = policy;
    }
    std::vector<AdapterSummary> list;
    for (auto &[adapter, summary] : summaries) {
        summary.adapter = adapter;
        list.push_back(summary);
    }
    return list;
}

using Families = std::vector<std::pair<std::string, const std::map<std::string, ChainState> *>>;

Json::Value statusJson(const Settings &settings, const std::vector<AdapterSummary> &adapters, const KernelState &kernel,
                       const Families &families) {
    Json::Value json;
    json["enabled"] = settings.enabled;
    json["profile"] = settings.profile;
    json["adapters"] = Json::objectValue;
    for (const AdapterSummary &summary : adapters) {
        Json::Value &entry = json["adapters"][summary.adapter];
        entry["rules"] = static_cast<Json::UInt64>(summary.rules);
        entry["disabled"] = static_cast<Json::UInt64>(summary.disabled);
        entry["default"] = policyText(summary.defaultPolicy);
    }
    json["live"] = Json::Value();
    if (!kernel.error.empty()) {
        json["liveError"] = kernel.error;
        return json;
    }
    uint64_t dropped = 0;
    for (const auto &[family, chains] : families) {
        for (const auto &[chain, state] : *chains) {
            Json::Value &entry = json["live"][family][chain];
            entry["rules"] = static_cast<Json::UInt64>(state.rules);
            entry["dropped"] = static_cast<Json::UInt64>(state.droppedPackets);
            entry["reached"] = state.isReached;
            dropped += state.droppedPackets;
        }
    }
    json["dropped"] = static_cast<Json::UInt64>(dropped);
    json["droppedSince"] = "rules were last applied";
    return json;
}

void statusPrint(const Context &context, const Settings &settings, const std::vector<AdapterSummary> &adapters,
                 const KernelState &kernel, const Families &families) {
    context.print("Firewall:  " +
                  shaded(settings.enabled ? "on" : "off", settings.enabled ? Shade::GOOD : Shade::BAD, context.colour));
    context.print("Profile:   " + settings.profile);
    Table rules{{"ADAPTER", "RULES", "DISABLED", "DEFAULT"}, {}};
    for (const AdapterSummary &summary : adapters) {
        rules.rows.push_back({summary.adapter,
                              std::to_string(summary.rules),
                              std::to_string(summary.disabled),
                              {policyText(summary.defaultPolicy), policyShade(summary.defaultPolicy)}});
    }
    context.printTable(rules);
    if (!kernel.error.empty()) {
        context.print("In the kernel: not known: " + kernel.error);
        return;
    }
    Table live{{"IN THE KERNEL", "CHAIN", "RULES", "DROPPED", ""}, {}};
    uint64_t dropped = 0;
    for (const auto &[family, chains] : families) {
        for (const char *chain : {FW::FW_CHAIN_INPUT, FW::FW_CHAIN_FORWARD}) {
            const auto found = chains->find(chain);
            if (found == chains->end()) {
                live.rows.push_back({family, chain, "-", "-", {"missing: run \"veldfwctl setup\"", Shade::BAD}});
                continue;
            }
            dropped += found->second.droppedPackets;
            live.rows.push_back({family,
                                 chain,
                                 std::to_string(found->second.rules),
                                 std::to_string(found->second.droppedPackets),
                                 {found->second.isReached ? "" : "not reached: run \"veldfwctl setup\"", Shade::BAD}});
        }
    }
    context.printTable(live);
    context.print("Dropped:   " + std::to_string(dropped) +
                  " packets since the rules were last applied; when that was is not recorded");
}

int status(const Context &context) {
    KernelStateQuery query;  // first: the programs take longer than all the rest
    const Settings settings = settingsRead();
    const std::vector<AdapterSummary> adapters = adapterSummaries(profileChosen(""));
    const KernelState kernel = query.answer();
    const Families families = {{"IPv4", &kernel.v4}, {"IPv6", &kernel.v6}};
    if (context.json) {
        context.printJson(statusJson(settings, adapters, kernel, families));
    } else {
        statusPrint(context, settings, adapters, kernel, families);
    }
    return STATUS_DONE;
}

}  // namespace

void registerStatus(CLI::App &app, Context &context) {
    verbAdd(app, context,
            {"status", "Show whether the firewall is on, its profile and its rules", "veldfwctl status",
             [&context] { return status(context); }, false,
             "Packets dropped are counted by the rules themselves, so the count begins anew with every enable, reload "
             "and profile use."});
}

}  // namespace veldfwctl
