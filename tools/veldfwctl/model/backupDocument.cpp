// SPDX-License-Identifier: Apache-2.0
// Checks and compares backups of the whole configuration.
#include "model/backupDocument.h"

#include <json/writer.h>
#include <veldfirewall/fwDB.h>

#include <algorithm>
#include <map>

namespace veldfwctl {

namespace {

constexpr int VERSION = 1;
constexpr const char *SETTINGS_FILE = "firewall_settings.json";

std::string inQuotes(const std::string &text) {
    return Json::valueToQuotedString(text.c_str());
}

/// Why a member name cannot be the name of a profile's file; empty when it can.
std::string fileNameProblem(const std::string &name) {
    const std::string extension = ".json";
    if (name.size() <= extension.size() || name.substr(name.size() - extension.size()) != extension) {
        return "does not end in .json";
    }
    if (name.front() == '.') {
        return "begins with a dot";
    }
    if (name.find('/') != std::string::npos || name.find('\0') != std::string::npos || name.size() > 200) {
        return "is no plain file name";
    }
    return name == SETTINGS_FILE ? "is the name of the settings file" : "";
}

/// Why a profile document cannot be used; empty when it can.
std::string profileProblem(const Json::Value &profile) {
    if (!profile.isObject() || !profile["name"].isString() || profile["name"].asString().empty()) {
        return "has no \"name\"";
    }
    const auto isObjectOrMissing = [&](const char *member) {
        return profile[member].isNull() || profile[member].isObject();
    };
    if (!isObjectOrMissing("rules") || !isObjectOrMissing("adapterPolicyMap")) {
        return "has \"rules\" or an \"adapterPolicyMap\" that is no object";
    }
    for (auto list = profile["rules"].begin(); list != profile["rules"].end(); ++list) {
        if (!list->isArray() ||
            !std::all_of(list->begin(), list->end(), [](const Json::Value &r) { return r.isObject(); })) {
            return "has rules of " + inQuotes(list.name()) + " that are no list of objects";
        }
    }
    try {
        FW::FWPROFILE decoded;
        FW::VELDFW_JSON_DB().jsonToProfile(profile, decoded);
    } catch (const Json::Exception &error) {
        return std::string("does not decode: ") + error.what();
    }
    return "";
}

/// Profile name to document. Of two files with one name the first counts, as in the store.
std::map<std::string, const Json::Value *> profilesByName(const Json::Value &document) {
    std::map<std::string, const Json::Value *> profiles;
    const Json::Value &files = document["config_profiles"];
    for (const std::string &file : files.getMemberNames()) {
        profiles.try_emplace(files[file]["name"].asString(), &files[file]);
    }
    return profiles;
}

}  // namespace

std::vector<std::string> backupProblems(const Json::Value &document) {
    if (!document.isObject()) {
        return {"the document is no object"};
    }
    std::vector<std::string> problems;
    const Json::Value &version = document["config_version"];
    if (!version.isIntegral() || version != VERSION) {
        problems.push_back("\"config_version\" is not " + std::to_string(VERSION));
    }
    const Json::Value &files = document["config_profiles"];
    std::map<std::string, std::string> fileOfName;
    if (!files.isObject() || files.empty()) {
        problems.emplace_back("\"config_profiles\" holds no profile");
    } else {
        for (const std::string &file : files.getMemberNames()) {
            const std::string nameProblem = fileNameProblem(file);
            const std::string problem = nameProblem.empty() ? profileProblem(files[file]) : nameProblem;
            if (!problem.empty()) {
                problems.push_back(inQuotes(file) + " in \"config_profiles\" " + problem);
                continue;
            }
            const std::string name = files[file]["name"].asString();
            const auto [known, isNew] = fileOfName.try_emplace(name, file);
            if (!isNew) {
                problems.push_back(inQuotes(known->second) + " and " + inQuotes(file) + " are both named " +
                                   inQuotes(name));
            }
        }
    }
    const Json::Value &settings = document["config_firewall_settings"];
    if (!settings.isObject() || !settings["status"].isBool() || !settings["profile"].isString()) {
        problems.emplace_back("\"config_firewall_settings\" lacks \"status\" (true or false) or \"profile\" (a name)");
    } else if (fileOfName.count(settings["profile"].asString()) == 0) {
        problems.push_back("the active profile " + inQuotes(settings["profile"].asString()) + " is not in it");
    }
    return problems;
}

BackupChanges backupCompare(const Json::Value &current, const Json::Value &next) {
    BackupChanges changes;
    const auto before = profilesByName(current);
    const auto after = profilesByName(next);
    for (const auto &[name, document] : after) {
        const auto old = before.find(name);
        (old == before.end()         ? changes.added
         : *old->second == *document ? changes.unchanged
                                     : changes.changed)
            .push_back(name);
    }
    for (const auto &entry : before) {
        if (after.count(entry.first) == 0) {
            changes.removed.push_back(entry.first);
        }
    }
    const Json::Value &newSettings = next["config_firewall_settings"];
    const Json::Value &oldSettings = current["config_firewall_settings"];
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    for (const std::string &member : newSettings.getMemberNames()) {
        if (oldSettings[member] != newSettings[member]) {
            changes.settings.push_back(member + ": " + Json::writeString(builder, oldSettings[member]) + " -> " +
                                       Json::writeString(builder, newSettings[member]));
        }
    }
    return changes;
}

}  // namespace veldfwctl
