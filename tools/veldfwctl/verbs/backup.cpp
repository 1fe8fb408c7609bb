// SPDX-License-Identifier: Apache-2.0
// "backup": the whole configuration as one document.
#include <json/reader.h>
#include <json/writer.h>
#include <veldfirewall/veldFW.h>

#include <cstring>
#include <fstream>
#include <iostream>
#include <memory>

#include "frame/libraryCall.h"
#include "frame/verb.h"
#include "model/backupDocument.h"
#include "model/numbers.h"
#include "system/apply.h"
#include "system/editLock.h"
#include "system/newFile.h"
#include "system/store.h"

namespace veldfwctl {

namespace {

struct Options {
    std::string file;
    bool apply = false;
};

constexpr const char *STANDARD = "-";  // standard input or output in place of a file

Json::Value configurationExport() {
    Json::Value document;
    require("Cannot export the configuration", "look at /usr/veld/etc/firewall.d",
            [&document] { return FW::VELDFW_PROFILE().exportConfig(document); });
    return document;
}

int exportTo(const Context &context, const Options &options) {
    const Json::Value document = configurationExport();
    const std::string text = Json::StyledWriter().write(document);
    if (options.file == STANDARD) {
        std::cout << text;
        return STATUS_DONE;
    }
    fileReplace(options.file, text);
    const auto count = document["config_profiles"].size();
    context.print("Wrote " + std::to_string(count) + " profiles and the settings to " + options.file + ".");
    if (context.json) {
        Json::Value json;
        json["file"] = options.file;
        json["profiles"] = count;
        context.printJson(json);
    }
    return STATUS_DONE;
}

Json::Value documentRead(const std::string &file) {
    std::ifstream stream;
    if (file != STANDARD) {
        stream.open(file);
        if (!stream) {
            throw Failure("Cannot read " + file + ": " + std::strerror(errno) +
                          "; name a file made by \"backup export\"");
        }
    }
    Json::Value document;
    Json::CharReaderBuilder builder;
    builder["rejectDupKeys"] = true;
    std::string errors;
    bool isParsed = false;
    try {
        isParsed = Json::parseFromStream(builder, file == STANDARD ? std::cin : stream, &document, &errors);
    } catch (const Json::Exception &error) {  // nested too deeply
        errors = error.what();
    }
    if (!isParsed) {
        throw Failure(file + " is no JSON: " + errors + "; name a file made by \"backup export\"");
    }
    return document;
}

Json::Value namesJson(const std::vector<std::string> &names) {
    Json::Value json = Json::arrayValue;
    for (const std::string &name : names) {
        json.append(name);
    }
    return json;
}

void changesPrint(const Context &context, const BackupChanges &changes) {
    const auto show = [&context](const std::string &head, const std::vector<std::string> &names) {
        if (!names.empty()) {
            context.print(head + join(names, ", "));
        }
    };
    show("Profiles added:     ", changes.added);
    show("Profiles removed:   ", changes.removed);
    show("Profiles changed:   ", changes.changed);
    show("Profiles unchanged: ", changes.unchanged);
    show("Settings:           ", changes.settings);
}

/// Whether the store holds what the document says.
bool isStored(const Json::Value &document) {
    Json::Value stored;
    return libraryCall([&stored] { return FW::VELDFW_PROFILE().exportConfig(stored); }).succeeded &&
           stored["config_profiles"] == document["config_profiles"] &&
           stored["config_firewall_settings"]["status"] == document["config_firewall_settings"]["status"] &&
           stored["config_firewall_settings"]["profile"] == document["config_firewall_settings"]["profile"];
}

/// Replaces the configuration, or puts the old one back and throws Failure.
void configurationImport(const Json::Value &document, const Json::Value &old) {
    // The import goes on past a profile that it cannot write, so only a look at the store tells.
    const CallResult result =
        protectedCall([&document] { return FW::VELDFW_PROFILE().importConfig(document); }, [](int) {});
    if (result.succeeded && isStored(document)) {
        return;
    }
    const std::string reason =
        result.messages.empty() ? "the store does not hold what was written" : messagesJoin(result.messages);
    const CallResult back = protectedCall([&old] { return FW::VELDFW_PROFILE().importConfig(old); }, [](int) {});
    if (back.succeeded && isStored(old)) {
        throw Failure("Cannot import the configuration: " + reason + "; the old configuration was put back");
    }
    const std::string rescue = rescueFileWrite(Json::StyledWriter().write(old));
    throw Failure("Cannot import the configuration: " + reason +
                  "; the old configuration could not be put back either: " + messagesJoin(back.messages) +
                  (rescue.empty() ? "" : "; it is kept in " + rescue) + "; mend the cause and import that file");
}

/// Brings the kernel in line with the new settings, or says that it is not.
bool importApply(const Context &context, bool wasEnabled, bool apply) {
    const Settings settings = settingsRead();
    if (!apply) {
        if (wasEnabled || settings.enabled) {
            context.warn("the rules in the kernel are those from before; run \"veldfwctl " +
                         std::string(settings.enabled ? "reload" : "disable") + "\"");
        }
        return false;
    }
    if (settings.enabled) {
        return reloadRun(context);
    }
    if (wasEnabled) {
        applicationApply(context, {"Switching the firewall off", "Cannot switch the firewall off", "",
                                   [] { return FW::VELDFW().fwDisable(); }});
    }
    return wasEnabled;
}

int importFrom(const Context &context, const Options &options) {
    const Json::Value document = documentRead(options.file);
    const std::vector<std::string> problems = backupProblems(document);
    if (!problems.empty()) {
        throw Failure(options.file + " cannot be imported: " + join(problems, "; ") + "; nothing was changed");
    }
    const Json::Value old = configurationExport();
    const BackupChanges changes = backupCompare(old, document);
    changesPrint(context, changes);
    const bool isSame = changes.isEmpty() && old["config_profiles"] == document["config_profiles"];
    if (isSame) {
        context.print("Nothing to change.");
    } else {
        if (!context.confirm("Replace the configuration by that of " + options.file + "?")) {
            return STATUS_NO;
        }
        const EditLock lock;
        if (configurationExport() != old) {
            throw Failure("The configuration was changed meanwhile; nothing was imported: run this again");
        }
        configurationImport(document, old);
        context.print("Imported " + options.file + ".");
    }
    const bool applied = (!isSame || options.apply) &&
                         importApply(context, old["config_firewall_settings"]["status"].asBool(), options.apply);
    if (context.json) {
        Json::Value json;
        json["added"] = namesJson(changes.added);
        json["removed"] = namesJson(changes.removed);
        json["changed"] = namesJson(changes.changed);
        json["settings"] = namesJson(changes.settings);
        json["applied"] = applied;
        context.printJson(json);
    }
    return STATUS_DONE;
}

}  // namespace

void registerBackup(CLI::App &app, Context &context) {
    CLI::App *group = verbGroupAdd(app, "backup", "Save and restore the whole configuration: export, import");
    const auto options = std::make_shared<Options>();
    CLI::App *out =
        verbAdd(*group, context,
                {"export", "Write all profiles and the settings to a file", "veldfwctl backup export firewall.json",
                 [&context, options] { return exportTo(context, *options); }});
    CLI::App *in = verbAdd(*group, context,
                           {"import", "Replace all profiles and the settings by those of a file",
                            "veldfwctl backup import firewall.json --apply",
                            [&context, options] { return importFrom(context, *options); }, true,
                            "The file is checked and the changes are shown before anything is replaced. When the "
                            "import fails, the old\nconfiguration is put back."});
    out->add_option("FILE", options->file, "File to write, replacing it; - for standard output")->required();
    in->add_option("FILE", options->file, "File to read; - for standard input")->required();
    in->add_flag("--apply", options->apply, "Apply the imported settings and active profile afterwards");
}

}  // namespace veldfwctl
