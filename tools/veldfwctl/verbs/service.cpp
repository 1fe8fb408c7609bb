// SPDX-License-Identifier: Apache-2.0
// "service": the registry of services, and the rules that are kept for them.
#include <veldfirewall/veldFW.h>

#include <algorithm>
#include <memory>

#include "frame/libraryCall.h"
#include "frame/verb.h"
#include "model/ports.h"
#include "model/ruleText.h"
#include "system/apply.h"
#include "system/editLock.h"
#include "system/services.h"
#include "system/store.h"
#include "verbs/serviceImport.h"

namespace veldfwctl {

namespace {

struct Options {
    std::string name;
    std::string adapter = FW::FW_ADAPTER_GLOBAL;
    bool deny = false;
    bool apply = false;
};

Json::Value portsJson(int protocol, const std::vector<std::string> &ports) {
    Json::Value json;
    json["protocol"] = protocolText(protocol);
    json["ports"] = Json::arrayValue;
    for (const std::string &port : ports) {
        json["ports"].append(port);
    }
    return json;
}

Json::Value serviceJson(const Service &service) {
    Json::Value json;
    json["name"] = service.name;
    json["enabled"] = service.isUsable;
    json["source"] = portsJson(service.sourceProtocol, service.sourcePorts);
    json["destination"] = portsJson(service.destinationProtocol, service.destinationPorts);
    return json;
}

int list(const Context &context) {
    Json::Value json = Json::arrayValue;
    Table table{{"SERVICE", "PORTS", "STATE"}, {}};
    for (const Service &service : ServiceRegistry().all()) {
        json.append(serviceJson(service));
        table.rows.push_back({service.name,
                              servicePortsText(service),
                              {service.isUsable ? "on" : "off", service.isUsable ? Shade::PLAIN : Shade::FAINT}});
    }
    context.json ? context.printJson(json) : context.printTable(table);
    return STATUS_DONE;
}

Service serviceRequire(const std::string &name) {
    const std::optional<Service> service = ServiceRegistry().find(name);
    if (!service) {
        throw UsageError("Service \"" + name + "\" is not known; see \"veldfwctl service list\"");
    }
    return *service;
}

/// Where a service is named in the stored profiles.
struct ServiceUse {
    std::string profile;
    std::string adapter;
    size_t number = 0;
    FW::FWRULE rule;
};

std::vector<ServiceUse> serviceUses(const std::string &name) {
    std::map<std::string, FW::FWPROFILE> profiles;
    require("Cannot read the profiles", "look at /usr/veld/etc/firewall.d",
            [&profiles] { return FW::VELDFW_PROFILE().profileEnum(profiles); });
    std::vector<ServiceUse> uses;
    for (const auto &[profile, content] : profiles) {
        for (const auto &[adapter, rules] : content.rules) {
            for (size_t i = 0; i < rules.size(); ++i) {
                const FW::FWRULE &rule = rules[i];
                const bool hasServices =
                    rule.portGroup == FW::FW_PORT_GROUP_SERVICE || rule.portGroup == FW::FW_PORT_GROUP_RESERVED;
                if (hasServices && std::count(rule.portList.begin(), rule.portList.end(), name) > 0) {
                    uses.push_back({profile, adapter, i + 1, rule});
                }
            }
        }
    }
    return uses;
}

int show(const Context &context, const Options &options) {
    const Service service = serviceRequire(options.name);
    Json::Value json = serviceJson(service);
    json["rules"] = Json::arrayValue;
    context.print(service.name + ": " + servicePortsText(service) + (service.isUsable ? "" : ", switched off"));
    for (const ServiceUse &use : serviceUses(options.name)) {
        Json::Value entry = ruleJson(use.adapter, use.number, use.rule);
        entry["profile"] = use.profile;
        json["rules"].append(entry);
        context.print("  profile \"" + use.profile + "\", " + use.adapter + " rule " + std::to_string(use.number) +
                      ": " + ruleText(use.rule));
    }
    if (context.json) {
        context.printJson(json);
    }
    return STATUS_DONE;
}

int changeReport(const Context &context, const Options &options, const std::string &text) {
    context.print(text);
    const bool applied = changeApply(context, settingsRead().profile, options.apply);
    if (context.json) {
        Json::Value json;
        json["service"] = options.name;
        json["applied"] = applied;
        context.printJson(json);
    }
    return STATUS_DONE;
}

int reserve(const Context &context, const Options &options) {
    if (!serviceRequire(options.name).isUsable) {
        throw UsageError("Service \"" + options.name + "\" is switched off in its definition; a rule would do nothing");
    }
    if (adapterNames().count(options.adapter) == 0) {
        context.warn("there is no adapter \"" + options.adapter + "\" now; the rule has no effect until there is");
    }
    const FW::FW_POLICY policy = options.deny ? FW::FW_POLICY_DENY : FW::FW_POLICY_ALLOW;
    editRequire(
        "Cannot reserve service \"" + options.name + "\"", "profiles before the failing one have the rule now",
        [&] { return FW::VELDFW_PROFILE().profileAddServToReserve(options.adapter, options.name, policy, false); });
    return changeReport(context, options,
                        "Every profile begins with a rule of " + options.adapter + " to " + policyText(policy) +
                            " service " + options.name + ".");
}

int release(const Context &context, const Options &options) {
    const std::vector<ServiceUse> uses = serviceUses(options.name);
    if (uses.empty()) {
        throw UsageError("No rule names service \"" + options.name + "\"; see \"veldfwctl rule list\"");
    }
    const auto own = std::count_if(uses.begin(), uses.end(), [](const ServiceUse &use) {
        return use.rule.portGroup == FW::FW_PORT_GROUP_SERVICE;
    });
    if (own > 0 && !context.confirm("Take service " + options.name + " also out of " + std::to_string(own) +
                                    " rules that are not reserved, and drop those that name no other?")) {
        return STATUS_NO;
    }
    editRequire("Cannot release service \"" + options.name + "\"", "profiles before the failing one are changed",
                [&] { return FW::VELDFW_PROFILE().profileRemoveServ(options.name); });
    return changeReport(context, options,
                        "Took service " + options.name + " out of " + std::to_string(uses.size()) + " rules.");
}

}  // namespace

void registerService(CLI::App &app, Context &context) {
    CLI::App *group = verbGroupAdd(app, "service", "Services and their rules: list, show, reserve, release, import");
    const auto options = std::make_shared<Options>();
    verbAdd(*group, context, {"list", "List the services that rules can name", "veldfwctl service list", [&context] {
                                  return list(context);
                              }});
    const auto named = [&](const Verb &verb) {
        CLI::App *added = verbAdd(*group, context, verb);
        added->add_option("SERVICE", options->name, "Name of the service")->required();
        return added;
    };
    named({"show", "Show a service and the rules that name it", "veldfwctl service show smb",
           [&context, options] { return show(context, *options); }});
    CLI::App *verb =
        named({"reserve", "Put a rule for a service in front, in every profile",
               "veldfwctl service reserve ssh --apply", [&context, options] { return reserve(context, *options); }});
    verb->add_flag("--deny", options->deny, "Block it (else allow it)");
    verb->add_option("-a,--adapter", options->adapter, "Adapter whose list gets the rule")->capture_default_str();
    verb->add_flag("--apply", options->apply, "Reload afterwards");
    named({"release", "Take a service out of all rules of every profile", "veldfwctl service release ssh --apply",
           [&context, options] { return release(context, *options); }, true})
        ->add_flag("--apply", options->apply, "Reload afterwards");
    serviceImportAdd(*group, context);
}

}  // namespace veldfwctl
