// SPDX-License-Identifier: Apache-2.0
// What tests of the controller start from.
#include "firewallTest.h"

#include <json/json.h>

#include <boost/interprocess/sync/file_lock.hpp>
#include <sstream>

#include "caseTable.h"
#include "files.h"

namespace veldtest {

static constexpr const char *HOOK_RUNS = "/run/hook-runs";

FirewallTest::FirewallTest() {
    writeFile(PROFILE, R"({"name": "default"})");
    writeFile(MODULE_LIST, "KERNEL_MODULES_CORE=no_such_core.ko\nKERNEL_MODULES_COMMON=no_such_common.ko\n"
                           "KERNEL_MODULES_NAT=no_such_nat.ko\nIPV6_MODULES=no_such_ipv6.ko\n");
    writeFile("/etc/services", "discard 9/tcp\n");
    writeFile("/usr/veld/sbin/veldnetdtool", "#!/bin/sh\nprintf %s \"$2\"\n", 0755);
}

bool FirewallTest::isSwitchedOn() {
    Json::Value settings;
    std::istringstream(readFile(SETTINGS)) >> settings;
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
    const std::string runs = pathExists(HOOK_RUNS) ? readFile(HOOK_RUNS) : "";
    removeAll(HOOK_RUNS);
    return split(runs, '\n');
}

bool FirewallTest::execLockIsFree() {
    return boost::interprocess::file_lock(EXEC_LOCK).try_lock();
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
