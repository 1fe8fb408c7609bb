// SPDX-License-Identifier: Apache-2.0
// "rule": editing the rules of a profile.
#include <veldfirewall/veldFW.h>

#include <memory>

#include "frame/verb.h"
#include "model/ruleEdit.h"
#include "model/ruleRequest.h"
#include "model/ruleText.h"
#include "system/apply.h"
#include "system/countries.h"
#include "system/editLock.h"
#include "system/services.h"
#include "system/store.h"

namespace veldfwctl {

namespace {

struct Options {
    std::string adapter = FW::FW_ADAPTER_GLOBAL;
    std::string profile;
    bool apply = false;
    int position = 0;  ///< 0: none was given
    int number = 0;
    int newNumber = 0;
    RuleRequest request;
};

SystemKnowledge systemKnowledge() {
    const auto registry = std::make_shared<std::unique_ptr<ServiceRegistry>>();
    SystemKnowledge system;
    system.serviceIsUsable = [registry](const std::string &service) {
        if (!*registry) {
            *registry = std::make_unique<ServiceRegistry>();
        }
        return (*registry)->isUsable(service);
    };
    system.countryData = countryDataGet;
    return system;
}

/// Tells what was done with which rule, and applies the changed profile when asked to.
/// @param done "Added"
int changeFinish(const Context &context, const Options &options, const FW::FWPROFILE &profile, const std::string &done,
                 size_t number, const FW::FWRULE &rule) {
    context.print(done + " rule " + std::to_string(number) + " of " + options.adapter + " in profile \"" +
                  profile.name + "\": " + ruleText(rule));
    const bool applied = changeApply(context, profile.name, options.apply);
    if (context.json) {
        Json::Value json = ruleJson(options.adapter, number, rule);
        json["profile"] = profile.name;
        json["applied"] = applied;
        context.printJson(json);
    }
    return STATUS_DONE;
}

int list(const Context &context, const Options &options) {
    const FW::FWPROFILE profile = profileChosen(options.profile);
    if (!context.json) {
        context.printTable(ruleTable(profile, options.adapter));
        return STATUS_DONE;
    }
    Json::Value json;
    json["profile"] = profile.name;
    json["rules"] = Json::arrayValue;
    json["defaults"] = Json::objectValue;
    for (const auto &[adapter, rules] : profile.rules) {
        for (size_t i = 0; i < rules.size() && (options.adapter.empty() || options.adapter == adapter); ++i) {
            json["rules"].append(ruleJson(adapter, i + 1, rules[i]));
        }
    }
    for (const auto &[adapter, policy] : profile.adapterPolicyMap) {
        if (options.adapter.empty() || options.adapter == adapter) {
            json["defaults"][adapter] = policyText(policy);
        }
    }
    context.printJson(json);
    return STATUS_DONE;
}

int add(const Context &context, const Options &options) {
    const FW::FWRULE rule = ruleFromRequest(options.request, systemKnowledge());
    const bool isThere = adapterNames().count(options.adapter) > 0;
    size_t number = 0;
    const FW::FWPROFILE profile = profileEdit(options.profile, [&](FW::FWPROFILE &edited) {
        number = ruleInsert(edited, options.adapter, options.position, rule);
    });
    if (!isThere) {
        context.warn("there is no adapter \"" + options.adapter + "\" now; the rule has no effect until there is");
    }
    return changeFinish(context, options, profile, "Added", number, rule);
}

int remove(const Context &context, const Options &options) {
    FW::FWPROFILE profile = profileChosen(options.profile);
    const FW::FWRULE rule = ruleAt(profile, options.adapter, options.number);
    const std::string asked = ruleText(rule);
    if (!context.confirm("Remove rule " + std::to_string(options.number) + " of " + options.adapter +
                         " from profile \"" + profile.name + "\": " + asked + "?")) {
        return STATUS_NO;
    }
    profile = profileEdit(profile.name, [&](FW::FWPROFILE &edited) {
        if (ruleText(ruleAt(edited, options.adapter, options.number)) != asked) {
            throw UsageError("The rules were changed meanwhile; look at them again with \"veldfwctl rule list\"");
        }
        ruleRemove(edited, options.adapter, options.number);
    });
    return changeFinish(context, options, profile, "Removed", static_cast<size_t>(options.number), rule);
}

int move(const Context &context, const Options &options) {
    FW::FWPROFILE profile = profileEdit(options.profile, [&options](FW::FWPROFILE &edited) {
        ruleMove(edited, options.adapter, options.number, options.newNumber);
    });
    const FW::FWRULE rule = ruleAt(profile, options.adapter, options.newNumber);
    return changeFinish(context, options, profile, "Moved", static_cast<size_t>(options.newNumber), rule);
}

int enable(const Context &context, const Options &options, bool enabled) {
    FW::FWPROFILE profile = profileEdit(options.profile, [&](FW::FWPROFILE &edited) {
        ruleAt(edited, options.adapter, options.number).enable = enabled;
    });
    const FW::FWRULE changed = ruleAt(profile, options.adapter, options.number);
    return changeFinish(context, options, profile, enabled ? "Enabled" : "Disabled",
                        static_cast<size_t>(options.number), changed);
}

void commonOptionsAdd(CLI::App &verb, Options &options, bool changes) {
    verb.add_option("-a,--adapter", options.adapter, "Interface name, global (all of them), pppoe or vpn")
        ->capture_default_str();
    verb.add_option("-p,--profile", options.profile, "Profile; the active one when left out");
    if (changes) {
        verb.add_flag("--apply", options.apply, "Reload afterwards when the profile is the active one");
    }
}

void addVerbAdd(CLI::App &group, Context &context, const std::shared_ptr<Options> &options) {
    CLI::App *verb = verbAdd(
        group, context,
        {"add", "Add a rule",
         "veldfwctl rule add --adapter eth0 --deny --from 203.0.113.0/24 --port 8000-8010/tcp --log --name \"old "
         "scanner\"\n"
         "veldfwctl rule add --allow --from 192.168.1.0/24 --service ssh,https\n"
         "veldfwctl rule add --deny --country de,fr --position 1\n"
         "veldfwctl rule add --deny --from 10.0.0.5-10.0.0.9 --port 22/tcp --port 5900-5910/tcp",
         [&context, options] { return add(context, *options); }, false,
         "The first rule that matches decides. A rule without an address matches any, one without ports or services "
         "every\nprotocol. --direction out matches what is forwarded out through the adapter."});
    RuleRequest &request = options->request;
    commonOptionsAdd(*verb, *options, true);
    verb->add_flag("--allow", request.allow, "Let matching packets through");
    verb->add_flag("--deny", request.deny, "Drop matching packets");
    verb->add_option("--from", request.from, "Source: address, network, range A-B, or any");
    verb->add_option("--to", request.to, "Destination: the same");
    verb->add_option("--country", request.countries, "Source countries, by their codes: de,fr");
    verb->add_option("--to-country", request.countriesTo, "Destination countries");
    verb->add_flag("--any", request.anyAddress, "Any address (as when no address is given)");
    verb->add_option("--port", request.ports,
                     "Destination ports: 445/tcp, 8000-8010/udp, 80,443/tcp; 53 is tcp and udp");
    verb->add_option("--source-port", request.sourcePorts, "Source ports: the same");
    verb->add_option("--service", request.services, "Services by name: ssh,https");
    verb->add_option("--protocol", request.protocol, "icmp or igmp");
    verb->add_option("--direction", request.direction, "in or out")->capture_default_str();
    verb->add_option("--position", options->position, "Number that the rule gets; the last when left out");
    verb->add_flag("--log", request.log, "Log matching packets as well");
    verb->add_flag("--disabled", request.disabled, "Add it switched off");
    verb->add_option("--name", request.name, "A name to recognise it by");
    verb->add_option("--label", request.labels, "A label; may be given several times");
}

}  // namespace

void registerRule(CLI::App &app, Context &context) {
    CLI::App *group = verbGroupAdd(app, "rule", "Edit rules: list, add, remove, move, enable, disable");
    const auto options = std::make_shared<Options>();
    const auto listOptions = std::make_shared<Options>();
    listOptions->adapter.clear();

    CLI::App *verb = verbAdd(*group, context,
                             {"list", "List the rules of a profile", "veldfwctl rule list --adapter eth0",
                              [&context, listOptions] { return list(context, *listOptions); }});
    verb->add_option("-a,--adapter", listOptions->adapter, "Only this adapter");
    verb->add_option("-p,--profile", listOptions->profile, "Profile; the active one when left out");

    addVerbAdd(*group, context, options);

    const auto numbered = [&](const char *name, const char *summary, const char *example, bool asks,
                              const std::function<int()> &run) {
        CLI::App *added = verbAdd(*group, context, {name, summary, example, run, asks});
        added->add_option("NUMBER", options->number, "Number of the rule in its adapter's list")->required();
        commonOptionsAdd(*added, *options, true);
        return added;
    };
    numbered("remove", "Remove a rule", "veldfwctl rule remove 3 --adapter eth0", true,
             [&context, options] { return remove(context, *options); });
    numbered("move", "Move a rule to another place in its adapter's list", "veldfwctl rule move 3 1 --adapter eth0",
             false, [&context, options] { return move(context, *options); })
        ->add_option("NEW", options->newNumber, "The number it gets")
        ->required();
    numbered("enable", "Switch a rule on", "veldfwctl rule enable 3 --adapter eth0", false,
             [&context, options] { return enable(context, *options, true); });
    numbered("disable", "Switch a rule off and keep it", "veldfwctl rule disable 3 --adapter eth0", false,
             [&context, options] { return enable(context, *options, false); });
}

}  // namespace veldfwctl
