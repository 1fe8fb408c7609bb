// SPDX-License-Identifier: Apache-2.0
// "plan": the commands that an application of a profile runs.
#include "system/plan.h"

#include <iostream>
#include <memory>

#include "frame/verb.h"
#include "model/restoreText.h"
#include "system/store.h"

namespace veldfwctl {

namespace {

struct Options {
    std::string profile;
    std::string restore;
};

int plan(const Context &context, const Options &options) {
    const std::string profile = options.profile.empty() ? settingsRead().profile : options.profile;
    const Plan commands = planBuild(profile);
    if (!options.restore.empty()) {
        const std::string text = restoreTextWrite(familyCommands(commands, options.restore == "v6"));
        if (context.json) {
            context.printJson(text);
        } else {
            std::cout << text;
        }
        return STATUS_DONE;
    }
    Json::Value json;
    json["profile"] = profile;
    json["commands"] = Json::arrayValue;
    std::string heading;
    for (const PlannedCommand &planned : commands) {
        const char *family = planned.isV6 ? "IPv6" : "IPv4";
        Json::Value entry;
        entry["family"] = family;
        entry["adapter"] = planned.group;
        entry["command"] = planned.command;
        entry["rule"] = originJson(planned);
        json["commands"].append(entry);
        if (const std::string next = std::string("# ") + family + ", adapter " + planned.group; next != heading) {
            heading = next;
            context.print(heading);
        }
        context.print(planned.command);
    }
    if (context.json) {
        context.printJson(json);
    }
    return STATUS_DONE;
}

}  // namespace

void registerPlan(CLI::App &app, Context &context) {
    const auto options = std::make_shared<Options>();
    CLI::App *verb = verbAdd(
        app, context,
        {"plan", "Show the commands that an application of a profile runs",
         "veldfwctl plan office\nveldfwctl plan --restore v4 | iptables-restore --noflush --test",
         [&context, options] { return plan(context, *options); }, false,
         "They fill the firewall's chains, which are emptied before; meanwhile all new traffic is dropped. Nothing is "
         "changed."});
    verb->add_option("PROFILE", options->profile, "Name of the profile; the active one when left out");
    verb->add_option("--restore", options->restore, "As input of iptables-restore: v4, or v6 for ip6tables-restore")
        ->check(CLI::IsMember({"v4", "v6"}));
}

}  // namespace veldfwctl
