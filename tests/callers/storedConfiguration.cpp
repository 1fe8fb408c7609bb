// SPDX-License-Identifier: Apache-2.0
// A stored configuration for tests.
#include "storedConfiguration.h"

#include "files.h"

#include <gtest/gtest.h>
#include <json/value.h>
#include <syslog.h>
#include <veldfirewall/veldFW.h>

namespace veldtest {

void storeSettings(bool enabled, const std::string &profile) {
    Json::Value settings;
    settings["status"] = enabled;
    settings["profile"] = profile;
    writeFile(settingsFile, settings.toStyledString());
}

bool storedStatus() {
    bool enabled = false;
    EXPECT_TRUE(FW::VELDFW().fwStatus(enabled));
    return enabled;
}

void storeProfile(const std::string &file, const FW::FWPROFILE &profile) {
    Json::Value document;
    FW::VELDFW_JSON_DB().profileToJson(profile, document);
    writeFile(profileDirectory + file, document.toStyledString());
}

FW::FWPROFILE storedProfile(const std::string &name) {
    FW::FWPROFILE profile;
    EXPECT_TRUE(FW::VELDFW_JSON_DB().profileGet(name, profile)) << name;
    return profile;
}

void defineService(const std::string &name, const std::string &protocol, const std::string &ports, Side side) {
    const std::string filled = R"({"protocol": ")" + protocol + R"(", "ports": [)" + ports + "]}";
    const std::string empty = R"({"protocol": "tcp", "ports": []})";
    const bool isSource = side == Side::source;
    writeFile("/usr/veld/etc/services.d/" + name + ".json",
              R"({"name": ")" + name + R"(", "enabled": true, "source": )" + (isSource ? filled : empty) +
                  R"(, "destination": )" + (isSource ? empty : filled) + "}");
}

void installPlatformData() {
    writeFile("/usr/veld/sbin/veldnetdtool", "#!/bin/sh\nprintf %s \"$2\"\n", 0755);
    writeFile("/usr/veld/etc.defaults/iptables_modules_list", "KERNEL_MODULES_CORE=\"test_core_a.ko test_core_b.ko\"\n"
                                                              "KERNEL_MODULES_COMMON=\"test_common.ko\"\n"
                                                              "IPV6_MODULES=\"test_v6.ko\"\n"
                                                              "KERNEL_MODULES_NAT=\"test_nat.ko\"\n");
}

FW::FWRULE portRule(FW::FW_POLICY policy, const std::string &port, const std::string &address) {
    FW::FWRULE rule;
    rule.policy = policy;
    rule.portGroup = FW::FW_PORT_GROUP_PORT;
    rule.portList = {port};
    rule.ipGroup = address.empty() ? FW::FW_IP_GROUP_ANY : FW::FW_IP_GROUP_ADDRESS;
    if (!address.empty())
        rule.ipList = {address};
    return rule;
}

FW::FWRULE serviceRule(FW::FW_POLICY policy, const std::vector<std::string> &services) {
    FW::FWRULE rule;
    rule.policy = policy;
    rule.portGroup = FW::FW_PORT_GROUP_SERVICE;
    rule.portList = services;
    rule.ipGroup = FW::FW_IP_GROUP_ANY;
    rule.ipType = FW::FW_IP_TYPE_BOTH;
    return rule;
}

std::vector<std::string> errorsOf(SystemLog &log) {
    std::vector<std::string> errors;
    for (const LogMessage &message : log.messages()) {
        const size_t colon = message.text.find(".cpp:") + 4;
        const size_t blank = message.text.find_first_not_of("0123456789", colon + 1);
        const std::string source = message.text.substr(0, colon);
        const bool isLibrary = source.rfind("fw", 0) == 0 || source.rfind("veld", 0) == 0 || source == "utils.cpp";
        if (message.priority == LOG_ERR && isLibrary)
            errors.push_back(source + message.text.substr(blank));
    }
    return errors;
}

std::string lastError(SystemLog &log) {
    const auto errors = errorsOf(log);
    return errors.empty() ? "" : errors.back();
}

}  // namespace veldtest
