// SPDX-License-Identifier: Apache-2.0
// The settings document.
#include "settings/fwSettings.h"

#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "utils/log.h"
#include "veldfirewall/utils.h"

// The settings belong to the controller: their messages appear under its name.
#define SETTINGS_LOG_ERR(...) ::FW::logMessage(LOG_ERR, "veldFW.cpp", __LINE__, __VA_ARGS__)

namespace FW {

namespace {

constexpr const char *SETTINGS_PATH = "/usr/veld/etc/firewall.d/firewall_settings.json";
constexpr const char *STATUS_KEY = "status";
constexpr const char *PROFILE_KEY = "profile";

}  // namespace

void settingsInit(Json::Value &settings) {
    settings[STATUS_KEY] = false;
    settings[PROFILE_KEY] = "default";
}

bool settingsGet(Json::Value &settings) {
    const bool isReachable = access(SETTINGS_PATH, F_OK) == 0;
    // Only what is missing for sure may be replaced by the defaults, which switch the firewall off.
    if (!isReachable && errno != ENOENT && errno != ENOTDIR) {
        SETTINGS_LOG_ERR("Failed to reach %s: %s", SETTINGS_PATH, std::strerror(errno));
        return false;
    }
    if (!isReachable) {
        settingsInit(settings);
        jsonFileDump(settings, SETTINGS_PATH);
        return true;
    }
    if (!jsonFileLoad(settings, SETTINGS_PATH)) {
        return false;
    }
    if (!settings.isObject() && !settings.isNull()) {
        SETTINGS_LOG_ERR("%s holds no object", SETTINGS_PATH);
        return false;
    }
    return true;
}

bool settingsGetOrLog(Json::Value &settings) {
    if (!settingsGet(settings)) {
        SETTINGS_LOG_ERR("Falied to configGet()");
        return false;
    }
    return true;
}

bool settingsSet(const Json::Value &changes) {
    Json::Value settings;
    if (!settingsGet(settings)) {
        SETTINGS_LOG_ERR("Falied to config.configGet()");
        return false;
    }
    for (auto change = changes.begin(); change != changes.end(); ++change) {
        settings[change.name()] = *change;
    }
    return jsonFileDump(settings, SETTINGS_PATH);
}

bool settingsStatus(const Json::Value &settings, bool &enabled) {
    const Json::Value &status = settings[STATUS_KEY];
    if (!status.isConvertibleTo(Json::booleanValue)) {
        SETTINGS_LOG_ERR("The value of %s in %s is no boolean", STATUS_KEY, SETTINGS_PATH);
        return false;
    }
    enabled = status.asBool();
    return true;
}

bool settingsActiveProfile(const Json::Value &settings, std::string &name) {
    const Json::Value &profile = settings[PROFILE_KEY];
    if (!profile.isConvertibleTo(Json::stringValue)) {
        SETTINGS_LOG_ERR("The value of %s in %s is no string", PROFILE_KEY, SETTINGS_PATH);
        return false;
    }
    name = profile.asString();
    return true;
}

bool settingsActiveProfileOrLog(const Json::Value &settings, std::string &name) {
    if (!settings.isMember(PROFILE_KEY)) {
        SETTINGS_LOG_ERR("There are no key: %s in config", PROFILE_KEY);
        return false;
    }
    return settingsActiveProfile(settings, name);
}

}  // namespace FW
