// SPDX-License-Identifier: Apache-2.0
// A stored configuration for tests: settings, profiles, services, modules; and what the library logged.
#ifndef VELD_TEST_STORED_CONFIGURATION_H
#define VELD_TEST_STORED_CONFIGURATION_H

#include "systemLog.h"

#include <veldfirewall/fwRecords.h>

#include <string>
#include <vector>

namespace veldtest {

inline const std::string profileDirectory = "/usr/veld/etc/firewall.d/";
inline const std::string settingsFile = profileDirectory + "firewall_settings.json";

/// Writes the settings file.
void storeSettings(bool enabled, const std::string &profile);
/// Whether the stored switch is on.
bool storedStatus();
/// Writes a profile as it is, without the completion that the database does, to `file` ("1.json").
void storeProfile(const std::string &file, const FW::FWPROFILE &profile);
/// The profile as stored; fails the test when it cannot be read.
FW::FWPROFILE storedProfile(const std::string &name);
enum class Side { source, destination };
/// Writes a service definition with ports of one side (a JSON array's text: "\"22\", \"80-90\"").
void defineService(const std::string &name, const std::string &protocol, const std::string &ports,
                   Side side = Side::destination);
/// Installs a list of modules that no kernel knows, so that loads succeed and change nothing, and a network tool that
/// knows no tunnels.
void installPlatformData();
/// A rule for destination ports: any source when `address` is empty.
FW::FWRULE portRule(FW::FW_POLICY policy, const std::string &port, const std::string &address = "");
/// A rule for services of any source.
FW::FWRULE serviceRule(FW::FW_POLICY policy, const std::vector<std::string> &services);

/// The error messages of the library (not of the platform) without line numbers: "veldFW.cpp Failed to profileEnum()".
std::vector<std::string> errorsOf(SystemLog &log);
/// The last of them, empty when there is none.
std::string lastError(SystemLog &log);

}  // namespace veldtest

#endif
