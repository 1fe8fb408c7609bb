// SPDX-License-Identifier: Apache-2.0
// What tests of the controller start from.
#include "firewallTest.h"

#include <json/json.h>
#include <syslog.h>

#include <boost/interprocess/sync/file_lock.hpp>
#include <regex>
#include <sstream>
#include <stdexcept>

#include "files.h"

namespace veldtest {
namespace {

constexpr const char *HOOK_RUNS = "/run/hook-runs";

}  // namespace

FirewallTest::FirewallTest() {
    writeFile(PROFILE, R"({"name": "default"})");
    writeFile(MODULE_LIST, "KERNEL_MODULES_CORE=no_such_core.ko\nKERNEL_MODULES_COMMON=no_such_common.ko\n"
                           "KERNEL_MODULES_NAT=no_such_nat.ko\nIPV6_MODULES=no_such_ipv6.ko\n");
    writeFile("/etc/services", "discard 9/tcp\n");
    writeFile("/usr/veld/sbin/veldnetdtool", "#!/bin/sh\nprintf %s \"$2\"\n", 0755);
}

void FirewallTest::storeProfile(const std::map<std::string, std::vector<FW::FWRULE>> &rules,
                                const std::map<std::string, FW::FW_POLICY> &policies) {
    FW::FWPROFILE profile;
    profile.name = "default";
    profile.rules = rules;
    profile.adapterPolicyMap = policies;
    if (!FW::VELDFW_PROFILE().profileSet("default", profile))
        throw std::runtime_error("no profile could be stored: " + log.text());
    log.clear();
}

bool FirewallTest::isSwitchedOn() {
    Json::Value settings;
    std::istringstream(readFile(SETTINGS)) >> settings;
    if (!settings["status"].isBool())
        throw std::runtime_error("no \"status\" in the settings");
    return settings["status"].asBool();
}

void FirewallTest::installHook(const std::string &action, const std::string &name, const std::string &script) {
    writeFile("/usr/veld/etc/hooks.d/net/firewall_" + action + "/" + name, "#!/bin/sh\n" + script + "\n", 0755);
}

void FirewallTest::installNotingHooks() {
    for (const std::string action : {"enable", "disable"})
        installHook(action, "50-note", "echo \"" + action + " $* $RESULT\" >> " + HOOK_RUNS);
}

std::vector<std::string> FirewallTest::takeHookRuns() {
    std::vector<std::string> runs;
    std::istringstream lines(pathExists(HOOK_RUNS) ? readFile(HOOK_RUNS) : "");
    for (std::string line; std::getline(lines, line);)
        runs.push_back(line);
    removeAll(HOOK_RUNS);
    return runs;
}

bool FirewallTest::execLockIsFree() {
    return boost::interprocess::file_lock(EXEC_LOCK).try_lock();
}

std::vector<std::string> FirewallTest::errors() {
    static const std::regex own("((?:veldFW|fwHook|fwIptables|veldIptablesModule|fwGeoip)\\.cpp):[0-9]+( [^]*)");
    std::vector<std::string> texts;
    std::smatch parts;
    for (const LogMessage &message : log.messages()) {
        if (message.priority == LOG_ERR && std::regex_match(message.text, parts, own))
            texts.push_back(parts.str(1) + parts.str(2));
    }
    return texts;
}

FW::FWRULE portRule(const std::string &port, FW::FW_POLICY policy) {
    FW::FWRULE rule;
    rule.policy = policy;
    rule.ipGroup = FW::FW_IP_GROUP_ANY;
    rule.portGroup = FW::FW_PORT_GROUP_PORT;
    rule.portList = {port};
    return rule;
}

}  // namespace veldtest
