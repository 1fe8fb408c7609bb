// SPDX-License-Identifier: Apache-2.0
// An empty profile directory, and the words that tests of the store share.
#include "storeFixture.h"

#include <json/reader.h>

#include <algorithm>
#include <sstream>

namespace veldtest {

Json::Value json(std::string text) {
    std::replace(text.begin(), text.end(), '\'', '"');
    Json::Value value;
    std::istringstream(text) >> value;
    return value;
}

std::string namedDocument(const std::string &name) {
    return "{\"name\": \"" + name + "\"}";
}

std::string storedText(const std::string &file) {
    return readFile(profileDirectory + file);
}

Json::Value storedJson(const std::string &file) {
    return json(storedText(file));
}

void store(const std::string &file, const std::string &text) {
    writeFile(profileDirectory + file, text);
}

void storeSettings(const std::string &activeProfile) {
    writeFile(settingsPath, "{\"status\": false, \"profile\": \"" + activeProfile + "\"}");
}

Store::Store() {
    removeAll(profileDirectory);
    removeAll("/var/lock/firewall");
    makeDirectories(profileDirectory);
}

std::vector<std::string> Store::takeErrors() {
    const auto errors = log.errors();
    EXPECT_EQ(errors.size(), log.messages().size()) << log.text();
    log.clear();
    return errors;
}

std::vector<std::string> Store::names() {
    std::vector<std::string> result;
    EXPECT_TRUE(db.profileEnum(result));
    return result;
}

}  // namespace veldtest
