// SPDX-License-Identifier: Apache-2.0
// An empty profile directory, and the words that tests of the store share.
#ifndef VELD_TEST_STORE_FIXTURE_H
#define VELD_TEST_STORE_FIXTURE_H

#include <gmock/gmock.h>
#include <json/value.h>

#include "files.h"
#include "processes.h"
#include "systemLog.h"
#include "veldfirewall/fwDB.h"
#include "veldfirewall/utils.h"
#include "veldfirewall/veldFW.h"

namespace veldtest {

inline const std::string profileDirectory = "/usr/veld/etc/firewall.d/";
inline const std::string lockDirectory = "/var/lock/firewall/";
inline const std::string settingsPath = profileDirectory + "firewall_settings.json";

/// A JSON text with single quotes for double ones.
Json::Value json(std::string text);
/// A profile document with nothing but a name.
std::string namedDocument(const std::string &name);
/// Files in the profile directory.
std::string storedText(const std::string &file);
Json::Value storedJson(const std::string &file);
void store(const std::string &file, const std::string &text);
void storeSettings(const std::string &activeProfile);

/// An empty profile directory, and a system log.
class Store : public testing::Test {
protected:
    Store();
    /// The errors logged since the last call; expects no other messages.
    std::vector<std::string> takeErrors();
    std::vector<std::string> names();

    SystemLog log;
    FW::VELDFW_JSON_DB db;
};

}  // namespace veldtest

#endif
