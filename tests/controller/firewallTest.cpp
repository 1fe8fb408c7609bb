// SPDX-License-Identifier: Apache-2.0
// What tests of the controller start from.
#include "firewallTest.h"

#include <fcntl.h>
#include <json/json.h>
#include <syslog.h>
#include <unistd.h>

#include <sstream>
#include <stdexcept>

#include "files.h"

namespace veldtest {
namespace {

constexpr const char *HOOK_RUNS = "/run/hook-runs";

}  // namespace

FirewallTest::FirewallTest() {
    for (const char *left :
         {"/usr/veld/etc", MODULE_STATE, HOOK_RUNS, EXEC_LOCK, "/run/hook-daemon", "/usr/share/xt_geoip"})
        removeAll(left);
    writeFile(PROFILE, R"({"name": "default"})");
    writeFile(MODULE_LIST, "KERNEL_MODULES_CORE=\"no_such_core.ko\"\n"
                           "KERNEL_MODULES_COMMON=\"no_such_common.ko\"\n"
                           "KERNEL_MODULES_NAT=\"no_such_nat.ko\"\n"
                           "IPV6_MODULES=\"no_such_ipv6.ko\"\n");
    writeFile("/etc/services", "discard 9/tcp\n");
    writeFile("/usr/veld/sbin/veldnetdtool", "#!/bin/sh\nprintf %s \"$2\"\n", 0755);
    storeRules({});
}

void FirewallTest::storeRules(const std::vector<FW::FWRULE> &rules) {
    FW::FWPROFILE profile;
    profile.name = "default";
    if (!rules.empty())
        profile.rules["global"] = rules;
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

void FirewallTest::installNotingHooks() {
    for (const std::string name : {"enable", "disable"})
        writeFile("/usr/veld/etc/hooks.d/net/firewall_" + name + "/50-note",
                  "#!/bin/sh\necho \"" + name + " $* $RESULT\" >> " + HOOK_RUNS + "\n", 0755);
}

std::vector<std::string> FirewallTest::hookRuns() {
    std::vector<std::string> runs;
    std::istringstream lines(pathExists(HOOK_RUNS) ? readFile(HOOK_RUNS) : "");
    for (std::string line; std::getline(lines, line);)
        runs.push_back(line);
    return runs;
}

bool FirewallTest::execLockIsFree() {
    const int file = open(EXEC_LOCK, O_RDWR | O_CREAT | O_CLOEXEC, 0600);
    struct flock whole {};
    whole.l_type = F_WRLCK;
    whole.l_whence = SEEK_SET;
    const bool isFree = fcntl(file, F_OFD_SETLK, &whole) == 0;
    close(file);
    return isFree;
}

std::vector<std::string> FirewallTest::errors() {
    std::vector<std::string> texts;
    for (const LogMessage &message : log.messages()) {
        const std::string source = message.text.substr(0, message.text.find(':'));
        for (const char *own :
             {"veldFW.cpp", "fwHook.cpp", "fwIptables.cpp", "veldIptablesModule.cpp", "fwGeoip.cpp"}) {
            if (source == own && message.priority == LOG_ERR)
                texts.push_back(source + message.text.substr(message.text.find(' ')));
        }
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
