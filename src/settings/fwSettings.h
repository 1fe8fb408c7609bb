// SPDX-License-Identifier: Apache-2.0
// The settings document: whether the firewall is on and which profile is active.
#ifndef VELDFIREWALL_SRC_FWSETTINGS_H
#define VELDFIREWALL_SRC_FWSETTINGS_H

#include <json/value.h>

#include <string>

// Below the controller, whose messages these functions log, and the profile database, which both read and write it.
namespace FW {

/// Sets "status" and "profile" to their defaults.
void settingsInit(Json::Value &settings);
/// Reads the settings; a missing file is created with the defaults. @return false when the file cannot be read or is
/// neither object nor null; the reason is logged
bool settingsGet(Json::Value &settings);
/// As settingsGet(), with a failure also logged as such.
bool settingsGetOrLog(Json::Value &settings);
/// Merges the members of `changes` into the stored settings. @return false, logged, when reading or writing failed
bool settingsSet(const Json::Value &changes);
/// The switch; a missing member means off. @return false, logged, when the member is no boolean
bool settingsStatus(const Json::Value &settings, bool &enabled);
/// The active profile; a missing member gives an empty name. @return false, logged, when the member is no text
bool settingsActiveProfile(const Json::Value &settings, std::string &name);
/// The active profile; a missing member is a failure as well. @return false, logged
bool settingsActiveProfileOrLog(const Json::Value &settings, std::string &name);

}  // namespace FW

#endif
