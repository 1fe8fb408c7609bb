// SPDX-License-Identifier: Apache-2.0
// "profile": managing the stored profiles.
#include <veldfirewall/veldFW.h>

#include <memory>

#include "frame/libraryCall.h"
#include "frame/verb.h"
#include "model/ruleText.h"
#include "system/apply.h"
#include "system/editLock.h"
#include "system/store.h"

namespace veldfwctl {

namespace {

/// What the verbs of the group take.
struct Options {
    std::string name;
    std::string newName;
    bool empty = false;
    bool noApply = false;
};

size_t ruleCount(const FW::FWPROFILE &profile) {
    size_t count = 0;
    for (const auto &entry : profile.rules) {
        count += entry.second.size();
    }
    return count;
}

int list(const Context &context) {
    const std::string active = settingsRead().profile;
    std::map<std::string, FW::FWPROFILE> profiles;
    require("Cannot read the profiles", "look at /usr/veld/etc/firewall.d",
            [&profiles] { return FW::VELDFW_PROFILE().profileEnum(profiles); });
    Json::Value json = Json::arrayValue;
    Table table{{"PROFILE", "RULES", "STATE"}, {}};
    for (const auto &[name, profile] : profiles) {
        const bool isActive = name == active;
        Json::Value entry;
        entry["name"] = name;
        entry["active"] = isActive;
        entry["trialCopy"] = isTrialCopy(name);
        entry["rules"] = static_cast<Json::UInt64>(ruleCount(profile));
        json.append(entry);
        table.rows.push_back({name,
                              std::to_string(ruleCount(profile)),
                              {isActive            ? "active"
                               : isTrialCopy(name) ? "trial copy"
                                                   : "-",
                               isActive ? Shade::GOOD : Shade::FAINT}});
    }
    context.json ? context.printJson(json) : context.printTable(table);
    return STATUS_DONE;
}

int show(const Context &context, const Options &options) {
    const FW::FWPROFILE profile = profileChosen(options.name);
    if (context.json) {
        Json::Value json;
        FW::VELDFW_PROFILE().profileToJson(profile, json);
        context.printJson(json);
    } else {
        context.printTable(ruleTable(profile, ""));
    }
    return STATUS_DONE;
}

void nameMustBeFree(const std::string &name) {
    profileNameCheck(name);
    for (const std::string &existing : profileNames()) {
        if (existing == name) {
            throw UsageError("There is a profile \"" + name + "\" already; choose another name");
        }
    }
}

/// @param what "Created", for the line that is printed
int nameReport(const Context &context, const std::string &what, const std::string &name) {
    context.print(what + " profile \"" + name + "\".");
    if (context.json) {
        Json::Value json;
        json["profile"] = name;
        context.printJson(json);
    }
    return STATUS_DONE;
}

int create(const Context &context, const Options &options) {
    const EditLock lock;
    nameMustBeFree(options.name);
    require("Cannot create profile \"" + options.name + "\"", "",
            [&] { return FW::VELDFW_PROFILE().profileCreate(options.name); });
    return nameReport(context, "Created", options.name);
}

int copy(const Context &context, const Options &options) {
    const EditLock lock;
    FW::FWPROFILE profile = profileRead(options.name);
    nameMustBeFree(options.newName);
    profile.name = options.newName;
    profileWrite(profile);
    return nameReport(context, "Created", options.newName);
}

int rename(const Context &context, const Options &options) {
    const EditLock lock;
    profileRead(options.name);
    nameMustBeFree(options.newName);
    require("Cannot rename profile \"" + options.name + "\"", "",
            [&] { return FW::VELDFW_PROFILE().profileRename(options.name, options.newName); });
    return nameReport(context, "Renamed", options.newName);
}

int remove(const Context &context, const Options &options) {
    const FW::FWPROFILE profile = profileRead(options.name);
    if (settingsRead().profile == options.name) {
        throw UsageError("Profile \"" + options.name +
                         "\" is the active one; make another one active first: \"veldfwctl profile use NAME\"");
    }
    if (!context.confirm("Delete profile \"" + options.name + "\" with " + std::to_string(ruleCount(profile)) +
                         " rules?")) {
        return STATUS_NO;
    }
    editRequire("Cannot delete profile \"" + options.name + "\"", "", [&] {
        FW::VELDFW_PROFILE profiles;
        return profiles.profileDelete(options.name) && !profiles.profileExist(options.name);
    });
    return nameReport(context, "Deleted", options.name);
}

int use(const Context &context, const Options &options) {
    profileRead(options.name);
    const bool apply = settingsRead().enabled && !options.noApply;
    applicationApply(context, {"Applying profile \"" + options.name + "\"",
                               "Cannot make profile \"" + options.name + "\" the active one", options.name,
                               [&] { return FW::VELDFW().fwProfileConfigSet(options.name, apply); }});
    context.print("Profile \"" + options.name + "\" is the active one" + (apply ? " and applied." : "."));
    if (!apply && settingsRead().enabled) {
        context.warn("the rules of the profile before are still in force; run \"veldfwctl reload\"");
    }
    if (context.json) {
        Json::Value json;
        json["profile"] = options.name;
        json["applied"] = apply;
        context.printJson(json);
    }
    return STATUS_DONE;
}

}  // namespace

void registerProfile(CLI::App &app, Context &context) {
    CLI::App *group = verbGroupAdd(app, "profile", "Manage profiles: list, show, create, copy, rename, delete, use");
    const auto options = std::make_shared<Options>();

    verbAdd(*group, context,
            {"list", "List the profiles", "veldfwctl profile list", [&context] { return list(context); }});

    CLI::App *verb = verbAdd(*group, context,
                             {"show", "Show the rules of a profile", "veldfwctl profile show office",
                              [&context, options] { return show(context, *options); }});
    verb->add_option("PROFILE", options->name, "Its name; the active one when left out");

    const auto named = [&](const char *name, const char *summary, const char *example, bool asks, bool hasNewName,
                           int (*run)(const Context &, const Options &)) {
        CLI::App *added =
            verbAdd(*group, context,
                    {name, summary, example, [&context, options, run] { return run(context, *options); }, asks});
        added->add_option("PROFILE", options->name, "Name of the profile")->required();
        if (hasNewName) {
            added->add_option("NEW", options->newName, "The new name")->required();
        }
        return added;
    };
    named("create", "Create an empty profile", "veldfwctl profile create office", false, false, create);
    named("copy", "Copy a profile under a new name", "veldfwctl profile copy default office", false, true, copy);
    named("rename", "Rename a profile", "veldfwctl profile rename office branch", false, true, rename);
    named("delete", "Delete a profile", "veldfwctl profile delete office", true, false, remove);
    named("use", "Make a profile the active one and apply it if the firewall is on", "veldfwctl profile use office",
          false, false, use)
        ->add_flag("--no-apply", options->noApply, "Leave the rules in the kernel as they are");
}

}  // namespace veldfwctl
