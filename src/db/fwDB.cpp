// SPDX-License-Identifier: Apache-2.0
// The profile database: one numbered JSON file per profile, found by the name in the document.
#include "veldfirewall/fwDB.h"

#include <glob.h>
#include <veld/core.h>

#include <algorithm>
#include <chrono>
#include <cstdlib>
#include <ctime>
#include <exception>
#include <functional>
#include <memory>
#include <set>
#include <thread>

#include "db/profileCodec.h"
#include "db/profileStore.h"
#include "settings/fwSettings.h"
#include "utils/jsonFile.h"
#include "utils/log.h"
#include "veldfirewall/utils.h"

namespace FW {

namespace {

constexpr const char *PROFILE_DIRECTORY = "/usr/veld/etc/firewall.d/";
constexpr const char *PROFILE_PATTERN = "/usr/veld/etc/firewall.d/*.json";
constexpr const char *PROFILE_EXTENSION = ".json";
constexpr int FILE_NAME_CANDIDATES = 100;
constexpr unsigned CONFIG_VERSION = 1;

/// Base name without extension, and content, of one profile file.
struct ProfileFile {
    std::string fileName;
    Json::Value document;
};

std::string profilePath(const std::string &fileName) {
    return PROFILE_DIRECTORY + fileName + PROFILE_EXTENSION;
}

std::string fileNameOf(const std::string &path) {
    const std::string base = path.substr(path.rfind('/') + 1);
    return base.substr(0, base.rfind('.'));
}

bool profilePathsEnum(std::vector<std::string> &paths) {
    glob_t matches = {};
    const std::unique_ptr<glob_t, void (*)(glob_t *)> freeMatches(&matches, globfree);
    // Sorted here, because glob sorts by the locale of the calling program.
    if (glob(PROFILE_PATTERN, GLOB_ERR | GLOB_NOSORT, nullptr, &matches) != 0) {
        FW_LOG_ERR("Fail to read file from %s", PROFILE_DIRECTORY);
        return false;
    }
    paths.assign(matches.gl_pathv, matches.gl_pathv + matches.gl_pathc);
    std::sort(paths.begin(), paths.end());
    return true;
}

/// The one scan that every operation makes: visits each profile file, last first, so that of two files with one name
/// the visitor sees the one that counts last.
/// @param unreadable receives, when given, the paths of the files that could not be loaded
bool profileScan(const std::function<void(const std::string &name, ProfileFile &&file)> &visit,
                 std::vector<std::string> *unreadable = nullptr) {
    std::vector<std::string> paths;
    if (!profilePathsEnum(paths)) {
        return false;
    }
    for (auto path = paths.rbegin(); path != paths.rend(); ++path) {
        ProfileFile file;
        if (!jsonFileLoad(file.document, *path)) {
            FW_LOG_ERR("Failed to load json from %s", path->c_str());
            if (unreadable != nullptr) {
                unreadable->push_back(*path);
            }
            continue;
        }
        if (!file.document.isObject() || !file.document["name"].isString()) {
            continue;
        }
        file.fileName = fileNameOf(*path);
        visit(file.document["name"].asString(), std::move(file));
    }
    return true;
}

/// As profileScan(), with the failure logged for the callers that need the names.
bool profileScanOrLog(const std::function<void(const std::string &name, ProfileFile &&file)> &visit,
                      std::vector<std::string> *unreadable = nullptr) {
    if (!profileScan(visit, unreadable)) {
        FW_LOG_ERR("Failed to create meta json from %s", PROFILE_DIRECTORY);
        return false;
    }
    return true;
}

/// The file that counts for `name`; its fileName is empty when there is none. @return false when the scan failed
bool profileFileFind(const std::string &name, ProfileFile &found) {
    return profileScanOrLog([&](const std::string &candidate, ProfileFile &&file) {
        if (candidate == name) {
            found = std::move(file);
        }
    });
}

/// Stores a document over the file that `meta` has for `name`, or as a new file. A file name that another process took
/// after the scan is not used: the next is tried.
bool profileFileStore(VELDFW_JSON_DB &db, const std::string &name, const Json::Value &json, Json::Value meta) {
    if (meta.isMember(name)) {
        return jsonFileDump(json, profilePath(meta[name]["fileName"].asString()));
    }
    for (;;) {
        const std::string fileName = db.profilePathNameGen(meta);
        const JsonFileCreated created = jsonFileCreate(json, profilePath(fileName));
        if (created != JsonFileCreated::EXISTS) {
            return created == JsonFileCreated::YES;
        }
        meta["/" + fileName]["fileName"] = fileName;
    }
}

/// A visitor that notes each profile's file name in `meta`.
std::function<void(const std::string &, ProfileFile &&)> metaFill(Json::Value &meta) {
    return [&meta](const std::string &name, ProfileFile &&file) {
        meta[name] = Json::Value(Json::objectValue);
        meta[name]["fileName"] = file.fileName;
    };
}

Json::Value profileDocument(FWPROFILE profile) {
    adapterPoliciesComplete(profile);
    Json::Value document;
    profileEncode(profile, document);
    return document;
}

}  // namespace

bool storedProfilesLoad(std::map<std::string, StoredProfile> &profiles) {
    // Decoded while the document is at hand: a document takes many times the memory of its profile. One that cannot be
    // converted matters only if its file is the one that counts for the name.
    struct Decoded {
        StoredProfile stored;
        std::exception_ptr fault;
    };
    std::map<std::string, Decoded> decoded;
    const auto decode = [&](const std::string &name, ProfileFile &&file) {
        Decoded entry;
        entry.stored.path = profilePath(file.fileName);
        try {
            profileDecode(file.document, entry.stored.profile);
        } catch (const Json::Exception &) {
            entry.fault = std::current_exception();
        }
        decoded[name] = std::move(entry);
    };
    if (!profileScanOrLog(decode)) {
        return false;
    }
    for (auto &[name, entry] : decoded) {
        if (entry.fault) {
            std::rethrow_exception(entry.fault);
        }
        profiles[name] = std::move(entry.stored);
    }
    return true;
}

bool storedProfileSave(StoredProfile &&stored) {
    if (!jsonFileDump(profileDocument(std::move(stored.profile)), stored.path)) {
        FW_LOG_ERR("Failed to profileDbDump()");
        return false;
    }
    return true;
}

void VELDFW_JSON_DB::jsonToProfile(const Json::Value &json, FWPROFILE &profile) {
    profileDecode(json, profile);
}

void VELDFW_JSON_DB::jsonToRuleList(Json::Value json, std::map<std::string, std::vector<FWRULE>> &rules) {
    rulesDecode(json, rules);
}

void VELDFW_JSON_DB::profileToJson(const FWPROFILE &profile, Json::Value &json) {
    profileEncode(profile, json);
}

void VELDFW_JSON_DB::ruleListToJson(const std::map<std::string, std::vector<FWRULE>> &rules, Json::Value &json) {
    rulesEncode(rules, json);
}

bool VELDFW_JSON_DB::profileMetaCreate(Json::Value &meta) {
    return profileScan(metaFill(meta));
}

bool VELDFW_JSON_DB::profileEnum(std::vector<std::string> &names) {
    Json::Value meta(Json::objectValue);
    if (!profileScanOrLog(metaFill(meta))) {
        return false;
    }
    const std::vector<std::string> members = meta.getMemberNames();
    names.insert(names.end(), members.begin(), members.end());
    return true;
}

bool VELDFW_JSON_DB::profileEnum(std::map<std::string, FWPROFILE> &profiles) {
    std::map<std::string, StoredProfile> stored;
    if (!storedProfilesLoad(stored)) {
        return false;
    }
    for (auto &[name, entry] : stored) {
        profiles.emplace(name, std::move(entry.profile));
    }
    return true;
}

std::string VELDFW_JSON_DB::profilePathGet(const std::string &name) {
    ProfileFile file;
    profileFileFind(name, file);
    return file.fileName.empty() ? std::string() : profilePath(file.fileName);
}

std::string VELDFW_JSON_DB::profilePathNameGen(const Json::Value &meta) {
    std::set<std::string> taken;
    for (const Json::Value &entry : meta) {
        taken.insert(entry["fileName"].asString());
    }
    for (int attempt = 1;; ++attempt) {
        // Not seeded: a number that another process draws as well is noticed when the file is created.
        std::string candidate = std::to_string(std::time(nullptr) + std::rand() % FILE_NAME_CANDIDATES);
        if (taken.count(candidate) == 0) {
            return candidate;
        }
        if (attempt % FILE_NAME_CANDIDATES == 0) {
            std::this_thread::sleep_for(std::chrono::milliseconds(10));
        }
    }
}

bool VELDFW_JSON_DB::profileDbLoad(const std::string &name, Json::Value &json) {
    return jsonFileLoad(json, profilePathGet(name));
}

bool VELDFW_JSON_DB::profileDbDump(const std::string &name, const Json::Value &json) {
    Json::Value meta(Json::objectValue);
    return profileScanOrLog(metaFill(meta)) && profileFileStore(*this, name, json, std::move(meta));
}

bool VELDFW_JSON_DB::profileDbRemove(const std::string &name) {
    const std::string path = profilePathGet(name);
    if (!path.empty()) {
        jsonFileRemove(path);
    }
    return true;
}

bool VELDFW_JSON_DB::profileExist(const std::string &name) {
    return VLIBCFileExist(profilePathGet(name).c_str()) != 0;
}

bool VELDFW_JSON_DB::profileGet(const std::string &name, FWPROFILE &profile) {
    ProfileFile file;
    if (!profileFileFind(name, file) || file.fileName.empty()) {
        FW_LOG_ERR("Failed to profileGet %s due to not exist", name.c_str());
        return false;
    }
    profileDecode(file.document, profile);
    return true;
}

bool VELDFW_JSON_DB::profileSet(const std::string &name, const FWPROFILE &profile) {
    if (!profileDbDump(name, profileDocument(profile))) {
        FW_LOG_ERR("Failed to profileDbDump()");
        return false;
    }
    return true;
}

bool VELDFW_JSON_DB::profileCreate(const std::string &name) {
    Json::Value meta(Json::objectValue);
    const bool scanned = profileScanOrLog(metaFill(meta));
    if (meta.isMember(name)) {
        FW_LOG_ERR("The profile %s already exist", name.c_str());
        return false;
    }
    FWPROFILE profile;
    profile.name = name;
    if (!scanned || !profileFileStore(*this, name, profileDocument(profile), std::move(meta))) {
        FW_LOG_ERR("Failed to profileDbDump()");
        FW_LOG_ERR("Failed to profileSet");
        return false;
    }
    return true;
}

bool VELDFW_JSON_DB::profileRename(const std::string &oldName, const std::string &newName) {
    ProfileFile file;
    bool newNameTaken = false;
    const bool scanned = profileScanOrLog([&](const std::string &candidate, ProfileFile &&candidateFile) {
        newNameTaken = newNameTaken || candidate == newName;
        if (candidate == oldName) {
            file = std::move(candidateFile);
        }
    });
    if (newNameTaken) {
        FW_LOG_ERR("profile %s already exist", newName.c_str());
        return false;
    }
    Json::Value settings;
    std::string activeProfile;
    if (!settingsGet(settings) || !settingsActiveProfile(settings, activeProfile)) {
        FW_LOG_ERR("Falied to config.configGet()");
        return false;
    }
    if (!scanned || file.fileName.empty()) {
        FW_LOG_ERR("Failed to profileGet %s due to not exist", oldName.c_str());
        FW_LOG_ERR("Failed to get profile %s", oldName.c_str());
        return false;
    }
    FWPROFILE profile;
    profileDecode(file.document, profile);
    profile.name = newName;
    Json::Value renamed;
    profileEncode(profile, renamed);
    const std::string path = profilePath(file.fileName);
    if (!jsonFileDump(renamed, path)) {
        FW_LOG_ERR("Failed to jsonFileDump [%s]", path.c_str());
        return false;
    }
    if (activeProfile == oldName) {
        settings["profile"] = newName;
        if (!settingsSet(settings)) {
            FW_LOG_ERR("Falied to config.configSet()");
            return false;
        }
    }
    return true;
}

bool VELDFW_JSON_DB::profileDelete(const std::string &name) {
    return profileDbRemove(name);
}

bool VELDFW_JSON_DB::exportConfig(Json::Value &out) {
    Json::Value &documents = out["config_profiles"];
    std::map<std::string, ProfileFile> files;
    std::vector<std::string> unreadable;
    if (!profileScanOrLog([&](const std::string &name, ProfileFile &&file) { files[name] = std::move(file); },
                          &unreadable)) {
        return false;
    }
    Json::Value settings;
    std::string activeProfile;
    if (!settingsGet(settings) || !settingsActiveProfile(settings, activeProfile)) {
        FW_LOG_ERR("Falied to get firewall settings.");
        return false;
    }
    out["config_firewall_settings"] = settings;
    out["config_version"] = CONFIG_VERSION;
    for (auto &[name, file] : files) {
        documents[file.fileName + PROFILE_EXTENSION] = std::move(file.document);
    }
    // A file that cannot be read does not tell its name. When the profile in force was not found, it may be this one,
    // and a backup without it would pass for whole.
    if (files.count(activeProfile) == 0 && !unreadable.empty()) {
        for (const std::string &path : unreadable) {
            FW_LOG_ERR("Failed to load json from [%s] for profile [%s]%s", path.c_str(), activeProfile.c_str(),
                       " which is the current one.");
        }
        return false;
    }
    return true;
}

bool VELDFW_JSON_DB::importConfig(const Json::Value &in) {
    // Looked up before anything is deleted: a value that can have no members ends the import here, by exception.
    const Json::Value &documents = in["config_profiles"];
    const Json::Value &settings = in["config_firewall_settings"];
    std::map<std::string, std::string> oldPaths;
    if (!profileScanOrLog(
            [&](const std::string &name, ProfileFile &&file) { oldPaths[name] = profilePath(file.fileName); })) {
        return false;
    }
    for (const auto &[name, path] : oldPaths) {
        jsonFileRemove(path);
        if (VLIBCFileExist(path.c_str()) != 0) {
            FW_LOG_ERR("Failed to delete old profile '%s'.", name.c_str());
        }
    }
    for (auto document = documents.begin(); document != documents.end(); ++document) {
        const std::string path = PROFILE_DIRECTORY + document.name();
        if (!jsonFileDump(*document, path)) {
            FW_LOG_ERR("Failed to jsonFileDump [%s].", path.c_str());
        }
    }
    if (!settingsSet(settings)) {
        FW_LOG_ERR("Falied to set firewall settings.");
        return false;
    }
    return true;
}

}  // namespace FW
