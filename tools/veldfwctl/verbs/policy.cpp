// SPDX-License-Identifier: Apache-2.0
// "policy": what happens to traffic of an adapter that no rule matches.
#include <veldfirewall/veldFW.h>

#include <memory>

#include "frame/verb.h"
#include "model/ruleText.h"
#include "system/apply.h"
#include "system/editLock.h"
#include "system/store.h"

namespace veldfwctl {

namespace {

struct Options {
    std::string policy;
    std::string adapter;
    std::string profile;
    bool apply = false;
};

int set(const Context &context, const Options &options) {
    const FW::FW_POLICY policy = policyParse(options.policy);
    if (options.adapter == FW::FW_ADAPTER_GLOBAL) {
        throw UsageError("Adapter \"global\" keeps no default policy; name another adapter, or end its rules with "
                         "\"veldfwctl rule add --" +
                         std::string(policy == FW::FW_POLICY_DENY ? "deny" : "allow") + " --any\"");
    }
    if (adapterNames().count(options.adapter) == 0) {
        context.warn("there is no adapter \"" + options.adapter + "\" now; its policy has no effect until there is");
    }
    const FW::FWPROFILE profile =
        profileEdit(options.profile, [&](FW::FWPROFILE &edited) { edited.adapterPolicyMap[options.adapter] = policy; });
    context.print("Default policy of " + options.adapter + " in profile \"" + profile.name + "\" is " +
                  policyText(policy) + ".");
    const bool applied = changeApply(context, profile.name, options.apply);
    if (context.json) {
        Json::Value json;
        json["profile"] = profile.name;
        json["adapter"] = options.adapter;
        json["policy"] = policyText(policy);
        json["applied"] = applied;
        context.printJson(json);
    }
    return STATUS_DONE;
}

}  // namespace

void registerPolicy(CLI::App &app, Context &context) {
    CLI::App *group = verbGroupAdd(app, "policy", "Set what happens to traffic that no rule matches: set");
    const auto options = std::make_shared<Options>();
    CLI::App *verb = verbAdd(*group, context,
                             {"set", "Set the default policy of an adapter", "veldfwctl policy set deny --adapter eth0",
                              [&context, options] { return set(context, *options); }});
    verb->add_option("POLICY", options->policy, "allow, deny or none")->required();
    verb->add_option("-a,--adapter", options->adapter, "Interface name, pppoe or vpn")->required();
    verb->add_option("-p,--profile", options->profile, "Profile to change; the active one when left out");
    verb->add_flag("--apply", options->apply, "Reload afterwards when the profile is the active one");
}

}  // namespace veldfwctl
