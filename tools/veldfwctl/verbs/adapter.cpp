// SPDX-License-Identifier: Apache-2.0
// "adapter": what rules can be bound to.
#include <veld/net.h>
#include <veldfirewall/veldFW.h>

#include <array>
#include <memory>

#include "frame/libraryCall.h"
#include "frame/verb.h"
#include "model/ruleText.h"
#include "system/apply.h"
#include "system/editLock.h"
#include "system/store.h"

namespace veldfwctl {

namespace {

struct Options {
    std::string oldName;
    std::string newName;
    bool apply = false;
};

/// Interface name to whether it is up.
std::map<std::string, bool> interfaceStates() {
    std::array<VLIBNETINTERFACEINFO, 256> records = {};
    std::map<std::string, bool> states;
    libraryCall([&] {
        const int count = VLIBNetGetInterfaceInfo(records.data(), static_cast<int>(records.size()), VLIBNET_KIND_ALL);
        for (int i = 0; i < count; ++i) {
            const VLIBNETINTERFACEINFO &record = records[static_cast<size_t>(i)];
            states[record.szName] = (record.flags & IFF_UP) != 0;
        }
        return count >= 0;
    });
    return states;
}

int list(const Context &context) {
    const FW::FWPROFILE profile = profileChosen("");
    std::set<std::string> names = adapterNames();
    const std::map<std::string, bool> states = interfaceStates();
    const std::set<std::string> words = {FW::FW_ADAPTER_GLOBAL, FW::FW_ADAPTER_PPPOE, FW::FW_ADAPTER_VPN};
    for (const auto &entry : profile.rules) {
        names.insert(entry.first);
    }
    for (const auto &entry : profile.adapterPolicyMap) {
        names.insert(entry.first);
    }
    Json::Value json = Json::arrayValue;
    Table table{{"ADAPTER", "STATE", "RULES", "DEFAULT"}, {}};
    for (const std::string &name : names) {
        const auto state = states.find(name);
        const std::string shown = words.count(name) > 0   ? "word"
                                  : state == states.end() ? "missing"
                                  : state->second         ? "up"
                                                          : "down";
        const auto rules = profile.rules.find(name);
        const size_t count = rules == profile.rules.end() ? 0 : rules->second.size();
        const auto policy = profile.adapterPolicyMap.find(name);
        const std::string byDefault = policy == profile.adapterPolicyMap.end() ? "none" : policyText(policy->second);
        Json::Value entry;
        entry["name"] = name;
        entry["state"] = shown;
        entry["rules"] = static_cast<Json::UInt64>(count);
        entry["default"] = byDefault;
        json.append(entry);
        table.rows.push_back(
            {name, {shown, shown == "missing" ? Shade::BAD : Shade::PLAIN}, std::to_string(count), byDefault});
    }
    context.json ? context.printJson(json) : context.printTable(table);
    return STATUS_DONE;
}

int rename(const Context &context, const Options &options) {
    if (options.oldName == options.newName) {
        throw UsageError("\"" + options.oldName + "\" is its name already; nothing was changed");
    }
    std::map<std::string, FW::FWPROFILE> profiles;
    require("Cannot read the profiles", "look at /usr/veld/etc/firewall.d",
            [&profiles] { return FW::VELDFW_PROFILE().profileEnum(profiles); });
    size_t concerned = 0;
    size_t replaced = 0;
    for (const auto &[name, profile] : profiles) {
        const bool hasOld = profile.rules.count(options.oldName) + profile.adapterPolicyMap.count(options.oldName) > 0;
        const bool hasNew = profile.rules.count(options.newName) + profile.adapterPolicyMap.count(options.newName) > 0;
        concerned += hasOld ? 1 : 0;
        replaced += hasOld && hasNew ? 1 : 0;
    }
    if (concerned == 0) {
        throw UsageError("No profile names adapter \"" + options.oldName + "\"; see \"veldfwctl adapter list\"");
    }
    if (adapterNames().count(options.newName) == 0) {
        context.warn("there is no adapter \"" + options.newName + "\" now; its rules have no effect until there is");
    }
    if (replaced > 0 && !context.confirm("Replace rules and default policy of " + options.newName + " in " +
                                         std::to_string(replaced) + " profiles by those of " + options.oldName + "?")) {
        return STATUS_NO;
    }
    editRequire("Cannot move the rules of adapter \"" + options.oldName + "\"",
                "profiles before the failing one are changed",
                [&] { return FW::VELDFW_PROFILE().profileChangeAdapter(options.oldName, options.newName, false); });
    context.print("Moved rules and default policies of " + options.oldName + " to " + options.newName + " in " +
                  std::to_string(concerned) + " profiles.");
    const bool applied = changeApply(context, settingsRead().profile, options.apply);
    if (context.json) {
        Json::Value json;
        json["adapter"] = options.newName;
        json["profiles"] = static_cast<Json::UInt64>(concerned);
        json["applied"] = applied;
        context.printJson(json);
    }
    return STATUS_DONE;
}

}  // namespace

void registerAdapter(CLI::App &app, Context &context) {
    CLI::App *group = verbGroupAdd(app, "adapter", "What rules are bound to: list, rename");
    const auto options = std::make_shared<Options>();
    verbAdd(*group, context,
            {"list", "List interfaces and the words that stand for several", "veldfwctl adapter list",
             [&context] { return list(context); }, false,
             "Rules and default policies are those of the active profile."});
    CLI::App *verb = verbAdd(*group, context,
                             {"rename", "Move rules and default policy to another adapter, in every profile",
                              "veldfwctl adapter rename eth0 bond0",
                              [&context, options] { return rename(context, *options); }, true});
    verb->add_option("OLD", options->oldName, "Adapter that has the rules")->required();
    verb->add_option("NEW", options->newName, "Adapter that gets them")->required();
    verb->add_flag("--apply", options->apply, "Reload afterwards");
}

}  // namespace veldfwctl
