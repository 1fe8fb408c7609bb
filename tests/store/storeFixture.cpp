// SPDX-License-Identifier: Apache-2.0
// An empty profile directory, and the words that tests of the store share.
#include "storeFixture.h"

#include <json/reader.h>
#include <syslog.h>

#include <algorithm>
#include <regex>
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
    static const std::regex form(R"((\w+\.cpp):[1-9][0-9]* ((.|\n)*))");
    std::vector<std::string> errors;
    for (const LogMessage &message : log.messages()) {
        std::smatch parts;
        const bool regular = message.priority == LOG_ERR && std::regex_match(message.text, parts, form);
        errors.push_back(regular ? parts.str(1) + " " + parts.str(2) : "odd: " + message.text);
    }
    log.clear();
    return errors;
}

std::vector<std::string> Store::names() {
    std::vector<std::string> result;
    EXPECT_TRUE(db.profileEnum(result));
    return result;
}

}  // namespace veldtest
